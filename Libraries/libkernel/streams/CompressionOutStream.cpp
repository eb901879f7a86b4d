#include "libkernel/streams/CompressionOutStream.h"

#include "libkernel/streams/internal/CodecPools.h"

#include <algorithm>
#include <cstring>

namespace Kernel {

static_assert(c_outBlockSize % CompressionPredictor::c_stripeChunk == 0);

namespace {

BlockKind KindOf(CompressionPredictorType type, CompressionPredictorStripingType striping)
{
    if (type == CompressionPredictorType::None) return BlockKind::OutPlain;
    return striping == CompressionPredictorStripingType::None ? BlockKind::OutPredicted : BlockKind::OutStriped;
}

} // namespace

CompressionOutStream::CompressionOutStream(Counted<OutStream> target, CompressionPredictorType type,
                                           CompressionPredictorStripingType striping)
    : m_target(std::move(target)), m_predictor(CompressionPredictor::Create(type)),
      m_type(m_predictor ? type : CompressionPredictorType::None),
      m_striping(m_predictor && striping == CompressionPredictorStripingType::Striping64k
                     ? striping
                     : CompressionPredictorStripingType::None)
{
}

CompressionOutStream::~CompressionOutStream()
{
    GiveBlock(KindOf(m_type, m_striping), m_block);
}

bool CompressionOutStream::InitBlock()
{
    if (m_target) m_block = TakeBlock(KindOf(m_type, m_striping));
    return m_block != nullptr;
}

u64 CompressionOutStream::GetBufferSize()
{
    return c_outBlockSize;
}

u64 CompressionOutStream::WriteBlock(void const* from, u64 count)
{
    if (count == 0 || m_state != State::Open) return 0;
    if (!m_predictor) return Compress(from, count) ? count : 0;
    u8* const working = m_block + c_outBlockSize;
    u8 const* p = static_cast<u8 const*>(from);
    for (u64 left = count; left;) {
        bool const wholeBlock = m_fill == 0 && left >= c_outBlockSize;
        u64 const part = std::min(left, c_outBlockSize - m_fill);
        if (wholeBlock) {
            // The caller's memory serves as working block: same borders, one copy less.
            if (!CompressBlock(p, part)) return 0;
        } else {
            std::memcpy(working + m_fill, p, part);
            m_fill += part;
            if (m_fill == c_outBlockSize && !DoPredictor()) return 0;
        }
        p += part;
        left -= part;
    }
    return count;
}

bool CompressionOutStream::DoPredictor()
{
    u64 const count = m_fill;
    m_fill = 0;
    return count == 0 || CompressBlock(m_block + c_outBlockSize, count);
}

// Up to one working block, beginning on a border; @p from is the working block or the caller's memory.
bool CompressionOutStream::CompressBlock(u8 const* from, u64 count)
{
    u8* const working = m_block + c_outBlockSize;
    if (m_striping == CompressionPredictorStripingType::None) {
        m_predictor->EncodeTo(working, from, count);
        return Compress(working, count);
    }
    u8* const scratch = working + c_outBlockSize;
    u64 done = 0;
    for (; count - done >= CompressionPredictor::c_stripeChunk; done += CompressionPredictor::c_stripeChunk)
        m_predictor->StripeAndEncodeTo(scratch + done, from + done);
    m_predictor->EncodeTo(scratch + done, from + done, count - done);
    return Compress(scratch, count);
}

bool CompressionOutStream::Compress(void const* from, u64 count)
{
    m_state = State::Failed; // Stays so if the target throws.
    if (WriteToCompressionStream(from, count)) m_state = State::Open;
    return m_state == State::Open;
}

bool CompressionOutStream::WriteToTarget(void const* from, u64 count)
{
    if (count == 0) return true;
    u64 const written = m_target->WriteBlock(from, count);
    m_compressedBytes += written;
    return written == count;
}

bool CompressionOutStream::Finalise()
{
    if (m_state != State::Open) return true;
    if (!DoPredictor()) return false;
    m_state = State::Failed;
    if (FinaliseCompressionStream()) m_state = State::Finalised;
    return m_state == State::Finalised;
}

void CompressionOutStream::Abort()
{
    if (m_state == State::Open) m_state = State::Failed;
}

bool CompressionOutStream::Flush()
{
    return true;
}

u64 CompressionOutStream::GetSizeOutStream() const
{
    return m_compressedBytes;
}

u64 CompressionOutStream::TellOutStream() const
{
    return m_compressedBytes;
}

} // namespace Kernel

#include "libkernel/streams/CompressionInStream.h"

#include "libkernel/streams/internal/CodecPools.h"

#include <algorithm>
#include <cstring>

namespace Kernel {

// Without striping the bytes are decompressed straight into the caller's memory and decoded there. With striping they
// come in blocks of four chunks, on the writer's borders. Chunks are decoded and put together one by one as the caller
// gets to them: straight into its memory where it has room for a whole chunk, otherwise into the chunk that lies
// behind the block. What is left under a whole chunk is the stream's end, which the writer did not stripe.

static_assert(c_chunkBlockSize % CompressionPredictor::c_stripeChunk == 0);

CompressionInStream::DecompressException::~DecompressException() = default;

namespace {

BlockKind KindOf(bool striped)
{
    return striped ? BlockKind::InStriped : BlockKind::InPlain;
}

} // namespace

CompressionInStream::CompressionInStream(Counted<InStream> source, CompressionPredictorType type,
                                         CompressionPredictorStripingType striping, bool throwOnError)
    : m_source(std::move(source)), m_predictor(CompressionPredictor::Create(type)),
      m_striped(m_predictor && striping == CompressionPredictorStripingType::Striping64k), m_throwOnError(throwOnError)
{
}

CompressionInStream::~CompressionInStream()
{
    GiveBlock(KindOf(m_striped), m_block);
}

bool CompressionInStream::InitBlocks()
{
    if (m_source) m_block = TakeBlock(KindOf(m_striped));
    return m_block != nullptr;
}

u64 CompressionInStream::ReadBlock(void* to, u64 count)
{
    u8* const p = static_cast<u8*>(to);
    return m_striped ? ReadStriped(p, count) : ReadPlain(p, count);
}

bool CompressionInStream::SkipBlock(u64 count)
{
    if (m_striped) return ReadStriped(nullptr, count) == count;
    u8 scratch[SCRATCH_SIZE];
    while (count) {
        u64 const part = std::min(count, SCRATCH_SIZE);
        if (ReadPlain(scratch, part) != part) return false;
        count -= part;
    }
    return true;
}

u64 CompressionInStream::Decompress(u8* to, u64 count, bool& failed)
{
    failed = m_damaged;
    u64 done = 0;
    while (done < count && !failed) {
        if (m_inputLeft == 0) {
            m_inputRead = m_block;
            m_inputLeft = m_source->ReadBlock(m_block, c_inputBlockSize);
            failed = m_inputLeft == 0 && !m_source->EOS();
            if (failed) break;
        }
        u64 const input = m_inputLeft;
        u64 delivered = 0;
        if (!DecompressFromBuffer(to + done, count - done, delivered)) failed = m_damaged = true;
        done += delivered;
        // At its end the source has nothing; behind the end of the compressed data nothing is taken from it.
        bool const ended = input == 0 || (delivered == 0 && m_inputLeft == input);
        if (ended) break;
    }
    return done;
}

u64 CompressionInStream::ReadPlain(u8* to, u64 count)
{
    bool failed = false;
    u64 const done = Decompress(to, count, failed);
    if (m_predictor) m_predictor->Decode(to, done);
    if (failed && m_throwOnError) throw DecompressException();
    return done;
}

// Null for @p to drops the bytes.
u64 CompressionInStream::ReadStriped(u8* to, u64 count)
{
    constexpr u64 chunk = CompressionPredictor::c_stripeChunk;
    u8* const ready = m_block + c_inputBlockSize + c_chunkBlockSize;
    u64 done = 0;
    while (done < count) {
        if (m_readyLeft) {
            u64 const part = std::min(count - done, m_readyLeft);
            if (to) std::memcpy(to + done, m_readyRead, part);
            m_readyRead += part;
            m_readyLeft -= part;
            done += part;
        } else if (m_chunkLeft >= chunk) {
            bool const direct = to && count - done >= chunk;
            m_predictor->DecodeAndUnstripeTo(direct ? to + done : ready, m_chunkRead);
            m_chunkRead += chunk;
            m_chunkLeft -= chunk;
            if (direct)
                done += chunk;
            else
                m_readyRead = ready, m_readyLeft = chunk;
        } else if (m_chunkLeft) {
            m_predictor->Decode(m_chunkRead, m_chunkLeft);
            m_readyRead = m_chunkRead;
            m_readyLeft = m_chunkLeft;
            m_chunkLeft = 0;
        } else if (!RefillChunks())
            break;
    }
    return done;
}

bool CompressionInStream::RefillChunks()
{
    bool failed = false;
    m_chunkRead = m_block + c_inputBlockSize;
    m_chunkLeft = Decompress(m_chunkRead, c_chunkBlockSize, failed);
    if (failed && m_throwOnError) {
        m_chunkLeft = 0;
        throw DecompressException();
    }
    return m_chunkLeft != 0;
}

bool CompressionInStream::EOS() const
{
    return true;
}

u64 CompressionInStream::GetSizeInStream() const
{
    return 0;
}

u64 CompressionInStream::TellInStream() const
{
    return 0;
}

} // namespace Kernel

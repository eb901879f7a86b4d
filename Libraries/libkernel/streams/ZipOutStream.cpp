#include "libkernel/streams/ZipOutStream.h"

#include "libkernel/streams/internal/CodecPools.h"

#include <algorithm>
#include <new>

namespace Kernel {

namespace {

constexpr u64 c_maxPiece = 1u << 30; // zlib counts in 32 bits.

} // namespace

ZipOutStream::ZipOutStream(Counted<OutStream> target, CompressionPredictorType type,
                           CompressionPredictorStripingType striping)
    : CompressionOutStream(std::move(target), type, striping)
{
}

ZipOutStream::~ZipOutStream()
{
    GiveDeflate(m_context);
}

Counted<ZipOutStream> ZipOutStream::Create(Counted<OutStream> target, CompressionPredictorType type, int level)
{
    return Create(std::move(target), type, CompressionPredictorStripingType::None, level);
}

Counted<ZipOutStream> ZipOutStream::Create(Counted<OutStream> target, CompressionPredictorType type,
                                           CompressionPredictorStripingType striping)
{
    return CreateI(std::move(target), type, striping, Z_DEFAULT_COMPRESSION);
}

Counted<ZipOutStream> ZipOutStream::Create(Counted<OutStream> target, CompressionPredictorType type,
                                           CompressionPredictorStripingType striping, int level)
{
    return CreateI(std::move(target), type, striping, std::clamp(level, MinCompression(), MaxCompression()));
}

Counted<ZipOutStream> ZipOutStream::CreateI(Counted<OutStream> target, CompressionPredictorType type,
                                            CompressionPredictorStripingType striping, int level)
try {
    Counted<ZipOutStream> stream(new ZipOutStream(std::move(target), type, striping));
    return stream->Init(level) ? stream : nullptr;
} catch (std::bad_alloc const&) {
    return nullptr;
}

bool ZipOutStream::Init(int level)
{
    m_context = TakeDeflate(level);
    return m_context && InitBlock();
}

u32 ZipOutStream::GetAdler32() const
{
    return static_cast<u32>(m_context->stream.adler);
}

bool ZipOutStream::WriteToCompressionStream(void const* from, u64 count)
{
    z_stream& z = m_context->stream;
    u8 const* p = static_cast<u8 const*>(from);
    while (count) {
        u64 const piece = std::min(count, c_maxPiece);
        z.next_in = const_cast<u8*>(p); // Read only; the interface is older than const.
        z.avail_in = static_cast<uInt>(piece);
        while (z.avail_in) {
            z.next_out = GetOutputBlock();
            z.avail_out = static_cast<uInt>(c_outBlockSize);
            if (deflate(&z, Z_NO_FLUSH) != Z_OK) return false;
            if (!WriteToTarget(GetOutputBlock(), c_outBlockSize - z.avail_out)) return false;
        }
        p += piece;
        count -= piece;
    }
    return true;
}

bool ZipOutStream::FinaliseCompressionStream()
{
    z_stream& z = m_context->stream;
    z.next_in = nullptr;
    z.avail_in = 0;
    for (int result = Z_OK; result != Z_STREAM_END;) {
        z.next_out = GetOutputBlock();
        z.avail_out = static_cast<uInt>(c_outBlockSize);
        result = deflate(&z, Z_FINISH);
        if (result != Z_OK && result != Z_BUF_ERROR && result != Z_STREAM_END) return false;
        if (!WriteToTarget(GetOutputBlock(), c_outBlockSize - z.avail_out)) return false;
    }
    return true;
}

} // namespace Kernel

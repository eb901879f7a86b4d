#include "libkernel/streams/ZStandardOutStream.h"

#include "libkernel/streams/internal/CodecPools.h"

#include <algorithm>
#include <new>

namespace Kernel {

ZStandardOutStream::ZStandardOutStream(Counted<OutStream> target, CompressionPredictorType type,
                                       CompressionPredictorStripingType striping)
    : CompressionOutStream(std::move(target), type, striping)
{
}

ZStandardOutStream::~ZStandardOutStream()
{
    GiveZstdCompressor(m_context);
}

Counted<ZStandardOutStream> ZStandardOutStream::Create(Counted<OutStream> target, CompressionPredictorType type,
                                                       int level)
{
    return Create(std::move(target), type, CompressionPredictorStripingType::None, level);
}

Counted<ZStandardOutStream> ZStandardOutStream::Create(Counted<OutStream> target, CompressionPredictorType type,
                                                       CompressionPredictorStripingType striping)
{
    return Create(std::move(target), type, striping, c_defaultLevel);
}

Counted<ZStandardOutStream> ZStandardOutStream::Create(Counted<OutStream> target, CompressionPredictorType type,
                                                       CompressionPredictorStripingType striping, int level)
try {
    Counted<ZStandardOutStream> stream(new ZStandardOutStream(std::move(target), type, striping));
    return stream->Init(std::clamp(level, MinCompression(), MaxCompression())) ? stream : nullptr;
} catch (std::bad_alloc const&) {
    return nullptr;
}

bool ZStandardOutStream::Init(int level)
{
    m_context = TakeZstdCompressor(level);
    return m_context && InitBlock();
}

bool ZStandardOutStream::WriteToCompressionStream(void const* from, u64 count)
{
    ZSTD_inBuffer input{from, count, 0};
    while (input.pos < input.size) {
        ZSTD_outBuffer output{GetOutputBlock(), c_outBlockSize, 0};
        if (ZSTD_isError(ZSTD_compressStream(m_context, &output, &input))) return false;
        if (!WriteToTarget(output.dst, output.pos)) return false;
    }
    return true;
}

bool ZStandardOutStream::FinaliseCompressionStream()
{
    for (size_t left = 1; left;) {
        ZSTD_outBuffer output{GetOutputBlock(), c_outBlockSize, 0};
        left = ZSTD_endStream(m_context, &output);
        if (ZSTD_isError(left)) return false;
        if (!WriteToTarget(output.dst, output.pos)) return false;
    }
    return true;
}

} // namespace Kernel

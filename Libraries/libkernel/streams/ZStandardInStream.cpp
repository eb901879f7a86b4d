#include "libkernel/streams/ZStandardInStream.h"

#include "libkernel/streams/internal/CodecPools.h"

#include <cstring>
#include <memory>
#include <new>
#include <zstd_errors.h>

namespace Kernel {

ZStandardInStream::ZStandardInStream(Counted<InStream> source, CompressionPredictorType type,
                                     CompressionPredictorStripingType striping, bool throwOnError)
    : CompressionInStream(std::move(source), type, striping, throwOnError)
{
}

ZStandardInStream::~ZStandardInStream()
{
    GiveZstdDecompressor(m_context);
}

Counted<ZStandardInStream> ZStandardInStream::Create(Counted<InStream> source, CompressionPredictorType type,
                                                     CompressionPredictorStripingType striping, bool throwOnError)
try {
    Counted<ZStandardInStream> stream(new ZStandardInStream(std::move(source), type, striping, throwOnError));
    return stream->Init() ? stream : nullptr;
} catch (std::bad_alloc const&) {
    return nullptr;
}

bool ZStandardInStream::Init()
{
    m_context = TakeZstdDecompressor();
    return m_context && InitBlocks();
}

bool ZStandardInStream::DecompressFromBuffer(void* to, u64 count, u64& delivered)
{
    ZSTD_inBuffer input{GetInput(), GetInputLeft(), 0};
    ZSTD_outBuffer output{to, count, 0};
    bool const good = !ZSTD_isError(ZSTD_decompressStream(m_context, &output, &input));
    UseInput(input.pos);
    delivered = good ? output.pos : 0;
    return good;
}

namespace {

struct GiveBack
{
    void operator()(ZSTD_DCtx* context) const { GiveZstdDecompressor(context); }
};

// For data that goes on behind the bytes that are wanted, which the call for whole frames refuses.
bool DecompressBeginning(ZSTD_DCtx* context, void const* from, u64 fromSize, void* to, u64 size)
{
    ZSTD_DCtx_reset(context, ZSTD_reset_session_only);
    ZSTD_inBuffer input{from, fromSize, 0};
    ZSTD_outBuffer output{to, size, 0};
    while (output.pos < size) {
        size_t const inputBefore = input.pos, outputBefore = output.pos;
        if (ZSTD_isError(ZSTD_decompressStream(context, &output, &input))) return false;
        if (input.pos == inputBefore && output.pos == outputBefore) return false;
    }
    return true;
}

bool DecompressAll(void const* from, u64 fromSize, void* to, u64 size)
{
    if (size == 0) return true;
    std::unique_ptr<ZSTD_DCtx, GiveBack> const context(TakeZstdDecompressor());
    if (!context) return false;
    size_t const result = ZSTD_decompressDCtx(context.get(), to, size, from, fromSize);
    if (!ZSTD_isError(result)) return result == size;
    ZSTD_ErrorCode const code = ZSTD_getErrorCode(result);
    bool const goesOn =
        code == ZSTD_error_dstSize_tooSmall || code == ZSTD_error_prefix_unknown || code == ZSTD_error_srcSize_wrong;
    return goesOn && DecompressBeginning(context.get(), from, fromSize, to, size);
}

} // namespace

bool ZStandardDecompressExact(void const* from, u64 fromSize, void* to, u64 size)
{
    return DecompressAll(from, fromSize, to, size);
}

bool ZStandardDecompressExact(void const* from, u64 fromSize, void* to, u64 size, CompressionPredictorType type,
                              CompressionPredictorStripingType striping)
try {
    constexpr u64 chunk = CompressionPredictor::c_stripeChunk;
    if (!DecompressAll(from, fromSize, to, size)) return false;
    Counted<CompressionPredictor> const predictor = CompressionPredictor::Create(type);
    if (!predictor) return true;
    u8* p = static_cast<u8*>(to);
    u64 left = size;
    if (striping == CompressionPredictorStripingType::Striping64k && left >= chunk) {
        u8* const block = TakeBlock(BlockKind::OutPlain);
        if (!block) return false;
        for (; left >= chunk; p += chunk, left -= chunk) {
            predictor->DecodeAndUnstripeTo(block, p);
            std::memcpy(p, block, chunk);
        }
        GiveBlock(BlockKind::OutPlain, block);
    }
    predictor->Decode(p, left);
    return true;
} catch (std::bad_alloc const&) {
    return false;
}

} // namespace Kernel

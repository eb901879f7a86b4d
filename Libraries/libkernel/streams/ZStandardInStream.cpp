#include "libkernel/streams/ZStandardInStream.h"

#include "libkernel/core/Endian.h"
#include "libkernel/streams/internal/CodecPools.h"

#include <algorithm>
#include <cstring>
#include <memory>
#include <new>
#include <zstd_errors.h>

namespace Kernel {

namespace {

// The library below also takes the formats from before RFC 8878, which have no limit on their window, and it looks for
// their magic numbers at the start of the bytes of a call, even in the middle of a header that it refuses. What a
// stream gives would then depend on how its bytes arrive. So a header is handed over whole, once its magic number is
// seen to be right, or else in pieces too small to hold one.
constexpr u64 c_longestHeader = 18; // Magic number, descriptor, window, dictionary, content size: 4 + 1 + 1 + 4 + 8.
constexpr u64 c_headerPiece = 3;

bool HasMagic(u8 const* at)
{
    u32 const magic = LoadLittleEndian<u32>(at);
    return magic == ZSTD_MAGICNUMBER || (magic & ZSTD_MAGIC_SKIPPABLE_MASK) == ZSTD_MAGIC_SKIPPABLE_START;
}

// One step. False for damaged data. @p frameTaken counts the bytes of the frame that were taken so far.
ZSTD_ErrorCode DecompressStep(ZSTD_DCtx* context, ZSTD_outBuffer& output, ZSTD_inBuffer& input, u64& frameTaken)
{
    size_t const before = input.pos, size = input.size;
    if (frameTaken == 0 && size - before >= c_longestHeader) {
        if (!HasMagic(static_cast<u8 const*>(input.src) + before)) return ZSTD_error_prefix_unknown;
    } else if (frameTaken < c_longestHeader)
        input.size = before + std::min(size - before, std::min(c_longestHeader - frameTaken, c_headerPiece));
    size_t const result = ZSTD_decompressStream(context, &output, &input);
    input.size = size;
    // 0 is the end of a frame.
    frameTaken = result == 0 ? 0 : frameTaken + (input.pos - before);
    return ZSTD_getErrorCode(result);
}

} // namespace

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
    ZSTD_ErrorCode const error = DecompressStep(m_context, output, input, m_frameTaken);
    if (error == ZSTD_error_memory_allocation) SetLacksMemory();
    bool const good = error == ZSTD_error_no_error;
    UseInput(input.pos);
    delivered = good ? output.pos : 0;
    return good;
}

namespace {

struct GiveBack
{
    void operator()(ZSTD_DCtx* context) const { GiveZstdDecompressor(context); }
};

// For data in several frames, or that goes on behind the bytes that are wanted.
bool DecompressBeginning(ZSTD_DCtx* context, void const* from, u64 fromSize, void* to, u64 size)
{
    ZSTD_DCtx_reset(context, ZSTD_reset_session_only);
    ZSTD_inBuffer input{from, fromSize, 0};
    ZSTD_outBuffer output{to, size, 0};
    u64 frameTaken = 0;
    while (output.pos < size) {
        size_t const inputBefore = input.pos, outputBefore = output.pos;
        if (DecompressStep(context, output, input, frameTaken) != ZSTD_error_no_error) return false;
        if (input.pos == inputBefore && output.pos == outputBefore) return false;
    }
    return true;
}

bool DecompressAll(void const* from, u64 fromSize, void* to, u64 size)
{
    if (size == 0) return true;
    std::unique_ptr<ZSTD_DCtx, GiveBack> const context(TakeZstdDecompressor());
    if (!context) return false;
    bool const isOneFrame = fromSize >= sizeof(u32) && HasMagic(static_cast<u8 const*>(from)) &&
                            ZSTD_findFrameCompressedSize(from, fromSize) == fromSize;
    if (!isOneFrame) return DecompressBeginning(context.get(), from, fromSize, to, size);
    size_t const result = ZSTD_decompressDCtx(context.get(), to, size, from, fromSize);
    if (!ZSTD_isError(result)) return result == size;
    return ZSTD_getErrorCode(result) == ZSTD_error_dstSize_tooSmall &&
           DecompressBeginning(context.get(), from, fromSize, to, size);
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

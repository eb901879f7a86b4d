#include "libkernel/streams/ZStandardInStream.h"

#include "libkernel/core/Endian.h"
#include "libkernel/core/Limits.h"
#include "libkernel/streams/internal/CodecPools.h"

#include <algorithm>
#include <cstring>
#include <memory>
#include <new>
#include <zstd_errors.h>

namespace Kernel {

namespace {

// The library below also takes the formats from before RFC 8878, which have no limit on their window, and it looks for
// their magic numbers at the start of the bytes of a call, even in the middle of a header that it refuses. And a frame
// that lies whole in one call and fits the output is not asked for its window. What a stream gives would then depend on
// how its bytes arrive and are asked for. In pieces too small to hold a magic number a header has one outcome only.
constexpr u64 c_headerPiece = 3;

// Magic number and descriptor, which says how long the header is; at most window, dictionary and content size follow.
constexpr u64 c_shortestHeader = 4 + 1;
constexpr u64 c_longestHeader = c_shortestHeader + 1 + 4 + 8;
static_assert(sizeof(ZStandardFrame::header) == c_longestHeader);

struct FrameHeader
{
    u64 size;
    u64 content; // All ones if the header does not say.
    u64 window;
};

// Of the c_longestHeader bytes at @p at, whatever their magic number.
FrameHeader DecodeHeader(u8 const* at)
{
    static constexpr u8 c_dictionarySizes[] = {0, 1, 2, 4};
    static constexpr u8 c_contentSizes[] = {0, 2, 4, 8};
    u8 const descriptor = at[4];
    bool const isSingle = (descriptor & 0x20) != 0; // Then there is no window byte: the content is the window.
    u64 const contentSize = isSingle && descriptor < 0x40 ? 1 : c_contentSizes[descriptor >> 6];
    u64 const contentAt = c_shortestHeader + (isSingle ? 0 : 1) + c_dictionarySizes[descriptor & 3];
    u8 bytes[8] = {};
    std::memcpy(bytes, at + contentAt, contentSize);
    FrameHeader header;
    header.size = contentAt + contentSize;
    header.content = contentSize ? LoadLittleEndian<u64>(bytes) + (contentSize == 2 ? 256 : 0) : ~u64(0);
    header.window = isSingle ? header.content : (u64(8) + (at[5] & 7)) << (7 + (at[5] >> 3));
    return header;
}

// One step. More than the frame says that it holds is damage, which the library below finds only where it has no larger
// block at hand from before.
ZSTD_ErrorCode DecompressStep(ZSTD_DCtx* context, ZSTD_outBuffer& output, ZSTD_inBuffer& input, ZStandardFrame& frame)
{
    size_t const inputBefore = input.pos, outputBefore = output.pos, size = input.size;
    u64 const headerLeft =
        (frame.headerTaken < c_shortestHeader ? c_shortestHeader : DecodeHeader(frame.header).size) - frame.headerTaken;
    if (headerLeft != 0) input.size = inputBefore + std::min({size - inputBefore, headerLeft, c_headerPiece});
    size_t const result = ZSTD_decompressStream(context, &output, &input);
    input.size = size;
    if (headerLeft != 0 && input.pos > inputBefore) {
        u64 const taken = input.pos - inputBefore;
        std::memcpy(frame.header + frame.headerTaken, static_cast<u8 const*>(input.src) + inputBefore, taken);
        frame.headerTaken += taken;
    }
    frame.delivered += output.pos - outputBefore;
    bool const isTooMuch = frame.delivered != 0 && frame.delivered > DecodeHeader(frame.header).content;
    if (result == 0) frame = ZStandardFrame(); // Behind a frame.
    return isTooMuch ? ZSTD_error_corruption_detected : ZSTD_getErrorCode(result);
}

// True if the bytes are one frame that a stream would take. What follows a header that is cut counts as zeros.
bool IsOneFrame(void const* from, u64 size)
{
    u8 header[c_longestHeader] = {};
    if (size == 0) return false;
    std::memcpy(header, from, std::min(size, c_longestHeader));
    return LoadLittleEndian<u32>(header) == ZSTD_MAGICNUMBER &&
           DecodeHeader(header).window <= u64(1) << c_maxZstdWindowLog &&
           ZSTD_findFrameCompressedSize(from, size) == size;
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
    ZSTD_ErrorCode const error = DecompressStep(m_context, output, input, m_frame);
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

// For data in several frames, that goes on behind the bytes that are wanted, or that no stream takes.
bool DecompressBeginning(ZSTD_DCtx* context, void const* from, u64 fromSize, void* to, u64 size)
{
    ZSTD_DCtx_reset(context, ZSTD_reset_session_only);
    ZSTD_inBuffer input{from, fromSize, 0};
    ZSTD_outBuffer output{to, size, 0};
    ZStandardFrame frame;
    while (output.pos < size) {
        size_t const inputBefore = input.pos, outputBefore = output.pos;
        if (DecompressStep(context, output, input, frame) != ZSTD_error_no_error) return false;
        if (input.pos == inputBefore && output.pos == outputBefore) return false;
    }
    return true;
}

bool DecompressAll(void const* from, u64 fromSize, void* to, u64 size)
{
    if (size == 0) return true;
    std::unique_ptr<ZSTD_DCtx, GiveBack> const context(TakeZstdDecompressor());
    if (!context) return false;
    if (!IsOneFrame(from, fromSize)) return DecompressBeginning(context.get(), from, fromSize, to, size);
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

#include "libkernel/streams/internal/CodecPools.h"

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Limits.h"
#include "libkernel/streams/CompressionPredictor.h"

#include <iterator>
#include <new>
#include <utility>

namespace Kernel {

namespace {

constexpr int c_keptPerPool = 8;
constexpr size_t c_largeContext = 16u << 20; // Bytes. A context at the default level takes a fifth of this.
constexpr int c_lastSmallLevel = 8;          // Contexts of higher levels are above that.
constexpr std::align_val_t c_blockAlignment{64};

// Constant-initialised and never destroyed, so streams may live in statics; what the pools hold stays reachable.
constinit CriticalSectionSpin s_lock;

template <class T>
struct Pool
{
    T* Take()
    {
        CriticalSectionSpinScope const lock(s_lock);
        return m_count ? m_free[--m_count] : nullptr;
    }
    /// False if the pool is full: the object stays the caller's.
    bool Give(T* object, int limit = c_keptPerPool)
    {
        CriticalSectionSpinScope const lock(s_lock);
        if (m_count >= limit) return false;
        m_free[m_count++] = object;
        return true;
    }

    T* m_free[c_keptPerPool] = {};
    int m_count = 0;
};

// By kind.
constexpr u64 c_blockSizes[] = {c_outBlockSize, 2 * c_outBlockSize, 3 * c_outBlockSize, c_inputBlockSize,
                                c_inputBlockSize + c_chunkBlockSize + CompressionPredictor::c_stripeChunk};

constinit Pool<u8> s_blocks[std::size(c_blockSizes)];
constinit Pool<DeflateContext> s_deflate;
constinit Pool<InflateContext> s_inflate;

// Small contexts and large ones apart: neither does a run of small streams hold on to the memory of a large one, nor
// does each stream of a high level begin by growing a small one.
template <class T>
struct ContextPool
{
    T* Take(bool preferLarge)
    {
        Pool<T>& first = preferLarge ? large : small;
        Pool<T>& second = preferLarge ? small : large;
        T* const context = first.Take();
        return context ? context : second.Take();
    }
    bool Give(T* context, size_t size) { return size > c_largeContext ? large.Give(context, 1) : small.Give(context); }

    Pool<T> small;
    Pool<T> large;
};

constinit ContextPool<ZSTD_CCtx> s_zstdCompressors;
constinit ContextPool<ZSTD_DCtx> s_zstdDecompressors;

} // namespace

u8* TakeBlock(BlockKind kind)
{
    u32 const index = static_cast<u32>(kind);
    if (u8* const block = s_blocks[index].Take()) return block;
    return static_cast<u8*>(::operator new(c_blockSizes[index], c_blockAlignment, std::nothrow));
}

void GiveBlock(BlockKind kind, u8* block)
{
    if (block && !s_blocks[static_cast<u32>(kind)].Give(block)) ::operator delete(block, c_blockAlignment);
}

DeflateContext* TakeDeflate(int level, int windowBits, int memoryLevel)
{
    DeflateContext* context = s_deflate.Take();
    if (context && (context->windowBits != windowBits || context->memoryLevel != memoryLevel)) {
        deflateEnd(&context->stream);
        delete std::exchange(context, nullptr);
    }
    if (context) {
        // On a state that has just been reset the level changes without any output.
        if (deflateReset(&context->stream) == Z_OK &&
            deflateParams(&context->stream, level, Z_DEFAULT_STRATEGY) == Z_OK)
            return context;
        deflateEnd(&context->stream);
        delete context;
    }
    context = new (std::nothrow) DeflateContext{{}, windowBits, memoryLevel};
    if (!context) return nullptr;
    if (deflateInit2(&context->stream, level, Z_DEFLATED, windowBits, memoryLevel, Z_DEFAULT_STRATEGY) == Z_OK)
        return context;
    delete context;
    return nullptr;
}

void GiveDeflate(DeflateContext* context)
{
    if (!context || s_deflate.Give(context)) return;
    deflateEnd(&context->stream);
    delete context;
}

InflateContext* TakeInflate(int windowBits)
{
    InflateContext* context = s_inflate.Take();
    if (context) {
        if (inflateReset2(&context->stream, windowBits) == Z_OK) return context;
        inflateEnd(&context->stream);
        delete context;
    }
    context = new (std::nothrow) InflateContext{{}};
    if (!context) return nullptr;
    if (inflateInit2(&context->stream, windowBits) == Z_OK) return context;
    delete context;
    return nullptr;
}

void GiveInflate(InflateContext* context)
{
    if (!context || s_inflate.Give(context)) return;
    inflateEnd(&context->stream);
    delete context;
}

ZSTD_CCtx* TakeZstdCompressor(int level)
{
    ZSTD_CCtx* context = s_zstdCompressors.Take(level > c_lastSmallLevel);
    if (!context) context = ZSTD_createCCtx();
    if (!context) return nullptr;
    if (!ZSTD_isError(ZSTD_CCtx_reset(context, ZSTD_reset_session_and_parameters)) &&
        !ZSTD_isError(ZSTD_CCtx_setParameter(context, ZSTD_c_compressionLevel, level)))
        return context;
    ZSTD_freeCCtx(context);
    return nullptr;
}

void GiveZstdCompressor(ZSTD_CCtx* context)
{
    if (context && !s_zstdCompressors.Give(context, ZSTD_sizeof_CCtx(context))) ZSTD_freeCCtx(context);
}

ZSTD_DCtx* TakeZstdDecompressor()
{
    ZSTD_DCtx* context = s_zstdDecompressors.Take(false);
    if (!context) context = ZSTD_createDCtx();
    if (!context) return nullptr;
    if (!ZSTD_isError(ZSTD_DCtx_reset(context, ZSTD_reset_session_and_parameters)) &&
        !ZSTD_isError(ZSTD_DCtx_setParameter(context, ZSTD_d_windowLogMax, c_maxZstdWindowLog)))
        return context;
    ZSTD_freeDCtx(context);
    return nullptr;
}

void GiveZstdDecompressor(ZSTD_DCtx* context)
{
    if (context && !s_zstdDecompressors.Give(context, ZSTD_sizeof_DCtx(context))) ZSTD_freeDCtx(context);
}

} // namespace Kernel

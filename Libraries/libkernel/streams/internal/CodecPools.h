#pragma once

#include "libkernel/core/Types.h"

#include <zlib.h>
#include <zstd.h>

namespace Kernel {

// Working blocks and compressor contexts that streams hand on to one another. Making them anew for each small item
// costs several times the compression itself: fresh pages, and tables to be cleared.
//
// One spin lock guards all the lists. Each keeps a few and frees the rest; a context that has grown large, by a high
// level or a large window, is kept once at most. Every Take may be called from any thread and gives null without
// memory; every Give accepts null.

/// What a working block is for; each kind has a pool of its own.
enum class BlockKind : u32
{
    OutPlain,     ///< Compressor output.
    OutPredicted, ///< Compressor output, working block.
    OutStriped,   ///< Compressor output, working block, stripe scratch.
    InPlain,      ///< Input block.
    InStriped     ///< Input block, four chunks, one chunk ready for the caller.
};

constexpr u64 c_outBlockSize = 131072;
constexpr u64 c_inputBlockSize = 262144;
constexpr u64 c_chunkBlockSize = 262144;

u8* TakeBlock(BlockKind kind);
void GiveBlock(BlockKind kind, u8* block);

/// A zlib compressor. Never moves, since zlib keeps its address.
struct DeflateContext
{
    z_stream stream;
    int windowBits;
    int memoryLevel;
};

/// As after deflateInit2 with the default strategy.
DeflateContext* TakeDeflate(int level, int windowBits = MAX_WBITS, int memoryLevel = 8);
void GiveDeflate(DeflateContext* context);

/// A zlib decompressor.
struct InflateContext
{
    z_stream stream;
};

/// As after inflateInit2.
InflateContext* TakeInflate(int windowBits = MAX_WBITS);
void GiveInflate(InflateContext* context);

/// All parameters at their defaults but the level.
ZSTD_CCtx* TakeZstdCompressor(int level);
void GiveZstdCompressor(ZSTD_CCtx* context);

/// Refuses windows above c_maxZstdWindowLog.
ZSTD_DCtx* TakeZstdDecompressor();
void GiveZstdDecompressor(ZSTD_DCtx* context);

} // namespace Kernel

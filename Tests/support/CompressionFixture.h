#pragma once

#include "libkernel/streams/CompressionPredictor.h"
#include "support/PlainStreams.h"

#include <algorithm>
#include <optional>
#include <random>
#include <vector>
#include <zlib.h>
#include <zstd.h>

namespace Kernel::Testing {

using Bytes = std::vector<u8>;

using Test::ByteSink;

/// Smooth with a little noise, as pixels are, so that both back ends have something to do.
inline Bytes MakePixels(u64 size, u32 seed)
{
    std::mt19937 random(seed);
    Bytes bytes(size);
    u32 value = random();
    for (u64 i = 0; i < size; ++i) {
        if (i % 4 == 0) value += random() % 4097;
        bytes[i] = static_cast<u8>(value >> (8 * (i % 4)));
    }
    return bytes;
}

/// What predictor and striping make of a whole stream, by the definition: one byte at a time.
inline Bytes TransformSlowly(Bytes const& original, u32 type, bool striped)
{
    u64 const width = type == 0 ? 1 : u64(1) << (type - 1);
    Bytes moved = original;
    for (u64 chunk = 0; striped && width > 1 && chunk + 65536 <= original.size(); chunk += 65536)
        for (u64 i = 0; i < 65536; ++i) {
            u64 const element = i / width, plane = width - 1 - i % width;
            moved[chunk + plane * (65536 / width) + element] = original[chunk + i];
        }
    if (type == 0) return moved;
    Bytes result = moved;
    u32 last = 0;
    for (u64 i = 0; i + width <= moved.size(); i += width) {
        u32 value = 0;
        for (u64 b = 0; b < width; ++b) value |= u32(moved[i + b]) << (8 * b);
        for (u64 b = 0; b < width; ++b) result[i + b] = static_cast<u8>((value - last) >> (8 * b));
        last = value;
    }
    return result;
}

inline Bytes PeerCompress(bool zstd, Bytes const& plain)
{
    Bytes packed(plain.size() + plain.size() / 8 + 1024);
    uLongf size = packed.size();
    if (zstd)
        size = ZSTD_compress(packed.data(), packed.size(), plain.data(), plain.size(), 1);
    else
        compress2(packed.data(), &size, plain.data(), plain.size(), 1);
    packed.resize(size);
    return packed;
}

/// Nothing where the peer refuses, or has more than one byte over.
inline std::optional<Bytes> PeerDecompress(bool zstd, Bytes const& packed, u64 size)
{
    Bytes plain(size + 1);
    uLongf got = plain.size();
    bool good;
    if (zstd) {
        got = ZSTD_decompress(plain.data(), plain.size(), packed.data(), packed.size());
        good = !ZSTD_isError(got);
    } else
        good = uncompress(plain.data(), &got, packed.data(), packed.size()) == Z_OK;
    if (!good) return {};
    plain.resize(got);
    return plain;
}

} // namespace Kernel::Testing

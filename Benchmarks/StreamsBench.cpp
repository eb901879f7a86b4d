// Compression streams against bare zstd and zlib on 16-bit pixels, the transforms alone, CRC-32, and what one small
// item costs. Peers run in turn with the library in the same process, so that their ratio means something, and move
// their bytes from the same sources and to the same targets, through blocks of the sizes that they recommend.

#include "libkernel/streams/CRC32.h"
#include "libkernel/streams/ZStandardInStream.h"
#include "libkernel/streams/ZStandardOutStream.h"
#include "libkernel/streams/ZipInStream.h"
#include "libkernel/streams/ZipOutStream.h"
#include "support/Table.h"

#include <cmath>
#include <cstring>
#include <functional>
#include <memory>
#include <zlib.h>
#include <zstd.h>

using namespace Kernel;

namespace {

using Bytes = std::vector<u8>;
using Type = CompressionPredictorType;
using Striping = CompressionPredictorStripingType;

constexpr u64 c_size = 16u << 20;
constexpr u64 c_block = 131072;

Bytes MakePixels()
{
    Bytes bytes(c_size);
    u32 noise = 1;
    for (u64 i = 0; i < c_size / 2; ++i) {
        noise = noise * 1664525 + 1013904223;
        u64 const x = i % 2048, y = i / 2048;
        double const light = 30000 + 12000 * std::sin(double(x) / 190) + 9000 * std::cos(double(y) / 260);
        u16 const value = static_cast<u16>(light + static_cast<int>((noise >> 26) + (noise >> 18 & 63)) - 64);
        std::memcpy(&bytes[2 * i], &value, 2);
    }
    return bytes;
}

// Target and source in memory that is warm and never grows.
class FixedOut : public OutStream
{
public:
    explicit FixedOut(Bytes& bytes) : m_bytes(bytes) {}
    u64 WriteBlock(void const* from, u64 count) override
    {
        if (count > m_bytes.size() - m_size) return 0;
        std::memcpy(m_bytes.data() + m_size, from, count);
        m_size += count;
        return count;
    }
    u64 GetSizeOutStream() const override { return m_size; }
    u64 TellOutStream() const override { return m_size; }

private:
    Bytes& m_bytes;
    u64 m_size = 0;
};

class FixedIn : public InStream
{
public:
    FixedIn(Bytes const& bytes, u64 size) : m_bytes(bytes), m_size(size) {}
    u64 ReadBlock(void* to, u64 count) override
    {
        u64 const part = std::min(count, m_size - m_position);
        std::memcpy(to, m_bytes.data() + m_position, part);
        m_position += part;
        return part;
    }
    bool SkipBlock(u64) override { return false; }
    u64 GetSizeInStream() const override { return m_size; }
    u64 TellInStream() const override { return m_position; }

private:
    Bytes const& m_bytes;
    u64 const m_size;
    u64 m_position = 0;
};

// The two of a pair measured turn by turn, best of each: seconds.
struct Pair
{
    double ours, peer;
};

Pair Compare(int rounds, std::function<void()> const& ours, std::function<void()> const& peer)
{
    Pair best{1e300, 1e300};
    for (int i = 0; i < rounds; ++i) {
        best.peer = std::min(best.peer, Bench::BestSeconds(1, peer));
        best.ours = std::min(best.ours, Bench::BestSeconds(1, ours));
    }
    return best;
}

void Report(Bench::Table& table, char const* workload, char const* peerName, Pair pair, double bytes, char const* goal)
{
    double const peer = bytes / pair.peer / 1e6;
    table.Row(workload, peerName, peer, "MB/s");
    table.Row(workload, "libkernel", bytes / pair.ours / 1e6, "MB/s", peer, goal);
}

// The planes and differences as one writes them down: what a program without this library would do.
void TransformNaively(u8* to, u8 const* from, u16& last)
{
    for (u64 i = 0; i < 32768; ++i) {
        to[i] = from[2 * i + 1];
        to[32768 + i] = from[2 * i];
    }
    for (u64 i = 0; i < 65536; i += 2) {
        u16 value;
        std::memcpy(&value, to + i, 2);
        u16 const difference = static_cast<u16>(value - last);
        std::memcpy(to + i, &difference, 2);
        last = value;
    }
}

void UndoNaively(u8* to, u8* from, u16& last)
{
    for (u64 i = 0; i < 65536; i += 2) {
        u16 value;
        std::memcpy(&value, from + i, 2);
        last = static_cast<u16>(value + last);
        std::memcpy(from + i, &last, 2);
    }
    for (u64 i = 0; i < 32768; ++i) {
        to[2 * i + 1] = from[i];
        to[2 * i] = from[32768 + i];
    }
}

struct Work
{
    Bytes plain = MakePixels();
    Bytes packed = Bytes(c_size + c_size / 4);
    Bytes back = Bytes(c_size);
    u64 packedSize = 0;
    Bytes block = Bytes(c_block);
    Bytes inBlock = Bytes(ZSTD_DStreamInSize());
    Bytes outBlock = Bytes(ZSTD_CStreamOutSize());
};

template <class Stream>
void PackByStream(Work& w, Type type, Striping striping)
{
    Counted<FixedOut> const out = MakeCounted<FixedOut>(w.packed);
    auto const stream = Stream::Create(out, type, striping);
    for (u64 at = 0; at < c_size; at += 1u << 20) stream->WriteBlock(w.plain.data() + at, 1u << 20);
    stream->Finalise();
    w.packedSize = out->GetSize();
}

template <class Stream>
void UnpackByStream(Work& w, Type type, Striping striping)
{
    auto const stream = Stream::Create(MakeCounted<FixedIn>(w.packed, w.packedSize), type, striping, true);
    for (u64 at = 0; at < c_size; at += 1u << 20) stream->ReadBlock(w.back.data() + at, 1u << 20);
}

void PackByZstd(Work& w, ZSTD_CCtx* context, bool planes)
{
    Counted<OutStream> const target = MakeCounted<FixedOut>(w.packed);
    ZSTD_CCtx_reset(context, ZSTD_reset_session_only);
    u16 last = 0;
    auto const step = [&](ZSTD_inBuffer in, ZSTD_EndDirective end) {
        for (size_t left = 1; end == ZSTD_e_end ? left != 0 : in.pos < in.size;) {
            ZSTD_outBuffer out{w.outBlock.data(), w.outBlock.size(), 0};
            left = ZSTD_compressStream2(context, &out, &in, end);
            target->WriteBlock(w.outBlock.data(), out.pos);
        }
    };
    if (!planes) step({w.plain.data(), c_size, 0}, ZSTD_e_continue);
    for (u64 at = 0; planes && at < c_size; at += c_block) {
        for (u64 chunk = 0; chunk < c_block; chunk += 65536)
            TransformNaively(w.block.data() + chunk, w.plain.data() + at + chunk, last);
        step({w.block.data(), c_block, 0}, ZSTD_e_continue);
    }
    step({nullptr, 0, 0}, ZSTD_e_end);
    w.packedSize = target->GetSize();
}

void UnpackByZstd(Work& w, ZSTD_DCtx* context, bool planes)
{
    Counted<InStream> const source = MakeCounted<FixedIn>(w.packed, w.packedSize);
    ZSTD_DCtx_reset(context, ZSTD_reset_session_only);
    ZSTD_inBuffer in{w.inBlock.data(), 0, 0};
    u16 last = 0;
    u64 const step = planes ? c_block : c_size;
    for (u64 at = 0; at < c_size; at += step) {
        ZSTD_outBuffer out{planes ? w.block.data() : w.back.data(), step, 0};
        while (out.pos < out.size) {
            if (in.pos == in.size) in = {w.inBlock.data(), source->ReadBlock(w.inBlock.data(), w.inBlock.size()), 0};
            ZSTD_decompressStream(context, &out, &in);
        }
        for (u64 chunk = 0; planes && chunk < c_block; chunk += 65536)
            UndoNaively(w.back.data() + at + chunk, w.block.data() + chunk, last);
    }
}

void PackByZlib(Work& w, z_stream& z, bool planes)
{
    Counted<OutStream> const target = MakeCounted<FixedOut>(w.packed);
    deflateReset(&z);
    u16 last = 0;
    u64 const step = planes ? c_block : c_size;
    for (u64 at = 0; at < c_size; at += step) {
        for (u64 chunk = 0; planes && chunk < c_block; chunk += 65536)
            TransformNaively(w.block.data() + chunk, w.plain.data() + at + chunk, last);
        z.next_in = planes ? w.block.data() : w.plain.data();
        z.avail_in = static_cast<uInt>(step);
        do {
            z.next_out = w.outBlock.data();
            z.avail_out = static_cast<uInt>(w.outBlock.size());
            deflate(&z, at + step == c_size ? Z_FINISH : Z_NO_FLUSH);
            target->WriteBlock(w.outBlock.data(), w.outBlock.size() - z.avail_out);
        } while (z.avail_out == 0);
    }
    w.packedSize = target->GetSize();
}

void UnpackByZlib(Work& w, z_stream& z, bool planes)
{
    Counted<InStream> const source = MakeCounted<FixedIn>(w.packed, w.packedSize);
    inflateReset(&z);
    z.avail_in = 0;
    u16 last = 0;
    u64 const step = planes ? c_block : c_size;
    for (u64 at = 0; at < c_size; at += step) {
        z.next_out = planes ? w.block.data() : w.back.data();
        z.avail_out = static_cast<uInt>(step);
        while (z.avail_out) {
            if (z.avail_in == 0) {
                z.next_in = w.inBlock.data();
                z.avail_in = static_cast<uInt>(source->ReadBlock(w.inBlock.data(), w.inBlock.size()));
            }
            inflate(&z, Z_NO_FLUSH);
        }
        for (u64 chunk = 0; planes && chunk < c_block; chunk += 65536)
            UndoNaively(w.back.data() + at + chunk, w.block.data() + chunk, last);
    }
}

void Streams(Work& w)
{
    Bench::Table table("W13 compression streams, 16 MiB of 16-bit pixels (to peer: higher is better)");
    std::unique_ptr<ZSTD_CCtx, size_t (*)(ZSTD_CCtx*)> const c(ZSTD_createCCtx(), ZSTD_freeCCtx);
    std::unique_ptr<ZSTD_DCtx, size_t (*)(ZSTD_DCtx*)> const d(ZSTD_createDCtx(), ZSTD_freeDCtx);
    ZSTD_CCtx_setParameter(c.get(), ZSTD_c_compressionLevel, 3);
    z_stream deflater{}, inflater{};
    deflateInit(&deflater, Z_DEFAULT_COMPRESSION);
    inflateInit(&inflater);
    for (bool planes : {false, true}) {
        Type const type = planes ? Type::UnsignedShort : Type::None;
        Striping const striping = planes ? Striping::Striping64k : Striping::None;
        char const* const goal = planes ? ">= 1.12 x naive planes" : ">= 0.98 x raw";
        Report(table, planes ? "zstd-3 compress, planes" : "zstd-3 compress", planes ? "naive planes + zstd" : "zstd",
               Compare(
                   7, [&] { PackByStream<ZStandardOutStream>(w, type, striping); },
                   [&] { PackByZstd(w, c.get(), planes); }),
               double(c_size), goal);
        double const ratio = double(c_size) / double(w.packedSize);
        Report(table, planes ? "zstd-3 expand, planes" : "zstd-3 expand", planes ? "zstd + naive planes" : "zstd",
               Compare(
                   15, [&] { UnpackByStream<ZStandardInStream>(w, type, striping); },
                   [&] { UnpackByZstd(w, d.get(), planes); }),
               double(c_size), goal);
        if (w.back != w.plain) std::puts("MISMATCH");
        table.Row("  packed to one in", "", ratio, "");
        Report(table, planes ? "zlib-6 compress, planes" : "zlib-6 compress", planes ? "naive planes + zlib" : "zlib",
               Compare(
                   3, [&] { PackByStream<ZipOutStream>(w, type, striping); }, [&] { PackByZlib(w, deflater, planes); }),
               double(c_size), planes ? "" : goal);
        Report(
            table, planes ? "zlib-6 expand, planes" : "zlib-6 expand", planes ? "zlib + naive planes" : "zlib",
            Compare(
                5, [&] { UnpackByStream<ZipInStream>(w, type, striping); }, [&] { UnpackByZlib(w, inflater, planes); }),
            double(c_size), planes ? "" : goal);
        if (w.back != w.plain) std::puts("MISMATCH");
    }
    deflateEnd(&deflater);
    inflateEnd(&inflater);
}

void Transforms(Work& w)
{
    Bench::Table table("Transforms alone, 64 KiB chunks in cache");
    constexpr int c_times = 2000;
    double const bytes = 65536.0 * c_times;
    u8* const plain = w.plain.data();
    u8* const moved = w.block.data();
    u8* const back = w.back.data();
    struct Case
    {
        char const* forward;
        char const* backward;
        Type type;
    };
    for (Case const& c : {Case{"8-bit differences", "8-bit sums", Type::UnsignedChar},
                          Case{"16-bit planes + differences", "16-bit sums + planes", Type::UnsignedShort},
                          Case{"32-bit planes + differences", "32-bit sums + planes", Type::UnsignedInt}})
    {
        Counted<CompressionPredictor> const p = CompressionPredictor::Create(c.type);
        double const forward = Bench::BestSeconds(5, [&] {
            for (int i = 0; i < c_times; ++i) p->StripeAndEncodeTo(moved, plain);
        });
        double const backward = Bench::BestSeconds(5, [&] {
            for (int i = 0; i < c_times; ++i) p->DecodeAndUnstripeTo(back, moved);
        });
        table.Row(c.forward, "libkernel", bytes / forward / 1e9, "GB/s", 0, ">= 6");
        table.Row(c.backward, "libkernel", bytes / backward / 1e9, "GB/s", 0, ">= 6");
    }
    u16 last = 0;
    double const forward = Bench::BestSeconds(2, [&] {
        for (int i = 0; i < c_times; ++i) TransformNaively(moved, plain, last);
    });
    double const backward = Bench::BestSeconds(2, [&] {
        for (int i = 0; i < c_times; ++i) UndoNaively(back, moved, last);
    });
    table.Row("16-bit planes + differences", "naive", bytes / forward / 1e9, "GB/s");
    table.Row("16-bit sums + planes", "naive", bytes / backward / 1e9, "GB/s");
}

void Checksums(Work& w)
{
    Bench::Table table("CRC-32 (to peer: higher is better)");
    auto const ours = [&] {
        u32 crc = 0;
        CRC32::DataCRC32(w.plain.data(), w.plain.size(), crc);
        Bench::Keep(crc);
    };
    auto const peer = [&] { Bench::Keep(crc32(0, w.plain.data(), static_cast<uInt>(w.plain.size()))); };
    auto const copy = [&] { std::memcpy(w.back.data(), w.plain.data(), c_size); };
    Report(table, "16 MiB", "zlib crc32", Compare(10, ours, peer), double(c_size), ">= 3 x zlib");
    table.Row("16 MiB", "memcpy", double(c_size) / Bench::BestSeconds(10, copy) / 1e6, "MB/s");
}

void SmallItems(Work& w)
{
    Bench::Table table("Items of 1 KiB, stream made and ended for each (to peer: lower is better)");
    constexpr int c_items = 2000;
    Bytes small(2048);
    u64 smallSize = 0;
    std::unique_ptr<ZSTD_CCtx, size_t (*)(ZSTD_CCtx*)> const c(ZSTD_createCCtx(), ZSTD_freeCCtx);
    std::unique_ptr<ZSTD_DCtx, size_t (*)(ZSTD_DCtx*)> const d(ZSTD_createDCtx(), ZSTD_freeDCtx);
    auto const packOurs = [&] {
        for (int i = 0; i < c_items; ++i) {
            Counted<FixedOut> const out = MakeCounted<FixedOut>(small);
            auto const stream = ZStandardOutStream::Create(out, Type::None, Striping::None);
            stream->WriteBlock(w.plain.data() + i * 1024, 1024);
            stream->Finalise();
            smallSize = out->GetSize();
        }
    };
    auto const packPeer = [&] {
        for (int i = 0; i < c_items; ++i) {
            ZSTD_CCtx_reset(c.get(), ZSTD_reset_session_only);
            ZSTD_inBuffer in{w.plain.data() + i * 1024, 1024, 0};
            ZSTD_outBuffer out{w.block.data(), c_block, 0};
            ZSTD_compressStream2(c.get(), &out, &in, ZSTD_e_continue);
            ZSTD_compressStream2(c.get(), &out, &in, ZSTD_e_end);
        }
    };
    Pair const pack = Compare(5, packOurs, packPeer);
    table.Row("pack", "zstd, one context", pack.peer / c_items * 1e6, "us");
    table.Row("pack", "libkernel", pack.ours / c_items * 1e6, "us", pack.peer / c_items * 1e6);
    auto const unpackPeer = [&] {
        for (int i = 0; i < c_items; ++i)
            Bench::Keep(ZSTD_decompressDCtx(d.get(), w.back.data(), 1024, small.data(), smallSize));
    };
    auto const unpackStream = [&] {
        for (int i = 0; i < c_items; ++i)
            ZStandardInStream::Create(MakeCounted<FixedIn>(small, smallSize), Type::None, Striping::None, true)
                ->ReadBlock(w.back.data(), 1024);
    };
    auto const unpackExact = [&] {
        for (int i = 0; i < c_items; ++i)
            Bench::Keep(ZStandardDecompressExact(small.data(), smallSize, w.back.data(), 1024));
    };
    Pair const stream = Compare(5, unpackStream, unpackPeer);
    Pair const exact = Compare(5, unpackExact, unpackPeer);
    double const peer = std::min(stream.peer, exact.peer) / c_items * 1e6;
    table.Row("unpack", "zstd, one context", peer, "us");
    table.Row("unpack by stream", "libkernel", stream.ours / c_items * 1e6, "us", peer);
    table.Row("unpack exactly", "libkernel", exact.ours / c_items * 1e6, "us", peer);
}

} // namespace

int main()
{
    Work work;
    Streams(work);
    Transforms(work);
    Checksums(work);
    SmallItems(work);
}

#include "libkernel/streams/ZStandardInStream.h"
#include "libkernel/streams/ZStandardOutStream.h"
#include "libkernel/streams/ZipInStream.h"
#include "support/CompressionFixture.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using DecompressException = CompressionInStream::DecompressException;
using Type = CompressionPredictorType;
using Striping = CompressionPredictorStripingType;
using Testing::Bytes;

Counted<CompressionInStream> Make(bool zstd, Counted<InStream> source, u32 type, bool striped, bool throwOnError)
{
    Striping const striping = striped ? Striping::Striping64k : Striping::None;
    if (zstd) return ZStandardInStream::Create(source, static_cast<Type>(type), striping, throwOnError);
    return ZipInStream::Create(source, static_cast<Type>(type), striping, throwOnError);
}

// A broken one stops before its end, as after a read error.
Counted<InStream> Source(Bytes bytes, u64 piece = ~u64{0}, bool isBroken = false)
{
    u64 const size = bytes.size();
    if (isBroken) bytes.push_back(0);
    auto const source = MakeCounted<Test::PlainSource>(bytes);
    source->piece = piece;
    source->silentFrom = size;
    return source;
}

// What a peer has packed of what the definition makes of the data.
Bytes Pack(bool zstd, Bytes const& plain, u32 type, bool striped)
{
    return Testing::PeerCompress(zstd, Testing::TransformSlowly(plain, type, striped));
}

Bytes ReadAll(CompressionInStream& stream, u64 room)
{
    Bytes got(room);
    got.resize(stream.ReadBlock(got.data(), room));
    return got;
}

class CompressionInStreamTest : public testing::TestWithParam<bool>
{
};

INSTANTIATE_TEST_SUITE_P(BackEnds, CompressionInStreamTest, testing::Bool(),
                         [](auto const& info) { return info.param ? "Zstandard" : "Zlib"; });

TEST_P(CompressionInStreamTest, AnyReadAndSkipSizesGiveTheData)
{
    std::mt19937 random(7);
    for (u64 size : {u64(1), u64(65535), u64(65537), u64(262145), u64(9 * 65536 + 4098)}) {
        Bytes const plain = Testing::MakePixels(size, static_cast<u32>(size));
        for (u32 type = 0; type <= 3; ++type)
            for (bool striped : {false, true}) {
                SCOPED_TRACE(testing::Message() << size << " type " << type << " striped " << striped);
                Bytes const packed = Pack(GetParam(), plain, type, striped);
                Counted<CompressionInStream> const stream =
                    Make(GetParam(), Source(packed, 1 + random() % 40000), type, striped, true);
                // Without striping the sizes must be whole elements, but for the last.
                u64 const unit = striped || type == 0 ? 1 : u64(1) << (type - 1);
                for (u64 at = 0, part; at < size; at += part) {
                    part = std::min<u64>(size - at, unit * (1 + (random() % 3 ? random() % 9000 : random() % 200000)));
                    if (random() % 4 == 0) {
                        ASSERT_TRUE(stream->SkipBlock(part));
                        continue;
                    }
                    Bytes got(part);
                    ASSERT_EQ(stream->ReadBlock(got.data(), part), part);
                    ASSERT_TRUE(std::equal(got.begin(), got.end(), plain.begin() + static_cast<i64>(at))) << at;
                }
                EXPECT_TRUE(stream->EOS());
                EXPECT_EQ(stream->GetSize() + stream->Tell(), 0u);
                EXPECT_TRUE(stream->SkipBlock(0));
                u8 more;
                EXPECT_EQ(stream->ReadBlock(&more, 1), 0u);
                EXPECT_FALSE(stream->SkipBlock(1));
            }
    }
    EXPECT_FALSE(Make(GetParam(), nullptr, 0, false, true));
}

TEST_P(CompressionInStreamTest, WithoutStripingABrokenElementComesBackUndecoded)
{
    Bytes const plain{1, 0, 3, 0, 6, 0}; // Differences 1, 2, 3.
    Counted<CompressionInStream> const stream =
        Make(GetParam(), Source(Pack(GetParam(), plain, 2, false)), 2, false, false);
    EXPECT_EQ(ReadAll(*stream, 3), (Bytes{1, 0, 2}));
    EXPECT_EQ(ReadAll(*stream, 2), (Bytes{1, 3})); // 0x0300 and 1, as it stands in the bytes of two elements.
}

TEST_P(CompressionInStreamTest, CutDataIsAShortReadAndDamageAnExceptionByTheFlag)
{
    Bytes const plain = Testing::MakePixels(300001, 9);
    for (bool striped : {false, true}) {
        Bytes const packed = Pack(GetParam(), plain, 2, striped);
        auto const cutAt = [&](u64 n) { return Bytes(packed.begin(), packed.begin() + static_cast<i64>(n)); };
        struct Case
        {
            char const* what;
            Bytes bytes;
            bool isBroken = false; // The source, before its end.
            bool isDamage = false;
        };
        for (Case const& c : {Case{"nothing", {}},
                              {"a byte", cutAt(1)},
                              {"half a header", cutAt(5)},
                              {"half", cutAt(packed.size() / 2)},
                              {"nearly all", cutAt(packed.size() - 20)},
                              {"a header that neither format knows", Bytes(1000, 0xFF), false, true},
                              {"a broken source", cutAt(packed.size() / 2), true, true}})
        {
            SCOPED_TRACE(testing::Message() << c.what << striped);
            auto const make = [&](bool throws) {
                return Make(GetParam(), Source(c.bytes, 5000, c.isBroken), 2, striped, throws);
            };
            Bytes const got = ReadAll(*make(false), plain.size());
            EXPECT_LT(got.size(), plain.size());
            // What lies before the chunk of the cut is whole.
            i64 const whole = static_cast<i64>(got.size() & ~(striped ? u64(0xFFFF) : u64(1)));
            EXPECT_TRUE(std::equal(got.begin(), got.begin() + whole, plain.begin()));
            EXPECT_FALSE(make(false)->SkipBlock(plain.size()));
            if (!c.isDamage) continue;
            EXPECT_THROW(make(true)->SkipBlock(plain.size()), DecompressException);
            Counted<CompressionInStream> const thrower = make(true);
            Bytes room(plain.size());
            EXPECT_THROW(thrower->ReadBlock(room.data(), room.size()), DecompressException);
            EXPECT_TRUE(striped || std::equal(room.begin(), room.begin() + whole, plain.begin())) << "not decoded";
            EXPECT_THROW(ReadAll(*thrower, 4), DecompressException);
        }
    }
}

TEST(ZipInStreamTest, BytesBehindTheEndAreTheEndAndFramesOneBehindTheOtherReadAsOne)
{
    Bytes const plain = Testing::MakePixels(1000, 13);
    for (bool striped : {false, true}) {
        Bytes packed = Pack(false, plain, 1, striped);
        packed.push_back(0x78);
        EXPECT_EQ(ReadAll(*Make(false, Source(packed), 1, striped, true), 5000), plain);
    }
    Bytes packed = Testing::PeerCompress(true, {1, 2});
    Bytes const second = Testing::PeerCompress(true, {3});
    packed.insert(packed.end(), second.begin(), second.end());
    EXPECT_EQ(ReadAll(*Make(true, Source(packed, 3), 0, false, true), 9), (Bytes{1, 2, 3}));
}

TEST(ZipInStreamTest, PresetDictionaryWindowsAboveTwoToThe27AndOldFormatsAreDamage)
{
    // Magic, descriptor without single segment, window byte, with @p isLong no dictionary and the content's size, one
    // last raw block of a byte.
    auto const frame = [](int windowLog, bool isLong) {
        u8 const window = static_cast<u8>((windowLog - 10) << 3);
        if (isLong) return Bytes{0x28, 0xB5, 0x2F, 0xFD, 0x83, window, 0, 0, 0, 0, 1, 0, 0, 0, 0x09, 0, 0, 'x'};
        return Bytes{0x28, 0xB5, 0x2F, 0xFD, 0x00, window, 0x09, 0, 0, 'x'};
    };
    // Of version 0.5: magic, window, a raw block, the end.
    auto const oldFrame = [](u8 size) {
        Bytes bytes{0x25, 0xB5, 0x2F, 0xFD, 0x00, 0x40, 0, size};
        bytes.resize(bytes.size() + size, 'x');
        bytes.insert(bytes.end(), {0xC0, 0, 0});
        return bytes;
    };
    struct Case
    {
        bool zstd;
        Bytes bytes;
        bool good;
    };
    for (Case const& c : {Case{false, {0x78, 0xBB, 1, 2, 3, 4, 0x4B, 0x04, 0x00}, false},
                          {true, frame(10, false), true},
                          {true, frame(27, false), true},
                          {true, frame(28, false), false},
                          {true, frame(41, false), false},
                          {true, frame(27, true), true},
                          {true, frame(28, true), false},
                          {true, oldFrame(1), false},
                          {true, oldFrame(20), false}})
    {
        auto const make = [&](bool throws) { return Make(c.zstd, Source(c.bytes), 0, false, throws); };
        EXPECT_EQ(ReadAll(*make(false), 4).size(), c.good ? 1u : 0u);
        u8 byte;
        EXPECT_EQ(c.zstd && ZStandardDecompressExact(c.bytes.data(), c.bytes.size(), &byte, 1), c.good);
        if (c.good) continue;
        EXPECT_THROW(ReadAll(*make(true), 4), DecompressException);
    }
}

TEST(ZStandardDecompressExactTest, GivesWhatTheStreamGives)
{
    Bytes const plain = Testing::MakePixels(3 * 65536 + 4097, 14);
    for (u32 type = 0; type <= 3; ++type)
        for (bool striped : {false, true}) {
            SCOPED_TRACE(testing::Message() << type << striped);
            Striping const striping = striped ? Striping::Striping64k : Striping::None;
            Counted<Testing::ByteSink> sink = MakeCounted<Testing::ByteSink>();
            auto const out = ZStandardOutStream::Create(sink, static_cast<Type>(type), striping);
            out->WriteBlock(plain.data(), plain.size());
            out->Finalise();
            Bytes& packed = sink->bytes;
            auto const unpack = [&](u64 size) {
                Bytes got(size);
                bool const good = ZStandardDecompressExact(packed.data(), packed.size(), got.data(), size,
                                                           static_cast<Type>(type), striping);
                return good ? got : Bytes();
            };
            EXPECT_EQ(unpack(plain.size()), plain);
            EXPECT_TRUE(unpack(plain.size() + 1).empty());
            packed.push_back(0xFF); // What lies behind the data does not matter.
            EXPECT_EQ(unpack(plain.size()), plain);
            EXPECT_EQ(unpack(65536), Bytes(plain.begin(), plain.begin() + 65536));
            packed.erase(packed.end() - 10, packed.end());
            EXPECT_TRUE(unpack(plain.size()).empty());
        }
    u8 byte;
    EXPECT_FALSE(ZStandardDecompressExact("noise and more", 14, &byte, 1));
    EXPECT_FALSE(ZStandardDecompressExact(nullptr, 0, &byte, 1));
    EXPECT_TRUE(ZStandardDecompressExact(nullptr, 0, nullptr, 0));
}

} // namespace
} // namespace Kernel

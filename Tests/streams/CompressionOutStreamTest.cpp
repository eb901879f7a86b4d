#include "libkernel/streams/ZStandardInStream.h"
#include "libkernel/streams/ZStandardOutStream.h"
#include "libkernel/streams/ZipInStream.h"
#include "libkernel/streams/ZipOutStream.h"
#include "support/CompressionFixture.h"

#include <gtest/gtest.h>
#include <thread>

namespace Kernel {
namespace {

using State = CompressionOutStream::State;
using Type = CompressionPredictorType;
using Striping = CompressionPredictorStripingType;
using Testing::Bytes;
using Testing::ByteSink;

Counted<CompressionOutStream> Make(bool zstd, Counted<OutStream> target, u32 type, bool striped, int level = 1)
{
    Striping const striping = striped ? Striping::Striping64k : Striping::None;
    if (zstd) return ZStandardOutStream::Create(target, static_cast<Type>(type), striping, level);
    return ZipOutStream::Create(target, static_cast<Type>(type), striping, level);
}

// Pieces of random sizes, now and then large enough to pass the working block by.
void WriteInPieces(CompressionOutStream& stream, Bytes const& data, u32 seed)
{
    std::mt19937 random(seed);
    for (u64 at = 0; at < data.size();) {
        u64 const wanted = random() % 4 ? 1 + random() % 5000 : 100000 + random() % 300000;
        u64 const part = std::min<u64>(wanted, data.size() - at);
        ASSERT_EQ(stream.WriteBlock(data.data() + at, part), part);
        at += part;
    }
}

class CompressionOutStreamTest : public testing::TestWithParam<bool>
{
};

INSTANTIATE_TEST_SUITE_P(BackEnds, CompressionOutStreamTest, testing::Bool(),
                         [](auto const& info) { return info.param ? "Zstandard" : "Zlib"; });

TEST_P(CompressionOutStreamTest, PeerReadsTheTransformedBytesAtEveryBorder)
{
    u32 seed = 0;
    for (u64 size : {u64(1), u64(7), u64(65535), u64(65536), u64(65537), u64(131073), u64(7 * 65536 + 4099)}) {
        Bytes const plain = Testing::MakePixels(size, static_cast<u32>(size));
        for (u32 type = 0; type <= 3; ++type)
            for (bool striped : {false, true}) {
                SCOPED_TRACE(testing::Message() << size << " type " << type << " striped " << striped);
                Counted<ByteSink> sink = MakeCounted<ByteSink>();
                Counted<CompressionOutStream> const stream = Make(GetParam(), sink, type, striped);
                WriteInPieces(*stream, plain, ++seed);
                ASSERT_TRUE(stream->Finalise());
                EXPECT_EQ(stream->GetState(), State::Finalised);
                EXPECT_EQ(stream->Tell(), sink->bytes.size());
                EXPECT_EQ(Testing::PeerDecompress(GetParam(), sink->bytes, size),
                          Testing::TransformSlowly(plain, type, striped));
            }
    }
}

TEST_P(CompressionOutStreamTest, EmptyStreamIsValidAndFinalisedOnce)
{
    Counted<ByteSink> sink = MakeCounted<ByteSink>();
    Counted<CompressionOutStream> const stream = Make(GetParam(), sink, 2, true);
    EXPECT_EQ(stream->WriteBlock("", 0), 0u);
    EXPECT_TRUE(stream->Flush());
    EXPECT_TRUE(sink->bytes.empty());
    EXPECT_TRUE(stream->Finalise());
    Bytes const written = sink->bytes;
    EXPECT_FALSE(written.empty());
    EXPECT_EQ(Testing::PeerDecompress(GetParam(), written, 0), Bytes());
    EXPECT_TRUE(stream->Finalise());
    EXPECT_EQ(stream->WriteBlock("x", 1), 0u);
    EXPECT_EQ(sink->bytes, written);
}

TEST_P(CompressionOutStreamTest, AbortLeavesTheTargetAsItIs)
{
    Counted<ByteSink> sink = MakeCounted<ByteSink>();
    Counted<CompressionOutStream> stream = Make(GetParam(), sink, 1, false);
    Bytes const plain = Testing::MakePixels(1000000, 1);
    WriteInPieces(*stream, plain, 1);
    u64 const before = sink->bytes.size();
    stream->Abort();
    EXPECT_EQ(stream->GetState(), State::Failed);
    EXPECT_EQ(stream->WriteBlock("x", 1), 0u);
    EXPECT_TRUE(stream->Finalise());
    stream.Reset();
    EXPECT_EQ(sink->bytes.size(), before);
}

class ThrowingSink : public ByteSink
{
public:
    u64 WriteBlock(void const*, u64) override { throw WriteException(); }
};

TEST_P(CompressionOutStreamTest, TargetThatFailsAtAnyByteFailsTheStream)
{
    Bytes const plain = Testing::MakePixels(400001, 2);
    Counted<ByteSink> whole = MakeCounted<ByteSink>();
    auto const writeAll = [&](Counted<OutStream> target) {
        Counted<CompressionOutStream> const stream = Make(GetParam(), target, 2, true);
        bool const wrote = stream->WriteBlock(plain.data(), plain.size()) == plain.size();
        EXPECT_EQ(stream->GetState(), wrote ? State::Open : State::Failed);
        bool const finalised = stream->Finalise();
        EXPECT_EQ(wrote ? finalised : !finalised, stream->GetState() == State::Finalised);
        EXPECT_EQ(stream->WriteBlock("x", 1), 0u);
        return stream->GetState() == State::Finalised;
    };
    ASSERT_TRUE(writeAll(whole));
    u64 const needed = whole->bytes.size();
    for (u64 limit = 0; limit < needed; limit += 1 + needed / 50)
        EXPECT_FALSE(writeAll(MakeCounted<ByteSink>(limit))) << limit;
    EXPECT_FALSE(writeAll(MakeCounted<ByteSink>(needed - 1)));

    Counted<CompressionOutStream> const thrown = Make(GetParam(), MakeCounted<ThrowingSink>(), 2, true);
    EXPECT_THROW(thrown->WriteBlock(plain.data(), plain.size()), OutStream::WriteException);
    EXPECT_EQ(thrown->GetState(), State::Failed);
}

TEST_P(CompressionOutStreamTest, LevelsAreClampedAndContextsKeepNothingOfTheLast)
{
    Bytes const plain = Testing::MakePixels(150000, 4);
    auto const pack = [&](int level) {
        Counted<ByteSink> sink = MakeCounted<ByteSink>();
        Counted<CompressionOutStream> const stream = Make(GetParam(), sink, 0, false, level);
        stream->WriteBlock(plain.data(), plain.size());
        EXPECT_TRUE(stream->Finalise());
        return sink->bytes;
    };
    int const top = GetParam() ? 19 : 9;
    Bytes const lowest = pack(1), highest = pack(top);
    EXPECT_NE(lowest, highest);
    for (int level : {0, std::numeric_limits<int>::min()}) EXPECT_EQ(pack(level), lowest) << level;
    for (int level : {100, top + 1}) EXPECT_EQ(pack(level), highest) << level;
    // Left in the middle, the context goes to the next stream.
    Make(GetParam(), MakeCounted<ByteSink>(), 0, false, top)->WriteBlock(plain.data(), 1000);
    EXPECT_EQ(pack(1), lowest);
    EXPECT_FALSE(Make(GetParam(), nullptr, 0, false));
}

TEST_P(CompressionOutStreamTest, ManyThreadsShareThePools)
{
    auto const work = [](u32 seed) {
        for (u32 i = 0; i < 20; ++i) {
            Bytes const plain = Testing::MakePixels(1000 + 70000 * (i % 3), seed + i);
            Counted<ByteSink> sink = MakeCounted<ByteSink>();
            Counted<CompressionOutStream> const stream = Make(GetParam(), sink, i % 4, i % 2);
            stream->WriteBlock(plain.data(), plain.size());
            stream->Finalise();
            EXPECT_EQ(Testing::PeerDecompress(GetParam(), sink->bytes, plain.size()),
                      Testing::TransformSlowly(plain, i % 4, i % 2));
        }
    };
    std::vector<std::thread> threads;
    for (u32 i = 0; i < 4; ++i) threads.emplace_back(work, 100 * i);
    for (std::thread& t : threads) t.join();
}

TEST(ZipOutStreamTest, AdlerIsThatOfTheBytesTaken)
{
    Bytes const plain = Testing::MakePixels(5000, 5);
    Counted<ZipOutStream> const stream = ZipOutStream::Create(MakeCounted<ByteSink>(), Type::None, Striping::None);
    EXPECT_EQ(stream->GetAdler32(), 1u);
    stream->WriteBlock(plain.data(), plain.size());
    EXPECT_TRUE(stream->Finalise());
    EXPECT_EQ(stream->GetAdler32(), adler32(1, plain.data(), static_cast<uInt>(plain.size())));
}

} // namespace
} // namespace Kernel

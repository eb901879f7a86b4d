#include "libkernel/streams/MemoryStreams.h"

#include "StreamTestSupport.h"
#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/streams/BufferedOutStream.h"
#include "libkernel/streams/FragmentedRawDataStream.h"
#include "libkernel/streams/NullOutStream.h"

#include <cstdlib>
#include <gtest/gtest.h>

namespace Kernel {
namespace {

using namespace Test;

constexpr u64 c_piece = 1 << 20;

TEST(MemoryStreamsTest, AReaderPointsAtTheCallersBytesOrCopiesThem)
{
    char bytes[] = "hello";
    auto pointing = MakeCounted<MemoryInStream>(bytes, 5, false);
    auto copying = MakeCounted<MemoryInStream>(bytes, 5, true);
    bytes[0] = 'J';
    EXPECT_EQ(pointing->GetBuffer(), bytes);
    EXPECT_EQ(ReadAll(*pointing, 2), "Jello");
    EXPECT_TRUE(pointing->EOS());
    EXPECT_EQ(ReadAll(*copying, 2), "hello");
    EXPECT_THROW(MakeCounted<MemoryInStream>(bytes, ~u64{0} / 2, true), MemoryException);
    EXPECT_TRUE(MakeCounted<MemoryInStream>(nullptr, 0, true)->EOS());
}

/// Seeks that the memory-like streams answer alike: {method, offset, where it lands from 40 of 100}.
struct SeekCase
{
    char const* what;
    SeekMethod method;
    i64 offset;
    u64 expected;
};
constexpr SeekCase c_seeksInside[] = {
    {"forward", SeekMethod::Current, 10, 50},
    {"back", SeekMethod::Current, -10, 30},
    {"below the start", SeekMethod::Current, -41, 0},
    {"from the start", SeekMethod::Beginning, 7, 7},
    {"negative from the start", SeekMethod::Beginning, -1, 0},
    {"into the end", SeekMethod::End, -1, 99},
    {"the end", SeekMethod::End, 0, 100},
    {"further back than the size", SeekMethod::End, -101, 0},
    {"the lowest offset", SeekMethod::End, INT64_MIN, 0},
};

TEST(MemoryStreamsTest, SeeksInsideLandWhereTheyShouldInEveryStream)
{
    std::string const text = Pattern(100);
    auto reader = MakeCounted<MemoryInStream>(text.data(), text.size(), false);
    auto memory = MakeCounted<MemoryInOutStream>();
    auto data = MakeCounted<FragmentedRawData>(u64{0});
    Counted<FragmentedRawDataStream> const fragments = FragmentedRawDataStream::Create(data);
    NullOutStream target, null;
    BufferedOutStream buffered(target, 1024);
    for (OutStream* out : std::vector<OutStream*>{memory.Get(), fragments.Get(), &null, &buffered}) Write(*out, text);

    for (SeekCase const& c : c_seeksInside) {
        SCOPED_TRACE(c.what);
        for (InStreamSeekable* in : std::vector<InStreamSeekable*>{reader.Get(), memory.Get(), fragments.Get()}) {
            EXPECT_TRUE(in->Seek(40) && in->Seek(c.method, c.offset));
            EXPECT_EQ(in->Tell(), c.expected);
            EXPECT_FALSE(in->Seek(static_cast<SeekMethod>(3), 0));
            EXPECT_FALSE(in->Seek(static_cast<SeekMethod>(-1), 0));
            EXPECT_EQ(in->Tell(), c.expected);
        }
        for (OutStreamSeekable* out : std::vector<OutStreamSeekable*>{&null, &buffered}) {
            EXPECT_TRUE(out->Seek(40) && out->Seek(c.method, c.offset));
            EXPECT_EQ(out->Tell(), c.expected);
            EXPECT_FALSE(out->Seek(static_cast<SeekMethod>(3), 0));
        }
    }
    EXPECT_EQ(memory->GetSize(), 100u);
    EXPECT_TRUE(reader->Seek(1000));
    EXPECT_EQ(reader->GetRem(), 0u) << "a reader can't pass the end";
}

TEST(MemoryStreamsTest, ASkipPastTheEndMovesNothingButASeekGrowsWithZeros)
{
    auto stream = MakeCounted<MemoryInOutStream>();
    Write(*stream, "abcdef");
    EXPECT_TRUE(stream->Truncate(3)); // Leaves old bytes behind the end, which must not come back.
    EXPECT_TRUE(stream->Rewind());
    EXPECT_FALSE(stream->SkipBlock(4));
    EXPECT_EQ(stream->Tell(), 0u);
    EXPECT_TRUE(stream->SkipBlock(3));
    EXPECT_TRUE(stream->Seek(SeekMethod::End, 4));
    EXPECT_EQ(Content(*stream), std::string("abc\0\0\0\0", 7));
    EXPECT_TRUE(stream->EOS());
}

TEST(MemoryStreamsTest, WritingAtAPositionFillsTheGapAndStaysWhereItIs)
{
    auto stream = MakeCounted<MemoryInOutStream>();
    Write(*stream, "abcdef");
    stream->Truncate(4);
    stream->Seek(2);
    EXPECT_TRUE(stream->WriteBlockAtPos(6, "Z", 1));
    EXPECT_TRUE(stream->WriteBlockAtPos(1, "BC", 2));
    EXPECT_EQ(Content(*stream), std::string("aBCd\0\0Z", 7));
    EXPECT_EQ(stream->Tell(), 2u);
    EXPECT_FALSE(stream->WriteBlockAtPos(~u64{0}, "Z", 1));
    EXPECT_EQ(stream->GetSize(), 7u);
}

TEST(MemoryStreamsTest, TruncationEndsAtTheSmallerOfSizeAndEnd)
{
    for (auto const& [size, expected] : {std::pair<u64, u64>{3, 3}, {6, 6}, {7, 6}, {0, 0}}) {
        SCOPED_TRACE(size);
        auto memory = MakeCounted<MemoryInOutStream>();
        Counted<FragmentedRawDataStream> fragments =
            FragmentedRawDataStream::Create(MakeCounted<FragmentedRawData>(u64{0}));
        NullOutStream target, null;
        BufferedOutStream buffered(target);
        for (OutStreamSeekable* out : std::vector<OutStreamSeekable*>{memory.Get(), fragments.Get(), &null, &buffered})
        {
            Write(*out, "abcdef");
            out->Seek(1);
            EXPECT_TRUE(out->Truncate(size));
            EXPECT_EQ(out->OutStream::GetSize(), expected);
            EXPECT_EQ(out->OutStream::Tell(), expected);
        }
    }
}

TEST(MemoryStreamsTest, LengthsBeyondReasonAreRefusedWithoutHarm)
{
    auto memory = MakeCounted<MemoryInOutStream>();
    NullOutStream target;
    BufferedOutStream buffered(target);
    Write(*memory, "abc");
    Write(buffered, "abc");
    for (i64 const offset : {INT64_MAX, i64{1} << 41}) {
        EXPECT_FALSE(memory->Seek(offset));
        EXPECT_FALSE(memory->Seek(SeekMethod::End, offset));
        EXPECT_FALSE(buffered.Seek(offset));
    }
    EXPECT_EQ(memory->WriteBlock("x", ~u64{0}), 0u);
    EXPECT_EQ(buffered.WriteBlock("x", ~u64{0}), 0u);
    memory->Reserve(~u64{0});
    EXPECT_EQ(memory->WriteBlock("x", 0), 0u);
    EXPECT_EQ(Content(*memory), "abc");
    EXPECT_EQ(memory->Tell(), 3u);
}

TEST(MemoryStreamsTest, GrowingCostsAFewMovesHoweverManyWritesThereAre)
{
    auto stream = MakeCounted<MemoryInOutStream>(u64{10});
    EXPECT_EQ(stream->GetReserveSize(), 10u);
    int moves = 0;
    std::string const text = Pattern(300'000);
    for (u64 i = 0, capacity = 10; i < text.size(); ++i) {
        ASSERT_EQ(stream->WriteBlock(&text[i], 1), 1u);
        moves += stream->GetReserveSize() != capacity;
        capacity = stream->GetReserveSize();
    }
    EXPECT_LT(moves, 20);
    EXPECT_EQ(Content(*stream), text);
    stream->Reserve(5'000'000);
    EXPECT_GE(stream->GetReserveSize(), 5'300'000u);
}

TEST(MemoryStreamsTest, ABufferPassesToAReaderWithoutACopy)
{
    auto writer = MakeCounted<MemoryInOutStream>();
    Write(*writer, "some bytes");
    void const* const buffer = writer->GetBuffer();
    auto reader = MakeCounted<MemoryInStream>(writer->ReleaseBuffer());
    EXPECT_EQ(reader->GetBuffer(), buffer);
    EXPECT_EQ(ReadAll(*reader), "some bytes");
    EXPECT_EQ(writer->GetSize(), 0u);
    EXPECT_EQ(writer->GetReserveSize(), 0u);
    EXPECT_EQ(Write(*writer, "again"), 5u);
    EXPECT_EQ(Content(*writer), "again");

    MemCourier courier = writer->ReleaseBuffer();
    MemCourier taken = std::move(courier);
    EXPECT_EQ(courier.GetData(), nullptr);
    EXPECT_EQ(taken.GetSize(), 5u);
    std::free(taken.Detach());
}

TEST(MemoryStreamsTest, CopiesUseTheBufferItselfAndCutItOnlyForSlowPeers)
{
    std::string const text = Pattern(2 * c_piece + 1);
    u64 const total = text.size();
    for (bool const slow : {false, true}) {
        SCOPED_TRACE(slow);
        std::vector<u64> const pieces = slow ? std::vector<u64>{c_piece, c_piece, 1} : std::vector<u64>{total};
        Reports const reports =
            slow ? Reports{{c_piece, total}, {2 * c_piece, total}, {total, total}} : Reports{{total, total}};
        auto source = MakeCounted<PlainSource>(text);
        source->slow = slow;
        auto memory = MakeCounted<MemoryInOutStream>();
        ProgressLog in;
        EXPECT_TRUE(memory->CopyFromStream(*source, &in));
        EXPECT_EQ(source->reads, pieces);
        EXPECT_EQ(in.reports, reports);

        for (bool const fromReader : {false, true}) {
            auto target = MakeCounted<PlainTarget>();
            target->slow = slow;
            ProgressLog out;
            auto reader = MakeCounted<MemoryInStream>(text.data(), text.size(), false);
            memory->Rewind();
            EXPECT_TRUE(fromReader ? reader->CopyToStream(*target, &out) : memory->CopyToStream(*target, &out));
            EXPECT_EQ(target->writes, pieces);
            EXPECT_EQ(out.reports, reports);
            EXPECT_TRUE(target->text == text);
        }
    }
    auto unasked = MakeCounted<PlainSource>(text);
    unasked->slow = true;
    EXPECT_TRUE(MakeCounted<MemoryInOutStream>()->CopyFromStream(*unasked));
    EXPECT_EQ(unasked->reads.size(), 1u) << "without a progress object there is nobody to cut the read for";
}

TEST(MemoryStreamsTest, ACopyThatComesUpShortKeepsWhatMoved)
{
    auto source = MakeCounted<PlainSource>(Pattern(100));
    source->silentFrom = 30;
    auto memory = MakeCounted<MemoryInOutStream>();
    Write(*memory, "ab");
    EXPECT_FALSE(memory->CopyFromStream(*source));
    EXPECT_EQ(Content(*memory), "ab" + Pattern(100).substr(0, 30));
    EXPECT_EQ(memory->Tell(), 32u);

    auto target = MakeCounted<PlainTarget>();
    target->room = 10;
    memory->Rewind();
    EXPECT_FALSE(memory->CopyToStream(*target));
    EXPECT_EQ(memory->Tell(), 10u);

    ProgressLog log;
    EXPECT_TRUE(memory->CopyFromStream(*MakeCounted<PlainSource>(""), &log));
    EXPECT_EQ(log.reports, (Reports{{0, 0}}));
}

} // namespace
} // namespace Kernel

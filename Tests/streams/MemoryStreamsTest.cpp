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

TEST(MemoryStreamsTest, SeeksWritesAndCutsAreAlikeInEveryMemoryStream)
{
    struct Case
    {
        SeekMethod method;
        i64 offset;
        u64 expected; // From 40 of 100.
    };
    static constexpr Case c_seeks[] = {
        {SeekMethod::Current, 10, 50}, {SeekMethod::Current, -10, 30},  {SeekMethod::Current, -41, 0},
        {SeekMethod::Beginning, 7, 7}, {SeekMethod::Beginning, -1, 0},  {SeekMethod::End, -1, 99},
        {SeekMethod::End, -101, 0},    {SeekMethod::End, INT64_MIN, 0}, {SeekMethod::End, 0, 100},
    };
    std::string const text = Pattern(100);
    auto reader = MakeCounted<MemoryInStream>(text.data(), text.size(), false);
    auto memory = MakeCounted<MemoryInOutStream>();
    Counted<FragmentedRawDataStream> const fragments =
        FragmentedRawDataStream::Create(MakeCounted<FragmentedRawData>(u64{0}));
    NullOutStream target, null;
    BufferedOutStream buffered(target, 1024);
    std::vector<OutStreamSeekable*> const outs = {memory.Get(), fragments.Get(), &null, &buffered};
    for (OutStream* out : outs) Write(*out, text);

    auto const check = [](auto& stream, Case const& c) {
        SCOPED_TRACE(testing::Message() << int(c.method) << " " << c.offset);
        EXPECT_TRUE(stream.Seek(40) && stream.Seek(c.method, c.offset));
        EXPECT_FALSE(stream.Seek(static_cast<SeekMethod>(3), 0) || stream.Seek(static_cast<SeekMethod>(-1), 0));
        EXPECT_EQ(stream.Tell(), c.expected);
    };
    for (Case const& c : c_seeks) {
        for (InStreamSeekable* in : std::vector<InStreamSeekable*>{reader.Get(), memory.Get(), fragments.Get()})
            check(*in, c);
        check(null, c);
        check(buffered, c);
    }
    EXPECT_TRUE(reader->Seek(1000));
    EXPECT_EQ(reader->GetRem(), 0u) << "a reader can't pass the end";
    EXPECT_FALSE(memory->Seek(40) && memory->SkipBlock(61)) << "nor a skip";
    EXPECT_EQ(memory->Tell(), 40u);

    // A cut ends at the smaller of size and end, and what lay behind it must not come back.
    for (auto const& [size, end] : {std::pair<u64, u64>{101, 100}, {100, 100}, {60, 60}, {4, 4}})
        for (OutStreamSeekable* out : outs) {
            out->Seek(1);
            EXPECT_TRUE(out->Truncate(size));
            EXPECT_EQ(out->OutStream::GetSize(), end);
            EXPECT_EQ(out->OutStream::Tell(), end);
        }
    EXPECT_TRUE(memory->Seek(SeekMethod::End, 2) && memory->Seek(SeekMethod::Current, -4));
    EXPECT_TRUE(memory->WriteBlockAtPos(8, "Z", 1) && memory->WriteBlockAtPos(1, "BC", 2));
    EXPECT_FALSE(memory->WriteBlockAtPos(~u64{0}, "Z", 1));
    EXPECT_EQ(Content(*memory), text.substr(0, 1) + "BC" + text.substr(3, 1) + std::string("\0\0\0\0Z", 5));
    EXPECT_EQ(memory->Tell(), 2u);
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
}

TEST(MemoryStreamsTest, ABufferPassesToAReaderWithoutACopy)
{
    auto writer = MakeCounted<MemoryInOutStream>();
    Write(*writer, "some bytes");
    void const* const buffer = writer->GetBuffer();
    auto reader = MakeCounted<MemoryInStream>(writer->ReleaseBuffer());
    EXPECT_EQ(reader->GetBuffer(), buffer);
    EXPECT_EQ(ReadAll(*reader), "some bytes");
    EXPECT_EQ(writer->GetReserveSize(), 0u);
    EXPECT_EQ(Write(*writer, "again"), 5u);

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
            EXPECT_TRUE(target->bytes == text);
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

TEST(NullOutStreamTest, MeasuresWithoutReading)
{
    NullOutStream out;
    EXPECT_EQ(out.WriteBlock(nullptr, u64{1} << 60), u64{1} << 60);
    EXPECT_EQ(out.WriteBlock(nullptr, ~u64{0}), 0u);
    EXPECT_TRUE(out.Truncate(5));
    auto source = MakeCounted<PlainSource>(Pattern(100));
    source->SkipBlock(30);
    EXPECT_TRUE(out.CopyFromStream(*source));
    EXPECT_EQ(out.GetSize(), 75u);
    EXPECT_TRUE(source->reads.empty() && source->EOS());
}

TEST(FragmentedRawDataStreamTest, StartsAtTheEndCrossesBlocksAndGrowsByASeek)
{
    std::string const text = Pattern(50'000);
    auto data = MakeCounted<FragmentedRawData>(u64{16384});
    ASSERT_TRUE(data->SetData(0, text.data(), 100, false));
    Counted<FragmentedRawDataStream> const stream = FragmentedRawDataStream::Create(data);
    EXPECT_EQ(ReadAll(*stream), "");
    EXPECT_EQ(Write(*stream, text.substr(100)), text.size() - 100);
    EXPECT_TRUE(stream->Rewind());
    EXPECT_TRUE(ReadAll(*stream, 7000) == text);
    EXPECT_TRUE(stream->WriteBlockAtPos(16'383, "XYZ", 3) && stream->Seek(16'383));
    EXPECT_EQ(ReadAll(*stream, 3).substr(0, 3), "XYZ");

    EXPECT_TRUE(stream->Seek(60'000));
    EXPECT_FALSE(stream->Seek(INT64_MAX));
    EXPECT_EQ(stream->WriteBlock("x", ~u64{0}), 0u);
    ASSERT_TRUE(data->SetSize(10, false));
    EXPECT_EQ(ReadAll(*stream), "") << "the data was cut below the position";
    EXPECT_EQ(Write(*stream, "a"), 1u);
    EXPECT_EQ(stream->GetSize(), 60'001u);

    auto huge = MakeCounted<FragmentedRawData>(~u64{0});
    EXPECT_EQ(Write(*FragmentedRawDataStream::Create(huge), "a"), 0u);
    EXPECT_EQ(huge->GetSize(), 0u);
    EXPECT_FALSE(FragmentedRawDataStream::Create(nullptr));
}

} // namespace
} // namespace Kernel

#include "libkernel/streams/BufferedOutStream.h"

#include "StreamTestSupport.h"

#include <gtest/gtest.h>
#include <random>

namespace Kernel {
namespace {

using namespace Test;
using CommitErrors = BufferedOutStream::CommitErrors;

TEST(BufferedOutStreamTest, WhatItCommitsIsWhatAMemoryStreamHolds)
{
    std::mt19937 random(1);
    for (int round = 0; round < 20; ++round) {
        PlainTarget target;
        BufferedOutStream out(target, 1024);
        auto reference = MakeCounted<MemoryInOutStream>();
        for (int step = 0; step < 100; ++step) {
            std::string const text = Pattern(random() % 3000, random());
            u64 const position = random() % 20'000;
            switch (random() % 6) {
            case 0: EXPECT_EQ(out.Seek(i64(position)), reference->Seek(i64(position))); break;
            case 1:
                EXPECT_EQ(out.WriteBlockAtPos(position, text.data(), text.size()),
                          reference->WriteBlockAtPos(position, text.data(), text.size()));
                break;
            case 2: EXPECT_EQ(out.Truncate(position), reference->Truncate(position)); break;
            case 3: {
                auto source = MakeCounted<PlainSource>(text);
                EXPECT_TRUE(out.CopyFromStream(*source));
                Write(*reference, text);
                break;
            }
            default: EXPECT_EQ(Write(out, text), Write(*reference, text));
            }
            ASSERT_EQ(out.GetSize(), reference->GetSize());
            ASSERT_EQ(out.Tell(), reference->Tell());
        }
        EXPECT_TRUE(out.Commit(CommitErrors::Swallow));
        EXPECT_TRUE(target.bytes == Content(*reference));
    }
}

TEST(BufferedOutStreamTest, ACommitWritesWholeBlocksThenTheTailAndCloses)
{
    PlainTarget target;
    BufferedOutStream out(target, 100);
    EXPECT_EQ(out.GetBlockSize(), 1024u);
    EXPECT_TRUE(out.SetBlockSize(2048));
    Write(out, Pattern(5000));
    EXPECT_FALSE(out.SetBlockSize(4096)) << "there are blocks already";
    EXPECT_TRUE(target.writes.empty());

    EXPECT_TRUE(out.Commit(CommitErrors::Rethrow));
    EXPECT_EQ(target.reserved, 5000u);
    EXPECT_EQ(target.writes, (std::vector<u64>{2048, 2048, 904}));
    EXPECT_EQ(Write(out, "x"), 0u);
    EXPECT_FALSE(out.Seek(0));
    EXPECT_FALSE(out.WriteBlockAtPos(0, "x", 1));
    EXPECT_EQ(out.GetSize(), 0u);
    EXPECT_TRUE(out.Commit(CommitErrors::Rethrow));
    EXPECT_EQ(target.bytes, Pattern(5000));
}

TEST(BufferedOutStreamTest, AShortWriteKeepsTheBytesForAnotherCommitAndTheDestructorSwallows)
{
    PlainTarget target;
    target.room = 1500;
    BufferedOutStream out(target, 1024);
    Write(out, Pattern(3000));
    EXPECT_FALSE(out.Commit(CommitErrors::Swallow));
    EXPECT_EQ(out.GetSize(), 3000u);

    target.throws = true;
    EXPECT_FALSE(out.Commit(CommitErrors::Swallow));
    EXPECT_THROW(out.Commit(CommitErrors::Rethrow), int);
    target.room = ~u64{0};
    target.bytes.clear();
    EXPECT_TRUE(out.Commit(CommitErrors::Rethrow));
    EXPECT_EQ(target.bytes, Pattern(3000));

    PlainTarget good, throwing;
    throwing.room = 0;
    throwing.throws = true;
    {
        BufferedOutStream kept(good), lost(throwing), empty(good);
        Write(kept, "abc");
        Write(lost, "abc"); // The destructor swallows what it throws.
    }
    EXPECT_EQ(good.bytes, "abc");
    EXPECT_EQ(good.writes.size(), 1u) << "an empty stream writes nothing";
}

TEST(BufferedOutStreamTest, ACopyReadsStraightIntoTheBlocks)
{
    PlainTarget target;
    BufferedOutStream out(target, 1024);
    Write(out, "0123456789");
    PlainSource source(Pattern(3000));
    source.silentFrom = 2900;
    ProgressLog log;
    EXPECT_FALSE(out.CopyFromStream(source, &log));
    EXPECT_EQ(source.reads, (std::vector<u64>{1014, 1024, 962}));
    EXPECT_EQ(out.GetSize(), 2910u);
    EXPECT_EQ(log.reports.front(), std::make_pair(u64{1014}, u64{3000}));
}

} // namespace
} // namespace Kernel

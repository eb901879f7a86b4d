#include "StreamTestSupport.h"
#include "libkernel/streams/ForwardBiasedSeekableInStream.h"
#include "libkernel/streams/LimitedStreams.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using namespace Test;

TEST(LimitedStreamsTest, AReaderSeesAWindowThatStartsWhereTheSourceStood)
{
    auto source = MakeCounted<PlainSource>("0123456789");
    source->SkipBlock(2);
    Counted<LimitedInStream> in = LimitedInStream::Create(Counted<InStream>(source), 5);
    EXPECT_EQ(in->GetSize(), 5u);
    EXPECT_TRUE(in->SkipBlock(1));
    EXPECT_EQ(ReadAll(*in, 3), "3456");
    EXPECT_TRUE(in->EOS());
    EXPECT_EQ(in->Remaining(), 0u);
    EXPECT_TRUE(in->SkipBlock(100)) << "a skip is cut to the limit";
    EXPECT_EQ(source->Tell(), 7u);

    Counted<LimitedInStream> beyond = LimitedInStream::Create(Counted<InStream>(source), 100);
    EXPECT_EQ(beyond->GetSize(), 3u);
    EXPECT_EQ(ReadAll(*beyond), "789");
    EXPECT_TRUE(beyond->EOS()) << "the source's end is the window's";
    EXPECT_EQ(beyond->Remaining(), 97u);
    EXPECT_FALSE(LimitedInStream::Create(nullptr, 5));
}

TEST(LimitedStreamsTest, AWriterPassesOnWhatIsAllowedAndRemembersTheRest)
{
    auto target = MakeCounted<PlainTarget>();
    Counted<LimitedOutStream> out = LimitedOutStream::Create(Counted<OutStream>(target), 10);
    EXPECT_EQ(Write(*out, "123456"), 6u);
    EXPECT_EQ(Write(*out, "abcd"), 4u);
    EXPECT_FALSE(out->WasExceeded()) << "exactly what is allowed";
    EXPECT_EQ(Write(*out, "x"), 0u);
    EXPECT_TRUE(out->WasExceeded());

    Counted<LimitedOutStream> borrowed = LimitedOutStream::Create(*target, 4);
    EXPECT_EQ(target->GetReferenceCount(), 2);
    EXPECT_EQ(Write(*borrowed, "0123456789"), 4u);
    EXPECT_TRUE(borrowed->WasExceeded());
    EXPECT_EQ(borrowed->Tell(), 4u);
    EXPECT_EQ(target->bytes, "123456abcd0123");
}

TEST(ForwardBiasedSeekableInStreamTest, SeeksForwardAlwaysAndBackWhereTheSourceRewinds)
{
    struct Case
    {
        SeekMethod method;
        i64 offset;
        bool plain, rewindable;
        u64 expected; // From 40 of 100, where it succeeds.
    };
    for (Case const& c : {
             Case{SeekMethod::Current, 5, true, true, 45},
             Case{SeekMethod::Current, 0, true, true, 40},
             Case{SeekMethod::Current, -5, false, true, 35},
             Case{SeekMethod::Beginning, 41, true, true, 41},
             Case{SeekMethod::Beginning, 39, false, true, 39},
             Case{SeekMethod::End, -10, true, true, 90},
             Case{SeekMethod::Current, -41, false, false, 0},
             Case{SeekMethod::End, 1, false, false, 0},
             Case{SeekMethod::End, INT64_MAX, false, false, 0},
             Case{SeekMethod::Beginning, INT64_MIN, false, false, 0},
             Case{static_cast<SeekMethod>(3), 0, false, false, 0},
         })
        for (bool const rewindable : {false, true}) {
            SCOPED_TRACE(testing::Message() << int(c.method) << " " << c.offset << " " << rewindable);
            PlainSource source(Pattern(100));
            source.rewindable = rewindable;
            source.SkipBlock(40);
            ForwardBiasedSeekableInStream in(source);
            bool const expected = rewindable ? c.rewindable : c.plain;
            EXPECT_EQ(in.Seek(c.method, c.offset), expected);
            EXPECT_EQ(in.Tell(), expected ? c.expected : 40u);
            EXPECT_EQ(in.Rewind(), rewindable);
        }
}

} // namespace
} // namespace Kernel

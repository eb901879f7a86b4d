#include "libkernel/streams/LimitedStreams.h"

#include "StreamTestSupport.h"

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
    EXPECT_FALSE(source->EOS());
    EXPECT_EQ(in->Tell(), 5u);
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
    EXPECT_EQ(borrowed->GetSize(), 4u);
    EXPECT_EQ(borrowed->Tell(), 4u);
    EXPECT_EQ(target->text, "123456abcd0123");
}

} // namespace
} // namespace Kernel

#include "libkernel/streams/NullOutStream.h"

#include "StreamTestSupport.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using namespace Test;

TEST(NullOutStreamTest, MeasuresWithoutReading)
{
    NullOutStream out;
    EXPECT_EQ(out.WriteBlock(nullptr, u64{1} << 60), u64{1} << 60);
    EXPECT_EQ(out.WriteBlock(nullptr, ~u64{0}), 0u);
    EXPECT_TRUE(out.Truncate(5));

    auto source = MakeCounted<PlainSource>(Pattern(100));
    source->SkipBlock(30);
    ProgressLog log;
    EXPECT_TRUE(out.CopyFromStream(*source, &log));
    EXPECT_EQ(out.GetSize(), 75u);
    EXPECT_EQ(log.reports, (Reports{{70, 70}}));
    EXPECT_TRUE(source->reads.empty());
    EXPECT_TRUE(source->EOS());
}

} // namespace
} // namespace Kernel

#include "libkernel/streams/ForwardBiasedSeekableInStream.h"

#include "StreamTestSupport.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using namespace Test;

TEST(ForwardBiasedSeekableInStreamTest, SeeksForwardAlwaysAndBackWhereTheSourceRewinds)
{
    struct Case
    {
        char const* what;
        SeekMethod method;
        i64 offset;
        bool plain, rewindable;
        u64 expected; // From 40 of 100, where it succeeds.
    };
    for (Case const& c : {
             Case{"forward", SeekMethod::Current, 5, true, true, 45},
             Case{"nowhere", SeekMethod::Current, 0, true, true, 40},
             Case{"back", SeekMethod::Current, -5, false, true, 35},
             Case{"forward from the start", SeekMethod::Beginning, 41, true, true, 41},
             Case{"back from the start", SeekMethod::Beginning, 39, false, true, 39},
             Case{"forward from the end", SeekMethod::End, -10, true, true, 90},
             Case{"back from the end", SeekMethod::End, -90, false, true, 10},
             Case{"below the start", SeekMethod::Current, -41, false, false, 0},
             Case{"past the end", SeekMethod::End, 1, false, false, 0},
             Case{"an overflow", SeekMethod::End, INT64_MAX, false, false, 0},
             Case{"the lowest offset", SeekMethod::Beginning, INT64_MIN, false, false, 0},
             Case{"an unknown method", static_cast<SeekMethod>(3), 0, false, false, 0},
         })
        for (bool const rewindable : {false, true}) {
            SCOPED_TRACE(std::string(c.what) + (rewindable ? ", rewindable" : ", plain"));
            PlainSource source(Pattern(100));
            source.rewindable = rewindable;
            source.SkipBlock(40);
            ForwardBiasedSeekableInStream in(source);
            bool const expected = rewindable ? c.rewindable : c.plain;
            EXPECT_EQ(in.Seek(c.method, c.offset), expected);
            EXPECT_EQ(in.Tell(), expected ? c.expected : 40u);
            EXPECT_EQ(in.Rewind(), rewindable);
            EXPECT_EQ(in.CanRewindInStream(), rewindable);
        }
}

} // namespace
} // namespace Kernel

#include "libkernel/numerics/IndexRange.h"

#include <gtest/gtest.h>
#include <tuple>

namespace Kernel {
namespace {

TEST(IndexRangeTest, BordersFollowFromLocationAndLength)
{
    IndexRange const range(3, 4);
    EXPECT_EQ(range.GetFirst(), 3);
    EXPECT_EQ(range.GetLast(), 6);
    EXPECT_EQ(range.GetMax(), 7);
    for (int i = 0; i < 10; ++i) EXPECT_EQ(range.Contains(i), i >= 3 && i <= 6) << i;
    EXPECT_TRUE(IndexRange().empty());
    EXPECT_FALSE(IndexRange(5, 0).Contains(5));
    EXPECT_EQ(IndexRange(5), IndexRange(5, 1));
    EXPECT_EQ(IndexRange::FromEndPoints(9, 4), IndexRange(4, 6));
    EXPECT_EQ(IndexRange(4, 2).Offset(-6), IndexRange(-2, 2));
}

TEST(IndexRangeTest, ClampAndIntersectsAgreeOnWhatBothHold)
{
    using Row = std::tuple<IndexRange, IndexRange, IndexRange, bool>;
    for (auto const& [a, b, clamped, intersects] :
         {Row{{2, 5}, {4, 10}, {4, 3}, true}, Row{{4, 10}, {2, 5}, {4, 3}, true}, Row{{2, 5}, {3, 2}, {3, 2}, true},
          Row{{2, 3}, {5, 4}, {5, 0}, false}, Row{{5, 4}, {2, 3}, {5, 0}, false}, Row{{2, 3}, {9, 0}, {9, 0}, false},
          Row{{7, 0}, {2, 9}, {7, 0}, true}, Row{{1, 2147483647}, {5, 2}, {5, 2}, true}})
    {
        SCOPED_TRACE(testing::Message() << a.GetLocation() << ',' << a.GetLength());
        EXPECT_EQ(IndexRange::Clamp(a, b), clamped);
        EXPECT_EQ(a.Intersects(b), intersects);
    }
}

} // namespace
} // namespace Kernel

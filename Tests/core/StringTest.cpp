#include "libkernel/core/String.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

TEST(StringTest, CapacityIsWhatTheBlockRoundsUpTo)
{
    struct Case
    {
        int units, utf8, utf16, utf32;
    };
    for (Case const& c : {Case{1, 3, 1, 2}, Case{3, 3, 5, 4}, Case{4, 11, 5, 4}, Case{100, 107, 101, 100}})
    {
        SCOPED_TRACE(c.units);
        String8 a;
        String16 b;
        String32 d;
        a.Reserve(c.units);
        b.Reserve(c.units);
        d.Reserve(c.units);
        EXPECT_EQ(a.GetCapacity(), ((c.units + 20) & ~7) - 13);
        EXPECT_EQ(b.GetCapacity(), (((2 * c.units + 21) & ~7) - 14) / 2);
        EXPECT_EQ(d.GetCapacity(), (((4 * c.units + 23) & ~7) - 16) / 4);
        EXPECT_EQ(a.GetCapacity(), c.utf8);
        EXPECT_EQ(b.GetCapacity(), c.utf16);
        EXPECT_EQ(d.GetCapacity(), c.utf32);
    }
}

TEST(StringTest, WritingNeverReachesASharedBlock)
{
    String8 original("abc");
    String8 copy(original);
    EXPECT_TRUE(copy.SharesBlockWith(original));
    copy.GetWritable()[0] = 'X';
    EXPECT_EQ(original, "abc");
    EXPECT_EQ(copy, "Xbc");
}

TEST(StringTest, AppendingAStringToItselfDoublesIt)
{
    String8 s("ab");
    s += s;
    EXPECT_EQ(s, "abab");
    s.Append(s.GetData() + 1, 2);
    EXPECT_EQ(s, "ababba");
}

TEST(StringTest, SubstringSharesOnlyTheWhole)
{
    String8 const s("abcdef");
    EXPECT_TRUE(s.GetSubstring(0).SharesBlockWith(s));
    EXPECT_EQ(s.GetSubstring(4, 100), "ef");
    EXPECT_TRUE(s.GetSubstring(6).IsEmpty());
}

} // namespace
} // namespace Kernel

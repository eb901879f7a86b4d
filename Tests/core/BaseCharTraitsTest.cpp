#include "libkernel/core/BaseCharTraits.h"

#include <gtest/gtest.h>
#include <string>

namespace Kernel {
namespace {

using Chars = BaseCharTraits<char>;
using Wide = BaseCharTraits<unsigned int>;

TEST(BaseCharTraitsTest, ComparingGivesTheDifferenceOfUnitsAndThenOfLengths)
{
    struct Case
    {
        char const* a;
        char const* b;
        int difference;
    };
    for (Case const& c : {Case{"abc", "abe", -2}, Case{"b", "a", 1}, Case{"\xC3\xA9", "a", -61 - 'a'},
                          Case{"abc", "abcde", -2}, Case{"abcdefghij", "abcdefgh", 2}, Case{"same", "same", 0},
                          Case{"0123456789abcXe", "0123456789abcYe", -1}, Case{"", "", 0}})
    {
        SCOPED_TRACE(c.a);
        int const n = Chars::GetLength(c.a);
        int const m = Chars::GetLength(c.b);
        EXPECT_EQ(Chars::Compare(c.a, c.b), c.difference);
        EXPECT_EQ(Chars::Compare(c.a, n, c.b), c.difference);
        EXPECT_EQ(Chars::Compare(c.b, m, c.a, n), -c.difference);
        EXPECT_EQ(Chars::IsEqual(c.a, n, c.b), c.difference == 0);
    }
    EXPECT_EQ(BaseCharTraits<char16_t>::Compare(u"\uFFFF", u"\u0001"), 0xFFFE);
}

TEST(BaseCharTraitsTest, WideDifferencesAreExactWhileTheyFit)
{
    struct Case
    {
        unsigned int a, b;
        int difference;
    };
    for (Case const& c : {Case{'a', 'c', -2}, Case{0x10FFFF, 1, 0x10FFFE}, Case{7, 7, 0},
                          Case{0xFFFFFFFF, 0, 0x7FFFFFFF}, Case{0, 0xFFFFFFFF, -0x7FFFFFFF - 1}})
        EXPECT_EQ(Wide::Compare(&c.a, 1, &c.b, 1), c.difference) << c.a;
}

TEST(BaseCharTraitsTest, TrimmingTouchesNothingOutsideTheUnitsGiven)
{
    struct Case
    {
        char const* text;
        char const* left;
        char const* right;
    };
    for (Case const& c : {Case{" \t\na b ", "a b ", " \t\na b"}, Case{"ab", "ab", "ab"},
                          Case{"\rab\r", "\rab\r", "\rab\r"}, Case{" \n ", "", ""}, Case{"", "", ""}})
    {
        SCOPED_TRACE(c.text);
        int const n = Chars::GetLength(c.text);
        std::string text = c.text + std::string("#");
        EXPECT_EQ(std::string(text.data(), static_cast<size_t>(Chars::TrimLeft(text.data(), n))), c.left);
        EXPECT_EQ(text[static_cast<size_t>(n)], '#');
        text = c.text + std::string("#");
        EXPECT_EQ(std::string(text.data(), static_cast<size_t>(Chars::TrimRight(text.data(), n))), c.right);
        EXPECT_EQ(text[static_cast<size_t>(n)], '#');
    }
    char text[] = " a ";
    EXPECT_EQ(Chars::TrimRight(text, 3), 2);
    EXPECT_STREQ(text, " a");
    EXPECT_EQ(Chars::TrimLeft(text, 2), 1);
    EXPECT_STREQ(text, "a");
}

TEST(BaseCharTraitsTest, FindingStaysInsideTheText)
{
    struct Case
    {
        char const* needle;
        int start, found;
    };
    for (Case const& c : {Case{"ab", 0, 0}, Case{"ab", 1, 3}, Case{"ab", -5, 0}, Case{"ab", 4, -1}, Case{"abc", 0, 3},
                          Case{"abcd", 0, -1}, Case{"", 6, 6}, Case{"", 7, -1}, Case{"c", 9, -1}})
        // The text ends before the "d".
        EXPECT_EQ(Chars::Find("ab-abcd", 6, c.needle, Chars::GetLength(c.needle), c.start), c.found) << c.needle;
}

} // namespace
} // namespace Kernel

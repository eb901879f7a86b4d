#include "libkernel/core/BaseCharTraits.h"

#include <gtest/gtest.h>
#include <string>
#include <tuple>

namespace Kernel {
namespace {

using Chars = BaseCharTraits<char>;
using Wide = BaseCharTraits<unsigned int>;

TEST(BaseCharTraitsTest, ComparingGivesTheDifferenceOfUnitsAndThenOfLengths)
{
    using Row = std::tuple<char const*, char const*, int>;
    for (auto const& [a, b, difference] :
         {Row{"abc", "abe", -2}, Row{"b", "a", 1}, Row{"\xC3\xA9", "a", -61 - 'a'}, Row{"abc", "abcde", -2},
          Row{"abcdefghij", "abcdefgh", 2}, Row{"same", "same", 0}, Row{"0123456789abcXe", "0123456789abcYe", -1},
          Row{"", "", 0}})
    {
        SCOPED_TRACE(a);
        int const n = Chars::GetLength(a);
        int const m = Chars::GetLength(b);
        EXPECT_EQ(Chars::Compare(a, b), difference);
        EXPECT_EQ(Chars::Compare(a, n, b), difference);
        EXPECT_EQ(Chars::Compare(b, m, a, n), -difference);
        EXPECT_EQ(Chars::IsEqual(a, n, b), difference == 0);
    }
    EXPECT_EQ(BaseCharTraits<char16_t>::Compare(u"\uFFFF", u"\u0001"), 0xFFFE);
}

TEST(BaseCharTraitsTest, WideDifferencesAreExactWhileTheyFit)
{
    using Row = std::tuple<unsigned int, unsigned int, int>;
    for (auto const& [a, b, difference] : {Row{'a', 'c', -2}, Row{0x10FFFF, 1, 0x10FFFE}, Row{7, 7, 0},
                                           Row{0xFFFFFFFF, 0, 0x7FFFFFFF}, Row{0, 0xFFFFFFFF, -0x7FFFFFFF - 1}})
        EXPECT_EQ(Wide::Compare(&a, 1, &b, 1), difference) << a;
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
    using Row = std::tuple<char const*, int, int>;
    for (auto const& [needle, start, found] :
         {Row{"ab", 0, 0}, Row{"ab", 1, 3}, Row{"ab", -5, 0}, Row{"ab", 4, -1}, Row{"abc", 0, 3}, Row{"abcd", 0, -1},
          Row{"", 6, 6}, Row{"", 7, -1}, Row{"c", 9, -1}})
        // The text ends before the "d".
        EXPECT_EQ(Chars::Find("ab-abcd", 6, needle, Chars::GetLength(needle), start), found) << needle;
}

} // namespace
} // namespace Kernel

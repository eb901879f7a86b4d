#include "libkernel/text/SearchString.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

TEST(SearchStringTest, TextIsSplitAtRunsOfBlanks)
{
    EXPECT_EQ(SearchString("\t b  a\r\n\u00A0c ", true).GetTokens(), (std::vector<String8>{"b", "a", "\u00A0c"}));
    EXPECT_TRUE(SearchString(" \t\r\n", true).GetTokens().empty());
    for (bool flag : {false, true}) EXPECT_EQ(SearchString("a", flag).IsCaseSensitive(), flag);
}

TEST(SearchStringTest, TokensMatchInOrderWithoutOverlap)
{
    struct Case
    {
        char const* search;
        bool flag;
        char const* text;
        u64 found;
    };
    for (Case const& c :
         {Case{"b a", false, "ab", 1}, Case{"a b", false, "ab", 2}, Case{"aa aa", false, "aaa", 1},
          Case{"A", false, "a", 0}, Case{"A", true, "a", 1}, Case{"strasse WEG", true, "Stra\u00DFe: weg", 2},
          // The match is shorter than its token, then longer.
          Case{"sss s", true, "\u00DFss", 2}, Case{"\u00DF s", true, "ss", 1}, Case{"\u1E9E s", true, "ss-s", 2},
          Case{"", true, "any", 0}})
    {
        SCOPED_TRACE(c.search);
        SearchString const search(c.search, c.flag);
        EXPECT_EQ(search.TestSubset(c.text, 0), c.found);
        EXPECT_EQ(search.Test(c.text), c.found == search.GetTokens().size());
    }
}

TEST(SearchStringTest, OneSearchGoesOnOverSeveralFields)
{
    SearchString const search("red apple pie", true);
    u64 next = search.TestSubset("Red Apples", 0);
    EXPECT_EQ(next, 2u);
    EXPECT_FALSE(search.Completed(next));
    next = search.TestSubset("a pie", next);
    EXPECT_TRUE(search.Completed(next));
    EXPECT_EQ(search.TestSubset("x", 9), 9u);
}

} // namespace
} // namespace Kernel

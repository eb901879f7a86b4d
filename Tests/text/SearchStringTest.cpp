#include "libkernel/text/SearchString.h"

#include <gtest/gtest.h>
#include <tuple>

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
    using Row = std::tuple<char const*, bool, char const*, u64>;
    for (auto const& [tokens, flag, text, found] :
         {Row{"b a", false, "ab", 1}, Row{"a b", false, "ab", 2}, Row{"aa aa", false, "aaa", 1},
          Row{"A", false, "a", 0}, Row{"A", true, "a", 1}, Row{"strasse WEG", true, "Stra\u00DFe: weg", 2},
          // The match is shorter than its token, then longer.
          Row{"sss s", true, "\u00DFss", 2}, Row{"\u00DF s", true, "ss", 1}, Row{"\u1E9E s", true, "ss-s", 2},
          Row{"", true, "any", 0}})
    {
        SCOPED_TRACE(tokens);
        SearchString const search(tokens, flag);
        EXPECT_EQ(search.TestSubset(text, 0), found);
        EXPECT_EQ(search.Test(text), found == search.GetTokens().size());
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

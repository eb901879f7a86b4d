#include "libkernel/text/SearchString.h"

#include "libkernel/core/ConvertEnc.h"
#include "libkernel/text/TextCase.h"

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

TEST(TextCaseTest, EachCodePointFollowsTheRulesOfTheLanguage)
{
    using Row = std::tuple<char const*, String8, char const*, char const*, char const*, char const*>;
    for (auto const& [language, text, lower, upper, title, toggled] :
         {Row{nullptr, "Stra\u00DFe", "stra\u00DFe", "STRASSE", "Stra\u00DFe", "sTRASSE"},
          Row{"de-DE", "\u00E9A \u00C9b", "\u00E9a \u00E9b", "\u00C9A \u00C9B", "\u00C9a \u00E9b", "\u00C9a \u00E9B"},
          Row{"tr-TR", "iI\u0130", "i\u0131i", "\u0130I\u0130", "\u0130\u0131i", "\u0130\u0131i"},
          Row{nullptr, "iI\u0130", "iii\u0307", "II\u0130", "Iii\u0307", "Iii\u0307"},
          Row{nullptr, "\u039F\u03A3", "\u03BF\u03C3", "\u039F\u03A3", "\u039F\u03C3", "\u03BF\u03C3"},
          Row{"el", "\u03AC", "\u03AC", "\u0386", "\u0386", "\u0386"},
          Row{nullptr, "\u01C6x", "\u01C6x", "\u01C4X", "\u01C5x", "\u01C4X"},
          Row{nullptr, "\uFB03", "\uFB03", "FFI", "Ffi", "FFI"},
          Row{nullptr, "\U00010428\U00010400", "\U00010428\U00010428", "\U00010400\U00010400", "\U00010400\U00010428",
              "\U00010400\U00010428"},
          Row{nullptr, "", "", "", "", ""}})
    {
        SCOPED_TRACE(text.GetData());
        Counted<Locale const> const locale = language ? Locale::Create(language) : nullptr;
        EXPECT_EQ(ToLowerCase(text, locale), lower);
        EXPECT_EQ(ToUpperCase(text, locale), upper);
        EXPECT_EQ(ToTitleCaseSingleWord(text, locale), title);
        EXPECT_EQ(ToggleCase(text, locale), toggled);
        String16 const wide = ConvertedTo<TEncUtf16>(text);
        EXPECT_EQ(ConvertedTo<TEncUtf8>(ToUpperCase(wide, locale)), upper);
        EXPECT_EQ(ConvertedTo<TEncUtf8>(ToggleCase(ConvertedTo<TEncUtf32>(text), locale)), toggled);
    }
    String8 const same("already so");
    EXPECT_TRUE(ToLowerCase(same).SharesBlockWith(same));
    EXPECT_EQ(ToUpperCase(String8("ab\xF0\x90")), "AB") << "the last code point is cut short";
    EXPECT_EQ(ToLowerCase(String8("ab\xC3")), "ab");
}

} // namespace
} // namespace Kernel

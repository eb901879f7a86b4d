#include "libkernel/text/TextCase.h"

#include "libkernel/core/ConvertEnc.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

TEST(TextCaseTest, EachCodePointFollowsTheRulesOfTheLanguage)
{
    struct Case
    {
        char const* locale;
        char const* text;
        char const *lower, *upper, *title, *toggled;
    };
    for (Case const& c :
         {Case{nullptr, "Stra\u00DFe", "stra\u00DFe", "STRASSE", "Stra\u00DFe", "sTRASSE"},
          Case{"de-DE", "\u00E9A \u00C9b", "\u00E9a \u00E9b", "\u00C9A \u00C9B", "\u00C9a \u00E9b", "\u00C9a \u00E9B"},
          Case{"tr-TR", "iI\u0130", "i\u0131i", "\u0130I\u0130", "\u0130\u0131i", "\u0130\u0131i"},
          Case{nullptr, "iI\u0130", "iii\u0307", "II\u0130", "Iii\u0307", "Iii\u0307"},
          Case{nullptr, "\u039F\u03A3", "\u03BF\u03C3", "\u039F\u03A3", "\u039F\u03C3", "\u03BF\u03C3"},
          Case{"el", "\u03AC", "\u03AC", "\u0386", "\u0386", "\u0386"},
          Case{nullptr, "\u01C6x", "\u01C6x", "\u01C4X", "\u01C5x", "\u01C4X"},
          Case{nullptr, "\uFB03", "\uFB03", "FFI", "Ffi", "FFI"},
          Case{nullptr, "\U00010428\U00010400", "\U00010428\U00010428", "\U00010400\U00010400", "\U00010400\U00010428",
               "\U00010400\U00010428"},
          Case{nullptr, "", "", "", "", ""}})
    {
        SCOPED_TRACE(c.text);
        Counted<Locale const> const locale = c.locale ? Locale::Create(c.locale) : nullptr;
        String8 const text(c.text);
        EXPECT_EQ(ToLowerCase(text, locale), c.lower);
        EXPECT_EQ(ToUpperCase(text, locale), c.upper);
        EXPECT_EQ(ToTitleCaseSingleWord(text, locale), c.title);
        EXPECT_EQ(ToggleCase(text, locale), c.toggled);
        String16 const wide = ConvertedTo<TEncUtf16>(text);
        EXPECT_EQ(ConvertedTo<TEncUtf8>(ToUpperCase(wide, locale)), c.upper);
        EXPECT_EQ(ConvertedTo<TEncUtf8>(ToggleCase(ConvertedTo<TEncUtf32>(text), locale)), c.toggled);
    }
}

TEST(TextCaseTest, TextThatStaysSharesItsBlock)
{
    String8 const text("already so");
    EXPECT_TRUE(ToLowerCase(text).SharesBlockWith(text));
}

TEST(TextCaseTest, LastCodePointCutShortIsLeftOut)
{
    EXPECT_EQ(ToUpperCase(String8("ab\xF0\x90")), "AB");
    EXPECT_EQ(ToLowerCase(String8("ab\xC3")), "ab");
}

} // namespace
} // namespace Kernel

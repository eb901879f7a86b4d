#include "libkernel/text/TextCase.h"

#include "libkernel/core/ConvertEnc.h"

#include <gtest/gtest.h>
#include <tuple>

namespace Kernel {
namespace {

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

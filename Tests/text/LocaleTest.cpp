#include "libkernel/text/Locale.h"

#include <gtest/gtest.h>
#include <tuple>

namespace Kernel::Test {
namespace {

TEST(LocaleTest, IdentifierIsTakenApart)
{
    using Row = std::tuple<char const*, char const*, u16, int>;
    for (auto const& [id, isoCode, language, units16] :
         {Row{"en-GB", "en", 0x656E, 5}, Row{"zh-Hans-CN", "zh", 0x7A68, 10}, Row{"de", "de", 0x6465, 2},
          Row{"x", "x", 0, 1}, Row{"", "", 0, 0}, Row{"-x", "", 0x2D78, 2}, Row{"e\xFF", "e\xFF", 0x65FF, 1}})
    {
        Counted<Locale const> const locale = Locale::Create(id);
        EXPECT_EQ(locale->GetId(), id);
        EXPECT_EQ(locale->GetISOCode(), isoCode) << id;
        EXPECT_EQ(locale->GetEncodedLanguage(), language) << id;
        EXPECT_EQ(locale->ToWin32Locale().GetLength(), units16) << id;
    }
    EXPECT_EQ(Locale::EncodeLanguage('e', 'n'), 0x656E);
}

TEST(LocaleTest, EqualIdentifiersMakeEqualLocales)
{
    Counted<Locale const> const locale = Locale::Create("en-GB");
    EXPECT_TRUE(locale->IsEqual(*Locale::Create("en-GB"), 0.0));
    EXPECT_FALSE(locale->IsEqual(*Locale::Create("en-US"), 100.0));
    EXPECT_FALSE(locale->IsEqual(*Locale::Create("fr-GB"), 100.0));
}

TEST(LocaleTest, CurrentLocaleIsALanguageTag)
{
    Counted<Locale const> const first = Locale::GetCurrent(), second = Locale::GetCurrent();
    EXPECT_NE(first, second);
    EXPECT_TRUE(first->IsEqual(*second, 0.0));
    EXPECT_GE(first->GetId().GetLength(), 2);
    EXPECT_EQ(first->GetId().Find('_'), -1) << first->GetId().GetData();
}

} // namespace
} // namespace Kernel::Test

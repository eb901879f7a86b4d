#include "libkernel/text/Locale.h"

#include <gtest/gtest.h>

namespace Kernel::Test {
namespace {

TEST(LocaleTest, IdentifierIsTakenApart)
{
    struct
    {
        char const* id;
        char const* isoCode;
        u16 language;
        int units16;
    } const cases[] = {
        {"en-GB", "en", 0x656E, 5},
        {"zh-Hans-CN", "zh", 0x7A68, 10},
        {"de", "de", 0x6465, 2},
        {"x", "x", 0, 1},
        {"", "", 0, 0},
        {"-x", "", 0x2D78, 2},
        {"e\xFF", "e\xFF", 0x65FF, 1},
    };
    for (auto const& c : cases) {
        Counted<Locale const> const locale = Locale::Create(c.id);
        EXPECT_EQ(locale->GetId(), c.id);
        EXPECT_EQ(locale->GetISOCode(), c.isoCode) << c.id;
        EXPECT_EQ(locale->GetEncodedLanguage(), c.language) << c.id;
        EXPECT_EQ(locale->ToWin32Locale().GetLength(), c.units16) << c.id;
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

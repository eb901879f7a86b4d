#include "libkernel/text/Locale.h"

#include "libkernel/text/LanguageId.h"

#include <gtest/gtest.h>
#include <map>
#include <tuple>
#include <unicode/uloc.h>

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

TEST(LocaleTest, EqualIdentifiersMakeEqualLocalesAndTheCurrentOneIsALanguageTag)
{
    Counted<Locale const> const locale = Locale::Create("en-GB");
    EXPECT_TRUE(locale->IsEqual(*Locale::Create("en-GB"), 0.0));
    for (char const* other : {"en-US", "fr-GB"}) EXPECT_FALSE(locale->IsEqual(*Locale::Create(other), 100.0));
    Counted<Locale const> const first = Locale::GetCurrent(), second = Locale::GetCurrent();
    EXPECT_NE(first, second);
    EXPECT_TRUE(first->IsEqual(*second, 0.0) && first->GetId().GetLength() >= 2);
    EXPECT_EQ(first->GetId().Find('_'), -1) << first->GetId().GetData();
}

TEST(LanguageIdTest, OfferIsMatchedWithTheWantedLanguage)
{
    using Row = std::tuple<char const*, char const*, int>;
    for (auto const& [wanted, offered, expected] :
         {Row{"en-GB", "en-US", 1}, Row{"en", "en-US", 2}, Row{"en", "en-GB", 1}, Row{"fr", "en-GB", 0},
          Row{"en", "en", 2}, Row{"en-GB", "en-GB", 2}, Row{"en-GB", "en_GB", 2}, Row{"xx", "xx-GB", 1},
          Row{"nb", "nb-NO", 2}, Row{"en-GB", "en", 0}, Row{"", "", 2}, Row{"", "en-GB", 0}, Row{"e", "e", 2},
          Row{"zh", "zh-Hans", 0}, Row{"zh-Hans", "zh-Hans", 2}, Row{"zh-TW", "zh-Hans", 0}, Row{"eng", "en-GB", 0},
          Row{"de", "d", 0}, Row{"ca-ES-valencia", "ca-ES", 0}})
        EXPECT_EQ(static_cast<int>(GetLanguageIdMatch(wanted, offered)), expected) << wanted << " " << offered;
}

TEST(LanguageIdTest, DefaultCountryIsPutBehindABareLanguage)
{
    int found = 0;
    for (char a = 'a'; a <= 'z'; ++a)
        for (char b = 'a'; b <= 'z'; ++b) {
            char const language[] = {a, b, 0};
            String8 const result = GetDefaultLanguageCountry(language);
            if (result == language) continue;
            ++found;
            char likely[ULOC_FULLNAME_CAPACITY], country[ULOC_COUNTRY_CAPACITY];
            UErrorCode status = U_ZERO_ERROR;
            uloc_addLikelySubtags(language, likely, sizeof likely, &status);
            uloc_getCountry(likely, country, sizeof country, &status);
            EXPECT_EQ(result, String8(language) + "-" + country);
        }
    EXPECT_EQ(found, 29);
    for (char const* same : {"en-GB", "xx", "pt", "zh", "", "e", "EN"})
        EXPECT_EQ(GetDefaultLanguageCountry(same), same);
}

TEST(LanguageIdTest, PublishedIdentifiersHaveTheirTags)
{
    using Row = std::tuple<int, char const*>;
    for (auto const& [lcid, tag] :
         {Row{1, "ar"}, Row{4, "zh-Hans"}, Row{1088, "ky-KG"}, Row{31890, "ku-Arab"}, Row{255, "zxx"}, Row{0, ""},
          Row{1033, "en-US"}, Row{2057, "en-GB"}, Row{1034, "es-ES_tradnl"}, Row{2051, "ca-ES-valencia"},
          Row{31748, "zh-Hant"}, Row{66567, "de-DE_phoneb"}, Row{331780, "zh-SG_phoneb"}, Row{331781, ""}, Row{127, ""},
          Row{4096, ""}, Row{-1, ""}, Row{2147483647, ""}})
        EXPECT_EQ(GetLanguageIdFromLcid(lcid), tag) << lcid;
}

// ICU fills in countries and scripts of its own, so only the language is compared; four it names in another way.
TEST(LanguageIdTest, LanguagesAgreeWithAnIndependentList)
{
    std::map<std::string, std::string> const otherNames = {{"quz", "qu"}, {"quc", "qut"}, {"prs", "fa"}, {"ku", "ckb"}};
    int known = 0;
    for (int lcid = 1; lcid < 0x10000; ++lcid) {
        String8 const tag = GetLanguageIdFromLcid(lcid);
        if (tag.IsEmpty()) continue;
        ++known;
        char icu[ULOC_FULLNAME_CAPACITY];
        UErrorCode status = U_ZERO_ERROR;
        uloc_getLocaleForLCID(static_cast<u32>(lcid), icu, sizeof icu, &status);
        if (U_FAILURE(status)) continue;
        std::string const ours(tag.GetView().substr(0, tag.GetView().find('-')));
        std::string const theirs = std::string(icu).substr(0, std::string(icu).find('_'));
        auto const other = otherNames.find(ours);
        EXPECT_TRUE(ours == theirs || (other != otherNames.end() && other->second == theirs))
            << lcid << " " << tag.GetData() << " " << icu;
    }
    EXPECT_EQ(known, 449 - 13); // The sort orders lie above.
}

} // namespace
} // namespace Kernel::Test

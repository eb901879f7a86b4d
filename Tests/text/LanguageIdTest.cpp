#include "libkernel/text/LanguageId.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <map>
#include <unicode/uloc.h>

namespace Kernel::Test {
namespace {

TEST(LanguageIdTest, OfferIsMatchedWithTheWantedLanguage)
{
    struct
    {
        char const* wanted;
        char const* offered;
        int expected;
    } const cases[] = {
        {"en-GB", "en-US", 1},
        {"en", "en-US", 2},
        {"en", "en-GB", 1},
        {"fr", "en-GB", 0},
        {"en", "en", 2},
        {"en-GB", "en-GB", 2},
        {"en-GB", "en_GB", 2},
        {"xx", "xx-GB", 1},
        {"nb", "nb-NO", 2},
        {"en-GB", "en", 0},
        {"", "", 2},
        {"", "en-GB", 0},
        {"e", "e", 2},
        {"zh", "zh-Hans", 0},
        {"zh-Hans", "zh-Hans", 2},
        {"zh-TW", "zh-Hans", 0},
        {"eng", "en-GB", 0},
        {"de", "d", 0},
        {"ca-ES-valencia", "ca-ES", 0},
    };
    for (auto const& c : cases)
        EXPECT_EQ(static_cast<int>(GetLanguageIdMatch(c.wanted, c.offered)), c.expected)
            << c.wanted << " " << c.offered;
}

TEST(LanguageIdTest, DefaultCountryIsPutBehindABareLanguage)
{
    char const* const countries[] = {"ca-ES", "cs-CZ", "da-DK", "de-DE", "el-GR", "en-US", "es-ES", "fi-FI",
                                     "fr-FR", "he-IL", "hi-IN", "hr-HR", "hu-HU", "id-ID", "it-IT", "ja-JP",
                                     "ko-KR", "ms-MY", "nb-NO", "nl-NL", "pl-PL", "ro-RO", "ru-RU", "sk-SK",
                                     "sv-SE", "th-TH", "tr-TR", "uk-UA", "vi-VN"};
    int found = 0;
    for (char a = 'a'; a <= 'z'; ++a)
        for (char b = 'a'; b <= 'z'; ++b) {
            char const language[] = {a, b, 0};
            String8 const result = GetDefaultLanguageCountry(language);
            if (result == language) continue;
            ++found;
            EXPECT_TRUE(std::ranges::any_of(countries, [&](char const* tag) { return result == tag; })) << language;
        }
    EXPECT_EQ(found, 29);
    for (char const* same : {"en-GB", "xx", "", "e", "EN"}) EXPECT_EQ(GetDefaultLanguageCountry(same), same);
}

TEST(LanguageIdTest, PublishedIdentifiersHaveTheirTags)
{
    struct
    {
        int lcid;
        char const* tag;
    } const cases[] = {
        {1, "ar"},
        {4, "zh-Hans"},
        {1088, "ky-KG"},
        {31890, "ku-Arab"},
        {255, "zxx"},
        {0, ""},
        {1033, "en-US"},
        {2057, "en-GB"},
        {1034, "es-ES_tradnl"},
        {2051, "ca-ES-valencia"},
        {31748, "zh-Hant"},
        {66567, "de-DE_phoneb"},
        {331780, "zh-SG_phoneb"},
        {331781, ""},
        {127, ""},
        {4096, ""},
        {-1, ""},
        {2147483647, ""},
    };
    for (auto const& c : cases) EXPECT_EQ(GetLanguageIdFromLcid(c.lcid), c.tag) << c.lcid;
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

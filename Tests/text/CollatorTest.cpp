#include "libkernel/text/Collator.h"

#include "libkernel/text/Locale.h"
#include "libkernel/text/Stemmer.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <random>
#include <string>
#include <tuple>
#include <vector>

namespace Kernel::Test {
namespace {

Counted<Collator> Make(char const* locale, bool caseSensitive, bool numeric)
{
    return MakeCounted<Collator>(locale ? Locale::Create(locale) : nullptr, caseSensitive, numeric);
}

constexpr char const* c_bad = "no locale at all"; ///< ICU refuses it.

TEST(CollatorTest, LanguageCaseAndDigitsDecideTheOrder)
{
    // Null for no locale.
    using Row = std::tuple<char const*, bool, bool, char const*, char const*, int>;
    for (auto const& [locale, caseSensitive, numeric, a, b, expected] :
         {Row{"sv-SE", false, false, "z", "\xC3\xB6", -1},
          Row{"de-DE", false, false, "z", "\xC3\xB6", 1},
          Row{nullptr, false, false, "z", "\xC3\xB6", 1},
          Row{"de-u-co-phonebk", false, false, "\xC3\xA4", "az", -1},
          Row{"de-DE", false, false, "\xC3\xA4", "az", -1},
          Row{"de-u-co-phonebk", false, false, "\xC3\xA4", "ad", 1},
          Row{"en", false, false, "Boat", "boat", 0},
          Row{"en", true, false, "Boat", "boat", 1},
          Row{"en", false, false, "resume", "r\xC3\xA9sum\xC3\xA9", -1},
          Row{"en", false, false, "r\xC3\xA9sum\xC3\xA9", "re\xCC\x81sume\xCC\x81", 0},
          Row{"en", false, false, "file10", "file9", -1},
          Row{"en", false, true, "file10", "file9", 1},
          Row{"en", false, true, "file010", "file10", 0},
          Row{"en", true, false, "", "a", -1},
          Row{"en", true, false, "", "", 0},
          Row{"xx-YY", true, false, "a", "B", -1},
          Row{c_bad, true, false, "a", "B", 1},
          Row{c_bad, true, true, "a10", "a9", -1},
          Row{c_bad, false, false, "a", "B", -1},
          Row{c_bad, false, false, "STRASSE", "stra\xC3\237e", 0},
          Row{c_bad, false, false, "a\xE2\x80", "a", 1},
          Row{"en", true, false, "\xFF", "\xEF\xBF\xBD", 0},
          Row{"en", true, false, "a\xE2\x80", "a", 1}})
    {
        auto const collator = Make(locale, caseSensitive, numeric);
        EXPECT_EQ(collator->IsLocaleAware(), locale != c_bad) << a;
        auto const sign = [](int order) { return (order > 0) - (order < 0); };
        EXPECT_EQ(sign(collator->Collate(a, b)), expected) << a << " " << b;
        EXPECT_EQ(sign(collator->Collate(b, a)), -expected) << a << " " << b;
        auto const changed = Make(locale, !caseSensitive, !numeric); // Setters change the order in place.
        changed->SetCaseSensitive(caseSensitive);
        changed->SetNumericOrdering(numeric);
        EXPECT_EQ(sign(changed->Collate(a, b)), expected) << a << " " << b;
    }
}

// Sorting algorithms run off the end of a list that has no order.
TEST(CollatorTest, RandomBytesAreInOrder)
{
    std::mt19937 random(5);
    auto const collator = Make("de", false, true);
    std::vector<String8> texts;
    for (int i = 0; i < 60; ++i) {
        std::string text;
        for (u32 n = random() % 6; n > 0; --n) text += static_cast<char>(random() % 3 ? random() : '0' + random() % 10);
        texts.emplace_back(std::string_view(text));
    }
    std::ranges::sort(texts, [&](String8 const& a, String8 const& b) { return collator->Collate(a, b) < 0; });
    for (size_t i = 0; i < texts.size(); ++i)
        for (size_t k = i; k < texts.size(); ++k) EXPECT_LE(collator->Collate(texts[i], texts[k]), 0);
}

TEST(StemmerTest, WordsAreCutDownInTheLanguageOfTheLocale)
{
    using Row = std::tuple<char const*, char const*, char const*>;
    for (auto const& [locale, word, stem] :
         {Row{"en-GB", "Sailing", "sail"}, Row{"en_US", "boats", "boat"}, Row{"en", "HARBOURS", "harbour"},
          Row{"de-DE", "H\xC3\x84USER", "haus"}, Row{"fr", "voiles", "voil"}, Row{"english", "sailing", "sail"},
          Row{"eng", "sailing", "sail"}, Row{"nb-NO", "B\xC3\xA5ten", "B\xC3\xA5ten"},
          Row{"no", "b\xC3\xA5ten", "b\xC3\xA5t"}, Row{"", "Sailing", "Sailing"}, Row{"-en", "Sailing", "Sailing"},
          Row{"en_GB-x", "Sailing", "Sailing"}, Row{"en", "", ""}})
        EXPECT_EQ(MakeCounted<Stemmer>(Locale::Create(locale))->Stem(word), stem) << locale << " " << word;
    EXPECT_FALSE(MakeCounted<Stemmer>(nullptr)->IsValid());
}

TEST(StemmerTest, EveryLanguageOnOfferHasAStemmer)
{
    for (char const* language : {"ar", "ca", "da", "de", "el", "en", "es", "eu", "fi", "fr", "ga", "hi", "hu",    "id",
                                 "it", "lt", "ne", "nl", "no", "pt", "ro", "ru", "sr", "sv", "ta", "tr", "porter"})
    {
        auto const stemmer = MakeCounted<Stemmer>(Locale::Create(language));
        EXPECT_TRUE(stemmer->IsValid()) << language;
        // Text that isn't UTF-8 gives some stem, and nothing outside it is read.
        for (char const* bad : {"\xE2", "a\xF0\x9F", "\xFF\xC3", "\x80\x80ing"})
            EXPECT_LE(stemmer->Stem(bad).GetLength(), 12) << language;
    }
    for (char const* language : {"nb", "ja", "xx", "EN"})
        EXPECT_FALSE(MakeCounted<Stemmer>(Locale::Create(language))->IsValid()) << language;
}

} // namespace
} // namespace Kernel::Test

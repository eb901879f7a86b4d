#include "libkernel/text/Stemmer.h"

#include "libkernel/text/Locale.h"

#include <gtest/gtest.h>
#include <tuple>

namespace Kernel::Test {
namespace {

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

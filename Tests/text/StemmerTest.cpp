#include "libkernel/text/Stemmer.h"

#include "libkernel/text/Locale.h"

#include <gtest/gtest.h>

namespace Kernel::Test {
namespace {

TEST(StemmerTest, WordsAreCutDownInTheLanguageOfTheLocale)
{
    struct
    {
        char const* locale;
        char const* word;
        char const* stem;
    } const cases[] = {
        {"en-GB", "Sailing", "sail"},
        {"en_US", "boats", "boat"},
        {"en", "HARBOURS", "harbour"},
        {"de-DE", "H\xC3\x84USER", "haus"},
        {"fr", "voiles", "voil"},
        {"english", "sailing", "sail"},
        {"eng", "sailing", "sail"},
        {"nb-NO", "B\xC3\xA5ten", "B\xC3\xA5ten"},
        {"no", "b\xC3\xA5ten", "b\xC3\xA5t"},
        {"", "Sailing", "Sailing"},
        {"-en", "Sailing", "Sailing"},
        {"en_GB-x", "Sailing", "Sailing"},
        {"en", "", ""},
    };
    for (auto const& c : cases)
        EXPECT_EQ(MakeCounted<Stemmer>(Locale::Create(c.locale))->Stem(c.word), c.stem) << c.locale << " " << c.word;
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

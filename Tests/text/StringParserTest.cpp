#include "libkernel/text/StringParser.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

TEST(StringParserTest, NumbersReadAsTheLanguageWritesThem)
{
    struct
    {
        char const* language;
        char const* text;
        bool parsed;
        double number;
        bool isLong;
        long whole;
    } const cases[] = {
        {"en-US", "1,234.5", true, 1234.5, true, 1234},
        {"de-DE", "1.234,5", true, 1234.5, true, 1234},
        {"de-DE", "-7", true, -7.0, true, -7},
        {"ar-EG", "\xD9\xA1\xD9\xA2", true, 12.0, true, 12}, // Its own digits.
        {"en-US", "12 cm", true, 12.0, true, 12},
        {"en-US", "2147483648", true, 2147483648.0, false, 0},
        {"en-US", "cm", false, 0.0, false, 0},
        {"en-US", "", false, 0.0, false, 0},
        {"en-US", "\xFF\xFE", false, 0.0, false, 0},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.text);
        Counted<Locale const> const locale = Locale::Create(c.language);
        double number = 99.0;
        EXPECT_EQ(StringParser::ParseAsDouble(c.text, locale, number), c.parsed);
        EXPECT_EQ(number, c.parsed ? c.number : 99.0);
        long whole = 99;
        EXPECT_EQ(StringParser::ParseAsLong(c.text, locale, whole), c.isLong);
        EXPECT_EQ(whole, c.isLong ? c.whole : 99);
    }
    double number;
    EXPECT_TRUE(StringParser::ParseAsDouble("5", nullptr, number)) << "the user's own language";
}

} // namespace
} // namespace Kernel

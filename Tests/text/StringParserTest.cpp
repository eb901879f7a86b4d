#include "libkernel/text/StringParser.h"

#include "support/Rows.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

TEST(StringParserTest, NumbersReadAsTheLanguageWritesThem)
{
    Rows<char const*, char const*, bool, double, bool, long> const cases = {
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
    for (auto const& [language, text, parsed, expected, isLong, expectedLong] : cases) {
        SCOPED_TRACE(text);
        Counted<Locale const> const locale = Locale::Create(language);
        double number = 99.0;
        EXPECT_EQ(StringParser::ParseAsDouble(text, locale, number), parsed);
        EXPECT_EQ(number, parsed ? expected : 99.0);
        long whole = 99;
        EXPECT_EQ(StringParser::ParseAsLong(text, locale, whole), isLong);
        EXPECT_EQ(whole, isLong ? expectedLong : 99);
    }
    double number;
    EXPECT_TRUE(StringParser::ParseAsDouble("5", nullptr, number)) << "the user's own language";
}

} // namespace
} // namespace Kernel

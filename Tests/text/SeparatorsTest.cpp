#include "libkernel/text/Separators.h"

#include "libkernel/text/StringParser.h"
#include "support/Rows.h"

#include <gtest/gtest.h>
#include <random>
#include <string>
#include <tuple>

namespace Kernel::Test {
namespace {

class SeparatorsTest : public testing::Test
{
protected:
    ~SeparatorsTest() override { Set(0u, 0u); }

    static void Set(unsigned int decimal, unsigned int grouping)
    {
        SetLocalDecimalSeparator(decimal);
        SetLocalDigitGroupingSeparator(grouping);
    }
};

TEST_F(SeparatorsTest, NumbersAreConvertedByTheSeparators)
{
    // What the local text becomes, and what that becomes in turn.
    using Row = std::tuple<unsigned int, unsigned int, char const*, char const*, char const*>;
    for (auto const& [decimal, grouping, local, machine, back] :
         {Row{',', '.', "1.234,5", "1234.5", "1234,5"}, Row{',', '.', "f(1,5; 2)", "f(1.5, 2)", "f(1,5; 2)"},
          Row{'.', ',', "1,234.5", "1234.5", "1234.5"}, Row{'.', ',', "f(1.5; 2)", "f(1.5, 2)", "f(1.5; 2)"},
          Row{'.', ' ', "f(1 000.5, 2)", "f(1000.5,2)", "f(1000.5,2)"},
          Row{',', ' ', "1 000,5;2", "1000.5,2", "1000,5;2"},
          Row{0x66B, 0x66C,
              "1\xD9\254234\xD9\xAB"
              "5",
              "1234.5", "1234\xD9\2535"},
          Row{',', 0x202F, "1\xE2\x80\257234,5,6", "1234.5.6", "1234,5,6"}, Row{',', ',', "1,234", "1234", "1234"},
          Row{0, 0, "1,234.5;", "1,234.5;", "1,234.5;"}, Row{',', '.', "", "", ""}, Row{',', '.', "...", "", ""}})
    {
        Set(decimal, grouping);
        EXPECT_EQ(ConvertFromLocalisedDecimal(local), machine) << local;
        EXPECT_EQ(ConvertToLocalisedDecimal(machine), back) << local;
        EXPECT_EQ(IsDefaultDecimalSeparator(), decimal == '.');
    }
}

TEST_F(SeparatorsTest, OnlyTextOfOneCodePointIsTaken)
{
    using Row = std::tuple<char const*, unsigned int>;
    for (auto const& [text, expected] : {Row{",", ','}, Row{"\xD9\xAB", 0x66B}, Row{"\xF0\x9F\x98\x80", 0x1F600},
                                         Row{"", '?'}, Row{"..", '?'}, Row{"\xD9", '?'}, Row{"\xE2\x80,", '?'}})
    {
        Set('?', '?');
        SetLocalDecimalSeparator(String8(text));
        SetLocalDigitGroupingSeparator(String8(text));
        EXPECT_EQ(GetLocalDecimalSeparator(), expected) << text;
        EXPECT_EQ(GetLocalGroupingSeparator(), expected) << text;
    }
}

TEST_F(SeparatorsTest, LocalTextOfAMachineTextReadsBackAsThat)
{
    std::mt19937 random(11);
    std::string const alphabet = "0123456789.,+-ef() \xC3\xA9";
    for (int round = 0; round < 2000; ++round) {
        unsigned int const decimal = round % 3 == 0 ? '.' : round % 3 == 1 ? ',' : 0x66B;
        Set(decimal, round % 2 ? 0x2019 : '\'');
        std::string text;
        for (u32 i = random() % 30; i > 0; --i) text += alphabet[random() % alphabet.size()];
        String8 const machine(text.c_str());
        EXPECT_EQ(ConvertFromLocalisedDecimal(ConvertToLocalisedDecimal(machine)), machine) << text << decimal;
    }
}

TEST(StringParserTest, NumbersReadAsTheLanguageWritesThem)
{
    // 99 where nothing is read.
    for (auto const& [language, text, number, whole] : Rows<char const*, char const*, double, long>{
             {"en-US", "1,234.5", 1234.5, 1234},
             {"de-DE", "1.234,5", 1234.5, 1234},
             {"de-DE", "-7", -7.0, -7},
             {"ar-EG", "\xD9\xA1\xD9\xA2", 12.0, 12}, // Its own digits.
             {"en-US", "12 cm", 12.0, 12},
             {"en-US", "2147483648", 2147483648.0, 99},
             {"en-US", "cm", 99.0, 99},
             {"en-US", "", 99.0, 99},
             {"en-US", "\xFF\xFE", 99.0, 99},
         })
    {
        SCOPED_TRACE(text);
        Counted<Locale const> const locale = Locale::Create(language);
        double asDouble = 99.0;
        long asLong = 99;
        EXPECT_EQ(StringParser::ParseAsDouble(text, locale, asDouble), number != 99.0);
        EXPECT_EQ(StringParser::ParseAsLong(text, locale, asLong), whole != 99);
        EXPECT_TRUE(asDouble == number && asLong == whole);
    }
    double number;
    EXPECT_TRUE(StringParser::ParseAsDouble("5", nullptr, number)) << "the user's own language";
}

} // namespace
} // namespace Kernel::Test

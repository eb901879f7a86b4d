#include "libkernel/text/Separators.h"

#include <gtest/gtest.h>
#include <random>
#include <string>

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
    struct
    {
        unsigned int decimal, grouping;
        char const* local;
        char const* machine; ///< What the local text becomes.
        char const* back;    ///< What that becomes in turn.
    } const cases[] = {
        {',', '.', "1.234,5", "1234.5", "1234,5"},
        {',', '.', "f(1,5; 2)", "f(1.5, 2)", "f(1,5; 2)"},
        {'.', ',', "1,234.5", "1234.5", "1234.5"},
        {'.', ',', "f(1.5; 2)", "f(1.5, 2)", "f(1.5; 2)"},
        {'.', ' ', "f(1 000.5, 2)", "f(1000.5,2)", "f(1000.5,2)"},
        {',', ' ', "1 000,5;2", "1000.5,2", "1000,5;2"},
        {0x66B, 0x66C,
         "1\xD9\xAC"
         "234\xD9\xAB"
         "5",
         "1234.5",
         "1234\xD9\xAB"
         "5"},
        {',', 0x202F,
         "1\xE2\x80\xAF"
         "234,5,6",
         "1234.5.6", "1234,5,6"},
        {',', ',', "1,234", "1234", "1234"},
        {0, 0, "1,234.5;", "1,234.5;", "1,234.5;"},
        {',', '.', "", "", ""},
        {',', '.', "...", "", ""},
    };
    for (auto const& c : cases) {
        Set(c.decimal, c.grouping);
        EXPECT_EQ(ConvertFromLocalisedDecimal(c.local), c.machine) << c.local;
        EXPECT_EQ(ConvertToLocalisedDecimal(c.machine), c.back) << c.local;
        EXPECT_EQ(IsDefaultDecimalSeparator(), c.decimal == '.');
    }
}

TEST_F(SeparatorsTest, OnlyTextOfOneCodePointIsTaken)
{
    struct
    {
        char const* text;
        unsigned int expected;
    } const cases[] = {
        {",", ','},    {"\xD9\xAB", 0x66B}, {"\xF0\x9F\x98\x80", 0x1F600}, {"", '?'}, {"..", '?'},
        {"\xD9", '?'}, {"\xE2\x80,", '?'},
    };
    for (auto const& c : cases) {
        Set('?', '?');
        SetLocalDecimalSeparator(String8(c.text));
        SetLocalDigitGroupingSeparator(String8(c.text));
        EXPECT_EQ(GetLocalDecimalSeparator(), c.expected) << c.text;
        EXPECT_EQ(GetLocalGroupingSeparator(), c.expected) << c.text;
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

} // namespace
} // namespace Kernel::Test

#include "libkernel/core/NumberText.h"

#include "libkernel/core/BoolText.h"
#include "libkernel/core/FractionText.h"
#include "libkernel/core/SuperscriptText.h"

#include <gtest/gtest.h>
#include <limits>
#include <random>
#include <tuple>

namespace Kernel {
namespace {

// Units from the last to the first, one by one.
std::u16string ReadByTheRules(i64 value, SignStyle sign, CharacterGrouping const& grouping, u32 width, PadStyle pad)
{
    std::string digits = std::to_string(value);
    std::u16string text;
    if (value < 0) digits.erase(0, 1);
    std::u16string const before = value < 0                  ? u"-"
                                  : sign == SignStyle::Plus  ? u"+"
                                  : sign == SignStyle::Space ? u" "
                                                             : u"";
    u32 inGroup = 0;
    auto const put = [&](char digit) {
        if (grouping.size != 0 && inGroup++ == grouping.size) {
            text.insert(0, 1, static_cast<char16_t>(grouping.separator));
            inGroup = 1;
        }
        text.insert(0, 1, static_cast<char16_t>(digit));
    };
    for (size_t i = digits.size(); i > 0; --i) put(digits[i - 1]);
    while (pad == PadStyle::ZerosLeft && before.size() + text.size() < width) {
        put('0');
        if (before.size() + text.size() > width) text.erase(1, 1); // No separator comes first.
    }
    text = before + text;
    if (text.size() < width) text.insert(pad == PadStyle::SpacesRight ? text.size() : 0, width - text.size(), u' ');
    return text;
}

TEST(NumberTextTest, EveryStyleAndWidthReadsByTheRules)
{
    constexpr SignStyle signs[] = {SignStyle::None, SignStyle::Plus, SignStyle::Space};
    constexpr PadStyle pads[] = {PadStyle::SpacesLeft, PadStyle::ZerosLeft, PadStyle::SpacesRight};
    constexpr CharacterGrouping groupings[] = {{0, ','}, {3, ','}, {1, '.'}, {2, ' '}, {3, 0x202F}, {30, ','}};
    std::mt19937_64 random(1);
    u64 power = 1;
    for (int round = 0; round < 20000; ++round) {
        i64 value = static_cast<i64>(random() >> (random() % 64));
        if (round % 4 == 0) value = static_cast<i64>(power + random() % 3 - 1);
        if (round % 4 == 0) power = power > UINT64_MAX / 20 ? 1 : power * 10;
        SignStyle const sign = signs[random() % 3];
        PadStyle const pad = pads[random() % 3];
        CharacterGrouping const& grouping = groupings[random() % 6];
        u32 const width = random() % 4 ? static_cast<u32>(random() % 40) : 0;
        std::u16string const expected = ReadByTheRules(value, sign, grouping, width, pad);
        String16 const text = ToStringTPadded<String16>(value, static_cast<int>(width), pad, sign, &grouping);
        ASSERT_EQ(text, expected.c_str()) << value << " width " << width;
        if (grouping.separator > 0x7F) continue;
        ASSERT_EQ(ToStringPadded(value, static_cast<int>(width), pad, sign, &grouping),
                  std::string(expected.begin(), expected.end()).c_str());
        ASSERT_EQ(ToString(static_cast<u64>(value)), std::to_string(static_cast<u64>(value)).c_str());
        char hex[32];
        std::snprintf(hex, sizeof hex, "%llx", static_cast<unsigned long long>(value));
        ASSERT_EQ(ToStringBase(static_cast<u64>(value), 16, false), hex);
    }
}

TEST(NumberTextTest, EveryWidthShowsItsLimits)
{
    auto const check = []<class T>(T) {
        EXPECT_EQ(ToString(std::numeric_limits<T>::min()), std::to_string(std::numeric_limits<T>::min()).c_str());
        EXPECT_EQ(ToString(std::numeric_limits<T>::max()), std::to_string(std::numeric_limits<T>::max()).c_str());
    };
    std::apply(
        [&](auto... n) { (check(n), ...); },
        std::tuple<char, u8, short, u16, int, u32, i64, u64, long, unsigned long, long long, unsigned long long>());
    EXPECT_EQ(ToStringNumber(INT64_MIN), "-9,223,372,036,854,775,808");
    EXPECT_EQ(ToStringT<String16>(-12), u"-12");
    unsigned int const wide[] = {'1', ',', '2', '3', '4', 0};
    EXPECT_EQ(ToStringTNumber<String32>(1234), wide);
}

// One of each rule, which the slow reading may have wrong in the same way.
TEST(NumberTextTest, SignsGroupsAndFieldsReadAsPromised)
{
    EXPECT_EQ(ToString(0, SignStyle::Plus), "+0");
    EXPECT_EQ(ToString(0, SignStyle::Space), " 0");
    EXPECT_EQ(ToString(12345, SignStyle::None, CharacterGroupingHexBytes()), "1 23 45");
    EXPECT_EQ(ToString(123456789, SignStyle::None, CharacterGroupingHexWords()), "1 2345 6789");
    using Row = std::tuple<int, int, PadStyle, bool, char const*>;
    for (auto const& [value, width, pad, grouped, expected] :
         {Row{-5, 6, PadStyle::ZerosLeft, false, "-00005"}, Row{-5, 6, PadStyle::SpacesLeft, false, "    -5"},
          Row{-5, 6, PadStyle::SpacesRight, false, "-5    "}, Row{7, -9, PadStyle::ZerosLeft, false, "7"},
          Row{1234, 9, PadStyle::ZerosLeft, true, "0,001,234"}, Row{1234, 8, PadStyle::ZerosLeft, true, "0001,234"}})
        EXPECT_EQ(ToStringPadded(value, width, pad, SignStyle::None, grouped ? CharacterGroupingNumber() : nullptr),
                  expected);
    EXPECT_EQ(ToStringPadded(5u, 3, PadStyle::ZerosLeft), "005");
}

TEST(NumberTextTest, OtherBases)
{
    EXPECT_EQ(ToStringTBase(255u, 16, true), "FF") << "without a string type";
    EXPECT_EQ(ToStringBase(0u, 2, false), "0");
    EXPECT_EQ(ToStringBase(UINT64_MAX, 2, false), String8(std::string(64, '1').c_str()));
    EXPECT_EQ(ToStringBase(35u, 36, false), "z");
    EXPECT_EQ(ToStringBase(-1, 16, 4, PadStyle::ZerosLeft, false), "ffffffff");
    EXPECT_EQ(ToStringBase(static_cast<short>(-1), 16, 6, PadStyle::ZerosLeft, true), "00FFFF");
    EXPECT_EQ(ToStringBase(10, 16, 3, PadStyle::SpacesLeft, false), "  a");
    EXPECT_EQ(ToStringBase(10, 16, 3, PadStyle::SpacesRight, false), "a  ");
    for (u32 base : {0u, 1u, 37u, 4294967295u}) EXPECT_TRUE(ToStringBase(5u, base, false).IsEmpty());
    EXPECT_EQ(ToStringUnicode(0xE9, 4), "00e9");
    EXPECT_EQ(ToStringUnicode(0x1F600, 4), "1f600");
    EXPECT_EQ(ToStringPointer(reinterpret_cast<void*>(0xABC), true), "ABC");
    EXPECT_EQ(ToStringPointerPadded(reinterpret_cast<void*>(0xABC), PadStyle::ZerosLeft, false), "0000000000000abc");
}

TEST(BoolTextTest, EveryStyleHasItsWords)
{
    char const* const words[][2] = {{"true", "false"}, {"True", "False"}, {"TRUE", "FALSE"}, {"yes", "no"},
                                    {"Yes", "No"},     {"YES", "NO"},     {"on", "off"},     {"On", "Off"},
                                    {"On", "Off"},     {"1", "0"},        {"", ""}};
    for (u32 i = 0; i < std::size(words); ++i) {
        auto const style = static_cast<BoolStyle>(i);
        EXPECT_EQ(ToString(true, style), words[i][0]) << i;
        EXPECT_EQ(ToString(false, style), words[i][1]) << i;
    }
    EXPECT_TRUE(ToString(true, static_cast<BoolStyle>(0xFFFFFFFF)).IsEmpty());
    EXPECT_EQ(ToStringT<String16>(true, BoolStyle::YesNo), u"Yes");
    EXPECT_TRUE(ToString(true, BoolStyle::OnOff).SharesBlockWith(ToString(true, BoolStyle::OnOff)));
}

TEST(SuperscriptTextTest, DigitsAndSignsAreRaised)
{
    EXPECT_EQ(ToStringSuperscriptNumber(1234567890), "¹²³⁴⁵⁶⁷⁸⁹⁰");
    EXPECT_EQ(ToStringSuperscriptNumber(0, SignStyle::Plus), "⁺⁰");
    EXPECT_EQ(ToStringSuperscriptNumber(2, SignStyle::Space), " ²");
    EXPECT_EQ(ToStringSuperscriptNumber(static_cast<char>(-128), SignStyle::Plus), "⁻¹²⁸");
    EXPECT_EQ(ToStringSuperscriptNumber(INT64_MIN), "⁻⁹²²³³⁷²⁰³⁶⁸⁵⁴⁷⁷⁵⁸⁰⁸");
    EXPECT_EQ(ToStringSuperscriptT<String16>(u8{42}), u"⁴²");
    unsigned int const wide[] = {0x207B, 0xB9, 0};
    EXPECT_EQ(ToStringSuperscriptT<String32>(short{-1}), wide);
}

constexpr double c_infinity = std::numeric_limits<double>::infinity();
constexpr auto c_none = SignStyle::None;

TEST(FractionTextTest, ImperialFractionsStandInLowestTerms)
{
    using Row = std::tuple<double, u32, u32, SignStyle, char const*>;
    for (auto const& [value, most, least, sign, expected] :
         {Row{1.5, 16, 2, c_none, "1 1/2"}, Row{0.9999, 16, 2, c_none, "1"}, Row{-1.9999, 16, 2, c_none, "-2"},
          Row{-0.25, 16, 2, c_none, "-1/4"}, Row{0.25, 16, 2, SignStyle::Plus, "+1/4"},
          Row{2.25, 16, 2, SignStyle::Space, " 2 1/4"}, Row{-0.001, 16, 2, SignStyle::Plus, "+0"},
          Row{0.0, 16, 2, c_none, "0"}, Row{0.5, 16, 8, c_none, "4/8"}, Row{0.5, 16, 0, c_none, "1/2"},
          Row{0.5, 16, 4294967295, c_none, "8/16"}, Row{7.0 / 16, 16, 2, c_none, "7/16"},
          Row{3.0 / 32, 16, 2, c_none, "1/8"}, // 1.5 parts round up.
          Row{0.2, 10, 2, c_none, "2/10"}, Row{0.75, 12, 2, c_none, "3/4"}, Row{0.6, 1, 2, c_none, "1"},
          Row{3.7, 0, 2, c_none, "3"}, Row{-1e20, 16, 2, c_none, "-100000000000000000000"},
          Row{c_infinity, 16, 2, c_none, "inf"}})
        EXPECT_EQ(ToStringImperial(value, most, least, sign), expected);
    EXPECT_EQ(ToStringImperialT<String16>(1.5, 16, 2, c_none), u"1 1/2");
}

TEST(FractionTextTest, EighthsAreOneCharacter)
{
    char const* const eighths[] = {"", "⅛", "¼", "⅜", "½", "⅝", "¾", "⅞"};
    for (int i = 1; i < 8; ++i) {
        EXPECT_EQ(ToStringImperialSpecial(2 + i / 8.0, c_none), String8("2") + eighths[i]);
        EXPECT_EQ(ToStringImperialSpecial(-i / 8.0, SignStyle::Plus), String8("-") + eighths[i]);
    }
    EXPECT_EQ(ToStringImperialSpecial(2.97, SignStyle::Plus), "+3");
    EXPECT_EQ(ToStringImperialSpecial(-0.01, c_none), "0");
    EXPECT_EQ(ToStringImperialSpecialT<String16>(2.5, c_none), u"2\u00BD");
}

TEST(FractionTextTest, FractionsTellWhatTheyLose)
{
    EXPECT_FALSE(ToStringImperialWillBeApproximate(1.5, 16, 2, 0));
    EXPECT_TRUE(ToStringImperialWillBeApproximate(1.53, 16, 2, 0));
    EXPECT_FALSE(ToStringImperialWillBeApproximate(-0.09375, 16, 8, 2)) << "0.75 of an eighth, and 2 more decimals";
    EXPECT_TRUE(ToStringImperialWillBeApproximate(-0.09375, 16, 8, 1));
    EXPECT_FALSE(ToStringImperialWillBeApproximate(c_infinity, 16, 8, 1));
    EXPECT_FALSE(ToStringImperialSpecialWillBeApproximate(2.125, 0));
    EXPECT_TRUE(ToStringImperialSpecialWillBeApproximate(-2.13, 0));
    EXPECT_FALSE(ToStringImperialSpecialWillBeApproximate(2.1375, 1)) << "1.1 eighths";
}

TEST(FractionTextTest, PicasAndPoints)
{
    using Row = std::tuple<double, u32, SignStyle, TruncateStyle, char const*>;
    for (auto const& [value, precision, sign, truncate, expected] :
         {Row{1.5, 6, c_none, TruncateStyle::KeepOne, "1p6"}, Row{2.0, 6, c_none, TruncateStyle::KeepOne, "2p"},
          Row{0.5, 3, SignStyle::Plus, TruncateStyle::KeepAll, "0p6"},
          Row{18.25 / 12, 6, c_none, TruncateStyle::StripZeros, "1p6.25"},
          Row{24.5 / 12, 2, c_none, TruncateStyle::KeepAll, "2p0.50"},
          Row{-18.0 / 12, 6, c_none, TruncateStyle::KeepOne, "-1p6"},
          Row{-0.5, 6, c_none, TruncateStyle::KeepOne, "0p6"},
          Row{11.9999999 / 12, 2, c_none, TruncateStyle::KeepAll, "1p"},
          Row{1.5, 0, c_none, TruncateStyle::KeepAll, "1p6"},
          Row{1e20, 6, c_none, TruncateStyle::KeepOne, "100000000000000000000p"}})
        EXPECT_EQ(ToPicaString(value, precision, 9, sign, truncate), expected);
    EXPECT_EQ(ToPicaStringT<String16>(-2.5), u"-2p6");
}

} // namespace
} // namespace Kernel

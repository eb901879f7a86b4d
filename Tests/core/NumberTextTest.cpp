#include "libkernel/core/NumberText.h"

#include <gtest/gtest.h>
#include <random>

namespace Kernel {
namespace {

TEST(NumberTextTest, EveryMagnitudeReadsAsTheCLibraryWritesIt)
{
    std::mt19937_64 random(1);
    for (int round = 0; round < 20000; ++round) {
        u64 const value = random() >> (random() % 64);
        ASSERT_EQ(ToString(value), std::to_string(value).c_str());
        ASSERT_EQ(ToString(static_cast<i64>(value)), std::to_string(static_cast<i64>(value)).c_str());
        char hex[32];
        std::snprintf(hex, sizeof hex, "%llx", static_cast<unsigned long long>(value));
        ASSERT_EQ(ToStringBase(value, 16, false), hex);
    }
    for (u64 power = 1; power < u64{1} << 60; power *= 10)
        for (u64 value : {power - 1, power, power + 1}) ASSERT_EQ(ToString(value), std::to_string(value).c_str());
}

TEST(NumberTextTest, EveryWidthShowsItsLimits)
{
    EXPECT_EQ(ToString(static_cast<char>(-128)), "-128");
    EXPECT_EQ(ToString(u8{255}), "255");
    EXPECT_EQ(ToString(static_cast<short>(-32768)), "-32768");
    EXPECT_EQ(ToString(u16{65535}), "65535");
    EXPECT_EQ(ToString(INT32_MIN), "-2147483648");
    EXPECT_EQ(ToString(UINT32_MAX), "4294967295");
    EXPECT_EQ(ToString(INT64_MIN), "-9223372036854775808");
    EXPECT_EQ(ToString(UINT64_MAX), "18446744073709551615");
    EXPECT_EQ(ToStringNumber(INT64_MIN), "-9,223,372,036,854,775,808");
    EXPECT_EQ(ToStringT<String16>(-12), u"-12");
    unsigned int const wide[] = {'1', ',', '2', '3', '4', 0};
    EXPECT_EQ(ToStringTNumber<String32>(1234), wide);
}

TEST(NumberTextTest, SignsAndGroups)
{
    struct Case
    {
        i64 value;
        SignStyle sign;
        CharacterGrouping const* grouping;
        char const* expected;
    };
    CharacterGrouping const none{0, ','};
    for (Case const& c : {Case{1234567, SignStyle::None, CharacterGroupingNumber(), "1,234,567"},
                          Case{100, SignStyle::None, CharacterGroupingNumber(), "100"},
                          Case{1000, SignStyle::Plus, CharacterGroupingNumber(), "+1,000"},
                          Case{-999999, SignStyle::Space, CharacterGroupingNumber(), "-999,999"},
                          Case{0, SignStyle::None, nullptr, "0"}, Case{0, SignStyle::Plus, nullptr, "+0"},
                          Case{0, SignStyle::Space, nullptr, " 0"}, Case{-7, SignStyle::Plus, nullptr, "-7"},
                          Case{12345, SignStyle::None, CharacterGroupingHexBytes(), "1 23 45"},
                          Case{123456789, SignStyle::None, CharacterGroupingHexWords(), "1 2345 6789"},
                          Case{1234567, SignStyle::None, &none, "1234567"}})
    {
        SCOPED_TRACE(c.expected);
        EXPECT_EQ(ToString(c.value, c.sign, c.grouping), c.expected);
    }
}

TEST(NumberTextTest, FieldsAreFilled)
{
    struct Case
    {
        int value, width;
        PadStyle pad;
        SignStyle sign;
        bool grouped;
        char const* expected;
    };
    constexpr auto left = PadStyle::SpacesLeft;
    constexpr auto zeros = PadStyle::ZerosLeft;
    constexpr auto right = PadStyle::SpacesRight;
    for (Case const& c :
         {Case{-5, 6, zeros, SignStyle::None, false, "-00005"}, Case{-5, 6, left, SignStyle::None, false, "    -5"},
          Case{-5, 6, right, SignStyle::None, false, "-5    "}, Case{5, 3, zeros, SignStyle::Plus, false, "+05"},
          Case{123456, 3, left, SignStyle::None, false, "123456"}, Case{7, -9, zeros, SignStyle::None, false, "7"},
          Case{1234, 9, zeros, SignStyle::None, true, "0,001,234"},
          Case{1234, 8, zeros, SignStyle::None, true, "0001,234"},
          Case{1234, 7, zeros, SignStyle::None, true, "001,234"}, Case{123, 4, zeros, SignStyle::None, true, "0123"},
          Case{-123, 6, zeros, SignStyle::None, true, "-0,123"}, Case{-123, 5, zeros, SignStyle::None, true, "-0123"},
          Case{-1234, 8, left, SignStyle::None, true, "  -1,234"},
          Case{1234, 8, right, SignStyle::Space, true, " 1,234  "}, Case{0, 5, zeros, SignStyle::None, true, "0,000"}})
    {
        SCOPED_TRACE(c.expected);
        EXPECT_EQ(ToStringPadded(c.value, c.width, c.pad, c.sign, c.grouped ? CharacterGroupingNumber() : nullptr),
                  c.expected);
    }
    EXPECT_EQ(ToStringPadded(5u, 3, PadStyle::ZerosLeft), "005");
}

TEST(NumberTextTest, OtherBases)
{
    EXPECT_EQ(ToStringTBase<String8>(255u, 16, true), "FF");
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

} // namespace
} // namespace Kernel

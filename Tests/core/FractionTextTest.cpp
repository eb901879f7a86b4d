#include "libkernel/core/FractionText.h"

#include <gtest/gtest.h>
#include <limits>
#include <tuple>

namespace Kernel {
namespace {

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

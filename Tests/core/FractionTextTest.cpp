#include "libkernel/core/FractionText.h"

#include <gtest/gtest.h>
#include <limits>

namespace Kernel {
namespace {

constexpr double c_infinity = std::numeric_limits<double>::infinity();
constexpr auto c_none = SignStyle::None;

TEST(FractionTextTest, ImperialFractionsStandInLowestTerms)
{
    struct
    {
        double value;
        u32 most, least;
        SignStyle sign;
        char const* expected;
    } const cases[] = {
        {1.5, 16, 2, c_none, "1 1/2"},
        {0.9999, 16, 2, c_none, "1"},
        {-1.9999, 16, 2, c_none, "-2"},
        {-0.25, 16, 2, c_none, "-1/4"},
        {0.25, 16, 2, SignStyle::Plus, "+1/4"},
        {2.25, 16, 2, SignStyle::Space, " 2 1/4"},
        {-0.001, 16, 2, SignStyle::Plus, "+0"},
        {0.0, 16, 2, c_none, "0"},
        {0.5, 16, 8, c_none, "4/8"},
        {0.5, 16, 0, c_none, "1/2"},
        {0.5, 16, 4294967295, c_none, "8/16"},
        {7.0 / 16, 16, 2, c_none, "7/16"},
        {3.0 / 32, 16, 2, c_none, "1/8"}, // 1.5 parts round up.
        {0.2, 10, 2, c_none, "2/10"},
        {0.75, 12, 2, c_none, "3/4"},
        {0.6, 1, 2, c_none, "1"},
        {3.7, 0, 2, c_none, "3"},
        {-1e20, 16, 2, c_none, "-100000000000000000000"},
        {c_infinity, 16, 2, c_none, "inf"},
    };
    for (auto const& c : cases) EXPECT_EQ(ToStringImperial(c.value, c.most, c.least, c.sign), c.expected);
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
    struct
    {
        double value;
        u32 precision;
        SignStyle sign;
        TruncateStyle truncate;
        char const* expected;
    } const cases[] = {
        {1.5, 6, c_none, TruncateStyle::KeepOne, "1p6"},
        {2.0, 6, c_none, TruncateStyle::KeepOne, "2p"},
        {0.5, 3, SignStyle::Plus, TruncateStyle::KeepAll, "0p6"},
        {18.25 / 12, 6, c_none, TruncateStyle::StripZeros, "1p6.25"},
        {24.5 / 12, 2, c_none, TruncateStyle::KeepAll, "2p0.50"},
        {-18.0 / 12, 6, c_none, TruncateStyle::KeepOne, "-1p6"},
        {-0.5, 6, c_none, TruncateStyle::KeepOne, "0p6"},
        {11.9999999 / 12, 2, c_none, TruncateStyle::KeepAll, "1p"},
        {1.5, 0, c_none, TruncateStyle::KeepAll, "1p6"},
        {1e20, 6, c_none, TruncateStyle::KeepOne, "100000000000000000000p"},
    };
    for (auto const& c : cases) EXPECT_EQ(ToPicaString(c.value, c.precision, 9, c.sign, c.truncate), c.expected);
    EXPECT_EQ(ToPicaStringT<String16>(-2.5), u"-2p6");
}

} // namespace
} // namespace Kernel

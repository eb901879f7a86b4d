#include "libkernel/core/DoubleText.h"

#include "support/Rows.h"

#include <cmath>
#include <gtest/gtest.h>
#include <limits>
#include <random>

namespace Kernel {
namespace {

constexpr double c_infinity = std::numeric_limits<double>::infinity();
constexpr SignStyle c_signs[] = {SignStyle::None, SignStyle::Plus, SignStyle::Space};
constexpr TruncateStyle c_truncations[] = {TruncateStyle::KeepAll, TruncateStyle::StripZeros, TruncateStyle::KeepOne};

// The rules of the text one by one, on the characters that the C library prints.
std::string ReadByTheRules(double value, u32 precision, u32 width, SignStyle sign, TruncateStyle truncate)
{
    char const* const flag = sign == SignStyle::Plus ? "+" : sign == SignStyle::Space ? " " : "";
    char text[700];
    if (precision == 0) {
        std::snprintf(text, sizeof text, (std::string("%") + flag + "*lld").c_str(), static_cast<int>(width),
                      std::llround(value));
        return text;
    }
    u32 const p = std::min(precision, 12u);
    if (std::signbit(value) && -value < 1 / std::pow(10, p)) value = 0.0;
    std::snprintf(text, sizeof text, (std::string("%") + flag + "*.14f").c_str(),
                  std::max(static_cast<int>(width) - static_cast<int>(p) + 14, 0), value);
    std::string result = text;
    if (result.size() <= p + 1 || !std::isfinite(value)) return result;
    size_t const cut = result.find('.') + 1 + p;
    bool carry = result[cut] >= '5';
    result.resize(cut);
    size_t i = cut;
    while (carry && i > 0 && result[i - 1] != ' ' && result[i - 1] != '-' && result[i - 1] != '+') {
        char& unit = result[--i];
        if (unit == '.') continue;
        carry = unit == '9';
        unit = carry ? '0' : static_cast<char>(unit + 1);
    }
    if (carry) result.insert(i, "1");
    if (truncate == TruncateStyle::KeepAll) return result;
    size_t const point = result.find('.');
    size_t const last = result.find_last_not_of('0');
    size_t const least = truncate == TruncateStyle::KeepOne ? point + 2 : point;
    result.resize(last <= point ? least : std::max(least, last + 1));
    return result;
}

TEST(DoubleTextTest, ExamplesReadAsPromised)
{
    constexpr auto none = SignStyle::None;
    constexpr auto all = TruncateStyle::KeepAll;
    for (auto const& [value, precision, width, sign, truncate, expected] :
         Rows<double, u32, u32, SignStyle, TruncateStyle, char const*>{
             {0.999, 2, 0, none, all, "1.00"},
             {-0.0099, 2, 0, none, all, "0.00"},
             {-0.01, 2, 0, none, all, "-0.01"},
             {-0.0, 2, 0, SignStyle::Plus, all, "+0.00"},
             {-9.5, 0, 5, none, all, "  -10"},
             {1e300, 0, 0, none, all, "-9223372036854775808"},
             {0.125, 2, 0, none, all, "0.13"},
             {1.005, 2, 0, none, all, "1.01"},
             {-99.999, 2, 8, none, all, "  -100.00"},
             {1.5, 15, 0, none, all, "1.500000000000"},
             {1.5, 3, 9, SignStyle::Space, all, "    1.500"},
             {1.5, 3, 9, none, TruncateStyle::StripZeros, "    1.5"},
             {100.0, 4, 0, none, TruncateStyle::StripZeros, "100"},
             {100.0, 4, 0, none, TruncateStyle::KeepOne, "100.0"},
             {-c_infinity, 6, 3, none, all, "       -inf"},
             {c_infinity, 12, 0, SignStyle::Plus, TruncateStyle::StripZeros, "+inf"},
             {1.5, 3, 0xFFFFFFFF, none, all, "1.500"}})
        EXPECT_EQ(ToString(value, precision, width, sign, truncate), expected);
    EXPECT_EQ(ToStringT<String8>(1.5), "1.5");
    EXPECT_EQ(ToString(2.0), "2.0");
    EXPECT_EQ(ToString(0.1f), "0.1");
    EXPECT_EQ(ToString(0.1f, 12, 0, SignStyle::None, TruncateStyle::KeepAll), "0.100000001490");
    EXPECT_EQ(ToStringT<String16>(-12.25), u"-12.25");
    unsigned int const wide[] = {' ', '0', '.', '5', 0};
    EXPECT_EQ(ToStringT<String32>(0.5, 1, 4, SignStyle::None, TruncateStyle::KeepAll), wide);
}

// A value of one of the kinds in which rounding goes wrong most easily.
double RandomValue(std::mt19937_64& random)
{
    auto const scale = [&](int most) { return std::pow(10.0, static_cast<double>(random() % static_cast<u64>(most))); };
    double const sign = random() % 2 ? 1.0 : -1.0;
    switch (random() % 6) {
    case 0: return std::bit_cast<double>(random());
    case 1: return sign * static_cast<double>(random() % 1'000'000'000) / scale(16);
    case 2: return sign * (static_cast<double>(random() % 1'000'000) + 0.5) / scale(15); // Halves at the cut.
    case 3: return sign * std::nextafter(scale(20) / scale(20), random() % 2 ? 1e300 : 0.0);
    case 4: return sign * std::ldexp(static_cast<double>(random() % 100'000 | 1), -static_cast<int>(random() % 60));
    default: return sign * (scale(12) - std::pow(10.0, -static_cast<double>(random() % 16)) * 0.5);
    }
}

TEST(DoubleTextTest, MillionValuesReadByTheRules)
{
    std::mt19937_64 random(7);
    for (int round = 0; round < 1'000'000; ++round) {
        double const value = RandomValue(random);
        u64 const choice = random();
        u32 const precision = choice % 14;
        u32 const width = choice / 16 % 4 == 0 ? choice / 64 % 30 : 0;
        SignStyle const sign = c_signs[choice / 4096 % 3];
        TruncateStyle const truncate = c_truncations[choice / 65536 % 3];
        String8 const text = ToString(value, precision, width, sign, truncate);
        std::string const expected = ReadByTheRules(value, precision, width, sign, truncate);
        ASSERT_EQ(text.GetView(), expected)
            << std::hexfloat << value << " precision " << precision << " width " << width;
    }
}

TEST(DoubleTextTest, DebugTextIsThatOfThePrinter)
{
    double const values[] = {0.0,     0.001,   0.00099999, 1e6,   999999.99, -0.001,
                             -1e-300, 1.0 / 3, 5e-324,     1e308, c_infinity};
    for (double const value : values)
        for (int const precision : {0, 1, 6, 17, 1074, 1100, 1101, 1500})
            for (int const width : {0, 9, 60, 1600}) {
                char text[4000];
                bool const fixed = std::fabs(value) >= 0.001 && std::fabs(value) < 1e6;
                std::snprintf(text, sizeof text, fixed ? "%*.*f" : "%*.*e", width, precision, value);
                ASSERT_EQ(ToStringDebug(value, static_cast<u32>(precision), static_cast<u32>(width)), text);
            }
    EXPECT_THROW(ToStringDebug(1.0, 0xFFFFFFFF, 0), std::bad_alloc);
}

TEST(DoubleTextTest, ApproximationIsTold)
{
    for (auto const& [value, precision, extra, expected] : Rows<double, u32, u32, bool>{{1.5, 1, 0, false},
                                                                                        {1.25, 1, 0, true},
                                                                                        {-1.25, 1, 1, false},
                                                                                        {1.0 / 3, 6, 2, true},
                                                                                        {0.1, 1, 5, false},
                                                                                        {2.99999, 0, 0, false},
                                                                                        {2.9998, 0, 0, true},
                                                                                        {2.00005, 0, 0, false},
                                                                                        {2.0002, 0, 0, true},
                                                                                        {c_infinity, 2, 2, false},
                                                                                        {1.0, 4294967295, 2, false}})
        EXPECT_EQ(ToStringWillBeApproximate(value, precision, extra), expected) << value;
}

} // namespace
} // namespace Kernel

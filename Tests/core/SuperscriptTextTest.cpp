#include "libkernel/core/SuperscriptText.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

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

} // namespace
} // namespace Kernel

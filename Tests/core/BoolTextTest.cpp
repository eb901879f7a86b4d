#include "libkernel/core/BoolText.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

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

} // namespace
} // namespace Kernel

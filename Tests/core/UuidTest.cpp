#include "libkernel/core/Uuid.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

TEST(UuidTest, TextNamesTheFieldsOfAGuidAndComesBack)
{
    Uuid id = Uuid::Null;
    ASSERT_TRUE(id.Parse(String8("00112233-4455-6677-8899-aAbBcCdDeEfF")));
    u8 const expected[] = {0x33, 0x22, 0x11, 0x00, 0x55, 0x44, 0x77, 0x66,
                           0x88, 0x99, 0xAA, 0xBB, 0xCC, 0xDD, 0xEE, 0xFF};
    EXPECT_TRUE(std::equal(id.GetBytes().begin(), id.GetBytes().end(), expected));
    EXPECT_EQ(id.ToString(), "00112233-4455-6677-8899-AABBCCDDEEFF");
    for (char const* bad : {"", "00112233-4455-6677-8899-aabbccddeef", "00112233x4455-6677-8899-aabbccddeeff",
                            "{0112233-4455-6677-8899-aabbccddeeff}", "0011223g-4455-6677-8899-aabbccddeeff"})
    {
        EXPECT_FALSE(id.Parse(String8(bad))) << bad;
        EXPECT_TRUE(Uuid(bad).IsNull()) << bad;
    }
    EXPECT_EQ(id.ToString(), "00112233-4455-6677-8899-AABBCCDDEEFF");
}

TEST(UuidTest, FreshOnesDifferAndOrderIsThatOfTheTexts)
{
    for (int i = 0; i < 100; ++i) {
        Uuid const a;
        Uuid const b;
        EXPECT_FALSE(a.IsNull());
        EXPECT_NE(a, b);
        EXPECT_EQ(a.ToString().GetData()[14], '4');
        EXPECT_EQ(a < b, a.ToString() < b.ToString());
        EXPECT_EQ(Uuid(a.ToString()), a);
        EXPECT_EQ(std::hash<Uuid>()(a), std::hash<Uuid>()(Uuid(a.ToString())));
    }
}

} // namespace
} // namespace Kernel

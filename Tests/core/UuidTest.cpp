#include "libkernel/core/Uuid.h"

#include "libkernel/core/BaseCharTraits.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

TEST(UuidTest, TextShowsTheFieldsOfAGuid)
{
    Uuid const id("00112233-4455-6677-8899-AABBCCDDEEFF");
    std::array<u8, 16> const bytes{0x33, 0x22, 0x11, 0x00, 0x55, 0x44, 0x77, 0x66,
                                   0x88, 0x99, 0xAA, 0xBB, 0xCC, 0xDD, 0xEE, 0xFF};
    EXPECT_EQ(id.GetBytes(), bytes);
    EXPECT_EQ(id.ToString(), "00112233-4455-6677-8899-AABBCCDDEEFF");
    EXPECT_EQ(Uuid("00112233-4455-6677-8899-aabbccddeeff"), id);
}

TEST(UuidTest, FreshOnesDifferAndReadBack)
{
    Uuid const a;
    Uuid const b;
    EXPECT_FALSE(a.IsNull());
    EXPECT_FALSE(a == b);
    Uuid back(Uuid::Null);
    EXPECT_TRUE(back.Parse(a.ToString()));
    EXPECT_EQ(back, a);
    EXPECT_EQ(a.ToString()[14], '4'); // The version.
    EXPECT_TRUE(strchr("89AB", a.ToString()[19]));
}

TEST(UuidTest, AnyOtherTextIsRefused)
{
    for (char const* text : {"", "{00112233-4455-6677-8899-AABBCCDDEEFF}", "00112233-4455-6677-8899-AABBCCDDEEF",
                             "00112233-4455-6677-8899-AABBCCDDEEFF0", "00112233+4455-6677-8899-AABBCCDDEEFF",
                             "0011223-34455-6677-8899-AABBCCDDEEFF", "0011223G-4455-6677-8899-AABBCCDDEEFF",
                             "00112233-4455-6677-8899-AABBCCDDEE-F", "00112233445566778899AABBCCDDEEFF0000"})
    {
        SCOPED_TRACE(text);
        EXPECT_TRUE(Uuid(text).IsNull());
        Uuid kept;
        Uuid const before(kept);
        EXPECT_FALSE(kept.Parse(text));
        EXPECT_EQ(kept, before);
    }
    EXPECT_TRUE(Uuid(static_cast<char const*>(nullptr)).IsNull());
}

TEST(UuidTest, OrderIsThatOfTheTexts)
{
    for (int i = 0; i < 2000; ++i) {
        Uuid const a;
        String8 near = a.ToString();
        near.GetWritable()[i % 36 == 8 || i % 36 == 13 || i % 36 == 18 || i % 36 == 23 ? 0 : i % 36] = 'A';
        Uuid const b = i % 2 ? Uuid() : Uuid(near);
        EXPECT_EQ(a < b, BaseCharTraits<char>::Compare(a.ToString().GetData(), b.ToString().GetData()) < 0);
    }
}

} // namespace
} // namespace Kernel

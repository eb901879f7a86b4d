#include "libkernel/core/Hash.h"

#include "libkernel/core/BaseCharTraits.h"
#include "libkernel/core/Uuid.h"

#include <gtest/gtest.h>
#include <vector>

namespace Kernel {
namespace {

u32 HashOf(void const* bytes, u64 count, u32 seed)
{
    HashAccumulator hash(seed);
    hash.AddToHash(bytes, count);
    return hash.GetHash();
}

TEST(HashTest, AccumulatorGivesThePublishedValuesOfLookup3)
{
    char const text[] = "Four score and seven years ago";
    EXPECT_EQ(HashOf(text, 30, 0), 0x17770551u);
    EXPECT_EQ(HashOf(text, 30, 1), 0xCD628161u);
    EXPECT_EQ(HashOf("", 0, 0), 0xDEADBEEFu);
    EXPECT_EQ(HashOf("", 0, 0xDEADBEEF), 0xBD5B7DDEu);
}

TEST(HashTest, AlignmentDoesNotMatterAndEveryByteDoes)
{
    for (u64 count = 1; count <= 40; ++count) {
        std::vector<u8> room(count + 8, 0x55);
        u32 const first = HashOf(room.data(), count, 3);
        for (u64 shift = 1; shift < 8; ++shift) EXPECT_EQ(HashOf(room.data() + shift, count, 3), first);
        for (u64 i = 0; i < count; ++i) {
            room[i] ^= 1;
            EXPECT_NE(HashOf(room.data(), count, 3), first) << count << " " << i;
            room[i] ^= 1;
        }
    }
}

TEST(HashTest, StringsFeedTheBytesOfTheirUnits)
{
    char16_t const wide[] = u"abc\u00E9";
    unsigned int const widest[] = {'a', 0x1F600, 'c', 0};
    HashAccumulator a, b, c;
    AddToHash(a, String8("abc"));
    AddToHash(b, String16(wide));
    AddToHash(c, String32(widest));
    EXPECT_EQ(a.GetHash(), HashOf("abc", 3, 0));
    EXPECT_EQ(b.GetHash(), HashOf(wide, 8, 0));
    EXPECT_EQ(c.GetHash(), HashOf(widest, 12, 0));
}

TEST(HashTest, PointersAreHashedLowestByteFirst)
{
    // FNV-1a of eight zero bytes, and of the characters "foobar" with two zero bytes behind, step by step from the
    // published value 0x85944171F73967E8 of "foobar".
    EXPECT_EQ(HashConstVoidStar(nullptr), 0xA8C7F832281A39C5u);
    u64 const prime = 0x100000001B3;
    EXPECT_EQ(HashConstVoidStar(reinterpret_cast<void const*>(0x7261626F6F66)), 0x85944171F73967E8u * prime * prime);
}

TEST(HashTest, StringHashTakesBytesAsSigned)
{
    EXPECT_EQ(BaseCharTraits<char>::GenerateHash("", 0), 0u);
    EXPECT_EQ(BaseCharTraits<char>::GenerateHash("a", 1), 0x9E3779B9u + 'a');
    EXPECT_EQ(BaseCharTraits<char>::GenerateHash("\xFF", 1), 0x9E3779B8u);
    EXPECT_EQ(BaseCharTraits<char16_t>::GenerateHash(u"\u00FF", 1), 0x9E3779B9u + 0xFF);
    u32 const h = 0x9E3779B9u + 'a';
    EXPECT_EQ(BaseCharTraits<char>::GenerateHash("ab", 2), 'b' + (h << 6) + (h >> 2) + 0x9E3779B9u);
}

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

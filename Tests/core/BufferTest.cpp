#include "libkernel/core/Buffer.h"

#include "libkernel/core/Exception.h"

#include <gtest/gtest.h>
#include <string>

namespace Kernel {
namespace {

void Add(Buffer& buffer, std::string const& text)
{
    buffer.Append(reinterpret_cast<unsigned char const*>(text.data()), text.size());
}

std::string TextOf(RawData const& data)
{
    return data.GetData() ? std::string(static_cast<char const*>(data.GetData()), data.GetSize()) : std::string();
}

TEST(BufferTest, ConsolidateJoinsInOrderAndEmpties)
{
    Buffer buffer;
    buffer.Append(nullptr, 5);
    EXPECT_EQ(buffer.Consolidate()->GetData(), nullptr);
    std::string expected;
    for (int i = 0; i < 1000; ++i) {
        std::string const piece(static_cast<size_t>(i % 7), static_cast<char>('a' + i % 26));
        Add(buffer, piece);
        expected += piece;
    }
    EXPECT_EQ(buffer.GetSize(), expected.size());
    EXPECT_EQ(TextOf(*buffer.Consolidate()), expected);
    EXPECT_EQ(buffer.GetSize(), 0u);
    Add(buffer, "again");
    EXPECT_EQ(TextOf(*buffer.Consolidate()), "again");
}

TEST(BufferTest, MoveLeavesTheSourceEmptyAndUsable)
{
    Buffer from;
    Add(from, "abc");
    Buffer to(std::move(from));
    EXPECT_EQ(from.GetSize(), 0u);
    Add(from, "x");
    Add(to, "d");
    EXPECT_EQ(TextOf(*to.Consolidate()), "abcd");
    to = std::move(from);
    EXPECT_EQ(TextOf(*to.Consolidate()), "x");
}

TEST(BufferTest, BucketThatCannotBeHadIsRefused)
{
    Buffer buffer;
    Add(buffer, "abc");
    unsigned char const byte = 0;
    for (u64 count : {~u64{0}, ~u64{0} - 15, u64{1} << 62}) EXPECT_THROW(buffer.Append(&byte, count), MemoryException);
    EXPECT_EQ(TextOf(*buffer.Consolidate()), "abc");
}

TEST(BufferTest, ManyBucketsDieWithoutDeepRecursion)
{
    Buffer buffer;
    for (int i = 0; i < 500000; ++i) Add(buffer, "x");
    EXPECT_EQ(buffer.GetSize(), 500000u);
}

template <class T>
class RawDataTest : public testing::Test
{
};
using RawDataTypes = testing::Types<RawDataBaseT<AllocatorNew>, RawDataBaseT<AllocatorMalloc>, RawDataBlock>;
TYPED_TEST_SUITE(RawDataTest, RawDataTypes);

TYPED_TEST(RawDataTest, SizeIsKeptWhenTheMemoryIsNotThere)
{
    TypeParam const data(u64{1} << 62);
    EXPECT_EQ(data.GetData(), nullptr);
    EXPECT_EQ(data.GetSize(), u64{1} << 62);
    EXPECT_EQ(TypeParam(0).GetData(), nullptr);
}

TEST(RawDataBlockTest, ValueBlocksSwapAndMoveAlsoToThemselves)
{
    RawDataBlock a(10);
    void const* const bytes = a.GetData();
    RawDataBlock& same = a;
    a = std::move(same);
    EXPECT_EQ(a.GetData(), bytes);
    RawDataBlock b(20);
    a.Swap(b);
    EXPECT_EQ(a.GetSize(), 20u);
    EXPECT_EQ(b.GetData(), bytes);
    b.Swap(a);
    b = std::move(a);
    EXPECT_EQ(b.GetData(), bytes);
    EXPECT_EQ(b.GetSize(), 10u);
    EXPECT_EQ(a.GetSize(), 0u);
    EXPECT_EQ(a.GetData(), nullptr);
}

} // namespace
} // namespace Kernel

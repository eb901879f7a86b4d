#include "libkernel/core/FragmentedRawData.h"

#include "libkernel/streams/MemoryStreams.h"
#include "serialisation/WriterTestSupport.h"

#include <gtest/gtest.h>
#include <numeric>
#include <random>
#include <vector>

namespace Kernel {
namespace {

using Bytes = std::vector<u8>;

Bytes Pattern(u64 count, u8 seed = 1)
{
    Bytes bytes(count);
    std::iota(bytes.begin(), bytes.end(), seed);
    return bytes;
}

Bytes All(FragmentedRawData const& data)
{
    Bytes bytes(data.GetSize());
    EXPECT_EQ(data.GetData(0, bytes.data(), bytes.size()), bytes.size());
    return bytes;
}

TEST(FragmentedRawDataTest, SmallBlockSizesAreRaisedAndReadingStopsAtTheEnd)
{
    EXPECT_EQ(MakeCounted<FragmentedRawData>(16385u)->GetBlockSize(), 16385u);
    auto const data = MakeCounted<FragmentedRawData>(100u);
    EXPECT_EQ(data->GetBlockSize(), 16384u);
    Bytes const bytes = Pattern(20000);
    ASSERT_TRUE(data->SetData(0, bytes.data(), bytes.size(), false));
    u8 to[10] = {};
    for (u64 const offset : {u64{20000}, ~u64{0}}) EXPECT_EQ(data->GetData(offset, to, 10), 0u);
    EXPECT_EQ(data->GetData(19995, to, ~u64{0} - 10), 5u);
    EXPECT_EQ(to[4], bytes[19999]);
}

TEST(FragmentedRawDataTest, BehavesAsOneLongArray)
{
    std::mt19937 random(7);
    auto const data = MakeCounted<FragmentedRawData>(0u);
    Bytes model;
    for (int step = 0; step < 300; ++step) {
        u64 const offset = random() % 60000;
        u64 const count = random() % 40000;
        switch (random() % 4) {
        case 0:
            ASSERT_TRUE(data->SetSize(offset, true));
            model.resize(offset);
            break;
        case 1:
            data->ZeroRange(offset, count);
            if (offset < model.size())
                std::fill_n(model.begin() + static_cast<i64>(offset), std::min(count, model.size() - offset), u8{0});
            break;
        default:
            Bytes const bytes = Pattern(count, static_cast<u8>(random()));
            ASSERT_TRUE(data->SetData(offset, bytes.data(), count, true));
            model.resize(std::max<u64>(model.size(), offset + count));
            std::copy(bytes.begin(), bytes.end(), model.begin() + static_cast<i64>(offset));
        }
        ASSERT_EQ(All(*data), model) << step;
    }
}

TEST(FragmentedRawDataTest, RefusedGrowthLeavesTheObjectAsItWas)
{
    Bytes const bytes = Pattern(20000);
    for (u64 size : {~u64{0}, u64{1} << 62, u64{1} << 50}) {
        SCOPED_TRACE(size);
        auto const data = MakeCounted<FragmentedRawData>(0u);
        ASSERT_TRUE(data->SetData(0, bytes.data(), bytes.size(), false));
        EXPECT_FALSE(data->SetSize(size, true));
        EXPECT_FALSE(data->SetData(size, bytes.data(), 100, true));
        EXPECT_EQ(All(*data), bytes);
    }
    for (u64 blockSize : {~u64{0}, ~u64{0} - 16384, u64{1} << 63}) {
        SCOPED_TRACE(blockSize);
        auto const data = MakeCounted<FragmentedRawData>(blockSize);
        EXPECT_FALSE(data->SetSize(1, true));
        EXPECT_FALSE(data->SetData(0, bytes.data(), 1, true));
        auto const in = MakeCounted<MemoryInStream>(bytes.data(), bytes.size(), false);
        EXPECT_EQ(data->SetDataFromStream(0, *in, 1, true), 0u);
        EXPECT_EQ(in->TellInStream(), 0u);
        EXPECT_EQ(data->GetSize(), 0u);
    }
}

TEST(FragmentedRawDataTest, StreamThatEndsEarlyGivesItsCount)
{
    auto const data = MakeCounted<FragmentedRawData>(0u);
    Bytes const bytes = Pattern(40000);
    auto const in = MakeCounted<MemoryInStream>(bytes.data(), bytes.size(), false);
    EXPECT_EQ(data->SetDataFromStream(10, *in, 50000, true), 40000u);
    EXPECT_EQ(data->GetSize(), 50010u);
    Bytes to(40000);
    data->GetData(10, to.data(), to.size());
    EXPECT_EQ(to, bytes);
    EXPECT_EQ(All(*data)[9], 0);
}

TEST(FragmentedRawDataTest, CopyFailsAtTheFirstShortWrite)
{
    auto const data = MakeCounted<FragmentedRawData>(0u);
    Bytes const bytes = Pattern(50000);
    ASSERT_TRUE(data->SetData(0, bytes.data(), bytes.size(), false));
    for (u64 limit : {50000, 49999, 16384, 0}) {
        Kernel::Test::PlainTarget out(limit);
        EXPECT_EQ(data->CopyToStream(out), limit == bytes.size());
        EXPECT_EQ(out.bytes, std::string(bytes.begin(), bytes.begin() + static_cast<i64>(limit)));
    }
}

} // namespace
} // namespace Kernel

#include "libkernel/streams/FragmentedRawDataStream.h"

#include "StreamTestSupport.h"
#include "libkernel/core/FragmentedRawData.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using namespace Test;

TEST(FragmentedRawDataStreamTest, StartsAtTheEndAndCrossesBlocks)
{
    std::string const text = Pattern(50'000);
    auto data = MakeCounted<FragmentedRawData>(u64{16384});
    ASSERT_TRUE(data->SetData(0, text.data(), 100, false));
    Counted<FragmentedRawDataStream> const stream = FragmentedRawDataStream::Create(data);
    EXPECT_EQ(stream->Tell(), 100u);
    EXPECT_EQ(ReadAll(*stream), "");
    EXPECT_EQ(stream->WriteBlock(text.data() + 100, text.size() - 100), text.size() - 100);
    EXPECT_TRUE(stream->Rewind());
    EXPECT_TRUE(ReadAll(*stream, 7000) == text);
    EXPECT_TRUE(stream->EOS());
    EXPECT_TRUE(stream->WriteBlockAtPos(16'383, "XYZ", 3));
    EXPECT_TRUE(stream->Seek(16'383));
    EXPECT_EQ(ReadAll(*stream, 3).substr(0, 3), "XYZ");
    EXPECT_FALSE(FragmentedRawDataStream::Create(nullptr));
}

TEST(FragmentedRawDataStreamTest, ASeekBeyondTheEndGrowsTheDataAndOneBeyondMemoryFails)
{
    auto data = MakeCounted<FragmentedRawData>(u64{16384});
    Counted<FragmentedRawDataStream> const stream = FragmentedRawDataStream::Create(data);
    EXPECT_TRUE(stream->Seek(20'000));
    EXPECT_EQ(data->GetSize(), 20'000u);
    EXPECT_FALSE(stream->Seek(INT64_MAX));
    EXPECT_EQ(stream->WriteBlock("x", ~u64{0}), 0u);
    EXPECT_EQ(stream->Tell(), 20'000u);

    ASSERT_TRUE(data->SetSize(10, false));
    EXPECT_EQ(ReadAll(*stream), "") << "the data was cut below the position";
    EXPECT_EQ(Write(*stream, "a"), 1u);
    EXPECT_EQ(stream->GetSize(), 20'001u);

    auto huge = MakeCounted<FragmentedRawData>(~u64{0});
    EXPECT_EQ(Write(*FragmentedRawDataStream::Create(huge), "a"), 0u);
    EXPECT_EQ(huge->GetSize(), 0u);
}

} // namespace
} // namespace Kernel

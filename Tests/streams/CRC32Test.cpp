#include "libkernel/streams/CRC32.h"

#include <gtest/gtest.h>
#include <random>
#include <vector>

namespace Kernel {
namespace {

u32 CrcBitByBit(u8 const* p, u64 count)
{
    u32 crc = 0xFFFFFFFFu;
    for (u64 i = 0; i < count; ++i) {
        crc ^= p[i];
        for (int bit = 0; bit < 8; ++bit) crc = crc & 1 ? crc >> 1 ^ 0xEDB88320u : crc >> 1;
    }
    return ~crc;
}

TEST(CRC32Test, PublishedValuesAndMissingData)
{
    struct Case
    {
        char const* text;
        u32 crc;
    };
    u32 crc = 1;
    for (Case const& c : {Case{"", 0u}, Case{"123456789", 0xCBF43926u}, Case{"IEND", 0xAE426082u}}) {
        EXPECT_TRUE(CRC32::StringCRC32(c.text, crc));
        EXPECT_EQ(crc, c.crc) << c.text;
    }
    EXPECT_FALSE(CRC32::DataCRC32(nullptr, 1, crc));
    EXPECT_FALSE(CRC32::StringCRC32(nullptr, crc));
    EXPECT_TRUE(CRC32::DataCRC32(nullptr, 0, crc));
}

TEST(CRC32Test, EveryLengthAndAlignmentAgreesWithTheDefinitionWholeAndInPieces)
{
    std::mt19937 random(1);
    std::vector<u8> data(800);
    for (u8& b : data) b = static_cast<u8>(random());
    for (u64 start = 0; start < 16; ++start)
        for (u64 length = 0; length <= 700; ++length) {
            u32 const expected = CrcBitByBit(data.data() + start, length);
            u32 crc = 0;
            CRC32::DataCRC32(data.data() + start, length, crc);
            ASSERT_EQ(crc, expected) << start << " " << length;
            CRC32::BeginCRC32(crc);
            if (length > 0) CRC32::CalcCRC32(data[start], crc);
            for (u64 at = 1, piece; at < length; at += piece) {
                piece = std::min<u64>(1 + random() % 400, length - at);
                CRC32::CalcCRC32(data.data() + start + at, piece, crc);
            }
            CRC32::EndCRC32(crc);
            ASSERT_EQ(crc, expected) << start << " " << length << " in pieces";
        }
}

} // namespace
} // namespace Kernel

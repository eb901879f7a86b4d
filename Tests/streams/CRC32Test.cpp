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

TEST(CRC32Test, PublishedValues)
{
    struct Case
    {
        char const* text;
        u32 crc;
    };
    for (Case const& c :
         {Case{"", 0u}, Case{"a", 0xE8B7BE43u}, Case{"abc", 0x352441C2u}, Case{"123456789", 0xCBF43926u},
          Case{"IEND", 0xAE426082u}, Case{"The quick brown fox jumps over the lazy dog", 0x414FA339u}})
    {
        u32 crc = 1;
        EXPECT_TRUE(CRC32::StringCRC32(c.text, crc));
        EXPECT_EQ(crc, c.crc) << c.text;
    }
    std::vector<u8> const zeros(32, 0);
    u32 crc = 1;
    EXPECT_TRUE(CRC32::Instance().DataCRC32(zeros.data(), zeros.size(), crc));
    EXPECT_EQ(crc, 0x190A55ADu);
    EXPECT_FALSE(CRC32::DataCRC32(nullptr, 1, crc));
    EXPECT_FALSE(CRC32::StringCRC32(nullptr, crc));
    EXPECT_TRUE(CRC32::DataCRC32(nullptr, 0, crc));
}

TEST(CRC32Test, EveryLengthAndAlignmentAgreesWithTheDefinition)
{
    std::mt19937 random(1);
    std::vector<u8> data(800);
    for (u8& b : data) b = static_cast<u8>(random());
    for (u64 start = 0; start < 16; ++start)
        for (u64 length = 0; length <= 700; ++length) {
            u32 crc = 0;
            CRC32::DataCRC32(data.data() + start, length, crc);
            ASSERT_EQ(crc, CrcBitByBit(data.data() + start, length)) << start << " " << length;
        }
}

TEST(CRC32Test, PiecesGiveTheSameAsTheWhole)
{
    std::mt19937 random(2);
    std::vector<u8> data(100000);
    for (u8& b : data) b = static_cast<u8>(random());
    u32 crc;
    CRC32::BeginCRC32(crc);
    for (u64 at = 0, piece; at < data.size(); at += piece) {
        piece = std::min<u64>(random() % 700, data.size() - at);
        if (piece == 1)
            CRC32::CalcCRC32(data[at], crc);
        else
            CRC32::CalcCRC32(data.data() + at, piece, crc);
    }
    CRC32::EndCRC32(crc);
    EXPECT_EQ(crc, CrcBitByBit(data.data(), data.size()));
}

} // namespace
} // namespace Kernel

#include "support/ArchiveFixture.h"
#include "support/FakeClock.h"

#include <cctype>
#include <cstdio>
#include <gtest/gtest.h>

// The expected bytes are written out from the layout of the file, field by field.

namespace KernelTest {
namespace {

using namespace Kernel;

constexpr i64 c_now = 0x5F5E1000; // Its bytes: 00 10 5E 5F.

using ArchiveFormatTest = DocumentTest;

std::string Hex(std::string const& text)
{
    std::string bytes;
    std::string digits;
    for (char c : text) {
        if (!std::isxdigit(static_cast<unsigned char>(c))) continue;
        digits += c;
        if (digits.size() < 2) continue;
        bytes += static_cast<char>(std::stoi(digits, nullptr, 16));
        digits.clear();
    }
    return bytes;
}

std::string ToHex(std::string const& bytes)
{
    std::string text;
    for (unsigned char c : bytes) {
        char two[4];
        std::snprintf(two, sizeof(two), "%02X ", c);
        text += two;
    }
    return text;
}

TEST_F(ArchiveFormatTest, FreshScratchFileLinksToItsMaster)
{
    TestSupport::FakeClock const clock(c_now);
    Counted<Archive> const archive = CreateDocument(m_path);
    ASSERT_TRUE(archive);
    Archive::CreateResult result;
    ASSERT_TRUE(archive->AddScratchFile(Str(m_scratchPath), result));

    std::string const bytes = ReadWhole(m_scratchPath);
    u64 const n = m_path.size();
    EXPECT_EQ(ReadWhole(m_path).size(), 72u);
    ASSERT_EQ(bytes.size(), 86 + n);
    std::string expected = Hex("00 FF 4B 41  0B 00  01 00  75 63 6F 44"
                               "23 49 6E 66  00 00 00 00 00 00 00 00");
    expected += static_cast<char>(86 + n); // FileEnd; the folder's path is short.
    expected += Hex("00 00 00 00 00 00 00"
                    "00 00 00 00 00 00 00 00  00 00 00 00 00 00 00 00"
                    "00 10 5E 5F 00 00 00 00  01 00 00 00  01 00 00 00"
                    "50 72 6F 74  01 00 00 00"
                    "00 10 5E 5F 00 00 00 00  01 00 00 00"); // the master's time stamp and save count
    expected += static_cast<char>(n);
    expected += '\0';
    expected += m_path;
    EXPECT_EQ(ToHex(bytes), ToHex(expected));
}

TEST_F(ArchiveFormatTest, OneItemDocumentIsBlockTableAndNewInfo)
{
    TestSupport::FakeClock const clock(c_now);
    Counted<Archive> const archive = CreateDocument(m_path);
    ASSERT_TRUE(Save(*archive, {{"x.t", "123456789"}}));

    std::string bytes = ReadWhole(m_path);
    ASSERT_EQ(bytes.size(), 72u + 17 + 59 + 47);
    // How often the guard was passed is the writer's own affair.
    bytes.replace(68, 4, "????");
    std::string expected = Hex("00 FF 4B 41  0B 00  00 00  75 63 6F 44"
                               "23 49 6E 66"
                               "59 00 00 00 00 00 00 00" // FirstFAT 89
                               "C3 00 00 00 00 00 00 00" // FileEnd 195
                               "09 00 00 00 00 00 00 00" // TotalBytes 9
                               "00 00 00 00 00 00 00 00"
                               "00 10 5E 5F 00 00 00 00"
                               "02 00 00 00  02 00 00 00"
                               "50 72 6F 74");
    expected += "????";
    expected += Hex("23 46 69 6C  31 32 33 34 35 36 37 38 39  FF FF FF FF" // "#Fil", the bytes, terminator
                    "23 46 54 34"                                          // "#FT4"
                    "00 00 00 00 00 00 00 00"                              // NextFAT
                    "00 10 5E 5F 00 00 00 00"                              // TimeStamp
                    "C3 00 00 00 00 00 00 00"                              // FileEnd
                    "09 00 00 00 00 00 00 00  00 00 00 00 00 00 00 00"     // TotalBytes, DeadBytes
                    "01 00 00 00  00 00 00 00  2F 00 00 00  00 00  00"     // 1 record, no user data, body 47, tag 0
                    "01 00 00 00  00"                                      // UID 1, added
                    "48 00 00 00 00 00 00 00"                              // FilePos 72
                    "09 00 00 00 00 00 00 00  09 00 00 00 00 00 00 00"     // sizes
                    "26 39 F4 CB"                                          // CRC of "123456789"
                    "00  18 00 00 00  26 39 F4 CB"                         // direct, build 24, CRC as stored
                    "03 00  78 2E 74");                                    // "x.t"
    EXPECT_EQ(ToHex(bytes), ToHex(expected));
}

TEST_F(ArchiveFormatTest, ThumbnailBlockLiesBehindTheTable)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    ASSERT_TRUE(InSession(*archive, [](ArchiveSession& session) {
        session.CreateFile(Str("x"), MakeCounted<BytesItem>("1"));
        session.SetThumbnails(MakeThumbnails("abc"));
    }));

    std::string const bytes = ReadWhole(m_path);
    u64 const end = StateOf(*archive).fileEnd;
    EXPECT_EQ(ToHex(bytes.substr(end)), ToHex(Hex("FF FF FF FF  54 68 6D 62  01 00 00 00  10 00 00 00"
                                                  "1D 00 00 00 00 00 00 00  03 00 00 00  01"
                                                  "61 62 63")));
    Counted<Archive> const again = OpenDocument(m_path, Archive::OpenModeReadOnly);
    ASSERT_TRUE(again && again->LoadThumbnails());
    EXPECT_EQ(again->LoadThumbnails()->GetRecs().size(), 1u);
    // A save that sets none drops them.
    ASSERT_TRUE(Save(*archive, {{"x", "2"}}));
    EXPECT_FALSE(archive->LoadThumbnails());
}

} // namespace
} // namespace KernelTest

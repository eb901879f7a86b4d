#include "libkernel/core/UnicodeFile.h"

#include "libkernel/core/CharTraits.h"
#include "support/TempFolder.h"

#include <gtest/gtest.h>
#include <random>
#include <sys/stat.h>

using namespace Kernel;
using namespace std::string_literals;

namespace {

std::string ToUtf8(int encoding, std::string const& bytes, bool allowZero = false)
{
    String8 const text =
        ConvertToUtf8(static_cast<UnicodeEncoding>(encoding), reinterpret_cast<u8 const*>(bytes.data()),
                      static_cast<i64>(bytes.size()), allowZero);
    return {text.GetData(), static_cast<size_t>(text.GetLength())};
}

TEST(UnicodeFile, MarksAreFoundWhole)
{
    struct
    {
        std::string bytes;
        int encoding;
    } const cases[] = {
        {"", 0},
        {"\xFF", 0},
        {"ab", 0},
        {"\xEF\xBB", 0},
        {"\xEF\xBB\xBF", 1},
        {"\xFF\xFE", 2},
        {"\xFF\xFE\0"s, 2},
        {"\xFF\xFE"
         "A\0"s,
         2},
        {"\xFE\xFF", 3},
        {"\xFF\xFE\0\0"s, 4},
        {"\0\0\xFE\xFF"s, 5},
        {"\0\0\xFE"s, 0},
    };
    for (auto const& c : cases)
        EXPECT_EQ(static_cast<int>(
                      GetByteOrderMark(reinterpret_cast<u8 const*>(c.bytes.data()), static_cast<i64>(c.bytes.size()))),
                  c.encoding)
            << testing::PrintToString(c.bytes);
}

TEST(UnicodeFile, EachEncodingIsCutWhereItGoesWrong)
{
    std::string const smile = "\U0001F600";
    struct
    {
        int encoding;
        std::string bytes;
        std::string text;
    } const cases[] = {
        {0, "a\u20AC", "a\u20AC"},
        {1,
         "\xEF\xBB\xBF"
         "a",
         "a"},
        {1, "\xEF\xBB\xBF", ""},
        {6,
         "\xEF\xBB\xBF"
         "a",
         "\uFEFF"
         "a"},
        {2,
         "\xFF\xFE"
         "a\0\x3D\xD8\x00\xDE"s,
         "a" + smile},
        {3, "\xFE\xFF\0a\xD8\x3D\xDE\x00"s, "a" + smile},
        {7, "a\0\x3D\xD8\x00\xDE"s, "a" + smile},
        {8, "\0a\xD8\x3D\xDE\x00"s, "a" + smile},
        {4, "\xFF\xFE\0\0a\0\0\0\x00\xF6\x01\0"s, "a\U0001F600"},
        {5, "\0\0\xFE\xFF\0\0\0a\0\x01\xF6\x00"s, "a\U0001F600"},
        {9, "a\0\0\0\x00\xF6\x01\0"s, "a" + smile},
        {10, "\0\0\0a\0\x01\xF6\x00"s, "a" + smile},
        // Cut or ill-formed.
        {6, "a\xF0", "a"},
        {6, "a\xE2\x82", "a"},
        {6,
         "a\x80"
         "b",
         "a"},
        {2,
         "\xFF\xFE"
         "a\0\x00\xDE"
         "b\0"s,
         "a"}, // Lone trail surrogate.
        {7, "a\0\x3D\xD8"s, "a"},
        {7, "a\0b"s, "a"},
        {8, "\0a\xD8\x3D"s, "a"},
        {8, "\0a\xD8\x3D\0b"s, "a"},
        {8, "\0a\xDE\x00\0b"s, "a"},
        {8, "\0a\0"s, "a"},
        {9, "a\0\0\0\x00\xD8\0\0"s, "a"},
        {9, "a\0\0\0b\0\0"s, "a"},
        {10, "\0\0\0a\0\x11\0\0"s, "a"},
        {10, "\0\0\0a\0\0\xD8\0"s, "a"},
        {11, "a", ""},
        {-1, "a", ""},
        {6, "", ""},
    };
    for (auto const& c : cases)
        EXPECT_EQ(ToUtf8(c.encoding, c.bytes), c.text) << c.encoding << ": " << testing::PrintToString(c.bytes);
}

TEST(UnicodeFile, ZeroEndsTheTextUnlessAllowed)
{
    std::string const zeros[] = {"a\0b"s, "a\0\0\0b\0"s, "\0a\0\0\0b"s, "a\0\0\0\0\0\0\0b\0\0\0"s,
                                 "\0\0\0a\0\0\0\0\0\0\0b"s};
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(ToUtf8(6 + i, zeros[i]), "a");
        EXPECT_EQ(ToUtf8(6 + i, zeros[i], true), "a\0b"s);
    }
}

TEST(UnicodeFile, RandomBytesGiveValidText)
{
    std::mt19937 random(3);
    for (int round = 0; round < 4000; ++round) {
        std::string bytes(random() % 24, 0);
        for (char& c : bytes) c = static_cast<char>(random() % 4 ? random() : 0xD8);
        std::string const text = ToUtf8(static_cast<int>(random() % 12), bytes, round % 2 != 0);
        ASSERT_TRUE(CharTraits<TEncUtf8>::IsValid(text.data(), static_cast<int>(text.size()), round % 2 != 0));
    }
}

TEST(UnicodeFile, LoadsByTheMarkAndOnlyRegularFiles)
{
    TestSupport::TempFolder const folder;
    struct
    {
        std::string bytes;
        char const* text;
    } const cases[] = {
        {"plain", "plain"},
        {"\xFF\xFE"
         "a\0"s,
         "a"},
        {"\xEF\xBB\xBF"
         "a\n",
         "a\n"},
        {"a\xFF", "a"},
        {"", ""},
    };
    for (auto const& c : cases) {
        TestSupport::WriteWholeFile(folder / "text", c.bytes);
        EXPECT_EQ(LoadAsUtf8(String8(std::string_view(folder / "text")), false), c.text);
    }
    ASSERT_EQ(mkfifo((folder / "fifo").c_str(), 0600), 0);
    for (std::string const& path : {folder / "fifo", folder.GetPath(), folder / "none", "/dev/zero"s, ""s})
        EXPECT_TRUE(LoadAsUtf8(String8(std::string_view(path)), true).IsEmpty()) << path;
}

} // namespace

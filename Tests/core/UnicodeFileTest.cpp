#include "libkernel/core/UnicodeFile.h"

#include "support/TempFolder.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <tuple>

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
    using Row = std::tuple<std::string, int>;
    for (auto const& [bytes, encoding] :
         {Row{"", 0}, Row{"\xFF", 0}, Row{"ab", 0}, Row{"\xEF\xBB", 0}, Row{"\xEF\xBB\xBF", 1}, Row{"\xFF\xFE", 2},
          Row{"\xFF\xFE\0"s, 2}, Row{"\xFF\376A\0"s, 2}, Row{"\xFE\xFF", 3}, Row{"\xFF\xFE\0\0"s, 4},
          Row{"\0\0\xFE\xFF"s, 5}, Row{"\0\0\xFE"s, 0}})
        EXPECT_EQ(static_cast<int>(
                      GetByteOrderMark(reinterpret_cast<u8 const*>(bytes.data()), static_cast<i64>(bytes.size()))),
                  encoding)
            << testing::PrintToString(bytes);
}

TEST(UnicodeFile, EachEncodingIsCutWhereItGoesWrong)
{
    std::string const smile = "\U0001F600";
    using Row = std::tuple<int, std::string, std::string>;
    for (auto const& [encoding, bytes, text] :
         {Row{0, "a\u20AC", "a\u20AC"}, Row{1, "\xEF\xBB\277a", "a"}, Row{1, "\xEF\xBB\xBF", ""},
          Row{6, "\xEF\xBB\277a",
              "\uFEFF"
              "a"},
          Row{2, "\xFF\376a\0\x3D\xD8\x00\xDE"s, "a" + smile}, Row{3, "\xFE\xFF\0a\xD8\x3D\xDE\x00"s, "a" + smile},
          Row{7, "a\0\x3D\xD8\x00\xDE"s, "a" + smile}, Row{8, "\0a\xD8\x3D\xDE\x00"s, "a" + smile},
          Row{4, "\xFF\xFE\0\0a\0\0\0\x00\xF6\x01\0"s, "a\U0001F600"},
          Row{5, "\0\0\xFE\xFF\0\0\0a\0\x01\xF6\x00"s, "a\U0001F600"}, Row{9, "a\0\0\0\x00\xF6\x01\0"s, "a" + smile},
          Row{10, "\0\0\0a\0\x01\xF6\x00"s, "a" + smile},
          // Cut or ill-formed.
          Row{6, "a\xF0", "a"}, Row{6, "a\xE2\x82", "a"}, Row{6, "a\200b", "a"},
          Row{2,
              "\xFF\376a\0\x00\xDE"
              "b\0"s,
              "a"}, // Lone trail surrogate.
          Row{7, "a\0\x3D\xD8"s, "a"}, Row{7, "a\0b"s, "a"}, Row{8, "\0a\xD8\x3D"s, "a"},
          Row{8, "\0a\xD8\x3D\0b"s, "a"}, Row{8, "\0a\xDE\x00\0b"s, "a"}, Row{8, "\0a\0"s, "a"},
          Row{9, "a\0\0\0\x00\xD8\0\0"s, "a"}, Row{9, "a\0\0\0b\0\0"s, "a"}, Row{10, "\0\0\0a\0\x11\0\0"s, "a"},
          Row{10, "\0\0\0a\0\0\xD8\0"s, "a"}, Row{11, "a", ""}, Row{-1, "a", ""}, Row{6, "", ""}})
        EXPECT_EQ(ToUtf8(encoding, bytes), text) << encoding << ": " << testing::PrintToString(bytes);
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

TEST(UnicodeFile, LoadsByTheMarkAndOnlyRegularFiles)
{
    TestSupport::TempFolder const folder;
    using Row = std::tuple<std::string, char const*>;
    for (auto const& [bytes, text] : {Row{"plain", "plain"}, Row{"\xFF\376a\0"s, "a"}, Row{"\xEF\xBB\277a\n", "a\n"},
                                      Row{"a\xFF", "a"}, Row{"", ""}})
    {
        TestSupport::WriteWholeFile(folder / "text", bytes);
        EXPECT_EQ(LoadAsUtf8(String8(std::string_view(folder / "text")), false), text);
    }
    ASSERT_EQ(mkfifo((folder / "fifo").c_str(), 0600), 0);
    for (std::string const& path : {folder / "fifo", folder.GetPath(), folder / "none", "/dev/zero"s, ""s})
        EXPECT_TRUE(LoadAsUtf8(String8(std::string_view(path)), true).IsEmpty()) << path;
}

} // namespace

#include "libkernel/core/StringConverter.h"

#include "libkernel/core/ConvertEnc.h"
#include "support/Rows.h"
#include "support/TempFolder.h"

#include <cstring>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <tuple>

using namespace Kernel;
using namespace std::string_literals;

namespace {

String8 Text(std::string const& text)
{
    return String8(std::string_view(text));
}

TEST(StringConverter, EveryRoadGivesTheSameText)
{
    using Row = std::tuple<char const*, std::string, char const*>;
    for (auto const& [charset, bytes, text] :
         {Row{"UTF-8", "a\u20AC", "a\u20AC"}, Row{"windows-1252", "a\x80", "a\u20AC"},
          Row{"Shift_JIS", "\x82\xA0", "\u3042"}, Row{"ISO-2022-JP", "\x1B$B$\"\x1B(B", "\u3042"},
          Row{"gb18030", "\x94\x39\xFC\x36", "\U0001F600"}, Row{"UTF-8", "", ""}, Row{"windows-1252", "", ""}})
    {
        SCOPED_TRACE(charset);
        EXPECT_EQ(StringConverter(charset).Convert(bytes.c_str()), text);
        EXPECT_EQ(EncodedToUtf8(bytes.c_str(), charset), text);
        EXPECT_EQ(EncodedToUtf16(bytes.c_str(), charset), ConvertedTo<TEncUtf16>(String8(text)));
        EXPECT_STREQ(Utf8ToEncoded(text, charset).get(), bytes.c_str());
    }
    StringConverter again("ISO-2022-JP");
    EXPECT_EQ(again.Convert("\x1B$B$\""), "\u3042"); // Left in the Japanese set.
    EXPECT_EQ(again.Convert("a"), "a");
    auto const wide = Utf8ToEncoded("a", "UTF-32BE");
    EXPECT_EQ(std::string(wide.get(), 8), "\0\0\0a\0\0\0\0"s);
}

TEST(StringConverter, SurrogatesWithoutPartnerAreReplaced)
{
    // One unit in the compressed scheme's Unicode mode, and in the middle and at the end of UTF-7.
    EXPECT_EQ(EncodedToUtf8("\x0E\xD8\075a", "SCSU"), "\uFFFDa");
    EXPECT_EQ(EncodedToUtf8("+2D0-a", "UTF-7"), "\uFFFDa");
    EXPECT_EQ(EncodedToUtf16("a+2D0-", "UTF-7"), String16(u"a\uFFFD"));
}

TEST(StringConverter, UnknownCharsetsAndCutTextsHaveTheirAnswers)
{
    EXPECT_EQ(StringConverter("no such").Convert("a\u20AC"), "a\u20AC");
    EXPECT_TRUE(EncodedToUtf8("a", "no such").IsEmpty());
    EXPECT_TRUE(EncodedToUtf16("a", "no such").IsEmpty());
    EXPECT_FALSE(Utf8ToEncoded("a", "no such"));
    for (char const* cut : {"a\xF0", "a\xE2\x82", "a\xC3", "a\x80"}) {
        EXPECT_EQ(StringConverter("UTF-8").Convert(cut), "a");
        EXPECT_EQ(EncodedToUtf8(cut, "UTF-8"), "a");
        EXPECT_EQ(EncodedToUtf16(cut, "UTF-8").GetLength(), 1);
        EXPECT_STREQ(Utf8ToEncoded(cut, "windows-1252").get(), "a");
    }
}

TEST(StringConverter, EachByteKnowsItsUnit)
{
    std::vector<char> bytes{'x'};
    std::vector<int> sources{1};
    Rows<char const*, String8, std::string, std::vector<int>> const cases = {
        {"windows-1252", "a\u20ACb", "a\200b", {0, 1, 2}},
        {"Shift_JIS", "a\u3042b", "a\x82\240b", {0, 1, 1, 2}},
        {"UTF-8", "\U0001F600b", "\U0001F600b", {0, 0, 0, 0, 2}},
        {"windows-1252", "", "", {}}};
    for (auto const& [charset, text, encoded, places] : cases) {
        EXPECT_TRUE(Utf16ToEncoded(bytes, sources, ConvertedTo<TEncUtf16>(text), charset));
        EXPECT_EQ(std::string(bytes.begin(), bytes.end()), encoded);
        EXPECT_EQ(sources, places);
    }
    EXPECT_FALSE(Utf16ToEncoded(bytes, sources, String16(u"a"), "no such"));
    EXPECT_TRUE(bytes.empty() && sources.empty());
}

TEST(StringConverter, CharsetIsGuessedFromFilesAndBytes)
{
    TestSupport::TempFolder const folder;
    std::string const french =
        "Voil\xE0 l'\xE9t\xE9 qui s'en va, et d\xE9j\xE0 la for\xEAt a des couleurs plus \xE2pres.";
    using Row = std::tuple<std::string, char const*>;
    for (auto const& [bytes, charset] :
         {Row{french, "ISO-8859-1"}, Row{"\u3042\u3044\u3046 \u4E00\u4E8C", "UTF-8"}, Row{"", ""}})
    {
        TestSupport::WriteWholeFile(folder / "text", bytes);
        EXPECT_EQ(IcuCharsetDetect(Text(folder / "text")), charset);
        std::unique_ptr<char[]> copy(new char[bytes.size()]);
        if (!bytes.empty()) std::memcpy(copy.get(), bytes.data(), bytes.size());
        EXPECT_EQ(IcuCharsetDetect(std::move(copy), static_cast<i64>(bytes.size())), charset);
    }
    EXPECT_TRUE(IcuCharsetDetect(nullptr, 5).IsEmpty());
    EXPECT_TRUE(IcuCharsetDetect("/dev/zero").IsEmpty());
}

TEST(StringConverter, TextFilesComeWithPlainLineEnds)
{
    TestSupport::TempFolder const folder;
    // The compressed scheme reads two units from each byte here, beyond the room that its shortest character gives.
    std::string const dense = "\x0B\x07\xEC" + std::string(100, '\x80');
    using Row = std::tuple<std::string, char const*, char const*>;
    for (auto const& [bytes, charset, text] :
         {Row{"a\x80\r\nb\r", "windows-1252", "a\u20AC\nb\n"}, Row{"a\0\x0D\0\x0A\0"s, "UTF-16LE", "a\n"},
          Row{"a", "no such", ""}, Row{"", "windows-1252", ""}, Row{dense, "SCSU", ""}})
    {
        TestSupport::WriteWholeFile(folder / "text", bytes);
        EXPECT_EQ(IcuLoadTextFile(Text(folder / "text"), charset), text) << charset;
    }
    EXPECT_FALSE(EncodedToUtf8(dense.c_str(), "SCSU").IsEmpty());
    ASSERT_EQ(mkfifo((folder / "fifo").c_str(), 0600), 0);
    for (std::string const& path : {folder / "fifo", folder.GetPath(), folder / "none"})
        EXPECT_TRUE(IcuLoadTextFile(Text(path), "windows-1252").IsEmpty()) << path;
}

} // namespace

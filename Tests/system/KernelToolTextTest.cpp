#include "support/KernelTool.h"

#include <gmock/gmock.h>

namespace KernelTest {
namespace {

using namespace std::string_literals;
using Json = nlohmann::json;
using testing::StartsWith;

class KernelToolText : public testing::Test
{
protected:
    ToolResult Run(std::vector<std::string> words, std::string const& input = {})
    {
        words.insert(words.begin(), "text");
        return RunKernelTool(words, m_folder.GetPath(), input);
    }

    TestSupport::TempFolder m_folder;
};

TEST_F(KernelToolText, ConvertsBetweenEncodings)
{
    struct
    {
        std::vector<std::string> options;
        std::string in;
        std::string out;
        std::string err; // Start of the diagnosis; empty for status 0.
    } const cases[] = {
        {{}, "a\u20AC\n", "a\u20AC\n", ""},
        {{"--from", "windows-1252"}, "\x80", "\u20AC", ""},
        {{"--from", "page:1252", "--to", "mac:0"}, "\x80", "\xDB", ""},
        {{"--from", "mac:4,48"}, "\xB1", "\u06F1", ""},
        {{"--from", "pdfdoc"}, "\x80", "\u2022", ""},
        {{"--to", "utf-16le"}, "a\U0001F600", "a\0\x3D\xD8\x00\xDE"s, ""},
        {{"--from", "UTF-16"},
         "\xFF\xFE"
         "a\0\0\0b\0"s,
         "a\0b"s,
         ""},
        {{"--from", "UTF-32BE", "--to", "Shift_JIS"}, "\0\0\x30\x42"s, "\x82\xA0", ""},
        {{"--to", "page:1252"}, "a\u3042", "a?", "kerneltool: converting standard input failed: Unmapped (1)\n"},
        {{"--to", "windows-1252"},
         "a\u3042\u20AC",
         "a\x1A\x80",
         "kerneltool: converting standard input failed: Unmapped (1)\n"},
        {{}, "a\xF0", "", "kerneltool: reading UTF-8 failed: IllFormed (1)\n"},
        {{"--from", "windows-1252"},
         "a\0"s,
         "",
         "kerneltool: using encoding 'windows-1252' failed: HoldsZeroByte (3)\n"},
        // What passes as UTF-8 by its shape alone.
        {{"--to", "UTF-16LE"}, "a\xED\xA0\x80", "", "kerneltool: reading UTF-8 failed: IllFormed (1)\n"},
        {{}, "\xC0\x80", "", "kerneltool: reading UTF-8 failed: IllFormed (0)\n"},
        {{"--to", "UTF-16BE"}, "\xF7\xBF\xBF\xBF", "", "kerneltool: reading UTF-8 failed: IllFormed (0)\n"},
        {{"--from", "UTF-16"}, "\xFF\xFE\0\0"s, "\0"s, ""},
        {{"--from", "page:1252"}, "a\x81", "a\uFFFF", "kerneltool: reading standard input failed: Undefined (1)\n"},
        {{"--from", "GB18030"}, "\x84\x31\xA4\x37", "\uFFFD", ""},
        {{"--from", "US-ASCII"}, "a\xE9", "a\uFFFD", "kerneltool: reading standard input failed: Undefined (1)\n"},
        {{"--to", "windows-1252"},
         "\0\u3042"s,
         "\0\x1A"s,
         "kerneltool: converting standard input failed: Unmapped (1)\n"},
        {{"--from", "no such"}, "a", "", "kerneltool: using encoding 'no such' failed: UnknownEncoding (1)\n"},
        {{"--from", "mac:28"}, "a", "", "kerneltool: using encoding 'mac:28' failed: MappingFileMissing (2)\n"},
        {{"--from", "mac:x"}, "a", "", "kerneltool: using encoding 'mac:x' failed: UnknownEncoding (1)\n"},
    };
    for (auto const& c : cases) {
        std::vector<std::string> words = {"convert"};
        words.insert(words.end(), c.options.begin(), c.options.end());
        SCOPED_TRACE(testing::PrintToString(words));
        ToolResult const result = Run(words, c.in);
        EXPECT_EQ(result.status, c.err.empty() ? 0 : 1);
        EXPECT_EQ(result.out, c.out);
        EXPECT_THAT(result.err, StartsWith(c.err));
    }
    TestSupport::WriteWholeFile(m_folder / "old.txt", "\x80");
    EXPECT_EQ(Json::parse(Run({"convert", "--from", "page:1252", "--to", "UTF-16LE", "--json", "old.txt"}).out),
              Json({{"from", "page:1252"},
                    {"to", "UTF-16LE"},
                    {"text", "\u20AC"},
                    {"bytes", "ac20"},
                    {"undefined", 0},
                    {"unmapped", 0}}));
    EXPECT_THAT(Run({"convert", "none.txt"}).err, StartsWith("kerneltool: reading 'none.txt' failed: NotFound (2)\n"));
}

TEST_F(KernelToolText, DetectsByMarkFormOrGuess)
{
    struct
    {
        std::string bytes;
        char const* shown;
        Json json;
    } const cases[] = {
        {"\xFF\xFE"
         "a\0"s,
         "UTF-16LE, by its mark\n",
         {{"encoding", "UTF-16LE"}, {"by", "mark"}, {"mark", 2}}},
        {"plain", "US-ASCII, by its form\n", {{"encoding", "US-ASCII"}, {"by", "form"}, {"mark", 0}}},
        {"\u20AC", "UTF-8, by its form\n", {{"encoding", "UTF-8"}, {"by", "form"}, {"validUtf8", true}}},
        {"\xED\xA0\x80", "UTF-8, by its statistics\n", {{"by", "guess"}, {"validUtf8", false}}},
        {"Voil\xE0 l'\xE9t\xE9 qui s'en va, et la for\xEAt a des couleurs.",
         "ISO-8859-1, by its statistics\n",
         {{"encoding", "ISO-8859-1"}, {"by", "guess"}, {"validUtf8", false}, {"guess", "ISO-8859-1"}}},
    };
    for (auto const& c : cases) {
        TestSupport::WriteWholeFile(m_folder / "text", c.bytes);
        EXPECT_EQ(Run({"detect", "text"}).out, c.shown);
        Json const json = Json::parse(Run({"detect", "text", "--json"}).out);
        for (auto const& [key, value] : c.json.items()) EXPECT_EQ(json[key], value) << key;
    }
    EXPECT_EQ(Run({"detect", "."}).status, 1);
}

TEST_F(KernelToolText, ListsCodePoints)
{
    ToolResult const shown = Run({"chars", "a\u0301\n"});
    EXPECT_EQ(shown.out, "code    class  bytes  name\n"
                         "U+0061  Ll     61     LATIN SMALL LETTER A    a\n"
                         "U+0301  Mn     cc81   COMBINING ACUTE ACCENT\n"
                         "U+000A  Cc     0a\n");
    EXPECT_EQ(
        Json::parse(Run({"chars", "--json", "\U0001F600"}).out),
        Json::array({{{"codePoint", 0x1F600}, {"name", "GRINNING FACE"}, {"class", "So"}, {"utf8", "f09f9880"}}}));
    for (char const* text : {"a\xC3", "a\xED\xA0\x80", "a\xC1\xA1"}) {
        ToolResult const bad = Run({"chars", "--json", text});
        EXPECT_EQ(bad.status, 1);
        EXPECT_EQ(Json::parse(bad.out).size(), 1u);
        EXPECT_THAT(bad.err, StartsWith("kerneltool: reading TEXT failed: IllFormed (1)\n"));
    }
    EXPECT_EQ(Run({"chars", "--json", ""}).out, "[]\n");
}

} // namespace
} // namespace KernelTest

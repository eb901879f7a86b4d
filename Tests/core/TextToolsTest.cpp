#include "libkernel/core/TextTools.h"

#include "libkernel/core/AddressText.h"
#include "libkernel/core/UnicodeNormalize.h"

#include <gtest/gtest.h>
#include <string>
#include <tuple>

namespace Kernel {
namespace {

TEST(TextToolsTest, LineEndsOfEverySortBecomeOneLineFeed)
{
    using Row = std::tuple<char const*, char const*>;
    for (auto const& [text, canonical] :
         {Row{"a\r\n\r\nb", "a\n\nb"}, Row{"a\n\r\n\rb", "a\n\nb"}, Row{"a\rb\r\rc", "a\nb\n\nc"},
          Row{"a\n\nb", "a\n\nb"}, Row{"\r", "\n"}, Row{"\n\r", "\n"}, Row{"\n\n\r", "\n\n"}, Row{"x\n\r\r\n", "x\n\n"},
          Row{"\r\n\n", "\n\n"}, Row{"", ""}, Row{"plain", "plain"}})
        EXPECT_EQ(CanonicaliseLineEnds(text), canonical) << testing::PrintToString(text);
}

TEST(TextToolsTest, WordsAreCutBehindTheLastOneWanted)
{
    using Row = std::tuple<String8, int, bool, char const*>;
    for (auto const& [whole, count, ellipsis, cut] :
         {Row{"one two three", 2, false, "one two"}, Row{"one two three", 2, true, "one two\u2026"},
          Row{"one two", 2, true, "one two"}, Row{"one two ", 2, true, "one two\u2026"},
          Row{"one two three", 0, true, "one two three"}, Row{"one two", -1, true, "one two"},
          Row{"  one\t\ntwo  x", 2, false, "  one\t\ntwo"}, Row{"\u00E9\u00E9\u2003b", 1, false, "\u00E9\u00E9"},
          Row{"a\u00A0b", 1, true, "a\u2026"}, Row{"", 1, true, ""}, Row{"   ", 1, true, "   "},
          Row{"a\xE2\x80", 1, true, "a\xE2\x80"}})
    {
        String8 text(whole);
        ApplyMaxWordCount(text, count, ellipsis);
        EXPECT_EQ(text, cut) << count;
    }
}

TEST(TextToolsTest, XmlEscapesItsFiveCharactersInEveryEncoding)
{
    std::string const text = "<a href=\"x\">R&D 'q' \u00E9</a>\t";
    char const* const escaped = "&lt;a href=&quot;x&quot;&gt;R&amp;D &apos;q&apos; \u00E9&lt;/a&gt;\t";
    EXPECT_EQ(EscapeXml(text.data(), text.data() + text.size()), escaped);
    char16_t const wide[] = u"<\u0126&"; // 0x26 is "&".
    EXPECT_EQ(EscapeXml(wide, wide + 3), u"&lt;\u0126&amp;");
    unsigned int const widest[] = {'"', 0x10026};
    EXPECT_EQ(EscapeXml(widest, widest + 2).GetLength(), 7);
}

TEST(TextToolsTest, UrlsKeepWhatPdfWritersTakeAndEscapeTheRest)
{
    std::string const kept = "azAZ09!#$%&'()*+,-./:;=?@[]_~";
    for (int byte = 0; byte < 256; ++byte) {
        char const c = static_cast<char>(byte);
        bool const isAlnum = byte < 128 && std::isalnum(byte);
        bool const stays = isAlnum || (byte != 0 && kept.find(c) != kept.npos);
        char code[8];
        std::snprintf(code, sizeof code, "%%%02X", byte);
        EXPECT_EQ(EscapeURLForPDFLib(String8(&c, 1)), stays ? String8(&c, 1) : String8(code)) << byte;
        EXPECT_EQ(IsValidURLForPDFLib(String8(&c, 1)), stays && c != '%') << byte;
    }
    EXPECT_EQ(EscapeURLForPDFLib("http://x.y/a b\u00E9"), "http://x.y/a%20b%C3%A9");
    for (char const* url : {"", "%aF", "x%20%20", "a%25b"}) EXPECT_TRUE(IsValidURLForPDFLib(url)) << url;
    for (char const* url : {"%", "%2", "%2g", "%g2", "a b", "x%%20", "\u00E9"})
        EXPECT_FALSE(IsValidURLForPDFLib(url)) << url;
}

TEST(TextToolsTest, ProtocolIsAlphanumericUpToAColon)
{
    for (char const* text : {"http://x", ":", "a1:", "\u00E9\u4E00:", "x:\xFF"})
        EXPECT_TRUE(HasUriProtocol(text)) << text;
    for (char const* text : {"", "http", "ht tp:", "a+b:", "\xC3:", "a\xF0\x9F:"})
        EXPECT_FALSE(HasUriProtocol(text)) << text;
}

TEST(TextToolsTest, MailAddressesPassByTheByteWalk)
{
    std::string const longest = std::string(63, 'x') + "@b.c";
    std::string const tooLong = "x" + longest;
    for (char const* text :
         {"a@b.c", "@b.c", "a.b@c.d", "!#$%'*+-/=?^_{|}~@b.c", longest.c_str(), "a@b.1", "a@b-cd.e", "a@1-1x.d",
          "a@b.c?subject=x&y=1.2", "a@b.c?", "a@b c.d", "a@b@c.d", "a@\u00E9.fr", "a@b-.c-d", "a@-.b"})
        EXPECT_TRUE(IsValidEmail(text)) << text;
    for (char const* text :
         {"",           "a",       "a@",      "a@b",       ".a@b.c",       "a.@b.c",       "a..b@c.d", "a b@c.d",
          "\u00E9@b.c", "a(b@c.d", "a@1.c",   "a@.c",      "a@b.",         "a@b..c",       "a@b.@",    "a@b.c-",
          "a@b-c.d",    "a@-b.c",  "a@b?x.y", "a@b.c?x y", "a@b.c?\u00E9", tooLong.c_str()})
        EXPECT_FALSE(IsValidEmail(text)) << text;
}

TEST(TextToolsTest, NormalFormsComposeAndDecompose)
{
    EXPECT_EQ(UNormalize(String8("e\u0301\u1E69"), UnicodeNormalize::Composed), "\u00E9\u1E69");
    EXPECT_EQ(UNormalize(String8("\u00E9\u1E69"), UnicodeNormalize::Decomposed), "e\u0301s\u0323\u0307");
    EXPECT_EQ(UNormalize(String16(u"s\u0307\u0323"), UnicodeNormalize::Composed), u"\u1E69");
    EXPECT_EQ(UNormalize(String8("\uAC01"), UnicodeNormalize::Decomposed), "\u1100\u1161\u11A8");
    String8 const plain("plain");
    EXPECT_TRUE(UNormalize(plain, UnicodeNormalize::Composed).SharesBlockWith(plain));
    EXPECT_TRUE(UNormalize(plain, static_cast<UnicodeNormalize::ComposeType>(2)).IsEmpty());
    String8 many; // Grows eighteenfold.
    for (int i = 0; i < 1000; ++i) many += "\uFDFA\u0390";
    EXPECT_EQ(UNormalize(many, UnicodeNormalize::Decomposed).GetLength(), 1000 * (3 + 6));
}

} // namespace
} // namespace Kernel

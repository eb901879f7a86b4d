#include "libkernel/core/CharTraits.h"

#include <gtest/gtest.h>
#include <memory>
#include <random>
#include <string>
#include <vector>

namespace Kernel {
namespace {

using Utf8 = CharTraits<TEncUtf8>;
using Utf16 = CharTraits<TEncUtf16>;
using Utf32 = CharTraits<TEncUtf32>;

// The rule byte by byte, with none of the short cuts.
int SlowValidLength(std::string const& text, bool allowZero)
{
    size_t i = 0;
    while (i < text.size()) {
        u8 const lead = static_cast<u8>(text[i]);
        size_t const length = lead < 0x80   ? 1
                              : lead < 0xC0 ? 0
                              : lead < 0xE0 ? 2
                              : lead < 0xF0 ? 3
                              : lead < 0xF8 ? 4
                                            : 0;
        if (length == 0 || length > text.size() - i || (lead == 0 && !allowZero)) break;
        size_t tails = 1;
        while (tails < length && (static_cast<u8>(text[i + tails]) & 0xC0) == 0x80) ++tails;
        if (tails < length) break;
        i += length;
    }
    return static_cast<int>(i);
}

TEST(CharTraitsTest, ValidLengthStopsAtTheStartOfABadCodePoint)
{
    using namespace std::string_literals;
    struct Case
    {
        char const* what;
        std::string text;
        int valid;
    };
    for (Case const& c :
         {Case{"cut two-byte sequence", "abc\xC3", 3}, Case{"text ending in F0", "ab\xF0", 2},
          Case{"cut four-byte sequence", "\xF0\x9F\x98", 0}, Case{"continuation in lead place", "a\x80", 1},
          Case{"lead above F7", "a\xF8\x80\x80\x80\x80", 1}, Case{"bad continuation", "a\xE2\x82z", 1},
          Case{"overlong is not looked for", "\xC0\x80\xE0\x80\x80", 5},
          Case{"surrogate is not looked for", "\xED\xA0\x80", 3}, Case{"whole", "a\xC3\xA9\xF0\x9F\x98\x80", 7},
          Case{"zero", "0123456789abcdefgh\0i"s, 18}, Case{"zero in last place", "ab\0"s, 2}, Case{"empty", "", 0}})
    {
        SCOPED_TRACE(c.what);
        int const n = static_cast<int>(c.text.size());
        EXPECT_EQ(Utf8::GetValidLength(c.text.data(), n, false), c.valid);
        EXPECT_EQ(Utf8::IsValid(c.text.data(), n, false), c.valid == n);
    }
    EXPECT_TRUE(Utf8::IsValid("a\0b", 3, true));
}

TEST(CharTraitsTest, ValidLengthAgreesWithTheByteRuleOnDamagedText)
{
    std::mt19937 random(11);
    for (int round = 0; round < 20000; ++round) {
        char room[4 * 128];
        char* end = room;
        u32 const limit = round % 3 == 0 ? 0x7F : round % 3 == 1 ? 0x7FF : 0x10FFFF;
        for (u32 i = random() % 120; i > 0; --i)
            end = Utf8::AppendCodePoint(end, random() % 4 ? random() % 0x7F + 1 : random() % limit);
        std::string text(room, end);
        if (!text.empty() && round % 5) text[random() % text.size()] = static_cast<char>(random());
        if (round % 7 == 0) text.resize(random() % (text.size() + 1));
        // A block of the exact size, so that a read past the end shows under a checker.
        std::unique_ptr<char[]> const exact(new char[text.size()]);
        std::copy(text.begin(), text.end(), exact.get());
        for (bool allowZero : {false, true})
            ASSERT_EQ(Utf8::GetValidLength(exact.get(), static_cast<int>(text.size()), allowZero),
                      SlowValidLength(text, allowZero));
    }
}

TEST(CharTraitsTest, ValidLengthOfWiderTextStopsAtLoneSurrogates)
{
    std::u16string const text = u"a\xD83D\xDE00"
                                u"b";
    EXPECT_EQ(Utf16::GetValidLength(text.data(), 4, false), 4);
    EXPECT_EQ(Utf16::GetValidLength(text.data(), 2, false), 1);
    EXPECT_EQ(Utf16::GetValidLength(text.data() + 2, 2, false), 0);
    EXPECT_EQ(Utf16::GetValidLength(u"\xD800\xD800\xDC00", 3, false), 0);
    EXPECT_EQ(Utf16::GetValidLength(u"a\0b", 3, false), 1);
    EXPECT_EQ(Utf16::GetValidLength(u"a\0b", 3, true), 3);
    unsigned int const wide[] = {'a', 0x10FFFF, 0, 0xD800};
    unsigned int const beyond = 0x110000;
    EXPECT_EQ(Utf32::GetValidLength(wide, 4, false), 2);
    EXPECT_EQ(Utf32::GetValidLength(wide, 4, true), 3);
    EXPECT_EQ(Utf32::GetValidLength(&beyond, 1, true), 0);
}

TEST(CharTraitsTest, DecodingGoesByTheLeadByteAlone)
{
    struct Case
    {
        char const* bytes;
        u32 codePoint;
        int length;
    };
    for (Case const& c : {Case{"a", 'a', 1}, Case{"\xC3\xA9", 0xE9, 2}, Case{"\xE2\x82\xAC", 0x20AC, 3},
                          Case{"\xF0\x9F\x98\x80", 0x1F600, 4},
                          Case{"\x80"
                               "A",
                               1, 2},
                          Case{"\xF7\xBF\xBF\xBF", 0x1FFFFF, 4}})
    {
        SCOPED_TRACE(c.bytes);
        char const* p = c.bytes;
        EXPECT_EQ(Utf8::NextCodePoint(p), c.codePoint);
        EXPECT_EQ(p - c.bytes, c.length);
        EXPECT_EQ(Utf8::GetCodePointLength(c.bytes[0]), c.length);
    }
}

TEST(CharTraitsTest, CodePointsAreFoundFromTheirUnits)
{
    char const* const text = "a\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80z";
    int const begins[] = {0, 1, 1, 3, 3, 3, 6, 6, 6, 6, 10};
    for (int i = 0; i < 11; ++i) EXPECT_EQ(Utf8::GetCodePointBegin(text, i), begins[i]) << i;
    for (int n = 0; n <= 11; ++n) EXPECT_EQ(Utf8::IsCodePointEnd(text, n), n == 11 || n == 0 || begins[n] == n) << n;
    EXPECT_EQ(Utf8::GetLengthInCodePoints(text, 11), 5);

    char16_t const wide[] = u"a\xD83D\xDE00z";
    EXPECT_EQ(Utf16::GetCodePointBegin(wide, 2), 1);
    EXPECT_EQ(Utf16::GetCodePointBegin(wide, 3), 3);
    EXPECT_FALSE(Utf16::IsCodePointEnd(wide, 2));
    EXPECT_TRUE(Utf16::IsCodePointEnd(wide, 3));
    EXPECT_EQ(Utf16::GetLengthInCodePoints(wide, 4), 3);
    EXPECT_EQ(Utf16::MakeCodePoint(0xD83D, 0xDE00), 0x1F600u);
}

TEST(CharTraitsTest, LongTextIsCountedByLeads)
{
    std::string text;
    for (int i = 0; i < 100; ++i) text += "ab\xE2\x82\xAC\xF0\x9F\x98\x80";
    for (size_t cut = 0; cut < 9; ++cut) {
        int leads = 0;
        for (size_t i = cut; i < text.size(); ++i) leads += (static_cast<u8>(text[i]) & 0xC0) != 0x80;
        EXPECT_EQ(Utf8::GetLengthInCodePoints(text.data() + cut, static_cast<int>(text.size() - cut)), leads);
    }
}

TEST(CharTraitsTest, BytesAbove127SortBeforeAscii)
{
    EXPECT_LT(Utf8::Compare("\xC3\xA9", "a"), 0);
    EXPECT_GT(Utf16::Compare(u"\u00E9", u"a"), 0);
    EXPECT_LT(Utf8::Compare("0123456789abX", "0123456789abY"), 0);
    EXPECT_EQ(Utf8::Compare("0123456789", 10, "0123456789abc", 13), -3);
    unsigned int const low[] = {0};
    unsigned int const high[] = {0xFFFFFFFF};
    EXPECT_LT(Utf32::Compare(low, 1, high, 1), 0);
}

TEST(CharTraitsTest, TrimmingTakesSpacesTabsAndLineFeedsOnly)
{
    char text[] = " \t\n\ra b\r \n\t";
    int n = Utf8::TrimLeft(text, static_cast<int>(strlen(text)));
    EXPECT_STREQ(text, "\ra b\r \n\t");
    n = Utf8::TrimRight(text, n);
    EXPECT_STREQ(text, "\ra b\r");
    EXPECT_EQ(n, 5);
    char blank[] = " \n ";
    EXPECT_EQ(Utf8::TrimLeft(blank, 3), 0);
}

} // namespace
} // namespace Kernel

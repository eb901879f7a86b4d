#include "libkernel/core/CharTraits.h"

#include "libkernel/core/BaseCharTraits.h"
#include "support/Rows.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <memory>
#include <random>
#include <string>
#include <tuple>
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
    for (auto const& [what, text, valid] :
         Rows<char const*, std::string, int>{{"cut two-byte sequence", "abc\xC3", 3},
                                             {"text ending in F0", "ab\xF0", 2},
                                             {"cut four-byte sequence", "\xF0\x9F\x98", 0},
                                             {"continuation in lead place", "a\x80", 1},
                                             {"lead above F7", "a\xF8\x80\x80\x80\x80", 1},
                                             {"bad continuation", "a\xE2\x82z", 1},
                                             {"overlong is not looked for", "\xC0\x80\xE0\x80\x80", 5},
                                             {"surrogate is not looked for", "\xED\xA0\x80", 3},
                                             {"whole", "a\xC3\xA9\xF0\x9F\x98\x80", 7},
                                             {"zero", "0123456789abcdefgh\0i"s, 18},
                                             {"zero in last place", "ab\0"s, 2},
                                             {"empty", "", 0}})
    {
        int const n = static_cast<int>(text.size());
        EXPECT_EQ(Utf8::GetValidLength(text.data(), n, false), valid) << what;
        EXPECT_EQ(Utf8::IsValid(text.data(), n, false), valid == n) << what;
    }
    EXPECT_TRUE(Utf8::IsValid("a\0b", 3, true));
}

TEST(CharTraitsTest, ValidLengthAndCountAgreeWithTheByteRulesOnDamagedText)
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
        int const length = static_cast<int>(text.size());
        for (bool allowZero : {false, true})
            ASSERT_EQ(Utf8::GetValidLength(exact.get(), length, allowZero), SlowValidLength(text, allowZero));
        auto const leads = std::ranges::count_if(text, [](char c) { return (static_cast<u8>(c) & 0xC0) != 0x80; });
        ASSERT_EQ(Utf8::GetLengthInCodePoints(exact.get(), length), leads);
    }
}

TEST(CharTraitsTest, ValidLengthOfWiderTextStopsAtLoneSurrogates)
{
    std::u16string const text = u"a\U0001F600b";
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
    for (auto const& [bytes, codePoint, length] : Rows<char const*, u32, int>{{"a", 'a', 1},
                                                                              {"\xC3\xA9", 0xE9, 2},
                                                                              {"\xE2\x82\xAC", 0x20AC, 3},
                                                                              {"\xF0\x9F\x98\x80", 0x1F600, 4},
                                                                              {"\200A", 1, 2},
                                                                              {"\xF7\xBF\xBF\xBF", 0x1FFFFF, 4}})
    {
        char const* p = bytes;
        EXPECT_EQ(Utf8::NextCodePoint(p), codePoint);
        EXPECT_EQ(p - bytes, length) << bytes;
        EXPECT_EQ(Utf8::GetCodePointLength(bytes[0]), length);
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

using Chars = BaseCharTraits<char>;
using Wide = BaseCharTraits<unsigned int>;

TEST(BaseCharTraitsTest, ComparingGivesTheDifferenceOfUnitsAndThenOfLengths)
{
    using Row = std::tuple<char const*, char const*, int>;
    for (auto const& [a, b, difference] :
         {Row{"abc", "abe", -2}, Row{"b", "a", 1}, Row{"\xC3\xA9", "a", -61 - 'a'}, Row{"abc", "abcde", -2},
          Row{"abcdefghij", "abcdefgh", 2}, Row{"same", "same", 0}, Row{"0123456789abcXe", "0123456789abcYe", -1},
          Row{"", "", 0}})
    {
        SCOPED_TRACE(a);
        int const n = Chars::GetLength(a);
        int const m = Chars::GetLength(b);
        EXPECT_EQ(Chars::Compare(a, b), difference);
        EXPECT_EQ(Chars::Compare(a, n, b), difference);
        EXPECT_EQ(Chars::Compare(b, m, a, n), -difference);
        EXPECT_EQ(Chars::IsEqual(a, n, b), difference == 0);
    }
    EXPECT_EQ(BaseCharTraits<char16_t>::Compare(u"\uFFFF", u"\u0001"), 0xFFFE);
}

TEST(BaseCharTraitsTest, WideDifferencesAreExactWhileTheyFit)
{
    using Row = std::tuple<unsigned int, unsigned int, int>;
    for (auto const& [a, b, difference] : {Row{'a', 'c', -2}, Row{0x10FFFF, 1, 0x10FFFE}, Row{7, 7, 0},
                                           Row{0xFFFFFFFF, 0, 0x7FFFFFFF}, Row{0, 0xFFFFFFFF, -0x7FFFFFFF - 1}})
        EXPECT_EQ(Wide::Compare(&a, 1, &b, 1), difference) << a;
}

TEST(BaseCharTraitsTest, TrimmingTouchesNothingOutsideTheUnitsGiven)
{
    struct Case
    {
        char const* text;
        char const* left;
        char const* right;
    };
    for (Case const& c : {Case{" \t\na b ", "a b ", " \t\na b"}, Case{"ab", "ab", "ab"},
                          Case{"\rab\r", "\rab\r", "\rab\r"}, Case{" \n ", "", ""}, Case{"", "", ""}})
    {
        SCOPED_TRACE(c.text);
        int const n = Chars::GetLength(c.text);
        std::string text = c.text + std::string("#");
        EXPECT_EQ(std::string(text.data(), static_cast<size_t>(Chars::TrimLeft(text.data(), n))), c.left);
        EXPECT_EQ(text[static_cast<size_t>(n)], '#');
        text = c.text + std::string("#");
        EXPECT_EQ(std::string(text.data(), static_cast<size_t>(Chars::TrimRight(text.data(), n))), c.right);
        EXPECT_EQ(text[static_cast<size_t>(n)], '#');
    }
    char text[] = " a ";
    EXPECT_EQ(Chars::TrimRight(text, 3), 2);
    EXPECT_STREQ(text, " a");
    EXPECT_EQ(Chars::TrimLeft(text, 2), 1);
    EXPECT_STREQ(text, "a");
}

TEST(BaseCharTraitsTest, FindingStaysInsideTheTextAndAgreesWithTheStandardLibrary)
{
    std::string_view const whole = "abracadabra abcabcabd";
    for (int length = 0; length <= 21; ++length)
        for (std::string_view const needle :
             {"a", "abr", "abcabd", "z", "abracadabra abcabcabd", "abracadabra abcabcabdx", "", "d"})
            for (int start = -1; start <= length + 1; ++start) {
                size_t const found =
                    whole.substr(0, static_cast<size_t>(length)).find(needle, static_cast<size_t>(std::max(start, 0)));
                EXPECT_EQ(Chars::Find(whole.data(), length, needle.data(), static_cast<int>(needle.size()), start),
                          found == needle.npos ? -1 : static_cast<int>(found))
                    << needle << start;
            }
}

} // namespace
} // namespace Kernel

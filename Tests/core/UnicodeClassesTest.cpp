#include "libkernel/core/UnicodeClasses.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/Utf8Sequence.h"
#include "support/Rows.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <map>
#include <tuple>

using namespace Kernel;

namespace {

TEST(UnicodeClasses, EachClassHasItsMembersAndNoOthers)
{
    using Points = std::vector<u32>;
    Rows<char const*, bool (*)(u32), Points, Points> const cases = {
        {"alnum", IsAlnum, {'a', '0', 0xE9, 0x661, 0x3042}, {' ', '-', 0x20AC, 0x110000}},
        {"alpha", IsAlpha, {'a', 0xE9, 0x3042, 0x2160}, {'0', '_', 0xFFFFFFFF}},
        {"digit", IsDigit, {'0', '9'}, {'/', ':', 0x661, 0xFFFFFFFF}},
        {"any digit", IsAnyDigit, {'0', 0x661, 0xFF10}, {'a', 0xBD, 0x2160}},
        {"lower", IsLower, {'a', 0xE9, 0xAA, 0x2170}, {'A', '1', 0x1C5}},
        {"upper", IsUpper, {'A', 0xC9, 0x2160}, {'a', '1', 0x1C5}},
        {"space", IsSpace, {9, 10, 13, 32, 0x85, 0xA0, 0x2028, 0x3000}, {0, 8, 14, 0x1F, 0x21, 0x200B, 0xFEFF}},
        {"punct", IsPunct, {'+', '-', '.', '(', '_', '^', 0xAB, 0x2014, 0x2019, 0x2211}, {'$', 'a', ' ', 0xA9, 0x20AC}},
        {"combining", IsCombining, {0x301, 0x93C, 0x3099}, {'a', 0xE9, 0x903}},
        {"known", IsKnown, {'a', 0x1F600}, {0x378, 0xFFFF, 0x110000}},
        {"line break", IsAnyLineBreak, {10, 13, 0x2028, 0x2029}, {9, 11, 12, 0x85}},
        {"justification", IsJustificationSpace, {0x20, 0xA0}, {9, 0x2002, 0x3000}},
        {"name",
         IsXmlName,
         {'a', ':', '-', '.', '0', '9', 0xB7, 0x300, 0x36F, 0x203F, 0x2040},
         {' ', '/', 0xB6, 0xB8, 0x203E, 0x2041, 0xD7, 0xFFFFFFFF}},
    };
    for (auto const& [what, is, members, others] : cases) {
        for (u32 const member : members) EXPECT_TRUE(is(member)) << what << " " << std::hex << member;
        for (u32 const other : others) EXPECT_FALSE(is(other)) << what << " " << std::hex << other;
    }
    // The grammar of XML 1.0, fifth edition.
    constexpr std::pair<u32, u32> c_starts[] = {
        {':', ':'},       {'A', 'Z'},       {'_', '_'},       {'a', 'z'},        {0xC0, 0xD6},     {0xD8, 0xF6},
        {0xF8, 0x2FF},    {0x370, 0x37D},   {0x37F, 0x1FFF},  {0x200C, 0x200D},  {0x2070, 0x218F}, {0x2C00, 0x2FEF},
        {0x3001, 0xD7FF}, {0xF900, 0xFDCF}, {0xFDF0, 0xFFFD}, {0x10000, 0xEFFFF}};
    for (u32 c = 0; c <= 0x110000; ++c)
        ASSERT_EQ(
            IsXmlNameStart(c),
            std::ranges::any_of(c_starts, [&](auto const& range) { return c >= range.first && c <= range.second; }))
            << std::hex << c;
}

TEST(UnicodeClasses, CharactersHaveTypesNamesAndParts)
{
    EXPECT_EQ(GetUnicodeCharacterType('A'), 1);
    EXPECT_EQ(GetUnicodeCharacterType(0x378), 0);
    EXPECT_EQ(GetUnicodeName(0xE9), "LATIN SMALL LETTER E WITH ACUTE");
    EXPECT_EQ(GetUnicodeName(0xAC00), "HANGUL SYLLABLE GA");
    EXPECT_TRUE(GetUnicodeName(0x110000).IsEmpty());
    u32 out[4] = {};
    EXPECT_EQ(GetUnicodeDecomposition(out, 4, 0x1EA5), 3);
    EXPECT_THAT(out, testing::ElementsAre('a', 0x302, 0x301, 0));
    EXPECT_EQ(GetUnicodeDecomposition(out, 2, 0x1EA5), 2);
    EXPECT_EQ(GetUnicodeDecomposition(out, 4, 0x1D15E), 2); // Beyond the basic plane.
    EXPECT_EQ(out[0], 0x1D157u);
    EXPECT_EQ(GetUnicodeDecomposition(out, 4, 'a'), 0);
}

TEST(UnicodeClasses, TonasLeavesTheCapitalsAlone)
{
    std::map<u32, u32> const plain = {{0x386, 0x391}, {0x388, 0x395}, {0x389, 0x397}, {0x38A, 0x399},
                                      {0x38C, 0x39F}, {0x38E, 0x3A5}, {0x38F, 0x3A9}, {0x390, 0x3AA}};
    for (u32 c = 0x370; c < 0x400; ++c) EXPECT_EQ(RemoveGreekTonas(c), plain.contains(c) ? plain.at(c) : c) << c;
}

TEST(Utf8Sequence, CodePointsAndBytesTellEachOther)
{
    using Row = std::tuple<u32, std::string>;
    for (auto const& [codePoint, bytes] :
         {Row{'a', "a"}, Row{0x7F, "\x7F"}, Row{0x80, "\xC2\x80"}, Row{0x7FF, "\xDF\xBF"}, Row{0x800, "\xE0\xA0\x80"},
          Row{0xFFFF, "\xEF\xBF\xBF"}, Row{0x10000, "\xF0\x90\x80\x80"}, Row{0x1FFFFF, "\xF7\xBF\xBF\xBF"},
          Row{0x200000, "\xF8\x88\x80\x80\x80"}, Row{0x4000000, "\xFC\x84\x80\x80\x80\x80"},
          Row{0x7FFFFFFF, "\xFD\xBF\xBF\xBF\xBF\xBF"}})
    {
        Utf8Sequence const made(codePoint);
        EXPECT_EQ(std::string(made.GetSequence()), bytes);
        EXPECT_TRUE(made.Equals(bytes.c_str()) && made.Equals(bytes.data(), bytes.size()));
        EXPECT_FALSE(made.Equals((bytes + "x").c_str()) || made.Equals(bytes.data(), bytes.size() - 1));
        Utf8Sequence read;
        bool const readable = bytes.size() <= 4; // Longer forms are only written.
        EXPECT_EQ(read.Set((bytes + "x").c_str()), readable ? static_cast<int>(bytes.size()) : 0);
        EXPECT_EQ(read.GetValue(), readable ? codePoint : 0);
        EXPECT_EQ(read.IsValid(), readable);
    }
}

TEST(Utf8Sequence, BrokenFormsAreInvalid)
{
    Utf8Sequence sequence('a');
    for (char const* bad :
         {"\x80", "\xC3", "\xC3\x28", "\xE2\x82", "\xE2\x28\x80", "\xF0\x9F\x98", "\xF8\x88\x80\x80\x80", "\xFF"})
    {
        EXPECT_EQ(sequence.Set(bad), 0) << bad;
        EXPECT_FALSE(sequence.IsValid() || sequence.Equals("") || sequence.Equals(bad));
    }
    EXPECT_FALSE(sequence.Set(0x80000000));
    EXPECT_FALSE(Utf8Sequence().IsValid());
}

} // namespace

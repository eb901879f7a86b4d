#include "libkernel/core/CaseTable.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"

#include <algorithm>
#include <array>
#include <gtest/gtest.h>
#include <memory>
#include <random>
#include <tuple>
#include <unicode/uchar.h>
#include <unicode/ustring.h>

namespace Kernel {
namespace {

// A text, one folding for each of its code points.
using Folded = std::vector<std::u16string>;

Folded Fold(std::u32string const& text)
{
    Folded all;
    for (char32_t const c : text) {
        UChar from[2];
        UChar to[16];
        i32 n = 0;
        U16_APPEND_UNSAFE(from, n, c);
        UErrorCode error = U_ZERO_ERROR;
        i32 const length = u_strFoldCase(to, 16, from, n, U_FOLD_CASE_DEFAULT, &error);
        all.emplace_back(to, static_cast<size_t>(length));
    }
    return all;
}

// Code points of the match at @p at, or -1.
int SlowMatch(Folded const& text, size_t at, Folded const& needle)
{
    std::u16string wanted;
    for (auto const& piece : needle) wanted += piece;
    std::u16string have;
    size_t end = at;
    while (have.size() < wanted.size() && end < text.size()) have += text[end++];
    return have == wanted ? static_cast<int>(end - at) : -1;
}

template <class Enc>
StringT<Enc> Make(std::u32string const& text)
{
    StringT<Enc> result;
    ConvertEnc<Enc, TEncUtf32>(result, reinterpret_cast<unsigned int const*>(text.data()),
                               static_cast<int>(text.size()));
    return result;
}

// Calls for each of the three encodings.
template <class Check>
void InAllEncodings(Check const& check)
{
    check(TEncUtf8());
    check(TEncUtf16());
    check(TEncUtf32());
}

template <class Enc>
void ExpectFinds(std::u32string const& text, std::u32string const& needle, size_t start)
{
    using Traits = CharTraits<Enc>;
    auto const units = [](std::u32string const& part) { return Make<Enc>(part).GetLength(); };
    Folded const folded = Fold(text);
    Folded const foldedNeedle = Fold(needle);
    int expected = -1;
    int expectedLength = -7;
    for (size_t at = start; at < text.size() && expected < 0; ++at)
        if (int const count = SlowMatch(folded, at, foldedNeedle); count >= 0) {
            expected = units(text.substr(0, at));
            expectedLength = units(text.substr(at, static_cast<size_t>(count)));
        }
    StringT<Enc> const all = Make<Enc>(text);
    StringT<Enc> const wanted = Make<Enc>(needle);
    // A block of the exact size, so that a read past the end shows under a checker.
    size_t const n = static_cast<size_t>(all.GetLength());
    std::unique_ptr<typename Enc::Unit[]> const exact(new typename Enc::Unit[n]);
    std::copy(all.begin(), all.end(), exact.get());
    int matched = -7;
    ASSERT_EQ(Traits::FindNoCase(exact.get(), all.GetLength(), wanted.GetData(), wanted.GetLength(),
                                 units(text.substr(0, start)), &matched),
              expected);
    ASSERT_EQ(matched, expectedLength);

    bool ends = false;
    for (size_t at = 0; at < text.size(); ++at)
        ends |= SlowMatch(folded, at, foldedNeedle) == static_cast<int>(text.size() - at);
    ASSERT_EQ(Traits::BeginsWithNoCase(exact.get(), all.GetLength(), wanted.GetData(), wanted.GetLength()),
              SlowMatch(folded, 0, foldedNeedle) >= 0);
    ASSERT_EQ(Traits::EndsWithNoCase(exact.get(), all.GetLength(), wanted.GetData(), wanted.GetLength()), ends);
}

TEST(CodePointTraitsTest, CaseBlindSearchAgreesWithFoldingEverything)
{
    // Letters that fold alike, to several, to each other's parts, and across the planes.
    std::u32string const letters = U"sS\u017F\u00DF\u1E9EtT\uFB06\uFB05aAkK\u212AiI\u0130\u0307\u03C3\u03C2\u03A3"
                                   U"nN\u0149\u02BC\u0434\u0414\U00010400\U00010428 \u1FB3\u03B1\u03B9\u0345";
    std::mt19937 random(8);
    auto const letter = [&](u32 variety) { return letters[random() % std::min<size_t>(variety, letters.size())]; };
    for (int round = 0; round < 4000; ++round) {
        u32 const variety = 3 + random() % 40;
        std::u32string text(random() % (round % 2 ? 300 : 12), U' ');
        for (char32_t& c : text) c = random() % 3 ? letter(variety) : U'-';
        std::u32string needle(1 + random() % 3, U' ');
        for (char32_t& c : needle) c = letter(variety);
        size_t const start = text.empty() ? 0 : random() % (text.size() / 4 + 1);
        SCOPED_TRACE(round);
        InAllEncodings([&]<class Enc>(Enc) { ExpectFinds<Enc>(text, needle, start); });
        if (HasFatalFailure()) return;
    }
}

TEST(CodePointTraitsTest, EveryCodePointIsFoundByItsFolding)
{
    CaseTable const& folding = CaseTable::Get(CaseTable::Operation::Fold);
    std::u32string const filler(120, U'.');
    for (u32 const codePoint : folding.GetChanged()) {
        u32 folded[CaseTable::c_longest];
        int const count = folding.Map(codePoint, folded);
        String8 const text = Make<TEncUtf8>(filler + static_cast<char32_t>(codePoint) + filler);
        String8 const needle = Make<TEncUtf8>(std::u32string(folded, folded + count));
        ASSERT_EQ(
            CharTraits<TEncUtf8>::FindNoCase(text.GetData(), text.GetLength(), needle.GetData(), needle.GetLength(), 0),
            120)
            << codePoint;
    }
}

TEST(CodePointTraitsTest, OrderWithoutCaseIsThatOfTheFoldings)
{
    using Row = std::tuple<char32_t const*, char32_t const*, int>;
    for (auto const& [first, second, order] :
         {Row{U"Stra\u00DFe", U"STRASSE", 0}, Row{U"\u00DF", U"s", 1}, Row{U"s", U"\u1E9E", -1}, Row{U"", U"", 0},
          Row{U"", U"a", -1}, Row{U"a", U"B", -1}, Row{U"Z", U"a", 1}, Row{U"\u00C9", U"\u00E9", 0},
          Row{U"\u00E9", U"z", 1}, Row{U"\u03A3", U"\u03C2", 0}, Row{U"[", U"A", -1},
          Row{U"\U00010400", U"\U00010428", 0}, Row{U"\uFFFD", U"\U00010400", -1}})
        InAllEncodings([a = first, b = second, order = order]<class Enc>(Enc) {
            StringT<Enc> const x = Make<Enc>(a), y = Make<Enc>(b);
            auto const compare = [](StringT<Enc> const& l, StringT<Enc> const& r) {
                int const n = CharTraits<Enc>::CompareNoCase(l.GetData(), l.GetLength(), r.GetData(), r.GetLength());
                return (n > 0) - (n < 0);
            };
            EXPECT_EQ(compare(x, y), order);
            EXPECT_EQ(compare(y, x), -order);
        });
}

TEST(CodePointTraitsTest, MatchesCoverWholeCodePointsFromAnyStart)
{
    using Row = std::tuple<String8, String8, int, int>;
    for (auto const& [text, needle, start, found] : {Row{"Wei\u00DFbier", "s", 0, -1}, Row{"\uFB01n", "in", 0, -1},
                                                     Row{"ab", "", 1, 1}, Row{"ab", "", 3, -1}, Row{"aA", "A", -5, 0}})
        EXPECT_EQ(CharTraits<TEncUtf8>::FindNoCase(text.GetData(), text.GetLength(), needle.GetData(),
                                                   needle.GetLength(), start),
                  found);
}

TEST(CodePointTraitsTest, CutTextIsReadToItsEndOnly)
{
    using Traits = CharTraits<TEncUtf8>;
    std::string const whole = "k\u00DF\u20AC\U00010400";
    for (size_t from = 0; from <= whole.size(); ++from)
        for (size_t n = 0; n <= whole.size() - from; ++n) {
            std::unique_ptr<char[]> const exact(new char[n]);
            std::copy_n(whole.begin() + static_cast<i64>(from), n, exact.get());
            int const length = static_cast<int>(n);
            EXPECT_EQ(Traits::CompareNoCase(exact.get(), length, exact.get(), length), 0);
            EXPECT_TRUE(Traits::BeginsWithNoCase(exact.get(), length, exact.get(), length));
            EXPECT_EQ(Traits::FindAnyOf(exact.get(), length, exact.get(), length, 0).GetLocation(), n ? 0 : -1);
            std::string reversed(n, ' ');
            Traits::Reverse(reversed.data(), exact.get(), length);
            std::sort(reversed.begin(), reversed.end());
            std::sort(exact.get(), exact.get() + n);
            EXPECT_EQ(reversed, std::string(exact.get(), n));
        }
}

TEST(CodePointTraitsTest, FindAnyOfGivesTheUnitsOfTheFirstMember)
{
    using Row = std::tuple<char32_t const*, char32_t const*, int,
                           std::array<IndexRange, 5>>; // The place by the size of a unit.
    IndexRange const none(-1, 0);
    for (auto const& [in, members, from, places] :
         {Row{U"a\u20ACb", U"b\u20AC", 0, {{{}, {1, 3}, {1, 1}, {}, {1, 1}}}},
          Row{U"a\U0001F600", U"\U0001F600", 0, {{{}, {1, 4}, {1, 2}, {}, {1, 1}}}},
          Row{U"abcab", U"ab", 2, {{{}, {3, 1}, {3, 1}, {}, {3, 1}}}},
          Row{U"\u00E9", U"\u00C3\u00A9", 0, {{{}, none, none, {}, none}}},
          Row{U"a", U"\u0161", 0, {{{}, none, none, {}, none}}}, // Equal low bits.
          Row{U"abc", U"", 0, {{{}, none, none, {}, none}}}, Row{U"", U"a", 0, {{{}, none, none, {}, none}}}})
        InAllEncodings([a = in, b = members, start = from, expected = places]<class Enc>(Enc) {
            StringT<Enc> const text = Make<Enc>(a), set = Make<Enc>(b);
            String32 const points = Make<TEncUtf32>(b);
            auto const find = [&](auto const& any) {
                return CharTraits<Enc>::FindAnyOf(text.GetData(), text.GetLength(), any.GetData(), any.GetLength(),
                                                  start);
            };
            EXPECT_EQ(find(set), expected[sizeof(typename Enc::Unit)]);
            EXPECT_EQ(find(points), expected[sizeof(typename Enc::Unit)]);
        });
}

TEST(CodePointTraitsTest, ReversalKeepsEachCodePointWhole)
{
    std::u32string const text = U"a\u00E9\u20AC\U0001F600z";
    InAllEncodings([&]<class Enc>(Enc) {
        StringT<Enc> const from = Make<Enc>(text);
        typename Enc::Unit* to;
        StringT<Enc> reversed(from.GetLength(), to);
        CharTraits<Enc>::Reverse(to, from.GetData(), from.GetLength());
        EXPECT_TRUE(reversed == Make<Enc>(std::u32string(text.rbegin(), text.rend())));
    });
}

} // namespace
} // namespace Kernel

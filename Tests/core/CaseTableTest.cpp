#include "libkernel/core/CaseTable.h"

#include <gtest/gtest.h>
#include <string>
#include <thread>
#include <tuple>
#include <unicode/uchar.h>
#include <unicode/ustring.h>
#include <vector>

namespace Kernel {
namespace {

using Operation = CaseTable::Operation;

std::u32string Map(Operation operation, char const* locale, u32 codePoint)
{
    u32 to[CaseTable::c_longest];
    int const count = CaseTable::Get(operation, locale).Map(codePoint, to);
    return std::u32string(to, to + count);
}

TEST(CaseTableTest, EveryCodePointFoldsAndMapsAsTheUnicodeLibraryDoes)
{
    for (UChar32 c = 0; c <= 0x10FFFF; c = c == 0xD7FF ? 0xE000 : c + 1) {
        UChar from[2];
        UChar to[16];
        i32 n = 0;
        U16_APPEND_UNSAFE(from, n, c);
        for (Operation operation : {Operation::Fold, Operation::Lower, Operation::Upper}) {
            UErrorCode error = U_ZERO_ERROR;
            i32 const length = operation == Operation::Fold    ? u_strFoldCase(to, 16, from, n, 0, &error)
                               : operation == Operation::Lower ? u_strToLower(to, 16, from, n, "", &error)
                                                               : u_strToUpper(to, 16, from, n, "", &error);
            UChar32 wide[16];
            i32 count = 0;
            u_strToUTF32WithSub(wide, 16, &count, to, length, c, nullptr, &error);
            u32 mapped[CaseTable::c_longest];
            ASSERT_EQ(CaseTable::Get(operation).Map(static_cast<u32>(c), mapped), count) << c;
            for (i32 i = 0; i < count; ++i) ASSERT_EQ(mapped[i], static_cast<u32>(wide[i])) << c;
        }
        // The simple mapping is all there is to go by for title case; it is a full one where that is one code point.
        std::u32string const title = Map(Operation::Title, "", static_cast<u32>(c));
        ASSERT_TRUE(title.size() > 1 || title[0] == static_cast<char32_t>(u_totitle(c))) << c;
    }
}

TEST(CaseTableTest, LanguagesKeepTheirOwnRules)
{
    using Row = std::tuple<Operation, char const*, u32, char32_t const*>;
    for (auto const& [operation, locale, codePoint, mapped] :
         {Row{Operation::Lower, "tr-TR", 'I', U"\u0131"}, Row{Operation::Upper, "az", 'i', U"\u0130"},
          Row{Operation::Title, "tr_TR", 'i', U"\u0130"}, Row{Operation::Lower, "tr", 0x130, U"i"},
          Row{Operation::Lower, "en", 0x130, U"i\u0307"}, Row{Operation::Lower, "tru", 'I', U"i"},
          Row{Operation::Lower, "lt", 0xCC, U"i\u0307\u0300"}, Row{Operation::Upper, "hy", 0x587, U"\u0535\u054E"},
          Row{Operation::Upper, "", 0x587, U"\u0535\u0552"}, Row{Operation::Upper, "el", 0x3AC, U"\u0386"},
          Row{Operation::Fold, "tr", 'I', U"i"}, Row{Operation::Title, "", 0x1C6, U"\u01C5"},
          Row{Operation::Title, "", 0xFB01, U"Fi"}, Row{Operation::Upper, "", 0x390, U"\u0399\u0308\u0301"},
          Row{Operation::Lower, "not a locale at all, and a long one", 'A', U"a"},
          Row{Operation::Upper, "", 0xFFFFFFFF, U"\xFFFFFFFF"}})
    {
        SCOPED_TRACE(locale);
        EXPECT_EQ(Map(operation, locale, codePoint), mapped) << codePoint;
    }
}

TEST(CaseTableTest, ThreadsThatComeFirstTogetherShareOneTable)
{
    CaseTable const* seen[4] = {};
    std::vector<std::thread> threads;
    for (CaseTable const*& place : seen)
        threads.emplace_back([&place] {
            place = &CaseTable::Get(Operation::Title, "lt");
            u32 to[CaseTable::c_longest];
            EXPECT_EQ(place->Map('a', to), 1);
        });
    for (std::thread& thread : threads) thread.join();
    for (CaseTable const* table : seen) EXPECT_EQ(table, seen[0]);
}

} // namespace
} // namespace Kernel

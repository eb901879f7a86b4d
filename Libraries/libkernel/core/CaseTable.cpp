#include "libkernel/core/CaseTable.h"

#include <algorithm>
#include <atomic>
#include <cstring>
#include <new>
#include <unicode/casemap.h>
#include <unicode/uchar.h>
#include <unicode/uloc.h>
#include <unicode/ustring.h>

// ICU maps whole texts, and some of its rules look at neighbours; a text of one code point has none. Asking it so for
// every code point that takes part in a case mapping, once, gives the table.

namespace Kernel {
namespace {

using Operation = CaseTable::Operation;
using Mapping = i32 (*)(char const* language, UChar* to, i32 room, UChar const* from, i32 n, UErrorCode& error);

// By Operation.
constexpr Mapping c_mappings[] = {
    [](char const*, UChar* to, i32 room, UChar const* from, i32 n, UErrorCode& error) {
        return u_strFoldCase(to, room, from, n, U_FOLD_CASE_DEFAULT, &error);
    },
    [](char const* language, UChar* to, i32 room, UChar const* from, i32 n, UErrorCode& error) {
        return u_strToLower(to, room, from, n, language, &error);
    },
    [](char const* language, UChar* to, i32 room, UChar const* from, i32 n, UErrorCode& error) {
        return u_strToUpper(to, room, from, n, language, &error);
    },
    [](char const* language, UChar* to, i32 room, UChar const* from, i32 n, UErrorCode& error) {
        u32 const options = U_TITLECASE_WHOLE_STRING | U_TITLECASE_NO_BREAK_ADJUSTMENT;
        return icu::CaseMap::toTitle(language, options, nullptr, from, n, to, room, nullptr, error);
    }};

// Languages whose code points have mappings of their own, and the rules they follow. Others must not reach ICU, which
// has rules for whole words of Greek and Dutch besides.
struct LanguageRules
{
    char const* language;
    int rules;
};
constexpr LanguageRules c_languages[] = {{"", 0}, {"tr", 1}, {"az", 1}, {"lt", 2}, {"hy", 3}};
constexpr char const* c_rules[] = {"", "tr", "lt", "hy"};

int FindRules(char const* locale)
{
    char language[ULOC_LANG_CAPACITY] = "";
    UErrorCode error = U_ZERO_ERROR;
    if (*locale) uloc_getLanguage(locale, language, sizeof language, &error);
    if (U_FAILURE(error)) return 0;
    for (LanguageRules const& row : c_languages)
        if (std::strncmp(row.language, language, sizeof language) == 0) return row.rules;
    return 0;
}

// A table is kept for ever, so it must not be made of what was left out for want of memory.
void ThrowIfOutOfMemory(UErrorCode error)
{
    if (error == U_MEMORY_ALLOCATION_ERROR) throw std::bad_alloc();
}

// Asked one by one, where there may be any. ICU has a set of them all, but makes that once for the process, and where
// it lacks the memory the set stays empty.
std::vector<u32> CodePointsWithCase()
{
    constexpr u32 kinds = U_GC_LC_MASK | U_GC_LM_MASK | U_GC_M_MASK | U_GC_NL_MASK | U_GC_SO_MASK;
    std::vector<u32> all;
    all.reserve(4096); // More than there are, since nothing ought to be thrown through ICU.
    std::vector<u32>* const list = &all;
    u_enumCharTypes(
        [](void const* context, UChar32 first, UChar32 end, UCharCategory kind) -> UBool {
            auto& codePoints = **static_cast<std::vector<u32>* const*>(context);
            for (UChar32 c = first; (U_MASK(kind) & kinds) != 0 && c < end; ++c)
                if (u_hasBinaryProperty(c, UCHAR_CASE_SENSITIVE)) codePoints.push_back(static_cast<u32>(c));
            return true;
        },
        &list);
    return all;
}

} // namespace

CaseTable const& CaseTable::Get(Operation operation, char const* locale)
{
    static std::atomic<CaseTable const*> s_tables[std::size(c_rules)][std::size(c_mappings)];
    int const rules = operation == Operation::Fold ? 0 : FindRules(locale);
    auto& place = s_tables[rules][static_cast<int>(operation)];
    if (CaseTable const* const made = place.load(std::memory_order_acquire)) return *made;
    // Two threads may make one each; the first to hand it in wins.
    std::unique_ptr<CaseTable const> mine(new CaseTable(operation, c_rules[rules]));
    CaseTable const* made = nullptr;
    if (place.compare_exchange_strong(made, mine.get(), std::memory_order_acq_rel)) made = mine.release();
    return *made;
}

CaseTable::CaseTable(Operation operation, char const* language) : m_entries(c_block)
{
    for (u32 const codePoint : CodePointsWithCase()) {
        if (codePoint >= c_end) break;
        UChar from[2];
        i32 fromLength = 0;
        U16_APPEND_UNSAFE(from, fromLength, codePoint);
        UChar to[4 * c_longest];
        UErrorCode error = U_ZERO_ERROR;
        i32 const length =
            c_mappings[static_cast<int>(operation)](language, to, std::size(to), from, fromLength, error);
        ThrowIfOutOfMemory(error);
        if (U_FAILURE(error) || length < 1 || u_strCompare(to, length, from, fromLength, false) == 0) continue;

        u32 mapped[c_longest];
        u32 count = 0;
        for (i32 i = 0; i < length && count < c_longest; ++count) U16_NEXT_UNSAFE(to, i, mapped[count]);
        u16& block = m_blocks[codePoint / c_block];
        if (block == 0) {
            block = static_cast<u16>(m_entries.size());
            m_entries.resize(m_entries.size() + c_block);
        }
        u32& entry = m_entries[block + codePoint % c_block];
        if (count == 1)
            entry = mapped[0];
        else {
            entry = c_several | count << 24 | static_cast<u32>(m_sequences.size());
            m_sequences.insert(m_sequences.end(), mapped, mapped + count);
        }
        m_changed.push_back(codePoint);
    }
}

int CaseTable::MapToSeveral(u32 entry, u32* to) const
{
    int const count = static_cast<int>(entry >> 24 & 0x7F);
    std::copy_n(m_sequences.data() + (entry & 0xFFFFFF), count, to);
    return count;
}

} // namespace Kernel

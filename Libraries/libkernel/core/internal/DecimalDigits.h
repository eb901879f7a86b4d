#pragma once

#include "libkernel/core/NumberText.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <type_traits>

namespace Kernel::NumberTextDetail {

// What the writers of numbers share.

inline constexpr auto c_powersOfTen = [] {
    std::array<u64, 20> table{};
    u64 power = 1;
    for (u64& entry : table) {
        entry = power;
        power *= 10;
    }
    return table;
}();

// The three digits of each number below 1,000: one division gives three digits.
inline constexpr auto c_triples = [] {
    std::array<char, 3000> table{};
    for (u32 i = 0; i < 1000; ++i) {
        table[3 * i] = static_cast<char>('0' + i / 100);
        table[3 * i + 1] = static_cast<char>('0' + i / 10 % 10);
        table[3 * i + 2] = static_cast<char>('0' + i % 10);
    }
    return table;
}();

/// Decimal digits of @p value; 1 for 0.
inline int CountDigits(u64 value)
{
    // 1233 / 4096 is a little above the logarithm of 2, which gives the count or one less.
    u32 const low = static_cast<u32>(std::bit_width(value | 1)) * 1233 >> 12;
    return static_cast<int>(low + (value >= c_powersOfTen[low])) + (value == 0);
}

template <class Unit>
Unit* WriteTriple(Unit* end, u64 triple)
{
    char const* const digits = &c_triples[3 * triple];
    *--end = static_cast<Unit>(digits[2]);
    *--end = static_cast<Unit>(digits[1]);
    *--end = static_cast<Unit>(digits[0]);
    return end;
}

/// The digits of @p value, ending at @p end, without leading zeros; "0" for 0. Gives the first.
template <class Unit>
Unit* WriteDigits(Unit* end, u64 value)
{
    for (; value >= 1000; value /= 1000) end = WriteTriple(end, value % 1000);
    do *--end = static_cast<Unit>('0' + value % 10);
    while (value /= 10);
    return end;
}

/// The character before a number; 0 for none.
inline char SignOf(bool negative, SignStyle style)
{
    if (negative) return '-';
    return style == SignStyle::Plus ? '+' : style == SignStyle::Space ? ' ' : char{0};
}

/// Copies ASCII; gives the position behind it.
template <class Unit>
Unit* CopyAscii(Unit* to, char const* begin, char const* end)
{
    if constexpr (std::is_same_v<Unit, char>) {
        std::memcpy(to, begin, static_cast<size_t>(end - begin));
        return to + (end - begin);
    } else
        return std::copy(begin, end, to);
}

} // namespace Kernel::NumberTextDetail

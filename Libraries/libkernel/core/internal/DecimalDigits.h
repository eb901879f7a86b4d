#pragma once

#include "libkernel/core/Endian.h"
#include "libkernel/core/NumberText.h"

#include <algorithm>
#include <array>
#include <bit>

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

/// Decimal digits of @p value; 1 for 0.
inline int CountDigits(u64 value)
{
    // 1233 / 4096 is a little above the logarithm of 2, which gives the count or one less.
    u32 const low = static_cast<u32>(std::bit_width(value | 1)) * 1233 >> 12;
    return static_cast<int>(low + (value >= c_powersOfTen[low])) + (value == 0);
}

/// The 8 decimal digits of @p value, below 10^8, as values 0 to 9, the first in the lowest byte.
inline u64 SpreadDigits(u64 value)
{
    // Halves the digits three times, in all parts of the word at once.
    u64 const fours = value / 10000 | (value % 10000) << 32;
    u64 const hundreds = (fours * 10486 >> 20) & 0x0000007F'0000007F;
    u64 const twos = hundreds | (fours - 100 * hundreds) << 16;
    u64 const tens = (twos * 103 >> 10) & 0x000F000F'000F000F;
    return tens | (twos - 10 * tens) << 8;
}

/// What makes characters of spread digits.
constexpr u64 c_zeroDigits = 0x30303030'30303030;

inline void WriteEight(char* to, u64 value)
{
    StoreLittleEndian(to, SpreadDigits(value) | c_zeroDigits);
}

constexpr u64 c_eightDigits = 100'000'000;
/// Room that WriteDigits needs before the end: it writes whole words, so that the number of digits, which no machine
/// can foresee, decides about few branches.
constexpr int c_digitsRoom = 24;

/// The digits of @p value, ending at @p end, without leading zeros; "0" for 0. Gives the first.
inline char* WriteDigits(char* end, u64 value)
{
    if (value < c_eightDigits)
        WriteEight(end - 8, value);
    else {
        u64 const high = value / c_eightDigits;
        WriteEight(end - 8, value % c_eightDigits);
        if (high < c_eightDigits)
            WriteEight(end - 16, high);
        else {
            WriteEight(end - 16, high % c_eightDigits);
            WriteEight(end - 24, high / c_eightDigits);
        }
    }
    return end - CountDigits(value);
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
    return std::copy(begin, end, to);
}

} // namespace Kernel::NumberTextDetail

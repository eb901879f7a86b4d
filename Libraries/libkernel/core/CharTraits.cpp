#include "libkernel/core/CharTraits.h"

#include <bit>

namespace Kernel {
namespace {

constexpr u64 c_highBits = 0x8080808080808080u;
constexpr u64 c_lowBits = 0x0101010101010101u;

u64 LoadEight(char const* p)
{
    u64 word;
    std::memcpy(&word, p, sizeof word);
    return word;
}

// True if any of the eight bytes is zero. Only exact for bytes below 0x80, which is where it is asked.
bool HasZeroByte(u64 asciiWord)
{
    return ((asciiWord - c_lowBits) & c_highBits) != 0;
}

bool IsTail(char c)
{
    return (static_cast<u8>(c) & 0xC0) == 0x80;
}

} // namespace

int CharTraits<TEncUtf8>::GetLengthInCodePoints(char const* s, int n)
{
    int count = 0;
    int i = 0;
    // A continuation byte has bit 7 set and bit 6 clear; eight bytes are asked at once.
    for (; n - i >= 8; i += 8) {
        u64 const word = LoadEight(s + i);
        count += 8 - std::popcount(word & ~(word << 1) & c_highBits);
    }
    for (; i < n; ++i) count += !IsContinuation(s[i]);
    return count;
}

int CharTraits<TEncUtf8>::GetValidLength(char const* s, int n, bool allowZero)
{
    int i = 0;
    while (i < n) {
        while (n - i >= 16) {
            u64 const a = LoadEight(s + i);
            u64 const b = LoadEight(s + i + 8);
            if ((a | b) & c_highBits) break;
            if (!allowZero && (HasZeroByte(a) || HasZeroByte(b))) break;
            i += 16;
        }
        // Text beyond ASCII comes in runs, so the wide test is worth trying again only after one plain byte.
        while (i < n) {
            u32 const lead = Byte(s[i]);
            if (lead < 0x80) {
                if (lead == 0 && !allowZero) return i;
                ++i;
                break;
            }
            if (lead < 0xC0 || lead > 0xF7) return i;
            int const length = GetCodePointLength(s[i]);
            if (length > n - i || !IsTail(s[i + 1])) return i;
            if (length > 2 && !IsTail(s[i + 2])) return i;
            if (length > 3 && !IsTail(s[i + 3])) return i;
            i += length;
        }
    }
    return i;
}

int CharTraits<TEncUtf16>::GetLengthInCodePoints(char16_t const* s, int n)
{
    int count = 0;
    for (int i = 0; i < n; ++i) count += !IsTrailSurrogate(s[i]);
    return count;
}

int CharTraits<TEncUtf16>::GetValidLength(char16_t const* s, int n, bool allowZero)
{
    int i = 0;
    while (i < n) {
        if (s[i] == 0 && !allowZero) return i;
        if (!IsSurrogate(s[i])) {
            ++i;
            continue;
        }
        if (!IsLeadSurrogate(s[i]) || n - i < 2 || !IsTrailSurrogate(s[i + 1])) return i;
        i += 2;
    }
    return i;
}

int CharTraits<TEncUtf32>::GetValidLength(unsigned int const* s, int n, bool allowZero)
{
    int i = 0;
    while (i < n && s[i] <= 0x10FFFF && !CharTraits<TEncUtf16>::IsSurrogate(s[i]) && (s[i] != 0 || allowZero)) ++i;
    return i;
}

} // namespace Kernel

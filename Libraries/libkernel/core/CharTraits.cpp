#include "libkernel/core/CharTraits.h"

#include <algorithm>
#include <bit>
#if defined(__SSE2__)
#include <emmintrin.h>
#endif

namespace Kernel {
namespace {

constexpr u64 c_highBits = 0x8080808080808080u;

u64 LoadEight(char const* p)
{
    u64 word;
    std::memcpy(&word, p, sizeof word);
    return word;
}

bool IsTail(char c)
{
    return (static_cast<u8>(c) & 0xC0) == 0x80;
}

// The rule code point by code point, from @p i, which begins one, until it stops or has come to @p enough.
int ScanValid(char const* s, int i, int enough, int n, bool allowZero)
{
    while (i < enough) {
        u8 const lead = static_cast<u8>(s[i]);
        if (lead < 0x80) {
            if (lead == 0 && !allowZero) return i;
            ++i;
            continue;
        }
        if (lead < 0xC0 || lead > 0xF7) return i;
        int const length = CharTraits<TEncUtf8>::GetCodePointLength(s[i]);
        if (length > n - i || !IsTail(s[i + 1])) return i;
        if (length > 2 && !IsTail(s[i + 2])) return i;
        if (length > 3 && !IsTail(s[i + 3])) return i;
        i += length;
    }
    return i;
}

#if defined(__SSE2__)

__m128i Load(char const* p)
{
    return _mm_loadu_si128(reinterpret_cast<__m128i const*>(p));
}

__m128i AtLeast(__m128i bytes, int bound)
{
    __m128i const b = _mm_set1_epi8(static_cast<char>(bound));
    return _mm_cmpeq_epi8(_mm_max_epu8(bytes, b), bytes);
}

// Stretches of ASCII from @p i on.
int SkipAscii(char const* s, int i, int n, bool allowZero)
{
    for (; n - i >= 64; i += 64) {
        __m128i const a = Load(s + i), b = Load(s + i + 16), c = Load(s + i + 32), d = Load(s + i + 48);
        __m128i const any = _mm_or_si128(_mm_or_si128(a, b), _mm_or_si128(c, d));
        __m128i const least = _mm_min_epu8(_mm_min_epu8(a, b), _mm_min_epu8(c, d));
        __m128i const zeros = _mm_cmpeq_epi8(least, _mm_setzero_si128());
        if (_mm_movemask_epi8(any) != 0 || (!allowZero && _mm_movemask_epi8(zeros) != 0)) break;
    }
    return i;
}

// A byte is in its place if it is a continuation byte exactly where one of the three bytes before it asks for one, and
// is no lead above F7. Sixteen places are asked at once, from @p i on, which has three bytes before it that are in
// theirs; gives where the first sixteen begin that are not all in place, or fewer than sixteen bytes are left.
int SkipValid(char const* s, int i, int n, bool allowZero)
{
    __m128i const forbidden = _mm_set1_epi8(allowZero ? static_cast<char>(0xFF) : 0);
    for (; n - i >= 16; i += 16) {
        __m128i const bytes = Load(s + i);
        __m128i const asked = _mm_or_si128(_mm_or_si128(AtLeast(Load(s + i - 1), 0xC0), AtLeast(Load(s + i - 2), 0xE0)),
                                           AtLeast(Load(s + i - 3), 0xF0));
        __m128i const tails = _mm_cmplt_epi8(bytes, _mm_set1_epi8(static_cast<char>(0xC0)));
        __m128i const bad = _mm_or_si128(_mm_xor_si128(asked, tails),
                                         _mm_or_si128(AtLeast(bytes, 0xF8), _mm_cmpeq_epi8(bytes, forbidden)));
        if (_mm_movemask_epi8(bad) != 0) break;
        if (_mm_movemask_epi8(bytes) == 0) i = SkipAscii(s, i + 16, n, allowZero) - 16;
    }
    return i;
}

#else

// True if any of the eight bytes is zero. Only exact for bytes below 0x80, which is where it is asked.
bool HasZeroByte(u64 asciiWord)
{
    return ((asciiWord - 0x0101010101010101u) & c_highBits) != 0;
}

int SkipValid(char const* s, int i, int n, bool allowZero)
{
    for (; n - i >= 8; i += 8) {
        u64 const word = LoadEight(s + i);
        if ((word & c_highBits) != 0 || (!allowZero && HasZeroByte(word))) break;
    }
    return i;
}

#endif

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
    int i = ScanValid(s, 0, std::min(n, 3), n, allowZero);
    if (i < 3) return i;
    int const skipped = SkipValid(s, i, n, allowZero);
    // What was skipped may end inside a code point.
    if (skipped > i) i = GetCodePointBegin(s, skipped - 1);
    return ScanValid(s, i, n, n, allowZero);
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

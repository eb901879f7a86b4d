#include "libkernel/core/ConvertEnc.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/internal/VectorConvert.h"

#include <algorithm>
#include <bit>
#include <limits>
#include <new>
#if defined(__SSE2__)
#include <emmintrin.h>
#endif

// Two passes. The first counts what each unit adds to the target, with no look at its neighbours, so that sixteen units
// can be counted at once; for well-formed text that is the exact length. The second walks code points and is held
// to that length, which keeps ill-formed text inside the block as well. Between UTF-8 and UTF-16 most goes by vectors
// (VectorConvert.cpp); elsewhere runs of ASCII go sixteen units at a time.

namespace Kernel {
namespace {

constexpr int c_run = 16;
constexpr int c_longest = 4;       // Units of the longest code point.
constexpr int c_asciiSample = 512; // Units from the start that tell what kind of text it is.

// Units that one source unit adds to the target. The lead byte of a code point pays for the whole of it in UTF-16 and
// UTF-32; in UTF-8 each half of a surrogate pair pays for two of its four bytes.
template <class To, class From>
int TargetLength(typename From::Unit unit)
{
    if constexpr (std::is_same_v<From, TEncUtf8>) {
        int const leads = static_cast<signed char>(unit) >= static_cast<signed char>(0xC0);
        if constexpr (std::is_same_v<To, TEncUtf16>)
            return leads + (static_cast<u8>(unit) >= 0xF0);
        else
            return leads;
    } else if constexpr (std::is_same_v<From, TEncUtf16>) {
        if constexpr (std::is_same_v<To, TEncUtf32>)
            return (unit & 0xFC00) != 0xDC00;
        else
            return 1 + (unit > 0x7F) + (unit > 0x7FF) - ((unit & 0xF800) == 0xD800);
    } else
        return CharTraits<To>::GetCodePointLength(static_cast<u32>(unit));
}

template <class To, class From>
u64 SumLengths(typename From::Unit const* src, int n)
{
    u64 total = 0;
    for (int i = 0; i < n; ++i) total += static_cast<u32>(TargetLength<To, From>(src[i]));
    return total;
}

#if defined(__SSE2__)

__m128i Load(void const* p)
{
    return _mm_loadu_si128(static_cast<__m128i const*>(p));
}

void Store(void* p, __m128i v)
{
    _mm_storeu_si128(static_cast<__m128i*>(p), v);
}

// Each CopyAscii copies c_run units, whatever they are, and gives how many of the first are ASCII: the rest of what it
// wrote is to be written over. Both sides have room for c_run units.
int CopyAscii(char16_t* to, char const* from)
{
    __m128i const v = Load(from);
    __m128i const zero = _mm_setzero_si128();
    Store(to, _mm_unpacklo_epi8(v, zero));
    Store(to + 8, _mm_unpackhi_epi8(v, zero));
    return std::countr_zero(static_cast<u32>(_mm_movemask_epi8(v)) | 1u << c_run);
}

int CopyAscii(char* to, char16_t const* from)
{
    __m128i const a = Load(from);
    __m128i const b = Load(from + 8);
    __m128i const beyond = _mm_set1_epi16(static_cast<short>(0xFF80));
    __m128i const zero = _mm_setzero_si128();
    __m128i const plain = _mm_packs_epi16(_mm_cmpeq_epi16(_mm_and_si128(a, beyond), zero),
                                          _mm_cmpeq_epi16(_mm_and_si128(b, beyond), zero));
    Store(to, _mm_packus_epi16(a, b));
    return std::countr_one(static_cast<u32>(_mm_movemask_epi8(plain)));
}

// Sum of the sixteen bytes.
u64 SumBytes(__m128i v)
{
    __m128i const halves = _mm_sad_epu8(v, _mm_setzero_si128());
    return static_cast<u64>(_mm_cvtsi128_si64(halves)) + static_cast<u64>(_mm_cvtsi128_si64(_mm_srli_si128(halves, 8)));
}

// Target lengths of the stretches of sixteen units that @p n holds; the rest is left to the caller. A comparison that
// holds is -1 in its lane, so subtracting it counts; the sums are emptied before a byte can overflow.
template <class To>
u64 SumRuns(char const* src, int runs)
{
    u64 total = 0;
    __m128i const fourByteLead = _mm_set1_epi8(static_cast<char>(0xF0));
    while (runs > 0) {
        int const stretch = std::min(runs, 127);
        __m128i sum = _mm_setzero_si128();
        for (int i = 0; i < stretch; ++i, src += c_run) {
            __m128i const v = Load(src);
            sum = _mm_sub_epi8(sum, _mm_cmpgt_epi8(v, _mm_set1_epi8(static_cast<char>(0xBF))));
            if constexpr (std::is_same_v<To, TEncUtf16>)
                sum = _mm_sub_epi8(sum, _mm_cmpeq_epi8(_mm_max_epu8(v, fourByteLead), v));
        }
        total += SumBytes(sum);
        runs -= stretch;
    }
    return total;
}

template <class To>
u64 SumRuns(char16_t const* src, int runs)
{
    u64 total = 0;
    __m128i const zero = _mm_setzero_si128();
    auto const atMost = [&](__m128i v, short bound) {
        return _mm_cmpeq_epi16(_mm_subs_epu16(v, _mm_set1_epi16(bound)), zero);
    };
    while (runs > 0) {
        int const stretch = std::min(runs, 32);
        __m128i sum = zero; // Of what each unit stays below three bytes, or of trail surrogates.
        for (int i = 0; i < 2 * stretch; ++i, src += c_run / 2) {
            __m128i const v = Load(src);
            if constexpr (std::is_same_v<To, TEncUtf8>) {
                __m128i const surrogate = _mm_cmpeq_epi16(_mm_and_si128(v, _mm_set1_epi16(static_cast<short>(0xF800))),
                                                          _mm_set1_epi16(static_cast<short>(0xD800)));
                sum = _mm_sub_epi16(sum, _mm_add_epi16(_mm_add_epi16(atMost(v, 0x7F), atMost(v, 0x7FF)), surrogate));
            } else {
                sum = _mm_sub_epi16(sum, _mm_cmpeq_epi16(_mm_and_si128(v, _mm_set1_epi16(static_cast<short>(0xFC00))),
                                                         _mm_set1_epi16(static_cast<short>(0xDC00))));
            }
        }
        u64 const most = (std::is_same_v<To, TEncUtf8> ? 3u : 1u) * static_cast<u64>(c_run) * static_cast<u64>(stretch);
        total += most - SumBytes(sum); // No lane passes 3 times 64, so its high byte is zero.
        runs -= stretch;
    }
    return total;
}

#endif

template <class To, class From>
u64 TargetLength(typename From::Unit const* src, int n)
{
#if defined(__SSE2__)
    if constexpr (!std::is_same_v<From, TEncUtf32>) {
        int const wide = n / c_run * c_run;
        return SumRuns<To>(src, n / c_run) + SumLengths<To, From>(src + wide, n - wide);
    }
#endif
    return SumLengths<To, From>(src, n);
}

template <class Unit>
bool IsAscii(Unit unit)
{
    return static_cast<std::make_unsigned_t<Unit>>(unit) <= 0x7F;
}

template <class To, class From>
int CopyAscii(To* to, From const* from)
{
    int n = 0;
    for (; n < c_run && IsAscii(from[n]); ++n) to[n] = static_cast<To>(from[n]);
    return n;
}

// Writes a code point beyond ASCII where there is room for c_longest units, all of which may be written.
template <class To>
[[gnu::always_inline]] inline typename To::Unit* AppendFar(typename To::Unit* to, u32 codePoint)
{
    if constexpr (std::is_same_v<To, TEncUtf8>) {
        u32 const last = 0x80 | (codePoint & 0x3F);
        if (codePoint <= 0x7FF) {
            StoreLittleEndian<u32>(to, 0xC0 | codePoint >> 6 | last << 8);
            return to + 2;
        }
        u32 const middle = 0x80 | (codePoint >> 6 & 0x3F);
        if (codePoint <= 0xFFFF) {
            StoreLittleEndian<u32>(to, 0xE0 | codePoint >> 12 | middle << 8 | last << 16);
            return to + 3;
        }
    }
    return CharTraits<To>::AppendCodePoint(to, codePoint);
}

// One code point beyond ASCII from one side to the other, with room for c_longest units on both. Each length has a road
// of its own, on which the compiler knows what the target needs.
template <class To, class From>
[[gnu::always_inline]] inline void ConvertFar(typename To::Unit*& to, typename From::Unit const*& from)
{
    if constexpr (std::is_same_v<From, TEncUtf8>) {
        auto const byte = [&](int i) { return static_cast<u32>(static_cast<u8>(from[i])); };
        u32 const lead = byte(0);
        if (lead <= 0xDF) {
            to = AppendFar<To>(to, (lead & 0x1F) << 6 | (byte(1) & 0x3F));
            from += 2;
        } else if (lead <= 0xEF) {
            to = AppendFar<To>(to, (lead & 0x0F) << 12 | (byte(1) & 0x3F) << 6 | (byte(2) & 0x3F));
            from += 3;
        } else
            to = AppendFar<To>(to, CharTraits<From>::NextCodePoint(from));
    } else if constexpr (std::is_same_v<From, TEncUtf16>) {
        u32 const unit = *from;
        if (!CharTraits<From>::IsLeadSurrogate(unit)) {
            to = AppendFar<To>(to, unit);
            ++from;
        } else
            to = AppendFar<To>(to, CharTraits<From>::NextCodePoint(from));
    } else
        to = AppendFar<To>(to, *from++);
}

template <class To, class From>
constexpr bool c_hasVectors = !std::is_same_v<To, TEncUtf32> && !std::is_same_v<From, TEncUtf32>;

bool IsBeyondVectors(char unit)
{
    return static_cast<u8>(unit) >= 0xF0;
}

bool IsBeyondVectors(char16_t unit)
{
    return CharTraits<TEncUtf16>::IsSurrogate(unit);
}

template <class To, class From>
typename To::Unit* Convert(typename To::Unit* to, typename To::Unit const* const toEnd, typename From::Unit const* from,
                           typename From::Unit const* const fromEnd)
{
    using Source = CharTraits<From>;
    using Target = CharTraits<To>;
    auto const room = [&] { return std::min(fromEnd - from, toEnd - to); };
    if constexpr (c_hasVectors<To, From>)
        while (room() >= c_vectorRoom && ConvertInVectors(to, toEnd, from, fromEnd) && room() >= c_longest) {
            // Whatever the vectors stopped at, and those of its like that follow.
            do {
                if (IsAscii(*from))
                    *to++ = static_cast<typename To::Unit>(*from++);
                else
                    ConvertFar<To, From>(to, from);
            } while (room() >= c_longest && IsBeyondVectors(*from));
        }
    while (room() >= c_run) {
        int const plain = CopyAscii(to, from);
        if (plain == c_run) { // A step of known length lets the next copy begin before this one is looked at.
            from += c_run;
            to += c_run;
            continue;
        }
        from += plain;
        to += plain;
        // Words of other scripts stand between single spaces, which are not worth a wide copy.
        int plainRun = 0;
        for (auto safe = room() / c_longest; safe > 0; --safe) {
            if (!IsAscii(*from)) {
                ConvertFar<To, From>(to, from);
                plainRun = 0;
                continue;
            }
            *to++ = static_cast<typename To::Unit>(*from++);
            if (++plainRun == c_run / 2) break;
        }
    }
    while (from < fromEnd && Source::GetCodePointLength(*from) <= fromEnd - from) {
        u32 const codePoint = Source::NextCodePoint(from);
        if (Target::GetCodePointLength(codePoint) > toEnd - to) break;
        to = Target::AppendCodePoint(to, codePoint);
    }
    return to;
}

// Text that begins with ASCII is mostly ASCII to its end, and has as many units in every encoding: it is written at
// once, which saves the pass that measures. Gives the units that were appended so.
template <class To, class From>
int AppendAscii(StringT<To>& dst, typename From::Unit const* src, int n)
{
    if constexpr (c_hasVectors<To, From>) {
        int const old = dst.GetLength();
        if (n <= 0 || n > std::numeric_limits<i32>::max() - old || !IsAsciiRun(src, std::min(n, c_asciiSample)))
            return 0;
        int const plain = CopyAsciiRun(dst.SetLength(old + n) + old, src, n);
        dst.SetLength(old + plain);
        return plain;
    }
    return 0;
}

// Makes the text @p length units long, of which @p kept are there. The block is replaced if it was made far too large,
// which is where it now holds more than @p reserved units.
template <class To>
typename To::Unit* GrowTo(StringT<To>& dst, int kept, int length, int reserved)
{
    if (dst.GetCapacity() > reserved && dst.GetCapacity() - length > length / 4) {
        StringT<To> exact;
        exact.Reserve(length);
        exact.Append(dst.GetData(), kept);
        dst.Swap(exact);
    }
    return dst.SetLength(length);
}

} // namespace

template <class To, class From>
void ConvertEnc(StringT<To>& dst, typename From::Unit const* src, int n)
{
    if (n < 0) n = src ? BaseCharTraits<typename From::Unit>::GetLength(src) : 0;
    if constexpr (std::is_same_v<To, From>)
        dst.Append(src, n);
    else {
        int const old = dst.GetLength();
        int const reserved = dst.GetCapacity();
        int const plain = AppendAscii<To, From>(dst, src, n);
        if (plain == n) return;
        u64 const added = static_cast<u64>(plain) + TargetLength<To, From>(src + plain, n - plain);
        if (added > static_cast<u64>(std::numeric_limits<i32>::max() - old)) throw std::bad_alloc();
        int const length = old + static_cast<int>(added);
        auto* const units = GrowTo(dst, old + plain, length, reserved);
        auto* const end = Convert<To, From>(units + old + plain, units + length, src + plain, src + n);
        if (end != units + length) dst.SetLength(static_cast<int>(end - units));
    }
}

template KERNEL_API void ConvertEnc<TEncUtf8, TEncUtf8>(String8&, char const*, int);
template KERNEL_API void ConvertEnc<TEncUtf8, TEncUtf16>(String8&, char16_t const*, int);
template KERNEL_API void ConvertEnc<TEncUtf8, TEncUtf32>(String8&, unsigned int const*, int);
template KERNEL_API void ConvertEnc<TEncUtf16, TEncUtf8>(String16&, char const*, int);
template KERNEL_API void ConvertEnc<TEncUtf16, TEncUtf16>(String16&, char16_t const*, int);
template KERNEL_API void ConvertEnc<TEncUtf16, TEncUtf32>(String16&, unsigned int const*, int);
template KERNEL_API void ConvertEnc<TEncUtf32, TEncUtf8>(String32&, char const*, int);
template KERNEL_API void ConvertEnc<TEncUtf32, TEncUtf16>(String32&, char16_t const*, int);
template KERNEL_API void ConvertEnc<TEncUtf32, TEncUtf32>(String32&, unsigned int const*, int);

} // namespace Kernel

#include "libkernel/core/ConvertEnc.h"

#include "libkernel/core/CharTraits.h"

#include <algorithm>
#include <limits>
#include <new>
#if defined(__SSE2__)
#include <emmintrin.h>
#endif

// Two passes. The first counts what each unit adds to the target, with no look at its neighbours, so that the compiler
// can turn it into vector code; for well-formed text that is the exact length. The second walks code points and is held
// to that length, which keeps ill-formed text inside the block as well. Runs of ASCII go sixteen units at a time.

namespace Kernel {
namespace {

constexpr int c_run = 16;

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
u64 TargetLength(typename From::Unit const* src, int n)
{
    u64 total = 0;
    constexpr int stretch = 1 << 20; // An inner sum in 32 bits is what vectorises well.
    for (int begin = 0; begin < n;) {
        int const end = begin + std::min(stretch, n - begin);
        u32 sum = 0;
        for (int i = begin; i < end; ++i) sum += static_cast<u32>(TargetLength<To, From>(src[i]));
        total += sum;
        begin = end;
    }
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

// Each CopyRun copies c_run ASCII units, or gives false and may have scribbled on the target, which has room for them.
bool CopyRun(char16_t* to, char const* from)
{
    __m128i const v = Load(from);
    if (_mm_movemask_epi8(v)) return false;
    __m128i const zero = _mm_setzero_si128();
    Store(to, _mm_unpacklo_epi8(v, zero));
    Store(to + 8, _mm_unpackhi_epi8(v, zero));
    return true;
}

bool CopyRun(char* to, char16_t const* from)
{
    __m128i const a = Load(from);
    __m128i const b = Load(from + 8);
    __m128i const beyond = _mm_and_si128(_mm_or_si128(a, b), _mm_set1_epi16(static_cast<short>(0xFF80)));
    if (_mm_movemask_epi8(_mm_cmpeq_epi16(beyond, _mm_setzero_si128())) != 0xFFFF) return false;
    Store(to, _mm_packus_epi16(a, b));
    return true;
}

#endif

template <class To, class From>
bool CopyRun(To* to, From const* from)
{
    u32 all = 0;
    for (int i = 0; i < c_run; ++i) all |= static_cast<u32>(static_cast<std::make_unsigned_t<From>>(from[i]));
    if (all > 0x7F) return false;
    for (int i = 0; i < c_run; ++i) to[i] = static_cast<To>(from[i]);
    return true;
}

template <class To, class From>
typename To::Unit* Convert(typename To::Unit* to, typename To::Unit const* const toEnd, typename From::Unit const* from,
                           typename From::Unit const* const fromEnd)
{
    while (from < fromEnd) {
        while (fromEnd - from >= c_run && toEnd - to >= c_run && CopyRun(to, from)) {
            from += c_run;
            to += c_run;
        }
        // Text beyond ASCII comes in runs: the wide copy is worth trying again only where plain units stand.
        for (int plain = 0; from < fromEnd && plain < c_run / 2;) {
            if (static_cast<u32>(static_cast<std::make_unsigned_t<typename From::Unit>>(*from)) <= 0x7F) {
                if (to == toEnd) return to;
                *to++ = static_cast<typename To::Unit>(*from++);
                ++plain;
                continue;
            }
            plain = 0;
            if (CharTraits<From>::GetCodePointLength(*from) > fromEnd - from) return to;
            u32 const codePoint = CharTraits<From>::NextCodePoint(from);
            if (CharTraits<To>::GetCodePointLength(codePoint) > toEnd - to) return to;
            to = CharTraits<To>::AppendCodePoint(to, codePoint);
        }
    }
    return to;
}

} // namespace

template <class To, class From>
void ConvertEnc(StringT<To>& dst, typename From::Unit const* src, int n)
{
    if (n < 0) n = src ? BaseCharTraits<typename From::Unit>::GetLength(src) : 0;
    if constexpr (std::is_same_v<To, From>)
        dst.Append(src, n);
    else {
        u64 const added = TargetLength<To, From>(src, n);
        int const old = dst.GetLength();
        if (added > static_cast<u64>(std::numeric_limits<i32>::max() - old)) throw std::bad_alloc();
        if (added == 0) return;
        int const length = old + static_cast<int>(added);
        auto* const units = dst.SetLength(length);
        auto* const end = Convert<To, From>(units + old, units + length, src, src + n);
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

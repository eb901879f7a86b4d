#include "libkernel/core/internal/VectorConvert.h"

#include <array>
#include <bit>
#include <type_traits>
#if defined(__SSE2__)
#include <tmmintrin.h>
#endif

// Words of several scripts alternate in real text, and a branch on each code point is guessed wrong at every change. So
// several code points at a time are put in place by one byte shuffle, which comes from a table by their lengths: where
// code points end in the next twelve bytes, or which of four units need one, two or three bytes.

namespace Kernel {

#if defined(__SSE2__)

namespace {

using Shuffle = std::array<u8, 16>;

constexpr u8 c_zero = 0x80; // Puts a zero byte.

// UTF-8 to UTF-16. A step takes six code points of at most two bytes each into lanes of 16 bits, or up to four of at
// most three bytes into lanes of 32 bits; the last byte of each comes first. By the twelve bits that say which bytes
// end a code point.
struct WideningTables
{
    struct Step
    {
        u8 shuffle;
        u8 bytes : 4; // Taken from the source; 0 where a code point of four bytes comes first.
        u8 units : 4;
    };
    static constexpr int c_six = 64; // Shuffles for six code points; those for up to four follow.

    std::array<Step, 4096> steps{};
    std::array<Shuffle, c_six + 3 + 9 + 27 + 81> shuffles{};

    constexpr WideningTables()
    {
        for (u32 ends = 0; ends < steps.size(); ++ends) steps[ends] = MakeStep(ends);
    }

private:
    constexpr Step MakeStep(u32 ends)
    {
        int lengths[6] = {};
        int count = 0;
        for (int at = 0; count < 6; ++count) {
            if (ends >> at == 0) break;
            lengths[count] = std::countr_zero(ends >> at) + 1;
            at += lengths[count];
        }
        if (count == 6 && IsAtMost(lengths, 6, 2)) return Place(lengths, 6, 2, 0);
        int few = 0;
        while (few < count && few < 4 && lengths[few] <= 3) ++few;
        if (few == 0) return {};
        constexpr int c_starts[] = {0, c_six, c_six + 3, c_six + 3 + 9, c_six + 3 + 9 + 27};
        return Place(lengths, few, 4, c_starts[few]);
    }
    static constexpr bool IsAtMost(int const* lengths, int count, int most)
    {
        for (int i = 0; i < count; ++i)
            if (lengths[i] > most) return false;
        return true;
    }
    // Lanes of @p lane bytes; the shuffle's number is the lengths, as digits, from @p start on.
    constexpr Step Place(int const* lengths, int count, int lane, int start)
    {
        int number = 0;
        int end = 0;
        Shuffle shuffle{};
        shuffle.fill(c_zero);
        for (int i = 0; i < count; ++i) {
            number = number * (lane == 2 ? 2 : 3) + lengths[i] - 1;
            end += lengths[i];
            for (int byte = 0; byte < lengths[i]; ++byte)
                shuffle[static_cast<size_t>(i * lane + byte)] = static_cast<u8>(end - 1 - byte);
        }
        shuffles[static_cast<size_t>(start + number)] = shuffle;
        return {static_cast<u8>(start + number), static_cast<u8>(end & 15), static_cast<u8>(count & 15)};
    }
};
constexpr WideningTables c_widening;

// UTF-16 to UTF-8. Four units stand as three bytes each, in lanes of 32 bits, of which the last one, two or three
// count. By one bit each for those of one byte, then for those of at most two.
struct NarrowingTables
{
    std::array<Shuffle, 256> shuffles{};
    std::array<u8, 256> lengths{};

    constexpr NarrowingTables()
    {
        for (u32 key = 0; key < 256; ++key) {
            u8 length = 0;
            shuffles[key].fill(c_zero);
            for (u32 i = 0; i < 4; ++i) {
                u32 const skipped = (key >> i & 1) + (key >> (i + 4) & 1);
                for (u32 byte = skipped; byte < 3; ++byte) shuffles[key][length++] = static_cast<u8>(4 * i + byte);
            }
            lengths[key] = length;
        }
    }
};
constexpr NarrowingTables c_narrowing;

[[gnu::always_inline]] inline __m128i Load(void const* p)
{
    return _mm_loadu_si128(static_cast<__m128i const*>(p));
}

[[gnu::always_inline]] inline void Store(void* p, __m128i v)
{
    _mm_storeu_si128(static_cast<__m128i*>(p), v);
}

[[gnu::always_inline]] inline void StoreWide(char16_t* to, __m128i bytes)
{
    Store(to, _mm_unpacklo_epi8(bytes, _mm_setzero_si128()));
    Store(to + 8, _mm_unpackhi_epi8(bytes, _mm_setzero_si128()));
}

// Bits of a unit that ASCII hasn't, in 16 bytes of units.
[[gnu::always_inline]] inline bool HasNone(__m128i units, short bits)
{
    __m128i const found = _mm_and_si128(units, _mm_set1_epi16(bits));
    return _mm_movemask_epi8(_mm_cmpeq_epi8(found, _mm_setzero_si128())) == 0xFFFF;
}
constexpr short c_beyondAscii = static_cast<short>(0xFF80);

// So many units are not in the cache when they are read next, so they go past it: that saves reading the target's lines
// before they are written, a third of all that goes over the bus.
constexpr int c_streamed = 1 << 22;

struct Stored
{
    static constexpr u64 c_alignment = 1;
    static void Put(void* p, __m128i v) { Store(p, v); }
    static void Finish() {}
};
struct Streamed
{
    static constexpr u64 c_alignment = 16;
    static void Put(void* p, __m128i v) { _mm_stream_si128(static_cast<__m128i*>(p), v); }
    static void Finish() { _mm_sfence(); }
};

template <class How>
bool CopyBlock(char16_t* to, char const* from)
{
    __m128i const a = Load(from), b = Load(from + 16), c = Load(from + 32), d = Load(from + 48);
    if (_mm_movemask_epi8(_mm_or_si128(_mm_or_si128(a, b), _mm_or_si128(c, d))) != 0) return false;
    __m128i const zero = _mm_setzero_si128();
    int i = 0;
    for (__m128i const bytes : {a, b, c, d}) {
        How::Put(to + i, _mm_unpacklo_epi8(bytes, zero));
        How::Put(to + i + 8, _mm_unpackhi_epi8(bytes, zero));
        i += 16;
    }
    return true;
}

template <class How>
bool CopyBlock(char* to, char16_t const* from)
{
    for (int i = 0; i < 64; i += 32) {
        char16_t const* const p = from + i;
        __m128i const a = Load(p), b = Load(p + 8), c = Load(p + 16), d = Load(p + 24);
        if (!HasNone(_mm_or_si128(_mm_or_si128(a, b), _mm_or_si128(c, d)), c_beyondAscii)) return false;
        How::Put(to + i, _mm_packus_epi16(a, b));
        How::Put(to + i + 16, _mm_packus_epi16(c, d));
    }
    return true;
}

template <class How, class To, class From>
int CopyAscii(To* to, From const* from, int n)
{
    auto const isPlain = [&](int i) { return i < n && static_cast<std::make_unsigned_t<From>>(from[i]) < 0x80; };
    int i = 0;
    for (; isPlain(i) && reinterpret_cast<u64>(to + i) % How::c_alignment != 0; ++i) to[i] = static_cast<To>(from[i]);
    if (reinterpret_cast<u64>(to + i) % How::c_alignment == 0)
        while (n - i >= 64 && CopyBlock<How>(to + i, from + i)) i += 64;
    How::Finish();
    for (; isPlain(i); ++i) to[i] = static_cast<To>(from[i]);
    return i;
}

bool HasByteShuffle()
{
    static bool const has = __builtin_cpu_supports("ssse3");
    return has;
}

[[gnu::target("ssse3")]] void Widen(char16_t*& toBegin, char16_t const* toEnd, char const*& fromBegin,
                                    char const* fromEnd)
{
    char16_t* to = toBegin;
    char const* from = fromBegin;
    while (fromEnd - from >= c_vectorRoom && toEnd - to >= c_vectorRoom) {
        __m128i const bytes = Load(from);
        if (_mm_movemask_epi8(bytes) == 0) {
            StoreWide(to, bytes);
            from += 16;
            to += 16;
            continue;
        }
        int const tails = _mm_movemask_epi8(_mm_cmplt_epi8(bytes, _mm_set1_epi8(static_cast<char>(0xC0))));
        WideningTables::Step const step = c_widening.steps[static_cast<u32>(~tails) >> 1 & 0xFFF];
        if (step.bytes == 0) break;
        __m128i const lanes = _mm_shuffle_epi8(bytes, Load(c_widening.shuffles[step.shuffle].data()));
        if (step.shuffle < WideningTables::c_six) {
            __m128i const low = _mm_and_si128(lanes, _mm_set1_epi16(0x7F));
            __m128i const high = _mm_srli_epi16(_mm_and_si128(lanes, _mm_set1_epi16(0x1F00)), 2);
            Store(to, _mm_or_si128(low, high));
        } else {
            __m128i const last = _mm_and_si128(lanes, _mm_set1_epi32(0x7F));
            __m128i const middle = _mm_srli_epi32(_mm_and_si128(lanes, _mm_set1_epi32(0x3F00)), 2);
            __m128i const high = _mm_srli_epi32(_mm_and_si128(lanes, _mm_set1_epi32(0x0F0000)), 4);
            __m128i const wide = _mm_or_si128(last, _mm_or_si128(middle, high));
            Store(to, _mm_shuffle_epi8(wide, _mm_set_epi8(-1, -1, -1, -1, -1, -1, -1, -1, 13, 12, 9, 8, 5, 4, 1, 0)));
        }
        from += step.bytes;
        to += step.units;
    }
    fromBegin = from;
    toBegin = to;
}

[[gnu::target("ssse3")]] void Narrow(char*& toBegin, char const* toEnd, char16_t const*& fromBegin,
                                     char16_t const* fromEnd)
{
    char* to = toBegin;
    char16_t const* from = fromBegin;
    auto const fill = [](int value) { return _mm_set1_epi16(static_cast<short>(value)); };
    while (fromEnd - from >= c_vectorRoom && toEnd - to >= c_vectorRoom) {
        __m128i const units = Load(from);
        if (HasNone(units, c_beyondAscii)) {
            __m128i const behind = Load(from + 8);
            Store(to, _mm_packus_epi16(units, behind));
            int const taken = HasNone(behind, c_beyondAscii) ? 16 : 8;
            from += taken;
            to += taken;
            continue;
        }
        if (_mm_movemask_epi8(_mm_cmpeq_epi16(_mm_and_si128(units, fill(0xF800)), fill(0xD800))) != 0) break;
        __m128i const zero = _mm_setzero_si128();
        __m128i const isOne = _mm_cmpeq_epi16(_mm_and_si128(units, fill(0xFF80)), zero);
        __m128i const isAtMostTwo = _mm_cmpeq_epi16(_mm_and_si128(units, fill(0xF800)), zero);
        __m128i const tail = _mm_or_si128(_mm_and_si128(units, fill(0x3F)), fill(0x80));
        __m128i const last = _mm_or_si128(_mm_and_si128(isOne, units), _mm_andnot_si128(isOne, tail));
        __m128i const middle =
            _mm_or_si128(_mm_or_si128(_mm_and_si128(_mm_slli_epi16(units, 2), fill(0x3F00)), fill(0x8000)),
                         _mm_and_si128(isAtMostTwo, fill(0x4000)));
        __m128i const first = _mm_or_si128(_mm_srli_epi16(units, 12), fill(0xE0));
        __m128i const front = _mm_or_si128(first, middle);
        u32 const keys = static_cast<u32>(_mm_movemask_epi8(_mm_packs_epi16(isOne, isAtMostTwo)));
        u32 const low = (keys & 0xF) | (keys >> 4 & 0xF0);
        u32 const high = (keys >> 4 & 0xF) | (keys >> 8 & 0xF0);
        Store(to, _mm_shuffle_epi8(_mm_unpacklo_epi16(front, last), Load(c_narrowing.shuffles[low].data())));
        to += c_narrowing.lengths[low];
        Store(to, _mm_shuffle_epi8(_mm_unpackhi_epi16(front, last), Load(c_narrowing.shuffles[high].data())));
        to += c_narrowing.lengths[high];
        from += 8;
    }
    fromBegin = from;
    toBegin = to;
}

} // namespace

bool ConvertInVectors(char16_t*& to, char16_t const* toEnd, char const*& from, char const* fromEnd)
{
    if (!HasByteShuffle()) return false;
    Widen(to, toEnd, from, fromEnd);
    return true;
}

bool ConvertInVectors(char*& to, char const* toEnd, char16_t const*& from, char16_t const* fromEnd)
{
    if (!HasByteShuffle()) return false;
    Narrow(to, toEnd, from, fromEnd);
    return true;
}

int CopyAsciiRun(char16_t* to, char const* from, int n)
{
    return n < c_streamed ? CopyAscii<Stored>(to, from, n) : CopyAscii<Streamed>(to, from, n);
}

int CopyAsciiRun(char* to, char16_t const* from, int n)
{
    return n < c_streamed ? CopyAscii<Stored>(to, from, n) : CopyAscii<Streamed>(to, from, n);
}

bool IsAsciiRun(char const* from, int n)
{
    int i = 0;
    for (; n - i >= 16; i += 16)
        if (_mm_movemask_epi8(Load(from + i)) != 0) return false;
    while (i < n && static_cast<u8>(from[i]) < 0x80) ++i;
    return i == n;
}

bool IsAsciiRun(char16_t const* from, int n)
{
    int i = 0;
    for (; n - i >= 8; i += 8)
        if (!HasNone(Load(from + i), c_beyondAscii)) return false;
    while (i < n && from[i] < 0x80) ++i;
    return i == n;
}

#else

namespace {

template <class To, class From>
int CopyAscii(To* to, From const* from, int n)
{
    int i = 0;
    for (; i < n && static_cast<std::make_unsigned_t<From>>(from[i]) < 0x80; ++i) to[i] = static_cast<To>(from[i]);
    return i;
}

} // namespace

bool ConvertInVectors(char16_t*&, char16_t const*, char const*&, char const*)
{
    return false;
}

bool ConvertInVectors(char*&, char const*, char16_t const*&, char16_t const*)
{
    return false;
}

int CopyAsciiRun(char16_t* to, char const* from, int n)
{
    return CopyAscii(to, from, n);
}

int CopyAsciiRun(char* to, char16_t const* from, int n)
{
    return CopyAscii(to, from, n);
}

bool IsAsciiRun(char const* from, int n)
{
    while (n > 0 && static_cast<u8>(from[n - 1]) < 0x80) --n;
    return n <= 0;
}

bool IsAsciiRun(char16_t const* from, int n)
{
    while (n > 0 && from[n - 1] < 0x80) --n;
    return n <= 0;
}

#endif

} // namespace Kernel

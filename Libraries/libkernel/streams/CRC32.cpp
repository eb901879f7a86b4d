#include "libkernel/streams/CRC32.h"

#include "libkernel/core/Endian.h"

#include <array>
#include <cstring>
#if defined(__x86_64__)
#include <immintrin.h>
#endif

namespace Kernel {

// Two methods. The tables take 16 bytes a step: table k holds the effect of a byte that k more bytes follow. Carry-less
// multiplication keeps four 128-bit remainders going and folds 64 bytes a step into them ("Fast CRC Computation for
// Generic Polynomials Using PCLMULQDQ Instruction", Intel 2009); the last 16 bytes of it go through the tables, which
// saves the reduction by division and costs some nanoseconds. Where the processor multiplies two at once, long data
// folds 128 bytes a step in the same way, in vectors of 256 bits: twice as fast.

namespace {

constexpr u32 c_reflectedPolynomial = 0xEDB88320u;
constexpr int c_tableCount = 16;

using Tables = std::array<std::array<u32, 256>, c_tableCount>;

constexpr Tables MakeTables()
{
    Tables t{};
    for (u32 i = 0; i < 256; ++i) {
        u32 crc = i;
        for (int bit = 0; bit < 8; ++bit) crc = (crc >> 1) ^ (crc & 1 ? c_reflectedPolynomial : 0);
        t[0][i] = crc;
    }
    for (int k = 1; k < c_tableCount; ++k)
        for (u32 i = 0; i < 256; ++i) t[k][i] = (t[k - 1][i] >> 8) ^ t[0][t[k - 1][i] & 0xFF];
    return t;
}

constexpr Tables c_tables = MakeTables();

// Four bytes with @p following bytes behind them in the step.
u32 FoldWord(u32 word, int following)
{
    return c_tables[following + 3][word & 0xFF] ^ c_tables[following + 2][word >> 8 & 0xFF] ^
           c_tables[following + 1][word >> 16 & 0xFF] ^ c_tables[following][word >> 24];
}

u32 CalcByTables(u8 const* p, u64 count, u32 crc)
{
    for (; count >= 16; p += 16, count -= 16)
        crc = FoldWord(crc ^ LoadLittleEndian<u32>(p), 12) ^ FoldWord(LoadLittleEndian<u32>(p + 4), 8) ^
              FoldWord(LoadLittleEndian<u32>(p + 8), 4) ^ FoldWord(LoadLittleEndian<u32>(p + 12), 0);
    for (; count; ++p, --count) crc = (crc >> 8) ^ c_tables[0][(crc ^ *p) & 0xFF];
    return crc;
}

#if defined(__x86_64__)

// x^exponent modulo the polynomial, bits reversed, and shifted by one because a product of two reversed numbers comes
// out one bit too low.
constexpr u64 FoldConstant(int exponent)
{
    u64 remainder = 1;
    for (int i = 0; i < exponent; ++i) {
        remainder <<= 1;
        if (remainder >> 32) remainder ^= 0x104C11DB7ull;
    }
    u64 reversed = 0;
    for (int bit = 0; bit < 32; ++bit) reversed |= (remainder >> bit & 1) << (31 - bit);
    return reversed << 1;
}

// What carries the two halves of a remainder over 1024, 512 and 128 bits.
constexpr u64 c_over1024Low = FoldConstant(1024 + 32);
constexpr u64 c_over1024High = FoldConstant(1024 - 32);
constexpr u64 c_over512Low = FoldConstant(512 + 32);
constexpr u64 c_over512High = FoldConstant(512 - 32);
constexpr u64 c_over128Low = FoldConstant(128 + 32);
constexpr u64 c_over128High = FoldConstant(128 - 32);
static_assert(c_over512Low == 0x154442bd4 && c_over512High == 0x1c6e41596);
static_assert(c_over128Low == 0x1751997d0 && c_over128High == 0x0ccaa009e);

#define KERNEL_CLMUL __attribute__((target("pclmul,sse4.1")))

KERNEL_CLMUL inline __m128i LoadVector(u8 const* p)
{
    return _mm_loadu_si128(reinterpret_cast<__m128i const*>(p));
}

KERNEL_CLMUL inline __m128i Fold(__m128i remainder, __m128i constants, __m128i next)
{
    __m128i const low = _mm_clmulepi64_si128(remainder, constants, 0x00);
    __m128i const high = _mm_clmulepi64_si128(remainder, constants, 0x11);
    return _mm_xor_si128(_mm_xor_si128(low, high), next);
}

KERNEL_CLMUL u32 CalcByMultiplication(u8 const* p, u64 count, u32 crc)
{
    if (count < 64) return CalcByTables(p, count, crc);
    __m128i const over512 = _mm_set_epi64x(static_cast<i64>(c_over512High), static_cast<i64>(c_over512Low));
    __m128i const over128 = _mm_set_epi64x(static_cast<i64>(c_over128High), static_cast<i64>(c_over128Low));
    __m128i a = _mm_xor_si128(LoadVector(p), _mm_cvtsi32_si128(static_cast<int>(crc)));
    __m128i b = LoadVector(p + 16);
    __m128i c = LoadVector(p + 32);
    __m128i d = LoadVector(p + 48);
    for (p += 64, count -= 64; count >= 64; p += 64, count -= 64) {
        a = Fold(a, over512, LoadVector(p));
        b = Fold(b, over512, LoadVector(p + 16));
        c = Fold(c, over512, LoadVector(p + 32));
        d = Fold(d, over512, LoadVector(p + 48));
    }
    a = Fold(a, over128, b);
    a = Fold(a, over128, c);
    a = Fold(a, over128, d);
    for (; count >= 16; p += 16, count -= 16) a = Fold(a, over128, LoadVector(p));
    u8 rest[16];
    _mm_storeu_si128(reinterpret_cast<__m128i*>(rest), a);
    return CalcByTables(p, count, CalcByTables(rest, sizeof rest, 0));
}

#undef KERNEL_CLMUL
#define KERNEL_WIDE __attribute__((target("vpclmulqdq,avx2,pclmul")))

KERNEL_WIDE inline __m256i LoadWide(u8 const* p)
{
    return _mm256_loadu_si256(reinterpret_cast<__m256i const*>(p));
}

KERNEL_WIDE inline __m256i FoldWide(__m256i remainder, __m256i constants, __m256i next)
{
    __m256i const low = _mm256_clmulepi64_epi128(remainder, constants, 0x00);
    __m256i const high = _mm256_clmulepi64_epi128(remainder, constants, 0x11);
    return _mm256_xor_si256(_mm256_xor_si256(low, high), next);
}

KERNEL_WIDE u32 CalcByWideMultiplication(u8 const* p, u64 count, u32 crc)
{
    // Below this the narrow steps that end the wide ones are all there is.
    if (count < 512) return CalcByMultiplication(p, count, crc);
    __m256i const over1024 = _mm256_set_epi64x(static_cast<i64>(c_over1024High), static_cast<i64>(c_over1024Low),
                                               static_cast<i64>(c_over1024High), static_cast<i64>(c_over1024Low));
    __m256i a = _mm256_xor_si256(LoadWide(p), _mm256_zextsi128_si256(_mm_cvtsi32_si128(static_cast<int>(crc))));
    __m256i b = LoadWide(p + 32);
    __m256i c = LoadWide(p + 64);
    __m256i d = LoadWide(p + 96);
    for (p += 128, count -= 128; count >= 128; p += 128, count -= 128) {
        a = FoldWide(a, over1024, LoadWide(p));
        b = FoldWide(b, over1024, LoadWide(p + 32));
        c = FoldWide(c, over1024, LoadWide(p + 64));
        d = FoldWide(d, over1024, LoadWide(p + 96));
    }
    // 128 bytes with the remainder of all that went before.
    __m256i rest[4] = {a, b, c, d};
    crc = CalcByMultiplication(reinterpret_cast<u8 const*>(rest), sizeof rest, 0);
    return CalcByMultiplication(p, count, crc);
}

#undef KERNEL_WIDE

using Method = u32 (*)(u8 const* p, u64 count, u32 crc);

Method ChooseMethod()
{
    __builtin_cpu_init();
    if (!__builtin_cpu_supports("pclmul") || !__builtin_cpu_supports("sse4.1")) return CalcByTables;
    bool const isWide = __builtin_cpu_supports("vpclmulqdq") && __builtin_cpu_supports("avx2");
    return isWide ? CalcByWideMultiplication : CalcByMultiplication;
}

u32 Calc(u8 const* p, u64 count, u32 crc)
{
    static Method const s_method = ChooseMethod();
    return s_method(p, count, crc);
}

#else

u32 Calc(u8 const* p, u64 count, u32 crc)
{
    return CalcByTables(p, count, crc);
}

#endif

} // namespace

CRC32 const& CRC32::Instance()
{
    static CRC32 const s_instance;
    return s_instance;
}

void CRC32::CalcCRC32(u8 byte, u32& crc)
{
    crc = (crc >> 8) ^ c_tables[0][(crc ^ byte) & 0xFF];
}

void CRC32::CalcCRC32(void const* data, u64 count, u32& crc)
{
    if (count) crc = Calc(static_cast<u8 const*>(data), count, crc);
}

bool CRC32::DataCRC32(void const* data, u64 count, u32& crc)
{
    crc = 0;
    if (!data && count) return false;
    BeginCRC32(crc);
    CalcCRC32(data, count, crc);
    EndCRC32(crc);
    return true;
}

bool CRC32::StringCRC32(char const* text, u32& crc)
{
    crc = 0;
    return text && DataCRC32(text, std::strlen(text), crc);
}

} // namespace Kernel

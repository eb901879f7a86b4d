#pragma once

#include "libkernel/core/Endian.h"
#include "libkernel/core/Types.h"

#include <cstring>
#if defined(__SSE2__)
#include <emmintrin.h>
#endif

namespace Kernel {

// The arithmetic of predictors and stripes, twice: in plain C++, which defines the bytes, and in SSE2, which must give
// the same. The last value goes in and the new one comes back.
//
// A striped chunk is not differenced element by element of the original. Its planes lie one behind the other and are
// taken as elements of the same width again, so an element of a plane holds one byte each of several neighbours, and
// the last value runs from the end of one plane into the next.

constexpr u64 c_stripeChunkSize = 65536;

template <class T>
struct PredictorScalar
{
    static constexpr u64 c_width = sizeof(T);
    static constexpr u64 c_planeSize = c_stripeChunkSize / c_width;

    static T Encode(u8* to, u8 const* from, u64 byteCount, T last)
    {
        u64 i = 0;
        for (; i + c_width <= byteCount; i += c_width) {
            T const value = LoadLittleEndian<T>(from + i);
            StoreLittleEndian(to + i, static_cast<T>(value - last));
            last = value;
        }
        if (to != from && i < byteCount) std::memcpy(to + i, from + i, byteCount - i);
        return last;
    }

    static T Decode(u8* buffer, u64 byteCount, T last)
    {
        for (u64 i = 0; i + c_width <= byteCount; i += c_width) {
            last = static_cast<T>(LoadLittleEndian<T>(buffer + i) + last);
            StoreLittleEndian(buffer + i, last);
        }
        return last;
    }

    static T StripeAndEncode(u8* to, u8 const* from, T last)
    {
        for (u64 i = 0; i < c_planeSize; ++i)
            for (u64 plane = 0; plane < c_width; ++plane)
                to[plane * c_planeSize + i] = from[i * c_width + (c_width - 1 - plane)];
        return Encode(to, to, c_stripeChunkSize, last);
    }

    static T DecodeAndUnstripe(u8* to, u8 const* from, T last)
    {
        for (u64 plane = 0; plane < c_width; ++plane)
            for (u64 i = 0; i < c_planeSize; i += c_width) {
                last = static_cast<T>(LoadLittleEndian<T>(from + plane * c_planeSize + i) + last);
                for (u64 b = 0; b < c_width; ++b)
                    to[(i + b) * c_width + (c_width - 1 - plane)] = static_cast<u8>(last >> (8 * b));
            }
        return last;
    }
};

#if defined(__SSE2__)

template <class T>
struct PredictorSse2
{
    static constexpr u64 c_width = sizeof(T);
    static constexpr u64 c_planeSize = c_stripeChunkSize / c_width;
    using Vector = __m128i;

    static T Encode(u8* to, u8 const* from, u64 byteCount, T last)
    {
        u64 const whole = byteCount & ~u64(15);
        Vector previous = InLastLane(last);
        for (u64 i = 0; i < whole; i += 16) {
            Vector const value = Load(from + i);
            Store(to + i, Difference(value, previous));
            previous = value;
        }
        return PredictorScalar<T>::Encode(to + whole, from + whole, byteCount - whole, LastLane(previous));
    }

    static T Decode(u8* buffer, u64 byteCount, T last)
    {
        u64 const whole = byteCount & ~u64(15);
        Vector carry = Broadcast(last);
        for (u64 i = 0; i < whole; i += 16) Store(buffer + i, NextSums(Load(buffer + i), carry));
        return PredictorScalar<T>::Decode(buffer + whole, byteCount - whole, LastLane(carry));
    }

    static T StripeAndEncode(u8* to, u8 const* from, T last)
    {
        if constexpr (c_width == 1)
            return Encode(to, from, c_stripeChunkSize, last);
        else if constexpr (c_width == 2) {
            u8 const* const end = from + c_stripeChunkSize;
            Vector previous0 = InLastLane(last);
            Vector previous1 = InLastLane(LastOfPlane(end, 0));
            for (u64 i = 0; i < c_planeSize; i += 16, from += 32) {
                Vector plane0, plane1;
                SplitBytes(Load(from), Load(from + 16), plane0, plane1);
                Store(to + i, Difference(plane0, previous0));
                Store(to + c_planeSize + i, Difference(plane1, previous1));
                previous0 = plane0;
                previous1 = plane1;
            }
            return LastLane(previous1);
        } else {
            u8 const* const end = from + c_stripeChunkSize;
            Vector previous0 = InLastLane(last);
            Vector previous1 = InLastLane(LastOfPlane(end, 0));
            Vector previous2 = InLastLane(LastOfPlane(end, 1));
            Vector previous3 = InLastLane(LastOfPlane(end, 2));
            for (u64 i = 0; i < c_planeSize; i += 16, from += 64) {
                Vector high0, high1, low0, low1, plane0, plane1, plane2, plane3;
                SplitWords(Load(from), Load(from + 16), high0, low0);
                SplitWords(Load(from + 32), Load(from + 48), high1, low1);
                SplitBytes(high0, high1, plane0, plane1);
                SplitBytes(low0, low1, plane2, plane3);
                Store(to + i, Difference(plane0, previous0));
                Store(to + c_planeSize + i, Difference(plane1, previous1));
                Store(to + 2 * c_planeSize + i, Difference(plane2, previous2));
                Store(to + 3 * c_planeSize + i, Difference(plane3, previous3));
                previous0 = plane0;
                previous1 = plane1;
                previous2 = plane2;
                previous3 = plane3;
            }
            return LastLane(previous3);
        }
    }

    // A plane begins with the sum of everything before it, so the earlier planes are summed first; then all planes are
    // walked side by side and woven together without a second buffer.
    static T DecodeAndUnstripe(u8* to, u8 const* from, T last)
    {
        if constexpr (c_width == 1) {
            std::memcpy(to, from, c_stripeChunkSize);
            return Decode(to, c_stripeChunkSize, last);
        } else if constexpr (c_width == 2) {
            Vector carry0 = Broadcast(last);
            Vector carry1 = Broadcast(static_cast<T>(last + PlaneSum(from)));
            for (u64 i = 0; i < c_planeSize; i += 16, to += 32) {
                Vector const high = NextSums(Load(from + i), carry0);
                Vector const low = NextSums(Load(from + c_planeSize + i), carry1);
                Store(to, _mm_unpacklo_epi8(low, high));
                Store(to + 16, _mm_unpackhi_epi8(low, high));
            }
            return LastLane(carry1);
        } else {
            T const start1 = last + PlaneSum(from);
            T const start2 = start1 + PlaneSum(from + c_planeSize);
            T const start3 = start2 + PlaneSum(from + 2 * c_planeSize);
            Vector carry0 = Broadcast(last), carry1 = Broadcast(start1);
            Vector carry2 = Broadcast(start2), carry3 = Broadcast(start3);
            for (u64 i = 0; i < c_planeSize; i += 16, to += 64) {
                Vector const byte3 = NextSums(Load(from + i), carry0);
                Vector const byte2 = NextSums(Load(from + c_planeSize + i), carry1);
                Vector const byte1 = NextSums(Load(from + 2 * c_planeSize + i), carry2);
                Vector const byte0 = NextSums(Load(from + 3 * c_planeSize + i), carry3);
                Vector const lowA = _mm_unpacklo_epi8(byte0, byte1), lowB = _mm_unpackhi_epi8(byte0, byte1);
                Vector const highA = _mm_unpacklo_epi8(byte2, byte3), highB = _mm_unpackhi_epi8(byte2, byte3);
                Store(to, _mm_unpacklo_epi16(lowA, highA));
                Store(to + 16, _mm_unpackhi_epi16(lowA, highA));
                Store(to + 32, _mm_unpacklo_epi16(lowB, highB));
                Store(to + 48, _mm_unpackhi_epi16(lowB, highB));
            }
            return LastLane(carry3);
        }
    }

private:
    static Vector Load(u8 const* from) { return _mm_loadu_si128(reinterpret_cast<Vector const*>(from)); }
    static void Store(u8* to, Vector value) { _mm_storeu_si128(reinterpret_cast<Vector*>(to), value); }

    static Vector Broadcast(T value)
    {
        if constexpr (c_width == 1)
            return _mm_set1_epi8(static_cast<char>(value));
        else if constexpr (c_width == 2)
            return _mm_set1_epi16(static_cast<short>(value));
        else
            return _mm_set1_epi32(static_cast<int>(value));
    }
    static Vector InLastLane(T value) { return Broadcast(value); }
    static T LastLane(Vector value)
    {
        u32 const top = static_cast<u32>(_mm_cvtsi128_si32(_mm_shuffle_epi32(value, 0xFF)));
        return static_cast<T>(top >> (32 - 8 * c_width));
    }

    static Vector Add(Vector a, Vector b)
    {
        if constexpr (c_width == 1)
            return _mm_add_epi8(a, b);
        else if constexpr (c_width == 2)
            return _mm_add_epi16(a, b);
        else
            return _mm_add_epi32(a, b);
    }
    static Vector Subtract(Vector a, Vector b)
    {
        if constexpr (c_width == 1)
            return _mm_sub_epi8(a, b);
        else if constexpr (c_width == 2)
            return _mm_sub_epi16(a, b);
        else
            return _mm_sub_epi32(a, b);
    }

    // Each lane less its left neighbour; the first less the last lane of @p previous.
    static Vector Difference(Vector value, Vector previous)
    {
        Vector const shifted = _mm_or_si128(_mm_slli_si128(value, c_width), _mm_srli_si128(previous, 16 - c_width));
        return Subtract(value, shifted);
    }

    // Running sums of the lanes upon @p carry, which holds the sum so far in every lane and gets the new one. The total
    // of these lanes is spread before the carry comes in, so that one addition is all that one step waits for another.
    static Vector NextSums(Vector x, Vector& carry)
    {
        if constexpr (c_width == 1) x = Add(x, _mm_slli_si128(x, 1));
        if constexpr (c_width <= 2) x = Add(x, _mm_slli_si128(x, 2));
        x = Add(x, _mm_slli_si128(x, 4));
        x = Add(x, _mm_slli_si128(x, 8));
        Vector const result = Add(x, carry);
        carry = Add(carry, SpreadLastLane(x));
        return result;
    }
    static Vector SpreadLastLane(Vector x)
    {
        if constexpr (c_width == 1) x = _mm_unpackhi_epi8(x, x);
        if constexpr (c_width <= 2) x = _mm_shufflehi_epi16(x, 0xFF);
        return _mm_shuffle_epi32(x, 0xFF);
    }

    // Two vectors of 16-bit numbers into their high and their low bytes, in order.
    static void SplitBytes(Vector a, Vector b, Vector& high, Vector& low)
    {
        Vector const mask = _mm_set1_epi16(0xFF);
        high = _mm_packus_epi16(_mm_srli_epi16(a, 8), _mm_srli_epi16(b, 8));
        low = _mm_packus_epi16(_mm_and_si128(a, mask), _mm_and_si128(b, mask));
    }
    // Two vectors of 32-bit numbers into their high and their low halves. The only pack of this width saturates as
    // signed numbers, which sign-extended halves never do.
    static void SplitWords(Vector a, Vector b, Vector& high, Vector& low)
    {
        high = _mm_packs_epi32(_mm_srai_epi32(a, 16), _mm_srai_epi32(b, 16));
        low = _mm_packs_epi32(_mm_srai_epi32(_mm_slli_epi32(a, 16), 16), _mm_srai_epi32(_mm_slli_epi32(b, 16), 16));
    }

    // The last element that plane @p plane will hold, from the original chunk that ends at @p end.
    static T LastOfPlane(u8 const* end, u64 plane)
    {
        u8 const* p = end - c_width * c_width + (c_width - 1 - plane);
        u32 value = 0;
        for (u64 b = 0; b < c_width; ++b, p += c_width) value |= u32(*p) << (8 * b);
        return static_cast<T>(value);
    }

    static T PlaneSum(u8 const* plane)
    {
        Vector a = _mm_setzero_si128(), b = a;
        for (u64 i = 0; i < c_planeSize; i += 32) {
            a = Add(a, Load(plane + i));
            b = Add(b, Load(plane + i + 16));
        }
        Vector zero = _mm_setzero_si128();
        return LastLane(NextSums(Add(a, b), zero));
    }
};

template <class T>
using PredictorKernels = PredictorSse2<T>;

#else

template <class T>
using PredictorKernels = PredictorScalar<T>;

#endif

} // namespace Kernel

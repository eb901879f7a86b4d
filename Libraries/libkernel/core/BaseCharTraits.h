#pragma once

#include "libkernel/core/Types.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <type_traits>

namespace Kernel {

/// Operations on raw arrays of code units, whatever the encoding. T is char, char16_t or unsigned int. Lengths are in
/// units; nothing here looks at code points, and nothing checks its pointers.
template <class T>
struct BaseCharTraits
{
    /// Units before the terminator.
    static int GetLength(T const* p)
    {
        if constexpr (sizeof(T) == 1)
            return static_cast<int>(std::strlen(p));
        else {
            T const* end = p;
            while (*end != 0) ++end;
            return static_cast<int>(end - p);
        }
    }

    /// Copies @p n units, which must not overlap; a length below 1 copies nothing.
    static void Copy(T* dst, T const* src, int n)
    {
        if (n > 0) std::memcpy(dst, src, static_cast<size_t>(n) * sizeof(T));
    }

    /// Difference of the first differing units, or n minus m. Units of char compare as signed bytes, so that bytes
    /// above 127 sort before ASCII. A difference that does not fit into 32 bits is the nearest number that does; that
    /// of two code points always fits.
    static int Compare(T const* a, int n, T const* b, int m)
    {
        int const common = n < m ? n : m;
        int const i = CommonPrefix(a, b, common);
        return i < common ? Difference(a[i], b[i]) : n - m;
    }
    static int Compare(T const* a, int n, T const* b) { return Compare(a, n, b, GetLength(b)); }
    static int Compare(T const* a, T const* b) { return Compare(a, GetLength(a), b, GetLength(b)); }

    /// True if both have the same length and the same units; without @p m, @p b ends at its terminator.
    static bool IsEqual(T const* a, int n, T const* b, int m)
    {
        return n == m && (n <= 0 || std::memcmp(a, b, static_cast<size_t>(n) * sizeof(T)) == 0);
    }
    static bool IsEqual(T const* a, int n, T const* b) { return IsEqual(a, n, b, GetLength(b)); }

    /// Index of the first match at or after @p start, or -1. An empty needle matches at @p start.
    static int Find(T const* s, int n, T const* needle, int m, int start)
    {
        if (start < 0) start = 0;
        if (m <= 0) return start <= n ? start : -1;
        int const ends = n - m + 1; // A match begins before here.
        for (int i = start; (i = Find(s, ends, needle[0], i)) >= 0; ++i)
            if (IsEqual(s + i + 1, m - 1, needle + 1, m - 1)) return i;
        return -1;
    }
    /// Index of the first such unit at or after @p start, or -1.
    static int Find(T const* s, int n, T unit, int start)
    {
        if (start < 0) start = 0;
        if (start >= n) return -1;
        if constexpr (sizeof(T) == 1) {
            void const* const found = std::memchr(s + start, static_cast<u8>(unit), static_cast<size_t>(n - start));
            return found ? static_cast<int>(static_cast<T const*>(found) - s) : -1;
        } else {
            while (start < n && s[start] != unit) ++start;
            return start < n ? start : -1;
        }
    }

    /// 32-bit hash of the units, sign-extended where they are char. Not for untrusted keys: it is easy to collide.
    static u32 GenerateHash(T const* s, int n)
    {
        u32 h = 0;
        for (int i = 0; i < n; ++i) {
            u32 c;
            if constexpr (sizeof(T) == 1)
                c = static_cast<u32>(static_cast<i32>(static_cast<signed char>(s[i])));
            else
                c = static_cast<u32>(s[i]);
            h = (h >> 2) + 0x9E3779B9u + c + (h << 6);
        }
        return h;
    }

    /// The space, and nothing else.
    static bool IsSpace(T c) { return c == 32; }
    /// Space, tab or line feed; a carriage return is not white space here.
    static bool IsWhiteSpace(T c) { return c == 32 || c == 9 || c == 10; }

    /// Removes leading IsWhiteSpace units in place; the new length. Where something was removed a terminator stands
    /// behind what is left; no unit outside the @p n is touched.
    static int TrimLeft(T* s, int n)
    {
        int first = 0;
        while (first < n && IsWhiteSpace(s[first])) ++first;
        if (first == 0) return n;
        std::memmove(s, s + first, static_cast<size_t>(n - first) * sizeof(T));
        s[n - first] = 0;
        return n - first;
    }
    /// Removes trailing IsWhiteSpace units, likewise.
    static int TrimRight(T* s, int n)
    {
        int const old = n;
        while (n > 0 && IsWhiteSpace(s[n - 1])) --n;
        if (n < old) s[n] = 0;
        return n;
    }

private:
    // Units that are equal at the start, eight bytes at a time.
    static int CommonPrefix(T const* a, T const* b, int n)
    {
        constexpr int wide = static_cast<int>(8 / sizeof(T));
        int i = 0;
        for (; n - i >= wide; i += wide)
            if (std::memcmp(a + i, b + i, 8) != 0) break;
        while (i < n && a[i] == b[i]) ++i;
        return i;
    }
    static int Difference(T a, T b)
    {
        if constexpr (sizeof(T) == 1)
            return static_cast<signed char>(a) - static_cast<signed char>(b);
        else {
            i64 const difference = static_cast<i64>(a) - static_cast<i64>(b);
            return static_cast<int>(
                std::clamp<i64>(difference, std::numeric_limits<int>::min(), std::numeric_limits<int>::max()));
        }
    }
};

} // namespace Kernel

#pragma once

#include "libkernel/core/BaseCharTraits.h"
#include "libkernel/core/CodePointTraits.h"
#include "libkernel/core/String.h"

namespace Kernel {

// Operations on raw units that depend on the encoding, beside those of BaseCharTraits and CodePointTraits. Lengths and
// indices are in units. All but GetValidLength and IsValid trust their input: text from outside is cut by
// GetValidLength first, since a text that ends inside a code point would be read past its end.

template <class TEnc>
struct CharTraits;

/// UTF-8, RFC 3629, but in the wider form that goes by lead bytes alone: overlong forms, surrogates and code points up
/// to 0x1FFFFF pass through.
template <>
struct KERNEL_API CharTraits<TEncUtf8> : BaseCharTraits<char>, CodePointTraits<TEncUtf8>
{
    static constexpr TEncUtf8 Enc{}; ///< Tag value.

    /// Decodes the code point at @p p and moves p behind it. The lead byte alone tells the length: up to 0x7F one byte,
    /// up to 0xDF two, up to 0xEF three, otherwise four.
    static u32 NextCodePoint(char const*& p)
    {
        u32 const lead = Byte(*p++);
        if (lead <= 0x7F) return lead;
        if (lead <= 0xDF) return (lead & 0x1F) << 6 | Tail(p);
        if (lead <= 0xEF) {
            u32 const high = (lead & 0x0F) << 12 | Tail(p) << 6;
            return high | Tail(p);
        }
        u32 const high = (lead & 0x07) << 18 | Tail(p) << 12;
        u32 const middle = Tail(p) << 6;
        return high | middle | Tail(p);
    }

    /// Writes @p codePoint, 1 to 4 bytes; gives the position behind it.
    static char* AppendCodePoint(char* to, u32 codePoint)
    {
        if (codePoint <= 0x7F) {
            *to++ = static_cast<char>(codePoint);
            return to;
        }
        if (codePoint <= 0x7FF)
            *to++ = static_cast<char>(0xC0 | codePoint >> 6);
        else {
            if (codePoint <= 0xFFFF)
                *to++ = static_cast<char>(0xE0 | codePoint >> 12);
            else {
                *to++ = static_cast<char>(0xF0 | (codePoint >> 18 & 0x07));
                *to++ = static_cast<char>(0x80 | (codePoint >> 12 & 0x3F));
            }
            *to++ = static_cast<char>(0x80 | (codePoint >> 6 & 0x3F));
        }
        *to++ = static_cast<char>(0x80 | (codePoint & 0x3F));
        return to;
    }

    /// Units of a code point.
    static int GetCodePointLength(u32 codePoint)
    {
        return 1 + (codePoint > 0x7F) + (codePoint > 0x7FF) + (codePoint > 0xFFFF);
    }
    /// Units of a code point, by its first unit.
    static int GetCodePointLength(char unit)
    {
        u32 const lead = Byte(unit);
        return 1 + (lead > 0x7F) + (lead > 0xDF) + (lead > 0xEF);
    }
    /// True for a unit that follows a lead byte.
    static bool IsContinuation(char unit) { return (Byte(unit) & 0xC0) == 0x80; }

    /// Index of the first unit of the code point that the unit at @p i belongs to.
    static int GetCodePointBegin(char const* s, int i)
    {
        while (i > 0 && IsContinuation(s[i])) --i;
        return i;
    }
    /// True if the text does not stop within a code point. Empty text does not.
    static bool IsCodePointEnd(char const* s, int n)
    {
        if (n <= 0) return true;
        int const begin = GetCodePointBegin(s, n - 1);
        return GetCodePointLength(s[begin]) <= n - begin;
    }
    /// Code points in @p n units, counted by lead units.
    static int GetLengthInCodePoints(char const* s, int n);
    /// Units from the start that form valid code points: a continuation byte in lead place, a lead above 0xF7, a
    /// sequence that runs past @p n or a bad continuation ends them, and so does a zero unit without @p allowZero.
    /// Any bytes may be given.
    static int GetValidLength(char const* s, int n, bool allowZero);
    /// True if all @p n units are valid.
    static bool IsValid(char const* s, int n, bool allowZero) { return GetValidLength(s, n, allowZero) == n; }

    /// 32 to 126.
    static bool IsPrintableAscii(char c) { return c >= 32 && c <= 126; }

private:
    static u32 Byte(char c) { return static_cast<u8>(c); }
    static u32 Tail(char const*& p) { return Byte(*p++) & 0x3F; }
};

/// UTF-16, RFC 2781, in the machine's byte order.
template <>
struct KERNEL_API CharTraits<TEncUtf16> : BaseCharTraits<char16_t>, CodePointTraits<TEncUtf16>
{
    static constexpr TEncUtf16 Enc{}; ///< Tag value.

    /// First half of a pair, D800 to DBFF; second half, DC00 to DFFF; either.
    static bool IsLeadSurrogate(u32 unit) { return (unit & 0xFFFFFC00u) == 0xD800; }
    static bool IsTrailSurrogate(u32 unit) { return (unit & 0xFFFFFC00u) == 0xDC00; }
    static bool IsSurrogate(u32 unit) { return (unit & 0xFFFFF800u) == 0xD800; }
    /// The code point of a surrogate pair.
    static u32 MakeCodePoint(u32 lead, u32 trail) { return ((lead & 0x3FF) << 10 | (trail & 0x3FF)) + 0x10000; }

    /// Decodes the code point at @p p and moves p behind it; a lead surrogate takes the unit behind it along.
    static u32 NextCodePoint(char16_t const*& p)
    {
        u32 const unit = *p++;
        return IsLeadSurrogate(unit) ? MakeCodePoint(unit, *p++) : unit;
    }
    /// Writes @p codePoint, 1 or 2 units; gives the position behind it.
    static char16_t* AppendCodePoint(char16_t* to, u32 codePoint)
    {
        if (codePoint > 0xFFFF) {
            *to++ = static_cast<char16_t>(0xD800 | ((codePoint - 0x10000) >> 10 & 0x3FF));
            *to++ = static_cast<char16_t>(0xDC00 | (codePoint & 0x3FF));
            return to;
        }
        *to++ = static_cast<char16_t>(codePoint);
        return to;
    }

    /// Units of a code point.
    static int GetCodePointLength(u32 codePoint) { return 1 + (codePoint > 0xFFFF); }
    /// Units of a code point, by its first unit.
    static int GetCodePointLength(char16_t unit) { return 1 + IsLeadSurrogate(unit); }
    /// True for a unit that follows a lead surrogate.
    static bool IsContinuation(char16_t unit) { return IsTrailSurrogate(unit); }

    /// Index of the first unit of the code point that the unit at @p i belongs to.
    static int GetCodePointBegin(char16_t const* s, int i)
    {
        while (i > 0 && IsContinuation(s[i])) --i;
        return i;
    }
    /// True if the text does not stop behind a lead surrogate.
    static bool IsCodePointEnd(char16_t const* s, int n) { return n <= 0 || !IsLeadSurrogate(s[n - 1]); }
    /// Code points in @p n units, counted by lead units.
    static int GetLengthInCodePoints(char16_t const* s, int n);
    /// Units from the start that form valid code points: a surrogate without its partner ends them, and so does a zero
    /// unit without @p allowZero. Any units may be given.
    static int GetValidLength(char16_t const* s, int n, bool allowZero);
    /// True if all @p n units are valid.
    static bool IsValid(char16_t const* s, int n, bool allowZero) { return GetValidLength(s, n, allowZero) == n; }
};

/// UTF-32, in the machine's byte order: each unit is a code point.
template <>
struct KERNEL_API CharTraits<TEncUtf32> : BaseCharTraits<unsigned int>, CodePointTraits<TEncUtf32>
{
    static constexpr TEncUtf32 Enc{}; ///< Tag value.

    /// Gives the unit at @p p and moves p behind it.
    static u32 NextCodePoint(unsigned int const*& p) { return *p++; }
    /// Writes @p codePoint; gives the position behind it.
    static unsigned int* AppendCodePoint(unsigned int* to, u32 codePoint)
    {
        *to++ = codePoint;
        return to;
    }
    /// 1, of a code point and by its unit.
    static int GetCodePointLength(u32) { return 1; }
    /// False: every unit is a code point's first.
    static bool IsContinuation(unsigned int) { return false; }
    /// Gives @p i.
    static int GetCodePointBegin(unsigned int const*, int i) { return i; }
    /// True: no text stops within a code point.
    static bool IsCodePointEnd(unsigned int const*, int) { return true; }
    /// Gives @p n, and 0 for less.
    static int GetLengthInCodePoints(unsigned int const*, int n) { return n > 0 ? n : 0; }
    /// Units from the start that are code points: a surrogate or a value above 0x10FFFF ends them, and so does a zero
    /// unit without @p allowZero. Any units may be given.
    static int GetValidLength(unsigned int const* s, int n, bool allowZero);
    /// True if all @p n units are valid.
    static bool IsValid(unsigned int const* s, int n, bool allowZero) { return GetValidLength(s, n, allowZero) == n; }
};

} // namespace Kernel

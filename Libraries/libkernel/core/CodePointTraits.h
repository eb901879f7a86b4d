#pragma once

#include "libkernel/core/String.h"
#include "libkernel/numerics/IndexRange.h"

namespace Kernel {

/// The operations of CharTraits that walk code points and need no more than to decode them. Lengths and indices are in
/// units. Text is trusted to be valid; in ill-formed text nothing outside the given units is read, and the units of a
/// last code point that is cut short equal only themselves.
///
/// Without case means by full case folding (The Unicode Standard, section 3.13): one code point may equal several, so
/// that "ß" equals "SS", whatever the language. A match always covers whole code points of the text: "s" is not found
/// in "ß". So the units of a match compare equal to the needle, and may be marked or replaced; there may be more or
/// fewer of them than in the needle.
template <class Enc>
struct CodePointTraits
{
    using Unit = typename Enc::Unit;

    /// Order by folded code points: below zero, zero or above zero.
    static int CompareNoCase(Unit const* a, int n, Unit const* b, int m);
    /// True if the text begins, or ends, with a match; always for an empty one.
    static bool BeginsWithNoCase(Unit const* s, int n, Unit const* prefix, int m);
    static bool EndsWithNoCase(Unit const* s, int n, Unit const* suffix, int m);
    /// Index of the first match at or after @p start, or -1. An empty needle matches at @p start. With a match and
    /// @p matched, that gets the units the match covers in the text.
    static int FindNoCase(Unit const* s, int n, Unit const* needle, int m, int start, int* matched = nullptr);

    /// The first code point at or after @p start that stands in the set: its index and its units. Index -1 and length
    /// 0 if there is none. The set is @p m units of text.
    static IndexRange FindAnyOf(Unit const* s, int n, Unit const* set, int m, int start);
    /// The same with the set given as code points.
    template <class CodePoint>
    requires(std::is_same_v<CodePoint, u32> && !std::is_same_v<CodePoint, Unit>) static IndexRange
        FindAnyOf(Unit const* s, int n, CodePoint const* set, int m, int start)
    {
        return FindAnyOfCodePoints(s, n, set, m, start);
    }

    /// Writes the code points of @p src to @p dst from the last to the first, @p n units, each code point with its
    /// units in order. The two must not overlap.
    static void Reverse(Unit* dst, Unit const* src, int n);

private:
    static IndexRange FindAnyOfCodePoints(Unit const* s, int n, u32 const* set, int m, int start);
};

extern template struct KERNEL_API CodePointTraits<TEncUtf8>;
extern template struct KERNEL_API CodePointTraits<TEncUtf16>;
extern template struct KERNEL_API CodePointTraits<TEncUtf32>;

} // namespace Kernel

#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/String.h"

namespace Kernel {

// Questions about one code point, answered from ICU's copy of the Unicode character database. Any u32 may be given: a
// value above 0x10FFFF belongs to no class. All may be called from any thread.

KERNEL_API bool IsAlnum(u32 codePoint); ///< Letter, mark of a letter or digit: the property POSIX alnum.
KERNEL_API bool IsAlpha(u32 codePoint); ///< The property Alphabetic.
inline bool IsDigit(u32 codePoint)      ///< One of the ten ASCII digits.
{
    return codePoint - 0x30 <= 9;
}
KERNEL_API bool IsAnyDigit(u32 codePoint); ///< A decimal digit of any script: general category Nd.
KERNEL_API bool IsLower(u32 codePoint);    ///< The property Lowercase.
KERNEL_API bool IsUpper(u32 codePoint);    ///< The property Uppercase.
KERNEL_API bool IsSpace(u32 codePoint);    ///< The property White_Space, which line ends have too.
/// General category of punctuation of any kind, mathematical symbol or modifier symbol. Currency signs and other
/// symbols are none: false for `$`, true for `+` and `-`.
KERNEL_API bool IsPunct(u32 codePoint);
/// A canonical combining class other than 0.
KERNEL_API bool IsCombining(u32 codePoint);
/// Assigned to a character by the version of Unicode in use.
KERNEL_API bool IsKnown(u32 codePoint);

/// Line feed, carriage return, line separator or paragraph separator.
inline bool IsAnyLineBreak(u32 codePoint)
{
    return codePoint == 10 || codePoint == 13 || codePoint == 0x2028 || codePoint == 0x2029;
}

/// The spaces that justified lines stretch: space and no-break space.
inline bool IsJustificationSpace(u32 codePoint)
{
    return codePoint == 0x20 || codePoint == 0xA0;
}

/// May begin a name: NameStartChar of XML 1.0, fifth edition, production 4.
KERNEL_API bool IsXmlNameStart(u32 codePoint);
/// May stand in a name: NameChar of XML 1.0, fifth edition, production 4a.
KERNEL_API bool IsXmlName(u32 codePoint);

/// General category, by the numbers of ICU's UCharCategory: 0 unassigned, 1 upper-case letter and so on.
KERNEL_API int GetUnicodeCharacterType(u32 codePoint);
/// The character's name in the Unicode standard, in ASCII capitals; empty where it has none.
KERNEL_API String8 GetUnicodeName(u32 codePoint);
/// Writes the full canonical decomposition of @p codePoint to @p out, which has room for @p size code points. Gives the
/// code points written: what does not fit is left out, and a character without a decomposition gives 0.
KERNEL_API int GetUnicodeDecomposition(u32* out, int size, u32 codePoint);

/// The capital Greek letter without its accent, for upper-case text: the accented capitals, and U+0390, which becomes
/// U+03AA. Everything else comes back unchanged.
KERNEL_API u32 RemoveGreekTonas(u32 codePoint);

} // namespace Kernel

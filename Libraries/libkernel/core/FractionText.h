#pragma once

#include "libkernel/core/DoubleText.h"

namespace Kernel {

// Lengths as a drawing office writes them: whole numbers with a fraction, and picas with points. Each operation exists
// as a template over the string type and in a plain form that gives a String8.

/// A whole number and a fraction in lowest terms, such as "-1 1/2", "3/8" or "2", rounded to the nearest of
/// @p maxDenominator parts. Lowest terms are sought from max(@p minDenominator, 2) on by doubling; where none of these
/// denominators gives the value exactly, the fraction stays in @p maxDenominator parts. @p sign goes before the whole
/// number, or before the fraction if there is none.
template <class S = String8>
S ToStringImperialT(double value, u32 maxDenominator, u32 minDenominator, SignStyle sign);
inline String8 ToStringImperial(double value, u32 maxDenominator, u32 minDenominator, SignStyle sign)
{
    return ToStringImperialT<String8>(value, maxDenominator, minDenominator, sign);
}

/// The same in eighths, with one character for the fraction (U+00BC to U+00BE, U+215B to U+215E) straight behind the
/// whole number.
template <class S = String8>
S ToStringImperialSpecialT(double value, SignStyle sign);
inline String8 ToStringImperialSpecial(double value, SignStyle sign)
{
    return ToStringImperialSpecialT<String8>(value, sign);
}

/// True if the text loses something that @p extra decimals of one part would show; judged as ToStringWillBeApproximate
/// judges, on the parts of the denominator that the text has.
KERNEL_API bool ToStringImperialWillBeApproximate(double value, u32 maxDenominator, u32 minDenominator, u32 extra);
KERNEL_API bool ToStringImperialSpecialWillBeApproximate(double value, u32 extra);

/// Picas and points, 12 points to the pica: "1p6", or "2p" without points. @p value is in picas; the other arguments
/// are those of the number of points, as ToString has them, of which sign and padding do not show. A fraction of a
/// point stands behind the points, "1p6.25", unless it is 0. The sign stands before the picas, so it is lost where
/// there are none: -0.5 gives "0p6".
template <class S = String8>
S ToPicaStringT(double value, u32 precision, u32 width, SignStyle sign, TruncateStyle truncate);
inline String8 ToPicaString(double value, u32 precision, u32 width, SignStyle sign, TruncateStyle truncate)
{
    return ToPicaStringT<String8>(value, precision, width, sign, truncate);
}
/// Precision 6, width 3, no sign before positive numbers, one decimal kept.
template <class S = String8>
S ToPicaStringT(double value)
{
    return ToPicaStringT<S>(value, 6, 3, SignStyle::None, TruncateStyle::KeepOne);
}
inline String8 ToPicaString(double value)
{
    return ToPicaStringT<String8>(value);
}

extern template KERNEL_API String8 ToStringImperialT<String8>(double, u32, u32, SignStyle);
extern template KERNEL_API String16 ToStringImperialT<String16>(double, u32, u32, SignStyle);
extern template KERNEL_API String32 ToStringImperialT<String32>(double, u32, u32, SignStyle);
extern template KERNEL_API String8 ToStringImperialSpecialT<String8>(double, SignStyle);
extern template KERNEL_API String16 ToStringImperialSpecialT<String16>(double, SignStyle);
extern template KERNEL_API String32 ToStringImperialSpecialT<String32>(double, SignStyle);
extern template KERNEL_API String8 ToPicaStringT<String8>(double, u32, u32, SignStyle, TruncateStyle);
extern template KERNEL_API String16 ToPicaStringT<String16>(double, u32, u32, SignStyle, TruncateStyle);
extern template KERNEL_API String32 ToPicaStringT<String32>(double, u32, u32, SignStyle, TruncateStyle);

} // namespace Kernel

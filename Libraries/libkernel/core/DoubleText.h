#pragma once

#include "libkernel/core/NumberText.h"

namespace Kernel {

// Numbers with decimals as text. Each operation exists as a template over the string type and in a plain form that
// gives a String8. The point is ".", whatever the host's locale is. A float shows as the double of the same value.

/// What becomes of zeros at the end of the decimals.
enum class TruncateStyle : u32
{
    KeepAll = 0,
    StripZeros = 1, ///< The point goes too if nothing stays after it.
    KeepOne = 2     ///< One decimal stays: "2.0".
};

template <class T>
concept TextDouble = std::same_as<T, double> || std::same_as<T, float>;

namespace DoubleTextDetail {

template <class S>
S Text(double value, u32 precision, u32 width, SignStyle sign, TruncateStyle truncate);
template <class S>
S DebugText(double value, u32 precision, u32 width);

/// Longest text in the short form of a number of magnitude below 2^63: a sign, 19 digits, the point and 6 decimals.
constexpr int c_maxShortLength = 27;
/// Writes the short form of @p value to @p to, and gives its length; -1, with nothing written, if it is longer than
/// c_maxShortLength or not a finite number.
template <class Unit>
int WriteShort(Unit* to, double value);

extern template KERNEL_API String8 Text<String8>(double, u32, u32, SignStyle, TruncateStyle);
extern template KERNEL_API String16 Text<String16>(double, u32, u32, SignStyle, TruncateStyle);
extern template KERNEL_API String32 Text<String32>(double, u32, u32, SignStyle, TruncateStyle);
extern template KERNEL_API String8 DebugText<String8>(double, u32, u32);
extern template KERNEL_API String16 DebugText<String16>(double, u32, u32);
extern template KERNEL_API String32 DebugText<String32>(double, u32, u32);
extern template KERNEL_API int WriteShort<char>(char*, double);
extern template KERNEL_API int WriteShort<char16_t>(char16_t*, double);
extern template KERNEL_API int WriteShort<unsigned int>(unsigned int*, double);

} // namespace DoubleTextDetail

/// Decimal text with @p precision decimals, 12 at most, in a field of @p width units; a width of 2^31 or more counts as
/// none. The text is aligned to the right before @p truncate shortens it, so a shortened text is narrower.
///
/// The value is rounded to 14 decimals first, by its exact value, and the text of that is rounded to @p precision
/// decimals, halves away from zero: 1.005 at 2 places gives "1.01", although the number stored is a little below. A
/// digit that this rounding adds in front, as from 9.999 to "10.00", widens the text, padding and all. A negative value
/// whose magnitude is below one unit of the last decimal shows as zero, which counts as positive, as -0.0 does.
///
/// Precision 0 rounds to the nearest integer, halves away from zero, and shows that; what does not fit into 64 signed
/// bits, or is no number, shows as the lowest of them. With decimals, infinities and not-a-number show as "inf" and
/// "nan" with their sign, in a field of width - precision + 14.
template <class S, TextDouble T>
S ToStringT(T value, u32 precision, u32 width, SignStyle sign, TruncateStyle truncate)
{
    return DoubleTextDetail::Text<S>(value, precision, width, sign, truncate);
}
template <TextDouble T>
String8 ToString(T value, u32 precision, u32 width, SignStyle sign, TruncateStyle truncate)
{
    return DoubleTextDetail::Text<String8>(value, precision, width, sign, truncate);
}

/// The short form: precision 6, width 3, no sign before positive numbers, one decimal kept.
template <class S, TextDouble T>
S ToStringT(T value)
{
    return DoubleTextDetail::Text<S>(value, 6, 3, SignStyle::None, TruncateStyle::KeepOne);
}
template <TextDouble T>
String8 ToString(T value)
{
    return ToStringT<String8>(value);
}

/// For traces: as printf has "%*.*f" for magnitudes from 0.001 to below 1e6, and "%*.*e" for all others. Every decimal
/// asked for is there. Throws std::bad_alloc for a text of 2^31 units or more.
template <class S = String8>
S ToStringDebugT(double value, u32 precision, u32 width)
{
    return DoubleTextDetail::DebugText<S>(value, precision, width);
}
inline String8 ToStringDebug(double value, u32 precision, u32 width)
{
    return DoubleTextDetail::DebugText<String8>(value, precision, width);
}

/// True if a text with @p precision decimals loses something that @p extra more decimals would show: the fraction f of
/// |value * 10^(precision + extra)| is above 0.0001 and, if it is above 0.5, below 0.9999.
KERNEL_API bool ToStringWillBeApproximate(double value, u32 precision, u32 extra);

} // namespace Kernel

#pragma once

#include "libkernel/core/NumberText.h"

namespace Kernel {

namespace NumberTextDetail {

template <class S>
S Superscript(Magnitude number, SignStyle sign);

extern template KERNEL_API String8 Superscript<String8>(Magnitude, SignStyle);
extern template KERNEL_API String16 Superscript<String16>(Magnitude, SignStyle);
extern template KERNEL_API String32 Superscript<String32>(Magnitude, SignStyle);

} // namespace NumberTextDetail

/// Decimal text in raised digits (U+2070, U+00B9, U+00B2, U+00B3, U+2074 to U+2079) with raised signs (U+207A, U+207B);
/// the sign style Space puts a plain space.
template <class S = String8, TextInteger T>
S ToStringSuperscriptT(T value, SignStyle sign = SignStyle::None)
{
    return NumberTextDetail::Superscript<S>(NumberTextDetail::Split(value), sign);
}
template <TextInteger T>
String8 ToStringSuperscriptNumber(T value, SignStyle sign = SignStyle::None)
{
    return ToStringSuperscriptT<String8>(value, sign);
}

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

// The decimal, grouping and list separators of the user's numbers: one code point each, for the whole process, 0 until
// the application sets them. Nothing guards them: set them at start, before other threads read.
//
// The list separator follows the other two: "," unless one of them is ",", and then ";". It is 0 until one of them is
// set.

KERNEL_API void SetLocalDecimalSeparator(unsigned int codePoint);
/// Takes effect only if the text is exactly one code point; so does the next one with a string.
KERNEL_API void SetLocalDecimalSeparator(String8 const& text);
KERNEL_API void SetLocalDigitGroupingSeparator(unsigned int codePoint);
KERNEL_API void SetLocalDigitGroupingSeparator(String8 const& text);

KERNEL_API unsigned int GetLocalDecimalSeparator();
KERNEL_API unsigned int GetLocalGroupingSeparator();
/// True if the decimal separator is ".".
KERNEL_API bool IsDefaultDecimalSeparator();

/// Makes a user's number text machine-readable: takes out the grouping separators, then makes each decimal separator a
/// "." and each list separator a ",". A separator that is not set changes nothing, here and in the inverse.
KERNEL_API String8 ConvertFromLocalisedDecimal(String8 const& text);
/// The inverse without grouping: "," becomes the list separator, then "." the decimal separator.
KERNEL_API String8 ConvertToLocalisedDecimal(String8 const& text);

} // namespace Kernel

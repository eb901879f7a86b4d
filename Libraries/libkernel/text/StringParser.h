#pragma once

#include "libkernel/text/Locale.h"

namespace Kernel {

/// Numbers as a user writes them, by ICU's number format for a language: decimal sign, groups and digits are the
/// language's. Null @p locale means Locale::GetCurrent().
///
/// As ICU has it, text behind a number is passed over: "12 cm" is 12. False, with @p value left as it was, if the text
/// does not begin with a number. Any thread. Slow: about 0.05 ms.
class KERNEL_API StringParser
{
public:
    /// The number as a double.
    static bool ParseAsDouble(String8 const& text, Counted<Locale const> const& locale, double& value);
    /// Drops a fraction. False also for a number that needs more than 32 bits, which is as far as ICU goes here.
    static bool ParseAsLong(String8 const& text, Counted<Locale const> const& locale, long& value);
};

} // namespace Kernel

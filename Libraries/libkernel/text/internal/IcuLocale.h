#pragma once

#include "libkernel/text/Locale.h"

#include <unicode/locid.h>

namespace Kernel {

/// The locale for ICU's C++ classes; Locale::GetCurrent() for null.
inline icu::Locale ToIcuLocale(Counted<Locale const> const& locale)
{
    return icu::Locale((locale ? locale : Locale::GetCurrent())->GetId().GetData());
}

} // namespace Kernel

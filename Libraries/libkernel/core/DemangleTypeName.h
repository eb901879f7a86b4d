#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// A class name for display, from what `typeid(x).name()` gives. With @p keepNamespaces the full name; otherwise
/// without the namespaces and enclosing classes in front of the name itself, template arguments left as they are. A
/// name that can't be demangled comes back as it is; null gives the empty string.
KERNEL_API String8 DemangleTypeName(char const* name, bool keepNamespaces);

} // namespace Kernel

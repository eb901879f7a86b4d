#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

namespace Kernel::Platform {

/// Lets this process have @p count files open at once, or as many of them as its user may; never lowers the limit.
/// Child processes inherit it. Any thread.
KERNEL_API void RaiseOpenFileLimit(u64 count);

} // namespace Kernel::Platform

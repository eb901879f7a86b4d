#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

namespace Kernel::Platform {

/// Fills @p data with @p size bytes from the system's cryptographic generator. False, with the contents undefined, only
/// if the system has none to give. Any thread.
KERNEL_API bool RandomBytes(void* data, u64 size);

} // namespace Kernel::Platform

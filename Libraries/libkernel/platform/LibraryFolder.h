#pragma once

#include "libkernel/core/Export.h"

#include <string>

namespace Kernel::Platform {

/// Where the library itself lies: the folder of the shared object, or of the program that it is linked into. Empty if
/// it can't be had.
KERNEL_API std::string GetLibraryFolder();

} // namespace Kernel::Platform

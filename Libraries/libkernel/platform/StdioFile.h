#pragma once

#include "libkernel/platform/PlatformFile.h"

#include <cstdio>

namespace Kernel::Platform {

/// Makes a C stream over @p handle, whose reads, writes and seeks go through the table of file calls, with @p mode as
/// in fopen (what it says must fit how the handle was opened). The stream owns the handle from here on: fclose closes
/// it. Null and ENOMEM in @p error if none could be made; the handle then stays the caller's.
KERNEL_API std::FILE* MakeStdioFile(FileHandle handle, char const* mode, int& error);

/// The handle under a stream, its own descriptor for a stream that was made elsewhere; c_noHandle if it has none. What
/// the stream still buffers has not reached it.
KERNEL_API FileHandle GetStdioHandle(std::FILE* file);

} // namespace Kernel::Platform

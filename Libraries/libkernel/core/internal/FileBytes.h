#pragma once

#include "libkernel/core/Types.h"

#include <memory>

namespace Kernel {

/// A regular file read whole: null if it can't be, is no regular file, or is longer than @p most bytes. Four zero bytes
/// stand behind the @p size ones, as a terminator in any charset. Throws std::bad_alloc when there is no memory.
std::unique_ptr<char[]> ReadFileBytes(char const* path, u64 most, u64& size);

} // namespace Kernel

#include "libkernel/core/Exception.h"

namespace Kernel {

// Out of line, so that each class has one type information record and can be caught across the library's border.
Exception::~Exception() = default;
AbortException::~AbortException() = default;
NestedException::~NestedException() = default;
MemoryException::~MemoryException() = default;
InvalidArgException::~InvalidArgException() = default;

} // namespace Kernel

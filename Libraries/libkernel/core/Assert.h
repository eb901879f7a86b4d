#pragma once

#include "libkernel/core/Export.h"

namespace Kernel {

/// Tells the AssertTrap of the host and standard error, then ends the process.
[[noreturn]] KERNEL_API void FailAssertion(char const* file, char const* condition, int line);

} // namespace Kernel

/// A promise between parts of the program, never about bytes from outside. Checked unless NDEBUG is defined; then the
/// condition is not evaluated.
#if defined(NDEBUG)
#define KERNEL_ASSERT(condition) static_cast<void>(sizeof(!(condition)))
#else
#define KERNEL_ASSERT(condition)                                                                                       \
    ((condition) ? static_cast<void>(0) : ::Kernel::FailAssertion(__FILE__, #condition, __LINE__))
#endif

#pragma once

#include "libkernel/core/Export.h"

#include <atomic>

namespace Kernel {

/// Hook of the host for assertion failures. At most one exists at a time: making a second is a programming error and
/// ends the process. It hears of failures from the end of its constructor until its destructor begins, on the thread
/// that failed.
class KERNEL_API AssertTrap
{
public:
    AssertTrap();
    AssertTrap(AssertTrap const&) = delete;
    AssertTrap& operator=(AssertTrap const&) = delete;
    virtual ~AssertTrap();

    /// Hands a failure to the trap, if there is one. A path that begins with the folder the sources were built from is
    /// given without that part.
    static void NotifyAssert(char const* file, char const* message, int line);

private:
    virtual void HandleAssert(char const* file, char const* message, int line) = 0;

    static std::atomic<AssertTrap*> s_pInstance;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// Facts about the machine. Any thread.
class KERNEL_API System
{
public:
    System() = delete;

    /// Logical processors, or physical cores with false. Counted once.
    static int GetCpuCount(bool logical);
    /// Bytes of installed memory, rounded down to kilobytes; 0 if unknown.
    static u64 GetRamCount();
    /// Names of the machine and of the user; empty if they can't be had.
    static String8 GetHostName();
    static String8 GetUserNameW();
};

} // namespace Kernel

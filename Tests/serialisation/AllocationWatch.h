#pragma once

#include "libkernel/core/Types.h"

namespace Kernel::Test {

/// Watches the heap of the whole process for a scope. One at a time, and no other thread.
class AllocationWatch
{
public:
    AllocationWatch();
    ~AllocationWatch();
    AllocationWatch(AllocationWatch const&) = delete;

    /// False where another allocator is in charge, as under a sanitiser.
    static bool IsAvailable();
    /// The most bytes that were in use at once, beyond those at the start.
    static u64 GetPeak();
    static u64 GetCount();
};

} // namespace Kernel::Test

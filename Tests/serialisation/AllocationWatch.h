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

    /// The most bytes that were in use at once, beyond those at the start; 0 under a sanitiser, which has the heap to
    /// itself.
    static u64 GetPeak();
};

} // namespace Kernel::Test

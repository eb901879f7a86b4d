#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// Told how far a copy between two streams has come. Called on the thread that copies; it must not use either stream.
/// An exception that it throws ends the copy and passes to the copy's caller.
class KERNEL_API StreamCopyProgress
{
public:
    virtual ~StreamCopyProgress();

    /// @p done bytes of @p total have been moved. @p total is 0 where the source does not know its size, and may be
    /// passed by @p done where the source grew.
    virtual void ReportProgress(u64 done, u64 total) = 0;
};

} // namespace Kernel

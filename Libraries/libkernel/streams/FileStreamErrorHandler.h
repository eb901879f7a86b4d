#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/streams/FileIOException.h"

namespace Kernel {

/// Told of a file stream's first failure instead of an exception. Runs on the thread of the failing call and may throw;
/// it may also take itself off the stream.
class KERNEL_API FileStreamErrorHandler : public Countable
{
public:
    /// @p fatal is false where the stream could in principle go on.
    virtual void OnError(FileIOException::Reason reason, bool fatal) = 0;

protected:
    ~FileStreamErrorHandler() override;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/streams/FileIOException.h"

namespace Kernel {

/// Told of a file stream's first failure, in place of a FileIOException. Derived by host programs.
class KERNEL_API FileStreamErrorHandler : public Countable
{
public:
    /// Runs on the thread of the failing call, after the stream has gone broken. @p fatal says that the stream is of no
    /// more use. May throw, which passes to the caller of the failing call, and may remove itself from the stream.
    virtual void OnError(FileIOException::Reason reason, bool fatal) = 0;

protected:
    ~FileStreamErrorHandler() override;
};

} // namespace Kernel

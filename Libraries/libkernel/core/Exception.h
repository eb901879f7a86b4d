#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// Root of the library's exceptions. The class is the message; there is no text. None derives from std::exception.
class KERNEL_API Exception
{
public:
    Exception() = default;
    Exception(Exception const&) = default;
    Exception& operator=(Exception const&) = default;
    virtual ~Exception();
};

/// A save found its abort flag set.
class KERNEL_API AbortException : public Exception
{
public:
    ~AbortException() override;
};

/// A save session's operation was called while the session was already inside one.
class KERNEL_API NestedException : public Exception
{
public:
    ~NestedException() override;
};

/// A large working buffer could not be allocated.
class KERNEL_API MemoryException : public Exception
{
public:
    ~MemoryException() override;
};

/// A caller passed null, or a buffer too small for the result.
class KERNEL_API InvalidArgException : public Exception
{
public:
    ~InvalidArgException() override;
};

} // namespace Kernel

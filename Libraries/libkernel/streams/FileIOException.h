#pragma once

#include "libkernel/core/Exception.h"

namespace Kernel {

/// The first failure of a file stream that has no error handler.
class KERNEL_API FileIOException : public Exception
{
public:
    enum class Reason
    {
        NoError = 0,
        FileHandleLost = 1,
        AccessDenied = 2,
        PermissionDenied = 3,
        OutOfSpace = 4,
        SocketNotConnected = 5,
        NotAllowed = 6,
        Other = 7
    };

    explicit FileIOException(Reason reason) : m_reason(reason) {}
    ~FileIOException() override;

    Reason GetReason() const { return m_reason; }
    /// A fixed text for logs, never null.
    char const* GetReasonString() const;

    /// The reason for an error number of the platform's file calls.
    static Reason FromError(int error);
    /// Name and meaning of an error number; null for one that is not in the table. Valid for ever.
    static char const* ErrorToString(int error);

private:
    Reason m_reason;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Exception.h"

namespace Kernel {

/// A file stream without an error handler met its first failure.
class KERNEL_API FileIOException : public Exception
{
public:
    enum class Reason : int
    {
        NoError = 0,            ///< Bytes were not taken, and the system named no error.
        FileHandleLost = 1,     ///< ENOENT, EIO, ENXIO: the file or its device is gone.
        AccessDenied = 2,       ///< EACCES.
        PermissionDenied = 3,   ///< EPERM, EROFS.
        OutOfSpace = 4,         ///< ENOSPC.
        SocketNotConnected = 5, ///< ENOTCONN: the server of a network volume is gone.
        NotAllowed = 6,         ///< EBADF: the stream wasn't opened for that.
        Other = 7               ///< Everything else.
    };

    explicit FileIOException(Reason reason) : m_reason(reason) {}
    ~FileIOException() override;

    Reason GetReason() const { return m_reason; }
    /// English, never null; "Exception Other Error" for a value that isn't listed.
    char const* GetReasonString() const;

    /// The reason for an `errno`.
    static Reason FromError(int error);
    /// Names an `errno` of this system, "ENOENT : No such file or directory"; null for one that isn't in the table.
    static char const* ErrorToString(int error);

private:
    Reason m_reason;
};

} // namespace Kernel

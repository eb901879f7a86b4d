#include "libkernel/streams/FileIOException.h"

#include "libkernel/platform/Errors.h"

#include <algorithm>
#include <iterator>

namespace Kernel {

namespace {

using Reason = FileIOException::Reason;

// By the reason's number; the last one stands for everything beyond.
constexpr char const* c_reasonTexts[] = {
    "Exception No Error",          "Exception File Handle Lost", "Exception Access Denied",
    "Exception Permission Denied", "Exception Out of Space",     "Exception Socket Not Connected",
    "Operation Not Allowed",       "Exception Other Error",
};
static_assert(std::size(c_reasonTexts) == static_cast<size_t>(Reason::Other) + 1);

struct ErrorReason
{
    int error;
    Reason reason;
};

constexpr ErrorReason c_errorReasons[] = {
    {0, Reason::NoError},
    {ENOENT, Reason::FileHandleLost},
    {EIO, Reason::FileHandleLost},
    {ENXIO, Reason::FileHandleLost},
    {EACCES, Reason::AccessDenied},
    {EPERM, Reason::PermissionDenied},
    {EROFS, Reason::PermissionDenied},
    {ENOSPC, Reason::OutOfSpace},
    {ENOTCONN, Reason::SocketNotConnected},
    {EBADF, Reason::NotAllowed},
};

struct ErrorText
{
    int error;
    char const* text;
};

constexpr ErrorText c_errorTexts[] = {
    {EPERM, "EPERM : Operation not permitted"},
    {ENOENT, "ENOENT : No such file or directory"},
    {ESRCH, "ESRCH : No such process"},
    {EINTR, "EINTR : Interrupted system call"},
    {EIO, "EIO : Input/output error"},
    {ENXIO, "ENXIO : Device not configured"},
    {E2BIG, "E2BIG : Argument list too long"},
    {ENOEXEC, "ENOEXEC : Exec format error"},
    {EBADF, "EBADF : Bad file descriptor"},
    {ECHILD, "ECHILD : No child processes"},
    {EAGAIN, "EAGAIN|EWOULDBLOCK : Resource temporarily unavailable"},
    {ENOMEM, "ENOMEM : Cannot allocate memory"},
    {EACCES, "EACCES : Permission denied"},
    {EFAULT, "EFAULT : Bad address"},
    {EBUSY, "EBUSY : Device / Resource busy"},
    {EEXIST, "EEXIST : File exists"},
    {EXDEV, "EXDEV : Cross-device link"},
    {ENODEV, "ENODEV : Operation not supported by device"},
    {ENOTDIR, "ENOTDIR : Not a directory"},
    {EISDIR, "EISDIR : Is a directory"},
    {EINVAL, "EINVAL : Invalid argument"},
    {ENFILE, "ENFILE : Too many open files in system"},
    {EMFILE, "EMFILE : Too many open files"},
    {ENOTTY, "ENOTTY : Inappropriate ioctl for device"},
    {EFBIG, "EFBIG : File too large"},
    {ENOSPC, "ENOSPC : No space left on device"},
    {ESPIPE, "ESPIPE : Illegal seek"},
    {EROFS, "EROFS : Read-only file system"},
    {EMLINK, "EMLINK : Too many links"},
    {EPIPE, "EPIPE : Broken pipe"},
    {EDEADLK, "EDEADLK : Resource deadlock avoided"},
    {EALREADY, "EALREADY : Operation already in progress"},
    {EINPROGRESS, "EINPROGRESS : Operation now in progress"},
    {ETXTBSY, "ETXTBSY : Text file busy"},
};

} // namespace

FileIOException::~FileIOException() = default;

char const* FileIOException::GetReasonString() const
{
    int const last = static_cast<int>(Reason::Other);
    int const index = static_cast<int>(m_reason);
    return c_reasonTexts[index < 0 || index > last ? last : index];
}

FileIOException::Reason FileIOException::FromError(int error)
{
    auto const* row = std::find_if(std::begin(c_errorReasons), std::end(c_errorReasons),
                                   [&](ErrorReason const& r) { return r.error == error; });
    return row != std::end(c_errorReasons) ? row->reason : Reason::Other;
}

char const* FileIOException::ErrorToString(int error)
{
    auto const* row = std::find_if(std::begin(c_errorTexts), std::end(c_errorTexts),
                                   [&](ErrorText const& t) { return t.error == error; });
    return row != std::end(c_errorTexts) ? row->text : nullptr;
}

} // namespace Kernel

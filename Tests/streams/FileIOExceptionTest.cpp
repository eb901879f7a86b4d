#include "libkernel/streams/FileIOException.h"

#include "libkernel/platform/Errors.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using Reason = FileIOException::Reason;

TEST(FileIOExceptionTest, EachErrorHasItsReasonAndText)
{
    struct Case
    {
        int error;
        int reason;
        char const* text;
    };
    for (Case const& c : {
             Case{0, 0, "Exception No Error"},
             Case{ENOENT, 1, "Exception File Handle Lost"},
             Case{EIO, 1, "Exception File Handle Lost"},
             Case{ENXIO, 1, "Exception File Handle Lost"},
             Case{EACCES, 2, "Exception Access Denied"},
             Case{EPERM, 3, "Exception Permission Denied"},
             Case{EROFS, 3, "Exception Permission Denied"},
             Case{ENOSPC, 4, "Exception Out of Space"},
             Case{ENOTCONN, 5, "Exception Socket Not Connected"},
             Case{EBADF, 6, "Operation Not Allowed"},
             Case{EFBIG, 7, "Exception Other Error"},
             Case{12345, 7, "Exception Other Error"},
         })
    {
        SCOPED_TRACE(c.error);
        FileIOException const exception(FileIOException::FromError(c.error));
        EXPECT_EQ(static_cast<int>(exception.GetReason()), c.reason);
        EXPECT_STREQ(exception.GetReasonString(), c.text);
    }
    for (int const unlisted : {8, 1000, -1})
        EXPECT_STREQ(FileIOException(static_cast<Reason>(unlisted)).GetReasonString(), "Exception Other Error");
}

TEST(FileIOExceptionTest, ErrorsAreNamedByTheirSymbolOnThisLibrary)
{
    EXPECT_STREQ(FileIOException::ErrorToString(ENXIO), "ENXIO : Device not configured");
    EXPECT_STREQ(FileIOException::ErrorToString(EAGAIN), "EAGAIN|EWOULDBLOCK : Resource temporarily unavailable");
    for (int const unlisted : {0, ENOSYS, -1, 12345}) EXPECT_EQ(FileIOException::ErrorToString(unlisted), nullptr);
}

} // namespace
} // namespace Kernel

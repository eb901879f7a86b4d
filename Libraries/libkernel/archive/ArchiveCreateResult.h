#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// Why an archive could not be created, with a text that a person can be shown.
class KERNEL_API ArchiveCreateResult
{
public:
    enum class Code
    {
        Ok = 0,
        BadPath = 1,
        CouldNotCreate = 2, ///< GetErr has the detail.
        ChangesNotAllowed = 3,
        InUse = 4,
        ExistsReadOnly = 5,
        WriteFailed = 6,
        HasScratchFile = 7,
        IsThrowAway = 8,
        NoMasterPath = 9,
        AccessDenied = 10,
        NotPermitted = 11,
        ReadOnlyVolume = 12,
        TimedOut = 13,
        Refused = 14,
        NoMemory = 15,
        IsDirectory = 16,
        TooManyFiles = 17,
        TooLarge = 18,
        NoSpace = 19,
        NotSupported = 20
    };

    void Set(Code code) { m_code = code; }
    Code GetCode() const { return m_code; }
    void SetErr(String8 const& text) { m_err = text; }
    String8 const& GetErr() const { return m_err; }

    /// The message for the code in the user's language, through the StringLocaliser with the context "Save errors". The
    /// operation's name is "Save", translated too, if none is given. Empty for codes that have no message.
    String8 GetErrorMessage() const;
    String8 GetErrorMessage(String8 const& operationName) const;

private:
    Code m_code = Code::Ok;
    String8 m_err;
};

} // namespace Kernel

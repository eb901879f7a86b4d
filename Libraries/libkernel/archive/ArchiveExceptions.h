#pragma once

#include "libkernel/core/Exception.h"

namespace Kernel {

class Archive;

/// Root of what an archive throws. GetArchive is not owned: it is good only while the caller holds the archive.
class KERNEL_API ArchiveException : public Exception
{
public:
    explicit ArchiveException(Archive const* archive) : m_archive(archive) {}
    ~ArchiveException() override;
    Archive const* GetArchive() const { return m_archive; }

private:
    Archive const* m_archive;
};

/// A CRC failed or a stored block is bad, and no error callback took it.
class KERNEL_API ArchiveCorruptionException : public ArchiveException
{
public:
    using ArchiveException::ArchiveException;
    ~ArchiveCorruptionException() override;
};

/// A save met a delay-load holder that has nothing to write from.
class KERNEL_API ArchiveBackingException : public ArchiveException
{
public:
    using ArchiveException::ArchiveException;
    ~ArchiveBackingException() override;
};

/// The CRC of stored bytes differs from the one recorded for them; the archive turns it into its documented result.
class KERNEL_API ArchiveCRCException : public ArchiveException
{
public:
    using ArchiveException::ArchiveException;
    ~ArchiveCRCException() override;
};

/// One of an archive's files could not be read or written.
class KERNEL_API ArchiveFileException : public ArchiveException
{
public:
    enum class Reason
    {
        FileError = 0, ///< The handle was lost, or the socket is not connected.
        OutOfSpace = 1,
        OtherWriter = 2,     ///< The write counter is not the one that this archive left.
        GuardUnreadable = 3, ///< The write guard block cannot be read, or its tag is wrong.
        PermissionDenied = 4,
        AccessDenied = 5,
        OperationNotAllowed = 6,
        Other = 7,
        ReadFailed = 8 ///< Stored data could not be read.
    };
    enum class WhatFile
    {
        Master = 0,
        Scratch = 1
    };

    ArchiveFileException(Archive const* archive, Reason reason, WhatFile what, Archive const* other = nullptr)
        : ArchiveException(archive), m_reason(reason), m_what(what), m_other(other)
    {
    }
    ~ArchiveFileException() override;

    Reason GetReason() const { return m_reason; }
    WhatFile GetWhatFile() const { return m_what; }
    /// The archive that was read from, where the failure was on the source's side; otherwise null. Not owned.
    Archive const* GetArchiveOther() const { return m_other; }

    /// The reason for a failure of a file stream; @p fileIOReason is the number of a FileIOException::Reason.
    static Reason FromFileIOReason(int fileIOReason);

private:
    Reason m_reason;
    WhatFile m_what;
    Archive const* m_other;
};

} // namespace Kernel

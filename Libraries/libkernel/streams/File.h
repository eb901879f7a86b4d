#pragma once

#include "libkernel/core/String.h"

#include <cstdio>

namespace Kernel {

/// Owns a C stream, opened by a UTF-8 path in the system's own grammar. One thread at a time.
///
/// Only regular files open: a folder gives IsDirectory, a pipe or a device Other, and none of them is waited for.
class KERNEL_API File
{
public:
    /// Each stands for a mode of the C library. Another value fails with Other and `errno` EINVAL.
    enum class AccessMode : int
    {
        Read = 0,       ///< "r"
        ReadWrite = 1,  ///< "r+"
        AppendRead = 2, ///< "a+"
        CreateRead = 3, ///< "w+"
        Append = 4,     ///< "a"
        Create = 5      ///< "w"
    };

    enum class ShareMode : int
    {
        DenyNone = 0,
        DenyWrite = 1 ///< No other opener that uses this library may write meanwhile; readers may read.
    };

    enum class VisibilityMode : int
    {
        Normal = 0,
        Hidden = 1 ///< The file gets the hidden attribute, where the file system has a place for it.
    };

    enum class Offset : int
    {
        Start = 0,
        Current = 1,
        End = 2
    };

    /// How an open went. Opened and OpenedToo mean that there is a stream.
    enum class OpenUnmanagedResult : int
    {
        Opened = 0,
        OpenedToo = 1,       ///< Not given on this platform.
        NotFound = 2,        ///< ENOENT; or EACCES and nothing is to be seen at the path.
        Exists = 3,          ///< EEXIST.
        InUse = 4,           ///< Not given on this platform.
        AccessDenied = 5,    ///< EACCES from TranslateError; an open tells NotPermitted and NotFound apart.
        NotPermitted = 6,    ///< EPERM; or EACCES for a path that exists, as when a share mode refuses the open.
        Locked = 7,          ///< EAGAIN.
        TimedOut = 8,        ///< ETIMEDOUT.
        Refused = 9,         ///< ECONNREFUSED.
        ReadOnlyVolume = 11, ///< EROFS.
        NoMemory = 12,       ///< ENOMEM.
        IsDirectory = 13,    ///< EISDIR.
        TooManyFiles = 14,   ///< ENFILE, EMFILE.
        TooLarge = 15,       ///< EFBIG.
        NoSpace = 16,        ///< ENOSPC.
        NotSupported = 17,   ///< ENODEV, ENOSYS.
        Other = 18           ///< Everything else.
    };

    /// Empty.
    File() = default;
    ~File();
    File(File const&) = delete;
    File& operator=(File const&) = delete;

    /// Opens; what is open is closed first. A mode string is as in fopen, with "x" to refuse an existing file and "S"
    /// as a hint that access will be sequential.
    bool Open(char const* path, AccessMode access, ShareMode share = ShareMode::DenyNone,
              VisibilityMode visibility = VisibilityMode::Normal);
    bool Open(char const* path, char const* mode, ShareMode share = ShareMode::DenyNone,
              VisibilityMode visibility = VisibilityMode::Normal);
    OpenUnmanagedResult OpenEx(char const* path, AccessMode access, ShareMode share = ShareMode::DenyNone,
                               VisibilityMode visibility = VisibilityMode::Normal);
    OpenUnmanagedResult OpenEx(char const* path, char const* mode, ShareMode share = ShareMode::DenyNone,
                               VisibilityMode visibility = VisibilityMode::Normal);

    /// Opens a stream that the caller closes with fclose. On failure @p out is null, `errno` tells why, and
    /// @p errorText, if given, gets the system's words for it.
    static OpenUnmanagedResult OpenUnmanaged(char const* path, AccessMode access, ShareMode share,
                                             VisibilityMode visibility, std::FILE*& out, String8* errorText = nullptr);
    static OpenUnmanagedResult OpenUnmanaged(char const* path, char const* mode, ShareMode share,
                                             VisibilityMode visibility, std::FILE*& out, String8* errorText = nullptr);

    static constexpr bool IsOpened(OpenUnmanagedResult result) { return static_cast<int>(result) < 2; }

    /// Takes over a stream; what is open is closed first.
    void Attach(std::FILE* file);
    /// Gives up the stream, null if none is open; the caller closes it.
    [[nodiscard]] std::FILE* Detach();
    /// False if the last bytes could not be written; the stream is gone all the same. True if none is open.
    bool Close();
    bool IsOpen() const { return m_file != nullptr; }
    std::FILE* GetHandle() const { return m_file; }
    operator std::FILE*() const { return m_file; }

    /// False on failure and when closed.
    bool Flush();
    /// Flush, and on to the device.
    bool ForceFlush();

    /// Bytes from the start; -1 when closed or on failure, here and below.
    i64 GetPosition() const;
    /// Bytes, with what the stream still holds.
    i64 GetSize() const;
    static i64 GetSize(char const* path);
    /// From the start.
    bool SetPosition(i64 position);
    bool SetPosition(i64 offset, Offset from);

    /// Seconds since the file was last written to, by the system's clock; -1 when closed or on failure.
    i64 GetSecondSinceModified() const;
    /// Always false: the times of an open file follow what is written to it, and without one there is nothing to touch.
    bool UpdateModifiedTimestamp();

    /// The result for an `errno`.
    static OpenUnmanagedResult TranslateError(int error);
    /// The same for an open of @p path that failed: EACCES is NotPermitted where something stands, NotFound where
    /// nothing does.
    static OpenUnmanagedResult TranslateOpenError(int error, char const* path);
    /// Lets go of a lock that the system put on @p file while opening. This one puts none.
    static void Unlock(std::FILE* file);

private:
    std::FILE* m_file = nullptr;
};

} // namespace Kernel

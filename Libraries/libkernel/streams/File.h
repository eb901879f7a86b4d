#pragma once

#include "libkernel/core/String.h"
#include "libkernel/core/Types.h"

#include <cstdio>

namespace Kernel {

/// Owner of a C stream, and the place where files are opened. Paths are UTF-8. One thread at a time.
class KERNEL_API File
{
public:
    /// Stands for the C modes "r", "r+", "a+", "w+", "a", "w", in this order.
    enum class AccessMode
    {
        Read = 0,
        ReadWrite = 1,
        AppendRead = 2,
        CreateRead = 3,
        Append = 4,
        Create = 5
    };

    enum class ShareMode
    {
        DenyNone = 0,
        DenyWrite = 1 ///< No other handle that this library opens may write, here or in another process.
    };

    enum class VisibilityMode
    {
        Normal = 0,
        Hidden = 1 ///< The hidden attribute is set after opening.
    };

    /// How an open went; Opened and OpenedToo mean that there is a stream.
    enum class OpenUnmanagedResult
    {
        Opened = 0,
        OpenedToo = 1,
        NotFound = 2,
        Exists = 3,
        InUse = 4,
        AccessDenied = 5,
        NotPermitted = 6, ///< Also a share mode that was refused, and a file whose rights forbid it.
        Locked = 7,
        TimedOut = 8,
        Refused = 9,
        ReadOnlyVolume = 11,
        NoMemory = 12,
        IsDirectory = 13,
        TooManyFiles = 14,
        TooLarge = 15,
        NoSpace = 16,
        NotSupported = 17,
        Other = 18
    };

    enum class Offset
    {
        Start = 0,
        Current = 1,
        End = 2
    };

    File() = default;
    ~File();
    File(File const&) = delete;
    File& operator=(File const&) = delete;

    /// Each closes what is open first. False, and a closed File, on failure.
    bool Open(char const* path, AccessMode mode, ShareMode share = ShareMode::DenyNone,
              VisibilityMode visibility = VisibilityMode::Normal);
    bool Open(char const* path, char const* mode, ShareMode share = ShareMode::DenyNone,
              VisibilityMode visibility = VisibilityMode::Normal);
    OpenUnmanagedResult OpenEx(char const* path, AccessMode mode, ShareMode share = ShareMode::DenyNone,
                               VisibilityMode visibility = VisibilityMode::Normal);
    OpenUnmanagedResult OpenEx(char const* path, char const* mode, ShareMode share = ShareMode::DenyNone,
                               VisibilityMode visibility = VisibilityMode::Normal);

    /// Opens a C stream that the caller owns. @p text, if not null, gets the platform's text for a failure.
    static OpenUnmanagedResult OpenUnmanaged(char const* path, AccessMode mode, ShareMode share,
                                             VisibilityMode visibility, std::FILE*& file, String8* text = nullptr);
    static OpenUnmanagedResult OpenUnmanaged(char const* path, char const* mode, ShareMode share,
                                             VisibilityMode visibility, std::FILE*& file, String8* text = nullptr);

    /// Takes over an open stream; closes what is open first.
    void Attach(std::FILE* file);
    /// Gives the stream up; the caller closes it.
    [[nodiscard]] std::FILE* Detach();
    /// True if it closed well, or there was nothing to close.
    bool Close();
    bool IsOpen() const { return m_file != nullptr; }
    std::FILE* GetHandle() const { return m_file; }
    operator std::FILE*() const { return m_file; }

    bool Flush();
    /// Flushes to the device.
    bool ForceFlush();
    /// -1 when closed or on failure; so is GetSize.
    i64 GetPosition() const;
    i64 GetSize() const;
    static i64 GetSize(char const* path);
    bool SetPosition(i64 position);
    bool SetPosition(i64 distance, Offset from);
    /// Age of the contents in seconds; -1 when it can't be asked.
    i64 GetSecondSinceModified() const;
    /// An open stream's times change with its writes alone: always false.
    bool UpdateModifiedTimestamp() { return false; }

    /// The result for an error number of the platform's file calls.
    static OpenUnmanagedResult TranslateError(int error);
    /// The same for an open that failed: an access error on a path where something stands is NotPermitted, and NotFound
    /// where nothing does.
    static OpenUnmanagedResult TranslateOpenError(int error, char const* path);
    /// A hook for hosts; does nothing here.
    static void Unlock(std::FILE*) {}

private:
    std::FILE* m_file = nullptr;
};

} // namespace Kernel

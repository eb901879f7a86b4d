#pragma once

#include "libkernel/core/String.h"
#include "libkernel/core/Types.h"

#include <ctime>
#include <utility>

namespace Kernel {

class TimeStamp;

/// Operations on files and directories by path, with the retries and fallbacks that documents rely on.
///
/// Paths are UTF-8 in the system's own grammar (PathTraitsNative). Links are followed, except where an entry itself is
/// moved, deleted or replaced. Retries are counts given by the caller; between tries there is a pause of
/// c_retryPauseMs. Nothing here throws but IsSameFile. All operations may be called from any thread; the directory
/// setters belong to the start of the program.
class KERNEL_API FileSystem
{
public:
    static constexpr int c_retryPauseMs = 1000;
    /// Longest path of the main program that is given out, in bytes.
    static constexpr int c_maxExecutablePath = 260;

    enum class SafeMoveFileResult
    {
        Moved = 0,
        AccessDenied = 1,
        PermissionDenied = 2, ///< Not produced on this platform.
        DiskFull = 3,
        NoRoom = 4,   ///< Not produced on this platform.
        NoRights = 5, ///< Not produced on this platform.
        Failed = 6    ///< Another failure, or there is no source.
    };

    enum class RenameFileForBackupResult
    {
        Renamed = 0,
        AccessDenied = 1,
        PermissionDenied = 2, ///< Not produced on this platform.
        DiskFull = 3,
        Failed = 4
    };

    enum class CopyFileResult
    {
        Copied = 0,
        Failed = 4
    };

    enum class PathResult
    {
        Nothing = 0,
        File = 1,
        Directory = 2
    };

    /// A file, a directory or anything else stands at the path. A link that leads nowhere is nothing.
    static bool Exists(String8 const& path);
    static bool IsFile(String8 const& path);
    static bool IsDirectory(String8 const& path);
    /// False as well for what is no directory or can't be listed.
    static bool IsDirectoryEmpty(String8 const& path);
    static PathResult TestPath(String8 const& path);

    /// Length in bytes, -1 on failure.
    static i64 GetFileSize(String8 const& path);
    /// The name as the file system spells it; the last part of the path if there is no such file.
    static String8 GetFilename(String8 const& path);
    /// True if the file's mode lets nobody write; false if it can't be asked.
    static bool FileIsReadOnly(String8 const& path);
    static bool HasReadAccess(String8 const& path);
    /// The file doesn't open for reading, and the open result says that it stands there all the same.
    static bool HasPermissionError(String8 const& path);

    /// True when the strings are equal or both name one file (device and file number). Throws
    /// std::filesystem::filesystem_error, with "equivalent" in its message, when one of two different paths can't be
    /// asked: the one exception that leaves this class.
    static bool IsSameFile(String8 const& a, String8 const& b);

    /// Whether the file system could be asked, and whether the file has the hidden attribute.
    static std::pair<bool, bool> GetFileHidden(String8 const& path);
    /// Sets or clears the hidden attribute. False where the file system has no place for it.
    static bool SetFileHidden(String8 const& path, bool hidden);

    /// Whether the file has a mark for the file-sync client at all, and whether the mark says "leave this alone". A
    /// mark shorter than 4 bytes says so.
    static std::pair<bool, bool> GetDropBoxIgnore(String8 const& path);
    /// Sets the mark to the 32-bit value 1, or removes it; there being none to remove is a success.
    static bool SetDropBoxIgnore(String8 const& path, bool ignore);

    static bool GetAccessTime(String8 const& path, TimeStamp& time);
    static bool GetModifiedTime(String8 const& path, TimeStamp& time);
    /// In civil fields: local time, or with @p utc in UTC.
    static bool GetAccessTime(String8 const& path, std::tm& time, bool utc);
    static bool GetModifiedTime(String8 const& path, std::tm& time, bool utc);
    static bool SetAccessTime(String8 const& path, TimeStamp time);
    static bool SetModifiedTime(String8 const& path, TimeStamp time);

    /// Gives @p to the permissions and the hidden attribute of @p from; a hidden attribute that the file system has no
    /// place for is no failure. The second form takes descriptors of open files.
    static bool CopyFileAttributes(String8 const& from, String8 const& to);
    static bool CopyFileAttributes(int fromDescriptor, int toDescriptor);

    /// Deletes a file; a missing one is a success. With too many open files or access denied, up to @p retries more
    /// tries.
    static bool Delete(String8 const& path, int retries);
    /// Deletes the files, not the directories, of a folder, each with Delete(file, 0). False if the folder can't be
    /// listed, whatever becomes of the files.
    static bool DeleteFilesFromFolder(String8 const& path);

    /// Renames and replaces, atomically or not at all, and flushes the folder. Where both are names of one file the old
    /// name goes. Up to @p retries more tries where the
    /// failure may pass: too many open files, access denied, file in use. False too when the folder's flush fails: the
    /// new name then stands, but may not outlast a power cut. @p isRenamed, if given, tells that from a file that
    /// still has its old name.
    static bool RenameFile(String8 const& from, String8 const& to, int retries, bool* isRenamed = nullptr);

    /// Moves the file to the first free of "path_backup1", "path_backup2", ... and stores that path in @p out, also
    /// where the move was made but gives a failure since it may not outlast a power cut.
    static RenameFileForBackupResult RenameFileForBackup(String8 const& path, String8& out);

    /// True if SafeMoveFileAdv without retries gives Moved. Who goes on with the file after a failure asks that form.
    static bool SafeMoveFile(String8 const& from, String8 const& to);

    /// Moves a file, or a symbolic link as it is, over @p to; contents and name are on the device before it returns.
    /// Between volumes, and when the rename fails for good, the contents go to a temporary beside the target, which is
    /// flushed and renamed, so that the target is old or new but never half written; the source goes last. A source
    /// that can't be deleted then is logged, and the file counts as moved. Failures are logged. A move that was made,
    /// but may not outlast a power cut because a folder can't be flushed, is a failure too: @p isMoved, if given, tells
    /// it from one after which the file stands at @p from as before.
    [[nodiscard]] static SafeMoveFileResult SafeMoveFileAdv(String8 const& from, String8 const& to, int retries,
                                                            bool* isMoved = nullptr);

    /// Copies contents, permissions and modification time over @p to, which is old or new but never half written.
    static bool CopyFile(String8 const& from, String8 const& to);
    static CopyFileResult CopyFileAdv(String8 const& from, String8 const& to);

    /// Both open, have one length and the same bytes.
    static bool CompareFileWithFile(String8 const& a, String8 const& b);
    /// The file opens and holds exactly these @p size bytes. A different length is told without reading.
    static bool CompareFileWithMemory(String8 const& path, void const* data, u64 size);

    /// The target of a symbolic link, one step, relative targets taken from the link's folder; the path as given if it
    /// is no link.
    static String8 ResolveLink(String8 const& path);

    /// Makes every directory on the path that isn't there. A last part with a "." in it counts as a file name and
    /// isn't made. A failure leaves what was made. False for an empty path, and for one that the system finds too long
    /// before anything is made.
    static bool CreateDirectoryRecursive(String8 const& path);

    /// The first path in @p dir at which nothing stands, of those that @p format gives with a process-wide count put
    /// in for "%1". No file is made. Empty if the format ignores the count and its one name is taken.
    static String8 GetUniqueFilename(String8 const& dir, String8 const& format);
    /// The same in the temporary directory.
    static String8 GetUniqueTemporaryFilename(String8 const& format);

    /// The process's working directory; empty if it is longer than c_maxExecutablePath.
    static String8 GetCurrentDirectory();
    /// Path of the main program, and the folder that it lies in; empty if that path is longer than
    /// c_maxExecutablePath.
    static String8 GetExecutablePath();
    static String8 GetExecutableDirectory();
    static String8 GetHomeDirectory();
    /// The system's folder of fonts.
    static String8 GetFontResourcesDirectory();

    /// Process-wide directories, empty until they are set. Set during start-up, before other threads read them.
    static String8 GetAppDataDirectory();
    static void SetAppDataDirectory(String8 const& path);
    static String8 GetResourcesDirectory();
    static void SetResourcesDirectory(String8 const& path);
    static String8 GetTemporaryDirectory();
    /// Adds a separator at the end if there is none, and makes the directory.
    static void SetTemporaryDirectory(String8 const& path);

    FileSystem() = delete;
};

} // namespace Kernel

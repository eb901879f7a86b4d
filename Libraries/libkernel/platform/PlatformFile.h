#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <string>
#include <vector>

/// The operating system's files. Every file operation of the library goes through one table of calls, so that tests can
/// put a faulty or recording file system in its place.
///
/// Paths are UTF-8, terminated, in the platform's own grammar; null is answered with EINVAL. An error is an `errno`
/// number by its symbolic name, 0 for success; the calls neither read nor set `errno` for the caller. Calls that a
/// signal interrupted are taken up again, except close. All may be called from any thread; one handle's position
/// belongs to one thread at a time.
namespace Kernel::Platform {

/// An open file. c_noHandle stands for none.
using FileHandle = int;
constexpr FileHandle c_noHandle = -1;

/// What other openers may do while the file is open. Honoured between handles and processes that use this library; a
/// refused open gives EACCES. An opener that neither writes nor denies is never refused and refuses nobody.
enum class FileShare : u8
{
    DenyNone = 0,
    DenyWrite = 1 ///< No other handle may be open for writing, nor be opened for it.
};

struct OpenFlags
{
    bool read = false;
    bool write = false;
    bool create = false;    ///< Make the file if it is missing, with mode 0666 less the process's mask.
    bool exclusive = false; ///< With create: EEXIST if anything stands there, a link too.
    bool truncate = false;  ///< Emptied only after the share mode was granted.
    bool append = false;    ///< Each write goes to the end.
    bool noFollow = false;  ///< ELOOP if the last element is a symbolic link.
    bool direct = false;    ///< Past the page cache. The caller aligns; EINVAL where the file system can't.
    bool anyKind = false;   ///< Devices and pipes too. Otherwise they give ENXIO. Folders give EISDIR in any case.
    FileShare share = FileShare::DenyNone;
};

/// Bytes moved, which may be fewer than asked, and the error that stopped the call, 0 if none. Both can be set: the
/// bytes that were moved before the error stay moved. A read at the end of the file gives 0 and 0.
struct IoResult
{
    u64 count = 0;
    int error = 0;
};

enum class FileKind : u8
{
    None = 0,
    File = 1,
    Folder = 2,
    Link = 3, ///< Only where links are not followed.
    Other = 4
};

struct FileInfo
{
    FileKind kind = FileKind::None;
    u64 size = 0;      ///< Bytes.
    u64 allocated = 0; ///< Bytes on the device; less than the size for a file with holes.
    u64 device = 0;    ///< With inode, the identity of the file while it exists.
    u64 inode = 0;
    u32 mode = 0;       ///< Permission bits, the low 12.
    i64 accessTime = 0; ///< Nanoseconds since 1970-01-01 UTC, here and below.
    i64 modifyTime = 0;
    i64 changeTime = 0;
};

enum class SeekFrom : u8
{
    Start = 0,
    Current = 1,
    End = 2
};

enum class FlushKind : u8
{
    Data = 0, ///< Contents, and the size where it changed.
    Full = 1  ///< And the times and attributes.
};

enum class Access : u8
{
    Exists = 0,
    Read = 1,
    Write = 2
};

enum class ReadAdvice : u8
{
    Normal = 0,
    Sequential = 1,
    Random = 2,
    DontNeed = 3 ///< The pages of the range may go; they go only if they were flushed.
};

/// A time that setTimes leaves as it is.
constexpr i64 c_keepTime = INT64_MIN;

struct FolderEntry
{
    std::string name;               ///< As the file system spells it; never "." or "..".
    FileKind kind = FileKind::None; ///< The entry's own kind: links are not followed.
};

/// The calls. A test's table is a copy of the default one with some entries replaced.
struct FileCalls
{
    /// Opens with the flags. The handle isn't inherited by child processes and opening never blocks.
    int (*open)(char const* path, OpenFlags const& flags, FileHandle& out);
    /// Closes; the handle is gone whatever is answered. Locks taken at opening end here.
    int (*close)(FileHandle handle);

    /// Reads and writes at the handle's position, or at @p offset without moving it. They go on until all is moved, the
    /// file ends or an error comes.
    IoResult (*read)(FileHandle handle, void* data, u64 size);
    IoResult (*write)(FileHandle handle, void const* data, u64 size);
    IoResult (*readAt)(FileHandle handle, void* data, u64 size, u64 offset);
    IoResult (*writeAt)(FileHandle handle, void const* data, u64 size, u64 offset);

    /// Moves the position and gives the new one, from the start. A target below 0 gives EINVAL.
    int (*seek)(FileHandle handle, i64 offset, SeekFrom from, u64& position);
    int (*getSize)(FileHandle handle, u64& size);
    /// Cuts, or grows with zeros. The position stays.
    int (*setSize)(FileHandle handle, u64 size);
    /// Brings what was written to the device. After a failure the state of the written data is unknown: a second call
    /// that succeeds proves nothing.
    int (*flush)(FileHandle handle, FlushKind kind);

    int (*statHandle)(FileHandle handle, FileInfo& info);
    /// Follows links unless told not to. ENOENT and a kind of None if nothing is there.
    int (*stat)(char const* path, bool followLinks, FileInfo& info);
    /// 0 if the process may do that with the path.
    int (*access)(char const* path, Access access);

    /// Replaces what stands at @p to, atomically. EXDEV between volumes.
    int (*rename)(char const* from, char const* to);
    /// Removes a file or a link, not a folder.
    int (*unlink)(char const* path);
    int (*makeFolder)(char const* path);
    int (*removeFolder)(char const* path);
    /// Target of a link, as it is written.
    int (*readLink)(char const* path, std::string& target);
    /// Makes a symbolic link with @p target as its text. EEXIST if anything stands at @p path.
    int (*makeLink)(char const* target, char const* path);
    /// The entries of a folder, in the file system's order, without "." and "..". Throws std::bad_alloc.
    int (*listFolder)(char const* path, std::vector<FolderEntry>& entries);
    /// Brings the names in a folder to the device: what was made, renamed or removed there lasts. Where that can't be
    /// done, because the file system can't or because the process may not read the folder, the answer is 0 as well.
    int (*flushFolder)(char const* path);

    /// Nanoseconds since 1970-01-01 UTC; c_keepTime leaves one as it is.
    int (*setTimes)(char const* path, i64 accessTime, i64 modifyTime);
    int (*setTimesHandle)(FileHandle handle, i64 accessTime, i64 modifyTime);
    int (*setMode)(char const* path, u32 mode);
    int (*setModeHandle)(FileHandle handle, u32 mode);

    /// Extended attributes in the `user.` namespace; @p name comes without that prefix. ENODATA if it isn't there,
    /// EOPNOTSUPP where the file system has none.
    int (*getAttribute)(char const* path, char const* name, std::string& value);
    int (*setAttribute)(char const* path, char const* name, void const* data, u64 size);
    int (*removeAttribute)(char const* path, char const* name);

    /// Hints. A failure changes nothing but speed. A length of 0 means to the end.
    int (*advise)(FileHandle handle, u64 offset, u64 length, ReadAdvice advice);
    /// Starts writing a range back to the device without waiting. No promise of durability.
    int (*startWriteBack)(FileHandle handle, u64 offset, u64 length);
    /// Sets room aside on the device, the size unchanged.
    int (*reserve)(FileHandle handle, u64 offset, u64 length);
};

/// The table in use.
KERNEL_API FileCalls const& GetFileCalls();

/// Puts another table in place; null puts back the operating system's. Borrowed until it is replaced. For tests, while
/// no other thread works with files.
KERNEL_API void SetFileCalls(FileCalls const* calls);

/// The operating system's own table, for a replacement to pass calls on to.
KERNEL_API FileCalls const& GetSystemFileCalls();

/// Places of this process and user; empty if they can't be had. Not part of the table.
KERNEL_API std::string GetCurrentFolder();
KERNEL_API std::string GetHomeFolder();
KERNEL_API std::string GetExecutablePath();
/// TMPDIR if it is set, else /tmp.
KERNEL_API std::string GetTemporaryFolder();

/// The folder part of a path, "." if it has none; what flushFolder wants after a change to @p path.
KERNEL_API std::string GetFolderOf(char const* path);

} // namespace Kernel::Platform

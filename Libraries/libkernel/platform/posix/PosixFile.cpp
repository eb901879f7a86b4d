#include "libkernel/platform/PlatformFile.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

namespace Kernel::Platform {
namespace {

constexpr i64 c_nsPerSecond = 1'000'000'000;

int Result(long answer)
{
    return answer < 0 ? errno : 0;
}

// Share modes are open-file-description locks on two bytes that lie far beyond any data. They belong to the open file,
// so they hold between two handles of one process too, and end with the handle whatever ends it. Three kinds of opener
// are told apart:
//
//   kind                        holds          must find nobody holding
//   writes, denies nothing      A shared       B
//   reads, denies writing       B shared       A
//   writes and denies writing   A and B alone
//
// The first two take their own byte before they look at the other, so of two openers that race at least one sees the
// other.
constexpr off_t c_writersByte = off_t{1} << 62;
constexpr off_t c_deniersByte = c_writersByte + 1;

struct ::flock RangeLock(short type, off_t start, off_t length)
{
    struct ::flock lock = {};
    lock.l_type = type;
    lock.l_whence = SEEK_SET;
    lock.l_start = start;
    lock.l_len = length;
    return lock;
}

// A file system without such locks denies nothing.
bool LocksAreMissing(int error)
{
    return error == EINVAL || error == ENOLCK || error == ENOSYS || error == EOPNOTSUPP || error == ENOTTY;
}

int TakeShareByte(int fd, short type, off_t start, off_t length)
{
    struct ::flock lock = RangeLock(type, start, length);
    while (::fcntl(fd, F_OFD_SETLK, &lock) < 0) {
        if (errno == EINTR) continue;
        return LocksAreMissing(errno) ? 0 : EACCES;
    }
    return 0;
}

int FindNobodyOn(int fd, off_t byte)
{
    struct ::flock lock = RangeLock(F_WRLCK, byte, 1);
    if (::fcntl(fd, F_OFD_GETLK, &lock) < 0) return LocksAreMissing(errno) ? 0 : EACCES;
    return lock.l_type == F_UNLCK ? 0 : EACCES;
}

int TakeShareMode(int fd, bool fdReads, bool write, bool deny)
{
    if (write && deny) return TakeShareByte(fd, F_WRLCK, c_writersByte, 2);
    if (!write && !deny) return 0;
    off_t const own = write ? c_writersByte : c_deniersByte;
    off_t const other = write ? c_deniersByte : c_writersByte;
    if (fdReads) {
        if (int const error = TakeShareByte(fd, F_RDLCK, own, 1)) return error;
    } else {
        // A shared lock wants a readable descriptor, and this user can't have one: all that is left is to look.
        struct ::flock lock = RangeLock(F_RDLCK, own, 1);
        if (::fcntl(fd, F_OFD_GETLK, &lock) == 0 && lock.l_type != F_UNLCK) return EACCES;
    }
    return FindNobodyOn(fd, other);
}

i64 ToNanoseconds(timespec const& t)
{
    return static_cast<i64>(t.tv_sec) * c_nsPerSecond + t.tv_nsec;
}

timespec ToTimespec(i64 ns)
{
    if (ns == c_keepTime) return {0, UTIME_OMIT};
    i64 seconds = ns / c_nsPerSecond;
    i64 rest = ns % c_nsPerSecond;
    if (rest < 0) {
        rest += c_nsPerSecond;
        --seconds;
    }
    return {static_cast<time_t>(seconds), static_cast<long>(rest)};
}

FileKind KindOf(mode_t mode)
{
    if (S_ISREG(mode)) return FileKind::File;
    if (S_ISDIR(mode)) return FileKind::Folder;
    return S_ISLNK(mode) ? FileKind::Link : FileKind::Other;
}

void Fill(struct ::stat const& s, FileInfo& info)
{
    info.kind = KindOf(s.st_mode);
    info.size = static_cast<u64>(s.st_size);
    info.allocated = static_cast<u64>(s.st_blocks) * 512;
    info.device = s.st_dev;
    info.inode = s.st_ino;
    info.mode = s.st_mode & 07777;
    info.accessTime = ToNanoseconds(s.st_atim);
    info.modifyTime = ToNanoseconds(s.st_mtim);
    info.changeTime = ToNanoseconds(s.st_ctim);
}

int OpenDescriptor(char const* path, int mode, int& fd)
{
    do {
        fd = ::open(path, mode, 0666);
    } while (fd < 0 && errno == EINTR);
    return Result(fd);
}

int RefuseOddKinds(int fd, OpenFlags const& flags, bool& regular)
{
    struct ::stat s;
    if (::fstat(fd, &s) < 0) return errno;
    regular = S_ISREG(s.st_mode);
    if (S_ISDIR(s.st_mode)) return EISDIR;
    return regular || flags.anyKind ? 0 : ENXIO;
}

// What follows the opening: the kind, the share mode, and only then the emptying.
int PrepareOpened(int fd, bool fdReads, OpenFlags const& flags)
{
    bool regular = false;
    if (int const error = RefuseOddKinds(fd, flags, regular)) return error;
    if (!regular) return Result(::fcntl(fd, F_SETFL, ::fcntl(fd, F_GETFL) & ~O_NONBLOCK));
    if (int const error = TakeShareMode(fd, fdReads, flags.write, flags.share == FileShare::DenyWrite)) return error;
    return flags.truncate && flags.write ? Result(::ftruncate(fd, 0)) : 0;
}

int Open(char const* path, OpenFlags const& flags, FileHandle& out)
{
    out = c_noHandle;
    if (!path || !(flags.read || flags.write)) return EINVAL;
    // Non-blocking, so that a pipe without a partner answers at once; on regular files it means nothing.
    int mode = O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
    if (flags.create) mode |= O_CREAT;
    if (flags.create && flags.exclusive) mode |= O_EXCL;
    if (flags.append) mode |= O_APPEND;
    if (flags.noFollow) mode |= O_NOFOLLOW;
    if (flags.direct) mode |= O_DIRECT;

    // A write-only opener gets a readable descriptor where it may, because a shared lock wants one.
    bool fdReads = flags.read || !flags.anyKind;
    int fd = c_noHandle;
    int error = OpenDescriptor(path, mode | (!flags.write ? O_RDONLY : fdReads ? O_RDWR : O_WRONLY), fd);
    if (error == EACCES && fdReads && !flags.read) {
        fdReads = false;
        error = OpenDescriptor(path, mode | O_WRONLY, fd);
    }
    if (error) return error;
    if ((error = PrepareOpened(fd, fdReads, flags)) != 0) {
        ::close(fd);
        return error;
    }
    out = fd;
    return 0;
}

// Never repeated: after EINTR the descriptor is gone already, and its number may be another thread's.
int Close(FileHandle handle)
{
    if (::close(handle) == 0 || errno == EINTR) return 0;
    return errno;
}

constexpr u64 c_mostPerCall = 1u << 30;

template <class Step>
IoResult MoveAll(u64 size, bool zeroIsEnd, Step&& step)
{
    IoResult result;
    while (result.count < size) {
        ssize_t const n = step(result.count, std::min(size - result.count, c_mostPerCall));
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) result.error = errno;
        if (n == 0 && !zeroIsEnd) result.error = EIO; // Nothing taken and no reason given: don't ask for ever.
        if (n <= 0) break;
        result.count += static_cast<u64>(n);
    }
    return result;
}

bool OffsetFits(u64 offset, u64 size)
{
    return offset <= INT64_MAX && size <= INT64_MAX - offset;
}

IoResult Read(FileHandle handle, void* data, u64 size)
{
    return MoveAll(size, true, [&](u64 at, u64 n) { return ::read(handle, static_cast<char*>(data) + at, n); });
}

IoResult Write(FileHandle handle, void const* data, u64 size)
{
    return MoveAll(size, false, [&](u64 at, u64 n) { return ::write(handle, static_cast<char const*>(data) + at, n); });
}

IoResult ReadAt(FileHandle handle, void* data, u64 size, u64 offset)
{
    if (offset > INT64_MAX) return {0, EINVAL};
    size = std::min(size, static_cast<u64>(INT64_MAX) - offset); // No file reaches further.
    return MoveAll(size, true, [&](u64 at, u64 n) {
        return ::pread(handle, static_cast<char*>(data) + at, n, static_cast<off_t>(offset + at));
    });
}

IoResult WriteAt(FileHandle handle, void const* data, u64 size, u64 offset)
{
    if (!OffsetFits(offset, size)) return {0, EFBIG};
    return MoveAll(size, false, [&](u64 at, u64 n) {
        return ::pwrite(handle, static_cast<char const*>(data) + at, n, static_cast<off_t>(offset + at));
    });
}

int Seek(FileHandle handle, i64 offset, SeekFrom from, u64& position)
{
    static constexpr int c_whence[] = {SEEK_SET, SEEK_CUR, SEEK_END};
    off_t const at = ::lseek(handle, offset, c_whence[static_cast<u8>(from)]);
    if (at < 0) return errno;
    position = static_cast<u64>(at);
    return 0;
}

int GetSize(FileHandle handle, u64& size)
{
    struct ::stat s;
    if (::fstat(handle, &s) < 0) return errno;
    size = static_cast<u64>(s.st_size);
    return 0;
}

int SetSize(FileHandle handle, u64 size)
{
    if (size > INT64_MAX) return EFBIG;
    int answer = 0;
    do {
        answer = ::ftruncate(handle, static_cast<off_t>(size));
    } while (answer < 0 && errno == EINTR);
    return Result(answer);
}

int Flush(FileHandle handle, FlushKind kind)
{
    int answer = 0;
    do {
        answer = kind == FlushKind::Data ? ::fdatasync(handle) : ::fsync(handle);
    } while (answer < 0 && errno == EINTR);
    return Result(answer);
}

int StatHandle(FileHandle handle, FileInfo& info)
{
    info = {};
    struct ::stat s;
    if (::fstat(handle, &s) < 0) return errno;
    Fill(s, info);
    return 0;
}

int Stat(char const* path, bool followLinks, FileInfo& info)
{
    info = {};
    if (!path) return EINVAL;
    struct ::stat s;
    if (::fstatat(AT_FDCWD, path, &s, followLinks ? 0 : AT_SYMLINK_NOFOLLOW) < 0) return errno;
    Fill(s, info);
    return 0;
}

int AccessPath(char const* path, Access access)
{
    static constexpr int c_modes[] = {F_OK, R_OK, W_OK};
    return path ? Result(::faccessat(AT_FDCWD, path, c_modes[static_cast<u8>(access)], AT_EACCESS)) : EINVAL;
}

int Rename(char const* from, char const* to)
{
    return from && to ? Result(::rename(from, to)) : EINVAL;
}

int Unlink(char const* path)
{
    return path ? Result(::unlink(path)) : EINVAL;
}

int MakeFolder(char const* path)
{
    return path ? Result(::mkdir(path, 0777)) : EINVAL;
}

int RemoveFolder(char const* path)
{
    return path ? Result(::rmdir(path)) : EINVAL;
}

int ReadLink(char const* path, std::string& target)
{
    target.clear();
    if (!path) return EINVAL;
    char text[PATH_MAX];
    ssize_t const n = ::readlink(path, text, sizeof text);
    if (n < 0) return errno;
    if (n == sizeof text) return ENAMETOOLONG;
    target.assign(text, static_cast<size_t>(n));
    return 0;
}

int MakeLink(char const* target, char const* path)
{
    return target && path ? Result(::symlink(target, path)) : EINVAL;
}

FileKind KindOfEntry(DIR* folder, dirent const& entry)
{
    switch (entry.d_type) {
    case DT_REG: return FileKind::File;
    case DT_DIR: return FileKind::Folder;
    case DT_LNK: return FileKind::Link;
    case DT_UNKNOWN: break;
    default: return FileKind::Other;
    }
    struct ::stat s;
    if (::fstatat(::dirfd(folder), entry.d_name, &s, AT_SYMLINK_NOFOLLOW) < 0) return FileKind::Other;
    return KindOf(s.st_mode);
}

struct FolderCloser
{
    void operator()(DIR* folder) const { ::closedir(folder); }
};

int ListFolder(char const* path, std::vector<FolderEntry>& entries)
{
    entries.clear();
    if (!path) return EINVAL;
    std::unique_ptr<DIR, FolderCloser> const folder(::opendir(path));
    if (!folder && errno == ENOMEM)
        throw std::bad_alloc(); // As the list of entries would: a folder is not empty for it.
    if (!folder) return errno;
    for (;;) {
        errno = 0;
        dirent const* const entry = ::readdir(folder.get());
        if (!entry) return errno;
        char const* const name = entry->d_name;
        if (std::strcmp(name, ".") == 0 || std::strcmp(name, "..") == 0) continue;
        entries.push_back({name, KindOfEntry(folder.get(), *entry)});
    }
}

int FlushFolder(char const* path)
{
    if (!path) return EINVAL;
    int fd = c_noHandle;
    if (int const error = OpenDescriptor(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC, fd)) {
        return error == EACCES ? 0 : error; // A folder that may be written in but not read can't be flushed by anyone.
    }
    int error = Flush(fd, FlushKind::Full);
    if (error == EINVAL || error == ENOTSUP || error == ENOSYS || error == EROFS) error = 0;
    ::close(fd);
    return error;
}

int SetTimes(char const* path, i64 accessTime, i64 modifyTime)
{
    timespec const times[2] = {ToTimespec(accessTime), ToTimespec(modifyTime)};
    return path ? Result(::utimensat(AT_FDCWD, path, times, 0)) : EINVAL;
}

int SetTimesHandle(FileHandle handle, i64 accessTime, i64 modifyTime)
{
    timespec const times[2] = {ToTimespec(accessTime), ToTimespec(modifyTime)};
    return Result(::futimens(handle, times));
}

int SetMode(char const* path, u32 mode)
{
    return path ? Result(::chmod(path, mode & 07777)) : EINVAL;
}

int SetModeHandle(FileHandle handle, u32 mode)
{
    return Result(::fchmod(handle, mode & 07777));
}

std::string AttributeName(char const* name)
{
    return std::string("user.") + name;
}

int GetAttribute(char const* path, char const* name, std::string& value)
{
    value.clear();
    if (!path || !name) return EINVAL;
    std::string const full = AttributeName(name);
    for (int attempt = 0; attempt < 16; ++attempt) {
        ssize_t const size = ::getxattr(path, full.c_str(), nullptr, 0);
        if (size < 0) return errno;
        value.resize(static_cast<size_t>(size));
        ssize_t const got = ::getxattr(path, full.c_str(), value.data(), value.size());
        if (got < 0 && errno == ERANGE) continue; // Grew in between.
        if (got < 0) return errno;
        value.resize(static_cast<size_t>(got));
        return 0;
    }
    return EAGAIN;
}

int SetAttribute(char const* path, char const* name, void const* data, u64 size)
{
    return path && name ? Result(::setxattr(path, AttributeName(name).c_str(), data, size, 0)) : EINVAL;
}

int RemoveAttribute(char const* path, char const* name)
{
    return path && name ? Result(::removexattr(path, AttributeName(name).c_str())) : EINVAL;
}

int Advise(FileHandle handle, u64 offset, u64 length, ReadAdvice advice)
{
    static constexpr int c_advice[] = {POSIX_FADV_NORMAL, POSIX_FADV_SEQUENTIAL, POSIX_FADV_RANDOM,
                                       POSIX_FADV_DONTNEED};
    if (!OffsetFits(offset, length)) return EINVAL;
    return ::posix_fadvise(handle, static_cast<off_t>(offset), static_cast<off_t>(length),
                           c_advice[static_cast<u8>(advice)]);
}

int StartWriteBack(FileHandle handle, u64 offset, u64 length)
{
    if (!OffsetFits(offset, length)) return EINVAL;
    return Result(
        ::sync_file_range(handle, static_cast<off_t>(offset), static_cast<off_t>(length), SYNC_FILE_RANGE_WRITE));
}

int Reserve(FileHandle handle, u64 offset, u64 length)
{
    if (!OffsetFits(offset, length)) return EFBIG;
    int answer = 0;
    do {
        answer = ::fallocate(handle, FALLOC_FL_KEEP_SIZE, static_cast<off_t>(offset), static_cast<off_t>(length));
    } while (answer < 0 && errno == EINTR);
    return Result(answer);
}

constexpr FileCalls c_systemCalls = {
    .open = Open,
    .close = Close,
    .read = Read,
    .write = Write,
    .readAt = ReadAt,
    .writeAt = WriteAt,
    .seek = Seek,
    .getSize = GetSize,
    .setSize = SetSize,
    .flush = Flush,
    .statHandle = StatHandle,
    .stat = Stat,
    .access = AccessPath,
    .rename = Rename,
    .unlink = Unlink,
    .makeFolder = MakeFolder,
    .removeFolder = RemoveFolder,
    .readLink = ReadLink,
    .makeLink = MakeLink,
    .listFolder = ListFolder,
    .flushFolder = FlushFolder,
    .setTimes = SetTimes,
    .setTimesHandle = SetTimesHandle,
    .setMode = SetMode,
    .setModeHandle = SetModeHandle,
    .getAttribute = GetAttribute,
    .setAttribute = SetAttribute,
    .removeAttribute = RemoveAttribute,
    .advise = Advise,
    .startWriteBack = StartWriteBack,
    .reserve = Reserve,
};

constinit std::atomic<FileCalls const*> s_calls{&c_systemCalls};

} // namespace

FileCalls const& GetFileCalls()
{
    return *s_calls.load(std::memory_order_acquire);
}

void SetFileCalls(FileCalls const* calls)
{
    s_calls.store(calls ? calls : &c_systemCalls, std::memory_order_release);
}

FileCalls const& GetSystemFileCalls()
{
    return c_systemCalls;
}

} // namespace Kernel::Platform

#include "libkernel/filesystem/FileSystem.h"

#include "libkernel/concurrency/TimeStamp.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/Limits.h"
#include "libkernel/filesystem/FileEnumerator.h"
#include "libkernel/filesystem/Path.h"
#include "libkernel/filesystem/internal/SystemFiles.h"
#include "libkernel/platform/Errors.h"
#include "libkernel/platform/FileMarks.h"
#include "libkernel/streams/File.h"

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <memory>
#include <new>

// Questions about files, their attributes and times, and the comparison of contents.

namespace Kernel {

using FileDetail::ToSystem;
using Platform::FileInfo;
using Platform::FileKind;
using Platform::GetFileCalls;

namespace {

constexpr i64 c_nanosecondsPerSecond = 1'000'000'000;

bool GetInfo(String8 const& path, FileInfo& info)
{
    return GetFileCalls().stat(ToSystem(path), true, info) == 0;
}

/// Whole seconds, rounded down also before 1970.
TimeStamp ToTimeStamp(i64 nanoseconds)
{
    i64 const seconds = nanoseconds / c_nanosecondsPerSecond;
    return TimeStamp(nanoseconds % c_nanosecondsPerSecond < 0 ? seconds - 1 : seconds);
}

bool GetTime(String8 const& path, i64 FileInfo::*field, TimeStamp& time)
{
    FileInfo info;
    if (!GetInfo(path, info)) return false;
    time = ToTimeStamp(info.*field);
    return true;
}

bool GetCivilTime(String8 const& path, i64 FileInfo::*field, std::tm& time, bool utc)
{
    TimeStamp stamp;
    if (!GetTime(path, field, stamp)) return false;
    time = stamp.GetAsStructTm(utc ? TimeStampLocale::Utc : TimeStampLocale::Local);
    return true;
}

bool ToNanoseconds(TimeStamp time, i64& nanoseconds)
{
    return !__builtin_mul_overflow(time.GetValue(), c_nanosecondsPerSecond, &nanoseconds);
}

bool ReadExactly(Platform::FileHandle file, void* data, u64 size)
{
    auto const result = GetFileCalls().read(file, data, size);
    return result.error == 0 && result.count == size;
}

bool OpenWithSize(FileDetail::OpenFile& file, String8 const& path, u64& size)
{
    if (file.Open(path, {.read = true}) != 0) return false;
    if (GetFileCalls().getSize(file.Get(), size) != 0) return false;
    GetFileCalls().advise(file.Get(), 0, 0, Platform::ReadAdvice::Sequential);
    return true;
}

std::unique_ptr<u8[]> MakeBuffer(u64 size)
{
    return std::unique_ptr<u8[]>(new (std::nothrow) u8[std::max<u64>(size, 1)]);
}

} // namespace

bool FileSystem::Exists(String8 const& path)
{
    FileInfo info;
    return GetInfo(path, info);
}

FileSystem::PathResult FileSystem::TestPath(String8 const& path)
{
    FileInfo info;
    if (!GetInfo(path, info)) return PathResult::Nothing;
    return info.kind == FileKind::Folder ? PathResult::Directory : PathResult::File;
}

bool FileSystem::IsFile(String8 const& path)
{
    return TestPath(path) == PathResult::File;
}

bool FileSystem::IsDirectory(String8 const& path)
{
    return TestPath(path) == PathResult::Directory;
}

bool FileSystem::IsDirectoryEmpty(String8 const& path)
{
    auto const entries = FileEnumerator::Create(path, false);
    return entries && entries->GetPaths().empty();
}

i64 FileSystem::GetFileSize(String8 const& path)
{
    FileInfo info;
    return GetInfo(path, info) && info.kind == FileKind::File ? static_cast<i64>(info.size) : -1;
}

String8 FileSystem::GetFilename(String8 const& path)
{
    String8 const last = FileDetail::GetLastPart(path);
    if (last.IsEmpty() || last == "." || last == ".." || !Exists(path)) return last;
    auto const folder = Platform::GetFolderOf(path.GetData());
    auto const siblings = FileEnumerator::Create(String8{std::string_view(folder)}, false);
    if (!siblings) return last;
    // A folder that ignores case may spell the name otherwise than the path did.
    std::string const folded = FileDetail::FoldName(last);
    String8 spelling = last;
    for (FileEnumerator::PathRec const& sibling : siblings->GetPaths()) {
        if (sibling.path == last) return last;
        if (FileDetail::FoldName(sibling.path) == folded) spelling = sibling.path;
    }
    return spelling;
}

bool FileSystem::FileIsReadOnly(String8 const& path)
{
    static constexpr u32 c_anyWrite = 0222;
    FileInfo info;
    return GetInfo(path, info) && (info.mode & c_anyWrite) == 0;
}

bool FileSystem::HasReadAccess(String8 const& path)
{
    FileDetail::OpenFile file;
    return file.Open(path, {.read = true}) == 0;
}

bool FileSystem::HasPermissionError(String8 const& path)
{
    FileDetail::OpenFile file;
    int const error = file.Open(path, {.read = true});
    return error != 0 && File::TranslateOpenError(error, path.GetData()) == File::OpenUnmanagedResult::NotPermitted;
}

bool FileSystem::IsSameFile(String8 const& a, String8 const& b)
{
    if (a == b) return true;
    FileInfo infoA, infoB;
    int error = GetFileCalls().stat(ToSystem(a), true, infoA);
    if (error == 0) error = GetFileCalls().stat(ToSystem(b), true, infoB);
    if (error != 0)
        throw std::filesystem::filesystem_error("equivalent", a.GetData(), b.GetData(),
                                                std::error_code(error, std::generic_category()));
    return infoA.device == infoB.device && infoA.inode == infoB.inode;
}

std::pair<bool, bool> FileSystem::GetFileHidden(String8 const& path)
{
    std::string value;
    int const error = GetFileCalls().getAttribute(ToSystem(path), Platform::c_hiddenAttribute, value);
    return {error == 0 || error == ENODATA, error == 0};
}

bool FileSystem::SetFileHidden(String8 const& path, bool hidden)
{
    auto const& calls = GetFileCalls();
    if (hidden) return calls.setAttribute(ToSystem(path), Platform::c_hiddenAttribute, "1", 1) == 0;
    int const error = calls.removeAttribute(ToSystem(path), Platform::c_hiddenAttribute);
    return error == 0 || error == ENODATA;
}

std::pair<bool, bool> FileSystem::GetDropBoxIgnore(String8 const& path)
{
    std::string value;
    if (GetFileCalls().getAttribute(ToSystem(path), Platform::c_syncIgnoreAttribute, value) != 0) return {false, false};
    return {true, value.size() < 4 || LoadLittleEndian<u32>(value.data()) != 0};
}

bool FileSystem::SetDropBoxIgnore(String8 const& path, bool ignore)
{
    auto const& calls = GetFileCalls();
    if (ignore) {
        u8 value[4];
        StoreLittleEndian<u32>(value, 1);
        return calls.setAttribute(ToSystem(path), Platform::c_syncIgnoreAttribute, value, sizeof value) == 0;
    }
    int const error = calls.removeAttribute(ToSystem(path), Platform::c_syncIgnoreAttribute);
    return error == 0 || error == ENODATA;
}

bool FileSystem::GetAccessTime(String8 const& path, TimeStamp& time)
{
    return GetTime(path, &FileInfo::accessTime, time);
}

bool FileSystem::GetModifiedTime(String8 const& path, TimeStamp& time)
{
    return GetTime(path, &FileInfo::modifyTime, time);
}

bool FileSystem::GetAccessTime(String8 const& path, std::tm& time, bool utc)
{
    return GetCivilTime(path, &FileInfo::accessTime, time, utc);
}

bool FileSystem::GetModifiedTime(String8 const& path, std::tm& time, bool utc)
{
    return GetCivilTime(path, &FileInfo::modifyTime, time, utc);
}

bool FileSystem::SetAccessTime(String8 const& path, TimeStamp time)
{
    i64 nanoseconds = 0;
    return ToNanoseconds(time, nanoseconds) &&
           GetFileCalls().setTimes(ToSystem(path), nanoseconds, Platform::c_keepTime) == 0;
}

bool FileSystem::SetModifiedTime(String8 const& path, TimeStamp time)
{
    i64 nanoseconds = 0;
    return ToNanoseconds(time, nanoseconds) &&
           GetFileCalls().setTimes(ToSystem(path), Platform::c_keepTime, nanoseconds) == 0;
}

bool FileSystem::CopyFileAttributes(String8 const& from, String8 const& to)
{
    FileInfo info;
    if (!GetInfo(from, info)) return false;
    if (GetFileCalls().setMode(ToSystem(to), info.mode & FileDetail::c_permissions) != 0) return false;
    auto const [couldAsk, hidden] = GetFileHidden(from);
    if (couldAsk) SetFileHidden(to, hidden);
    return true;
}

bool FileSystem::CopyFileAttributes(int fromDescriptor, int toDescriptor)
{
    if (fromDescriptor < 0 || toDescriptor < 0) return false;
    FileInfo info;
    if (GetFileCalls().statHandle(fromDescriptor, info) != 0) return false;
    if (GetFileCalls().setModeHandle(toDescriptor, info.mode & FileDetail::c_permissions) != 0) return false;
    // Attributes are asked by path only, and this is the path of an open file.
    auto const [couldAsk, hidden] = GetFileHidden(Format("/dev/fd/%1", fromDescriptor));
    if (couldAsk) SetFileHidden(Format("/dev/fd/%1", toDescriptor), hidden);
    return true;
}

bool FileSystem::CompareFileWithMemory(String8 const& path, void const* data, u64 size)
{
    FileDetail::OpenFile file;
    u64 length = 0;
    if (!OpenWithSize(file, path, length) || length != size) return false;
    u64 const step = std::min(size, c_copyBufferSize);
    auto const buffer = MakeBuffer(step);
    if (!buffer) return false;
    for (u64 done = 0; done < size; done += step) {
        u64 const n = std::min(step, size - done);
        if (!ReadExactly(file.Get(), buffer.get(), n)) return false;
        if (std::memcmp(buffer.get(), static_cast<u8 const*>(data) + done, n) != 0) return false;
    }
    return true;
}

bool FileSystem::CompareFileWithFile(String8 const& a, String8 const& b)
{
    FileDetail::OpenFile fileA, fileB;
    u64 size = 0, sizeB = 0;
    if (!OpenWithSize(fileA, a, size) || !OpenWithSize(fileB, b, sizeB) || size != sizeB) return false;
    u64 const step = std::min(size, c_copyBufferSize);
    auto const bufferA = MakeBuffer(step), bufferB = MakeBuffer(step);
    if (!bufferA || !bufferB) return false;
    for (u64 done = 0; done < size; done += step) {
        u64 const n = std::min(step, size - done);
        if (!ReadExactly(fileA.Get(), bufferA.get(), n) || !ReadExactly(fileB.Get(), bufferB.get(), n)) return false;
        if (std::memcmp(bufferA.get(), bufferB.get(), n) != 0) return false;
    }
    return true;
}

} // namespace Kernel

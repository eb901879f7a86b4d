// Deleting, renaming, moving and copying.
//
// A move is a rename wherever the system can do one. Where it can't, the contents are copied to a temporary beside the
// target, which is flushed and then renamed over it, and only then does the source go: at every moment either the
// source or the target is whole, and the target is never a part of a file.

#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/Limits.h"
#include "libkernel/core/LogSink.h"
#include "libkernel/filesystem/FileEnumerator.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/Path.h"
#include "libkernel/filesystem/internal/SystemFiles.h"
#include "libkernel/platform/Errors.h"
#include "libkernel/platform/FileMarks.h"

#include <algorithm>
#include <atomic>
#include <memory>
#include <new>

namespace Kernel {

using FileDetail::Failure;
using FileDetail::GetFailure;
using FileDetail::OpenFile;
using FileDetail::ToSystem;
using Platform::FileInfo;
using Platform::FileKind;
using Platform::GetFileCalls;

namespace {

constexpr int c_logLevel = 1;
constexpr int c_maxLinks = 40;   // Links followed to the target of a copy.
constexpr int c_maxNames = 1000; // Names tried for a temporary beside the target.

bool MayPass(int error)
{
    Failure const failure = GetFailure(error);
    return failure == Failure::TooManyOpen || failure == Failure::AccessDenied;
}

bool MayPassOrIsInUse(int error)
{
    return MayPass(error) || GetFailure(error) == Failure::InUse;
}

/// Calls @p operation up to @p retries + 1 times, as long as it fails in a way that may pass. Gives its last error.
template <class Operation, class Passing>
int Try(int retries, Operation const& operation, Passing const& mayPass)
{
    for (int attempt = 0;; ++attempt) {
        int const error = operation();
        if (error == 0 || attempt >= retries || !mayPass(error)) return error;
        Dispatch::Sleep(FileSystem::c_retryPauseMs);
    }
}

int FlushFolderOf(String8 const& path)
{
    return GetFileCalls().flushFolder(Platform::GetFolderOf(path.GetData()).c_str());
}

/// Brings to the device that a file is now called @p to and no longer @p from.
int FlushNames(String8 const& from, String8 const& to)
{
    if (int const error = FlushFolderOf(to)) return error;
    bool const isSameFolder = Platform::GetFolderOf(from.GetData()) == Platform::GetFolderOf(to.GetData());
    return isSameFolder ? 0 : FlushFolderOf(from);
}

/// Brings the file's contents to the device, so that its new name never stands for bytes that a power cut takes. What
/// can't be opened for reading has been left to its writer.
int FlushContents(String8 const& path)
{
    OpenFile file;
    return file.Open(path, {.read = true}) == 0 ? GetFileCalls().flush(file.Get(), Platform::FlushKind::Data) : 0;
}

int CopyBytes(Platform::FileHandle from, Platform::FileHandle to, u64 size)
{
    u64 const step = std::clamp<u64>(size, 4096, c_copyBufferSize);
    std::unique_ptr<u8[]> const buffer(new (std::nothrow) u8[step]);
    if (!buffer) return ENOMEM;
    for (;;) {
        auto const in = GetFileCalls().read(from, buffer.get(), step);
        if (in.error != 0) return in.error;
        if (in.count == 0) return 0;
        auto const out = GetFileCalls().write(to, buffer.get(), in.count);
        if (out.error != 0) return out.error;
        if (out.count != in.count) return EIO;
    }
}

/// Permissions before the first byte, so that nobody reads what the source kept to itself; times after the last.
int CopyInto(Platform::FileHandle from, FileInfo const& info, Platform::FileHandle to)
{
    auto const& calls = GetFileCalls();
    calls.setModeHandle(to, info.mode & FileDetail::c_permissions);
    if (int const error = CopyBytes(from, to, info.size)) return error;
    calls.setTimesHandle(to, Platform::c_keepTime, info.modifyTime);
    return calls.flush(to, Platform::FlushKind::Full);
}

/// Marks are no part of the contents: a file system that can't hold them doesn't stop the copy.
void CopyMarks(String8 const& from, String8 const& to)
{
    for (char const* const name : {Platform::c_hiddenAttribute, Platform::c_syncIgnoreAttribute}) {
        std::string value;
        if (GetFileCalls().getAttribute(ToSystem(from), name, value) == 0)
            GetFileCalls().setAttribute(ToSystem(to), name, value.data(), value.size());
    }
}

/// Makes something new in the folder of @p target, by @p make, that will be renamed over it.
template <class Make>
int MakeBeside(String8 const& target, String8& path, Make const& make)
{
    static std::atomic<u32> s_count{0};
    String8 const folder{std::string_view(Platform::GetFolderOf(target.GetData()))};
    int error = EEXIST;
    for (int i = 0; i < c_maxNames && error == EEXIST; ++i) {
        path = FileDetail::AppendElement(folder, Format("~move%1", ++s_count));
        error = make(path);
    }
    return error;
}

/// Puts what was made beside @p to in its place, if all went well, and otherwise takes it away again.
int FinishBeside(String8 const& beside, String8 const& to, int error)
{
    if (error == 0) error = GetFileCalls().rename(ToSystem(beside), ToSystem(to));
    if (error != 0) GetFileCalls().unlink(ToSystem(beside));
    return error;
}

/// Copies @p from over @p to, which is old or new but never half written. Gives the system's error.
int CopyWhole(String8 const& from, String8 const& to)
{
    OpenFile source;
    FileInfo info;
    if (int const error = source.Open(from, {.read = true})) return error;
    if (int const error = GetFileCalls().statHandle(source.Get(), info)) return error;
    GetFileCalls().advise(source.Get(), 0, 0, Platform::ReadAdvice::Sequential);

    OpenFile out;
    String8 beside;
    if (int const error = MakeBeside(to, beside, [&](String8 const& path) {
            return out.Open(path, {.write = true, .create = true, .exclusive = true, .noFollow = true});
        }))
        return error;
    int error = CopyInto(source.Get(), info, out.Get());
    int const closeError = out.Close();
    if (error == 0) error = closeError;
    if (error == 0) CopyMarks(from, beside);
    return FinishBeside(beside, to, error);
}

/// The same for a symbolic link: the link is what moves, not what it leads to.
int CopyLink(String8 const& from, String8 const& to)
{
    std::string target;
    if (int const error = GetFileCalls().readLink(ToSystem(from), target)) return error;
    String8 beside;
    int const error = MakeBeside(
        to, beside, [&](String8 const& path) { return GetFileCalls().makeLink(target.c_str(), ToSystem(path)); });
    return error == 0 ? FinishBeside(beside, to, 0) : error;
}

/// What a move does where nothing can be renamed, up to the deletion of the source.
int CopyEntry(String8 const& from, String8 const& to)
{
    bool const isLink = FileDetail::GetKind(from, false) == FileKind::Link;
    int const error = isLink ? CopyLink(from, to) : CopyWhole(from, to);
    return error == 0 ? FlushFolderOf(to) : error;
}

FileSystem::SafeMoveFileResult ToMoveResult(int error)
{
    using Result = FileSystem::SafeMoveFileResult;
    Failure const failure = GetFailure(error);
    if (failure == Failure::AccessDenied) return Result::AccessDenied;
    return failure == Failure::DiskFull ? Result::DiskFull : Result::Failed;
}

} // namespace

bool FileSystem::Delete(String8 const& path, int retries)
{
    int const error = Try(
        retries, [&] { return GetFileCalls().unlink(ToSystem(path)); }, MayPass);
    return error == 0 || GetFailure(error) == Failure::NotFound;
}

bool FileSystem::DeleteFilesFromFolder(String8 const& path)
{
    auto const entries = FileEnumerator::Create(path, true);
    if (!entries) return false;
    for (FileEnumerator::PathRec const& entry : entries->GetPaths())
        if (entry.kind == FileEnumerator::Kind::File) Delete(entry.path, 0);
    return true;
}

bool FileSystem::RenameFile(String8 const& from, String8 const& to, int retries, bool* isRenamed)
{
    int const error = Try(
        retries, [&] { return FileDetail::RenameEntry(from, to); }, MayPassOrIsInUse);
    if (isRenamed) *isRenamed = error == 0;
    return error == 0 && FlushNames(from, to) == 0;
}

FileSystem::RenameFileForBackupResult FileSystem::RenameFileForBackup(String8 const& path, String8& out)
{
    for (u32 n = 1;; ++n) {
        String8 const candidate = Format("%1_backup%2", path, n);
        if (FileDetail::IsTaken(candidate)) continue;
        bool isMoved = false;
        SafeMoveFileResult const result = SafeMoveFileAdv(path, candidate, 0, &isMoved);
        if (isMoved) out = candidate;
        return result <= SafeMoveFileResult::DiskFull ? static_cast<RenameFileForBackupResult>(result)
                                                      : RenameFileForBackupResult::Failed;
    }
}

bool FileSystem::SafeMoveFile(String8 const& from, String8 const& to)
{
    return SafeMoveFileAdv(from, to, 0) == SafeMoveFileResult::Moved;
}

FileSystem::SafeMoveFileResult FileSystem::SafeMoveFileAdv(String8 const& from, String8 const& to, int retries,
                                                           bool* isMoved)
{
    bool unused;
    bool& moved = isMoved ? *isMoved : unused;
    moved = false;
    auto const logMoveError = [&](int error) {
        WriteToLog(c_logLevel, Format("SafeMoveFile error: MoveFileExW failed with code %1!\n\tOld: %2\n\tNew: %3",
                                      error, from, to));
    };
    // A flush that fails says that the source itself can't be trusted, so no copy of it may replace anything.
    if (int const error = FlushContents(from)) {
        logMoveError(error);
        return ToMoveResult(error);
    }
    int error = Try(
        retries, [&] { return FileDetail::RenameEntry(from, to); }, MayPass);
    moved = error == 0;
    if (moved) {
        error = FlushNames(from, to);
        if (error == 0) return SafeMoveFileResult::Moved;
        logMoveError(error); // The source has gone: there is nothing to copy.
        return ToMoveResult(error);
    }
    if (GetFailure(error) == Failure::NotFound && !FileDetail::IsTaken(from)) return SafeMoveFileResult::Failed;
    // Between volumes the copy is the ordinary way, and no failure of the rename.
    if (error != EXDEV) logMoveError(error);

    // A copy over one's own name would end with the deletion of the only one.
    FileDetail::Kinship const kinship = FileDetail::GetKinship(from, to);
    error = kinship == FileDetail::Kinship::Strangers ? CopyEntry(from, to) : 0;
    if (error != 0) {
        WriteToLog(c_logLevel, Format("SafeMoveFile error: CopyFileExW failed with code %1!\n\tOld: %2\n\tNew: %3",
                                      error, from, to));
        return ToMoveResult(error);
    }
    moved = true;
    if (kinship == FileDetail::Kinship::OneName) return SafeMoveFileResult::Moved;
    error = GetFileCalls().unlink(ToSystem(from));
    if (error != 0)
        WriteToLog(c_logLevel,
                   Format("SafeMoveFile warning: DeleteFileW failed with code %1!\n\tPath: %2", error, from));
    return SafeMoveFileResult::Moved;
}

bool FileSystem::CopyFile(String8 const& from, String8 const& to)
{
    return CopyFileAdv(from, to) == CopyFileResult::Copied;
}

FileSystem::CopyFileResult FileSystem::CopyFileAdv(String8 const& from, String8 const& to)
{
    // The copy goes over what a link leads to, as writing to the link would.
    String8 target = to;
    for (int i = 0; i < c_maxLinks && FileDetail::GetKind(target, false) == FileKind::Link; ++i)
        target = ResolveLink(target);

    FileInfo source, old;
    if (GetFileCalls().stat(ToSystem(from), true, source) != 0) return CopyFileResult::Failed;
    if (GetFileCalls().stat(ToSystem(target), false, old) == 0) {
        bool const isSame = source.device == old.device && source.inode == old.inode;
        if (isSame || old.kind != FileKind::File) return CopyFileResult::Failed;
    }
    return CopyWhole(from, target) == 0 ? CopyFileResult::Copied : CopyFileResult::Failed;
}

} // namespace Kernel

#include "libkernel/archive/internal/ArchiveStreamliner.h"
#include "libkernel/archive/internal/ArchiveVerifier.h"
#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/core/NumberText.h"
#include "libkernel/filesystem/FileSystem.h"

// The compact file is written beside the master and moved over it. The master goes to a backup name first and is
// deleted when the move is on the device, so at every moment one of the two names has the document.

namespace Kernel {

using Result = Archive::StreamlineResult;

namespace {

constexpr int c_moveRetries = 2;
constexpr int c_backupFailures = 30;
constexpr int c_notFound = 2;
constexpr int c_notPermitted = 6;
constexpr int c_readOnlyVolume = 11;

String8 NthName(String8 const& path, char const* suffix, int n)
{
    String8 name = path + suffix;
    if (n > 1) name += ToString(n);
    return name;
}

int TestName(String8 const& path)
{
    Kernel::File file;
    return static_cast<int>(file.OpenEx(path.GetData(), Kernel::File::AccessMode::Read));
}

} // namespace

String8 ArchiveImpl::FindBackupName(String8 const& path, int maxFailures)
{
    int failures = 0;
    for (int n = 1;; ++n) {
        String8 const candidate = NthName(path, "~backup", n);
        int const result = TestName(candidate);
        if (result == c_notFound) return candidate;
        if (result == c_readOnlyVolume) return String8();
        // Failures of every kind count, or a process without handles would search for ever.
        bool const opened = Kernel::File::IsOpened(static_cast<Kernel::File::OpenUnmanagedResult>(result));
        if (!opened && ++failures == maxFailures) return String8();
    }
}

Counted<FileInOutStream> ArchiveStreamliner::CreateStream(String8 const& path, bool mustBeNew)
{
    Kernel::File::OpenUnmanagedResult result{};
    return FileInOutStream::Create(path.GetData(), Kernel::File::ShareMode::DenyWrite, result, nullptr, mustBeNew);
}

std::pair<bool, Result> ArchiveStreamliner::StreamlineReplacement()
{
    if (m_request->marshalled && !m_request->marshalled->path.IsEmpty()) {
        Archive::MarshalledFileAccess const& marshalled = *m_request->marshalled;
        // To move the master to its own name, to that of its scratch file or to the new file's would lose one of them.
        if (IsOwnFile(marshalled.path) || IsOwnFile(marshalled.backupPath) ||
            IsSamePlace(marshalled.path, marshalled.backupPath))
            return {false, Archive::StreamlineFailed};
        m_newFile->m_stream = CreateStream(marshalled.path, false);
        if (!m_newFile->m_stream) return {false, Archive::StreamlineFailed};
        FileSystem::SetFileHidden(marshalled.path, true);
        return {true, StreamlineReplacementInner(marshalled.path, marshalled.backupPath, marshalled.keepBackup)};
    }
    constexpr int c_maxCandidates = 29;
    constexpr int c_maxFailures = 3;
    int failures = 0;
    for (int n = 1; n <= c_maxCandidates; ++n) {
        String8 const candidate = NthName(m_master->m_path, "~tmp", n);
        int const result = TestName(candidate);
        if (result == c_readOnlyVolume) break;
        bool const taken = Kernel::File::IsOpened(static_cast<Kernel::File::OpenUnmanagedResult>(result));
        if (taken || result == c_notPermitted) continue;
        if (result == c_notFound) {
            // Refuses what has come to stand there meanwhile, be it a link that leads nowhere.
            m_newFile->m_stream = CreateStream(candidate, true);
            if (m_newFile->m_stream) {
                FileSystem::SetFileHidden(candidate, true);
                return {true, StreamlineReplacementInner(candidate, String8(), true)};
            }
        }
        if (++failures == c_maxFailures) break;
    }
    return {false, Archive::StreamlineFailed};
}

Result ArchiveStreamliner::WriteCompactFile(String8 const& tempPath)
{
    ArchiveCompactWriter::Options options;
    options.copyThumbnails = true;
    options.midStreamline = true;
    options.abort = m_request->abort;
    options.progress = m_request->progress.Get();
    FileInOutStream& stream = *m_newFile->m_stream;
    Result result = Archive::StreamlineFailed;
    try {
        result = ArchiveCompactWriter::StreamlineToArchiveFileI(m_impl, *m_newFile, stream, options, m_data);
    } catch (...) {
        m_newFile->m_stream = nullptr;
        FileSystem::Delete(tempPath, 0);
        throw;
    }
    // What replaces a document is whole on the device, with its name, before anything happens to the document.
    if (result == Archive::StreamlineDone && !(FlushArchiveFile(stream) && FlushFolderOf(tempPath)))
        result = Archive::StreamlineNoAccess;
    if (result == Archive::StreamlineDone && m_request->verify &&
        ArchiveVerifier::VerifyStreamlinedFileState(m_impl, *m_newFile, tempPath, m_data, *m_request->report) !=
            Archive::VerifyMatch)
        result = Archive::StreamlineNotVerified;
    if (result == Archive::StreamlineDone && !ReleaseHolders(m_data)) result = Archive::StreamlineFailed;
    if (result == Archive::StreamlineDone) return result;
    m_newFile->m_stream = nullptr;
    FileSystem::Delete(tempPath, 0);
    return result;
}

/// Closes the master and gives it the backup name. False if it still stands where it stood.
bool ArchiveStreamliner::MoveAway(String8 const& backupPath)
{
    {
        CriticalSectionScope const lock(m_master->m_lock);
        m_master->m_stream = nullptr;
    }
    if (backupPath.IsEmpty()) return false;
    // A rename can be reported as failed after it was made, when its folder cannot be flushed.
    return FileSystem::RenameFile(m_master->m_path, backupPath, c_moveRetries) || !FileSystem::Exists(m_master->m_path);
}

Result ArchiveStreamliner::StreamlineReplacementInner(String8 const& tempPath, String8 backupPath, bool keepBackup)
{
    if (Result const result = WriteCompactFile(tempPath)) return result;
    String8 const path = m_master->m_path;
    bool hasBackup = false;
    int moved = 0;
    bool published = false;
    {
        // While the master is away nobody may try to open it.
        CriticalSectionScope const access(m_impl.m_accessLock);
        if (Counted<FileInOutStream> const stream = m_master->GetStream())
            m_newFile->m_stream->CopyFileAttributes(*stream);
        if (keepBackup && backupPath.IsEmpty()) backupPath = ArchiveImpl::FindBackupName(path, c_backupFailures);
        hasBackup = MoveAway(backupPath);
        if (hasBackup || !keepBackup) {
            m_newFile->m_stream = nullptr;
            // Without a backup the move itself replaces the master, in one step. Deleting it first would leave only
            // the temporary, which a failed move deletes.
            if (!hasBackup) FileSystem::CopyFileAttributes(path, tempPath);
            moved = static_cast<int>(FileSystem::SafeMoveFileAdv(tempPath, path, c_moveRetries));
            if (moved != 0) return SwapFailed(tempPath, backupPath, hasBackup, moved);
            FileSystem::SetFileHidden(path, false);
            if (hasBackup) {
                FileSystem::CopyFileAttributes(backupPath, path);
                FileSystem::Delete(backupPath, c_moveRetries);
            }
            Kernel::File::OpenUnmanagedResult result{};
            m_newFile->m_stream =
                FileInOutStream::Open(path.GetData(), Kernel::File::ShareMode::DenyWrite, result, nullptr);
            try {
                if (!m_newFile->m_stream) return SwapFailed(tempPath, String8(), false, 0);
                Publish(m_newFile, m_data, false);
            } catch (std::bad_alloc const&) {
                return SwapFailed(tempPath, String8(), false, 0);
            }
            published = true;
        } else {
            // The master must not be lost, and could not be moved away: its bytes are written over.
            constexpr int c_attempts = 3;
            for (int i = 0; i < c_attempts && !m_master->GetStream(); ++i) {
                if (i > 0) Dispatch::Sleep(FileSystem::c_retryPauseMs);
                Kernel::File::OpenUnmanagedResult result{};
                CriticalSectionScope const lock(m_master->m_lock);
                m_master->m_stream =
                    FileInOutStream::Open(path.GetData(), Kernel::File::ShareMode::DenyWrite, result, nullptr);
            }
            if (!m_master->GetStream()) {
                m_newFile->m_stream = nullptr;
                FileSystem::Delete(tempPath, 0);
                return Archive::StreamlineNoAccess;
            }
        }
    }
    if (!published) return OverwriteI(tempPath);
    m_impl.m_self.UpdateDelayLoadOwners(m_impl.m_revisions.back().Get());
    return Archive::StreamlineDone;
}

// The archive no longer fits what lies on the disk, whatever that is; but the document is not lost: a copy is deleted
// only when another one stands at the master's path or at the backup's.
Result ArchiveStreamliner::SwapFailed(String8 const& tempPath, String8 const& backupPath, bool hasBackup,
                                      int moveResult)
{
    constexpr int c_noRoom = 4;
    constexpr int c_noRights = 5;
    ClearTables();
    String8 const& path = m_master->m_path;
    if (!hasBackup) {
        if (FileSystem::Exists(path)) FileSystem::Delete(tempPath, c_moveRetries);
        return Archive::StreamlineNoAccess;
    }
    FileSystem::Delete(tempPath, c_moveRetries);
    if (FileSystem::RenameFile(backupPath, path, c_moveRetries)) {
        FileSystem::SetFileHidden(path, false);
        return Archive::StreamlineFailed;
    }
    FileSystem::SetFileHidden(backupPath, false);
    return moveResult == c_noRoom || moveResult == c_noRights ? Archive::StreamlineOverwriteFailed
                                                              : Archive::StreamlineNoAccess;
}

} // namespace Kernel

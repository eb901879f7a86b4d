#include "libkernel/archive/internal/ArchiveImpl.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/FileIOException.h"

#include <new>

namespace Kernel {

namespace {

constexpr int c_renameRetries = 2;
constexpr int c_backupFailures = 10;

ArchiveFileException::Reason ReasonOf(FileSystem::SafeMoveFileResult result)
{
    switch (static_cast<int>(result)) {
    case 1: return ArchiveFileException::Reason::AccessDenied;
    case 2: return ArchiveFileException::Reason::PermissionDenied;
    case 3: return ArchiveFileException::Reason::OutOfSpace;
    default: return ArchiveFileException::Reason::FileError;
    }
}

} // namespace

void ArchiveImpl::MoveTemporary(Archive::ArchiveFile& file)
{
    CriticalSectionScope const lock(file.m_lock);
    String8 const final = file.m_finalPath;
    file.m_targetStream = nullptr;
    file.m_stream = nullptr;

    String8 backup;
    if (!file.m_backupPath.IsEmpty())
        backup = file.m_backupPath;
    else if (file.m_keepBackup && FileSystem::Exists(final))
        backup = FindBackupName(final, c_backupFailures);
    // What lies where is what counts here, whether or not it is known to last.
    bool isBackup = false;
    // A backup under the name of one of the two files would take the other one's place.
    if (IsSamePlace(backup, final) || IsSamePlace(backup, file.m_path)) backup = String8();
    if (!backup.IsEmpty()) FileSystem::RenameFile(final, backup, c_renameRetries, &isBackup);
    if (!isBackup) backup = String8();

    bool isThere = false;
    FileSystem::SafeMoveFileResult const moved = FileSystem::SafeMoveFileAdv(file.m_path, final, 0, &isThere);
    if (!isThere) {
        if (!backup.IsEmpty()) FileSystem::RenameFile(backup, final, c_renameRetries);
        // The temporary holds the save and stays usable where it is.
        File::OpenUnmanagedResult result{};
        file.m_stream = FileInOutStream::Open(file.m_path.GetData(), File::ShareMode::DenyWrite, result, nullptr);
        ThrowFileException(file, ReasonOf(moved));
    }
    {
        CriticalSectionScope const state(m_stateLock);
        file.m_path = final;
        file.m_finalPath = String8();
    }
    // A save that is in place but may not last keeps the replaced file beside it.
    bool const isLasting = static_cast<int>(moved) == 0;
    if (!backup.IsEmpty() && isLasting) {
        FileSystem::Delete(backup, 0);
        Platform::GetFileCalls().flushFolder(Platform::GetFolderOf(backup.GetData()).c_str());
    }
    FileSystem::SetFileHidden(final, false);

    File::OpenUnmanagedResult result{};
    file.m_stream = FileInOutStream::Open(final.GetData(), File::ShareMode::DenyWrite, result, nullptr);
    if (!file.m_stream) ThrowFileException(file, ArchiveFileException::Reason::FileError);
    if (!isLasting) ThrowFileException(file, ReasonOf(moved));
}

} // namespace Kernel

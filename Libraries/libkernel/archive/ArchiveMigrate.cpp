#include "libkernel/archive/internal/ArchiveImpl.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/streams/FileIOException.h"

// An archive whose files go elsewhere: the scratch file moved by the host, the master replaced by a third party, the
// single file taken into a temporary place.

namespace Kernel {

using namespace ArchiveFormat;

bool ArchiveImpl::IsBusyCSSession() const
{
    CriticalSectionScope const lock(m_stateLock);
    return m_activeSession || m_runningStreamlines > 0;
}

Archive::MigrateResult Archive::MigratePrepare(String8 const& newPath)
{
    if (newPath.IsEmpty()) return MigrateEmptyPath;
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    if (!HasScratchFile()) return MigrateNoScratch;
    if (m->IsBusyCSSession()) return MigrateBusy;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        if (m->m_master && !m->m_master->m_finalPath.IsEmpty()) return MigrateTemporaryTarget;
    }
    m->WaitForOffliningToAbort();
    // Holders take what they need from the files while these are still here.
    PreDestruction();

    CriticalSectionScope const accessLock(m->m_accessLock);
    m->CloseFilesCS();
    Counted<ArchiveFile> scratch;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        scratch = m->m_scratch;
    }
    // Moved is moved, even if a power cut may take it back: under either name the file is whole.
    bool isMoved = false;
    (void)FileSystem::SafeMoveFileAdv(scratch->m_path, newPath, 0, &isMoved);
    if (!isMoved) {
        bool reopened = false;
        return m->OpenFileHandleCS(reopened, true, true) == RestoreOk ? MigrateMoveFailed : MigrateLost;
    }
    CriticalSectionScope const lock(m->m_stateLock);
    scratch->m_moved = true;
    if (m->m_master) m->m_master->m_moved = true;
    m->m_paths.clear();
    m->m_revisions.clear();
    m->m_revisionsByAddress.clear();
    m->m_pathCounts.clear();
    m->m_rewindCount = 0;
    return MigrateDone;
}

Archive::OpenResult Archive::MigrateRestore(String8 const& path)
{
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    if (m->IsBusyCSSession()) return OpenInUse;
    OpenMode mode = OpenModeReadWrite;
    bool hadMaster = false;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        // Only an archive that holds nothing can load it all again: revisions that are in use must not be replaced.
        if (!m->m_scratch || !m->m_scratch->m_moved) return OpenInUse;
        hadMaster = static_cast<bool>(m->m_master);
        if (hadMaster) mode = m->m_master->m_mode;
    }
    // After a failure the archive is moved away as before.
    OpenResult const result = m->InitArchive(path, mode, nullptr, nullptr, !hadMaster);
    if (result != OpenOk) return result;
    CriticalSectionScope const accessLock(m->m_accessLock);
    m->m_lastRestore = RestoreOk;
    return OpenOk;
}

Archive::ExternalUpdateResult Archive::ExternalUpdatePrepare()
{
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    Counted<ArchiveFile> master;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        master = m->m_master;
    }
    if (master && master->m_closedForUpdate) return ExternalUpdateAlreadyPrepared;
    if (m->IsBusyCSSession()) return ExternalUpdateBusy;
    if (!master || !master->m_finalPath.IsEmpty()) return ExternalUpdateNoMaster;
    m->WaitForOffliningToPause();
    CriticalSectionScope const accessLock(m->m_accessLock);
    CriticalSectionScope const lock(master->m_lock);
    master->m_stream = nullptr;
    master->m_closedForUpdate = true;
    return ExternalUpdateDone;
}

bool Archive::ReadyForExternalUpdate() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_master && m->m_master->m_closedForUpdate;
}

void Archive::ExternalUpdateChangePath(String8 const& path)
{
    CriticalSectionScope const accessLock(m->m_accessLock);
    CriticalSectionScope const lock(m->m_stateLock);
    if (m->m_master && m->m_master->m_closedForUpdate && !path.IsEmpty()) m->m_master->m_path = path;
}

bool Archive::ExternalUpdateRestore()
{
    {
        CriticalSectionScope const accessLock(m->m_accessLock);
        Counted<ArchiveFile> master;
        {
            CriticalSectionScope const lock(m->m_stateLock);
            master = m->m_master;
        }
        if (!master || !master->m_closedForUpdate) return false;
        master->m_closedForUpdate = false;
        bool reopened = false;
        if (m->OpenFileHandleCS(reopened, true, true) != RestoreOk) return false;
    }
    m->ResumeOffliningIfNoReader();
    return true;
}

bool Archive::ExternalUpdateRestore(String8 const& path)
{
    ExternalUpdateChangePath(path);
    return ExternalUpdateRestore();
}

bool Archive::ExternalUpdateRestoreToUnsaved()
{
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    if (m->IsBusyCSSession()) return false;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        if (!m->m_master || !m->m_master->m_closedForUpdate || !m->m_scratch) return false;
        m->m_master = nullptr;
    }
    m->ResumeOffliningIfNoReader();
    return true;
}

Archive::CaptureResult Archive::CaptureToThrowaway()
{
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    if (IsThrowAway()) return CaptureDone;
    if (HasScratchFile() || m->IsBusyCSSession()) return CaptureFailed;
    Counted<AccessBlock> const block = m->CreateExclusiveAccessBlock();
    if (!block) return CaptureNoAccess;
    String8 path;
    if (!TempFile::GenerateTempFilePath(path, String8("tmp"))) return CaptureFailed;

    CriticalSectionScope const accessLock(m->m_accessLock);
    m->CloseFilesCS();
    Counted<ArchiveFile> master;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        master = m->m_master;
    }
    bool moved = false;
    if (master) (void)FileSystem::SafeMoveFileAdv(master->m_path, path, 0, &moved);
    if (moved) {
        CriticalSectionScope const lock(m->m_stateLock);
        master->m_path = path;
        master->m_throwAway = true;
    }
    bool reopened = false;
    bool const open = m->OpenFileHandleCS(reopened, true, true) == RestoreOk;
    return moved && open ? CaptureDone : CaptureFailed;
}

} // namespace Kernel

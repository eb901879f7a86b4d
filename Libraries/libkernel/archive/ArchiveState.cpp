#include "libkernel/archive/internal/ArchiveReadGate.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/streams/FileIOException.h"

// Questions about an archive's files, and small changes to them.

namespace Kernel {

using namespace ArchiveFormat;

IDTag Archive::GetArchiveIDTag() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_archiveUID;
}

u64 Archive::GetArchiveRuntimeUID() const
{
    return m->m_runtimeUID;
}

String8 Archive::GetArchivePath() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    if (!m->m_master) return String8();
    // While a temporary stands in for it, the document's place is the target.
    return m->m_master->m_finalPath.IsEmpty() ? m->m_master->m_path : m->m_master->m_finalPath;
}

String8 Archive::GetScratchPath() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_scratch ? m->m_scratch->m_path : String8();
}

bool Archive::MainFileHasPath() const
{
    return !GetArchivePath().IsEmpty();
}

bool Archive::HasScratchFile() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return static_cast<bool>(m->m_scratch);
}

bool Archive::IsJustScratchFile() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return !m->m_master && m->m_scratch;
}

bool Archive::HaveScratchRevisions() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return !m->m_revisions.empty() && m->m_revisions.back()->IsScratch();
}

bool Archive::IsThrowAway() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_master && m->m_master->m_throwAway;
}

bool Archive::IsEmpty() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_revisions.empty();
}

bool Archive::IsReadOnly() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    Archive::ArchiveFile const* const master = m->m_master.Get();
    return master && master->m_mode != OpenModeCoordinated && (master->m_readOnly || master->m_readOnlyFallback);
}

bool Archive::IsBroken() const
{
    if (IsCorrupted()) return true;
    return GetLastRestoreResult() != RestoreOk && GetOffliningState() != OffliningComplete;
}

bool Archive::IsCorrupted() const
{
    CriticalSectionSpinScope const lock(m->m_flagsLock);
    return m->m_broken;
}

bool Archive::IsDead() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return (m->m_master && m->m_master->m_bad) || (m->m_scratch && m->m_scratch->m_bad);
}

bool Archive::IsMainFileDead() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_master && m->m_master->m_bad && !(m->m_scratch && m->m_scratch->m_bad);
}

void Archive::SetErrorCallback(Counted<ArchiveErrorCallback> const& callback)
{
    Counted<ArchiveErrorCallback> old(callback);
    CriticalSectionSpinScope const lock(m->m_flagsLock);
    std::swap(m->m_errorCallback, old);
}

void Archive::SetReferenceInfo(Counted<ArchiveReferenceInfo> const& info)
{
    CriticalSectionScope const lock(m->m_stateLock);
    Counted<ArchiveFile> const& file = m->m_scratch ? m->m_scratch : m->m_master;
    if (file) file->m_referenceInfo = info;
}

Counted<ArchiveReferenceInfo> Archive::GetReferenceInfo() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    Counted<ArchiveFile> const& file = m->m_scratch ? m->m_scratch : m->m_master;
    return file ? file->m_referenceInfo : nullptr;
}

bool Archive::GetFileState(ArchiveChoice which, FileState& state) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    Counted<ArchiveFile> const& file = which == ChoiceScratch ? m->m_scratch : m->m_master;
    if (!file || which == ChoiceNone) return false;
    state.path = file->m_path;
    state.fileVersion = file->m_fileVersion;
    state.flags = file->m_flags;
    state.firstFAT = file->m_firstFAT;
    state.fileEnd = file->m_fileEnd;
    state.totalBytes = file->m_totalBytes;
    state.deadBytes = file->m_deadBytes;
    state.saveTimeStamp = file->m_saveTimeStamp;
    state.saveCount = file->m_saveCount;
    state.nextFreeUID = file->m_nextFreeUID;
    state.writeCounter = file->m_writeCounter;
    state.thumbnailsPos = file->m_thumbnailsPos;
    state.hasLink = file->m_hasLink;
    state.linkPath = file->m_linkPath;
    state.linkSaveTimeStamp = file->m_linkSaveTimeStamp;
    state.linkSaveCount = file->m_linkSaveCount;
    state.hasReferencePath = static_cast<bool>(file->m_referenceInfo);
    state.referencePath = file->m_referenceInfo ? file->m_referenceInfo->GetPath() : String8();
    return true;
}

bool Archive::CheckForReadOnlyChange()
{
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    if (m->IsBusyCSSession()) return false;
    CriticalSectionScope const accessLock(m->m_accessLock);
    CriticalSectionScope const lock(m->m_stateLock);
    if (!m->m_master || m->m_master->m_mode == OpenModeReadOnly) return false;
    bool const readOnly = FileSystem::FileIsReadOnly(m->m_master->m_path);
    if (readOnly == m->m_master->m_readOnlyFallback) return false;
    m->m_master->m_readOnlyFallback = readOnly;
    return true;
}

bool Archive::CheckForReplacedFile()
{
    ArchiveReadGate const gate(*m); // A streamline has the path empty for a moment.
    String8 path;
    ArchiveInfo held;
    IDTag tag;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        if (!m->m_master) return false;
        path = m->m_master->m_path;
        held = m->m_master->m_rawInfo;
        tag = m->m_master->m_archiveUID;
    }
    File::OpenUnmanagedResult unmanaged{};
    try {
        Counted<FileInOutStream> const stream =
            FileInOutStream::OpenReadOnly(path.GetData(), File::ShareMode::DenyNone, unmanaged, nullptr);
        if (!stream) return true;
        u8 headerBytes[c_headerSize];
        u8 infoBytes[c_infoSize];
        ArchiveHdr header;
        ArchiveInfo info;
        if (stream->ReadAt(c_headerPos, headerBytes, sizeof(headerBytes)) != sizeof(headerBytes)) return true;
        if (stream->ReadAt(c_infoPos, infoBytes, sizeof(infoBytes)) != sizeof(infoBytes)) return true;
        if (!DecodeHeader(headerBytes, header) || !DecodeInfo(infoBytes, info)) return true;
        return header.archiveUID != tag || info.firstFAT != held.firstFAT || info.fileEnd != held.fileEnd ||
               info.totalBytes != held.totalBytes || info.deadBytes != held.deadBytes ||
               info.saveTimeStamp != held.saveTimeStamp || info.saveCount != held.saveCount ||
               info.nextFreeUID != held.nextFreeUID;
    } catch (FileIOException const&) {
        return true;
    }
}

bool Archive::UpdateModifiedTimestamp()
{
    if (!GetKeepOpen() || !m->GuaranteeFileHandle()) return false;
    Counted<ArchiveFile> master;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        master = m->m_master;
    }
    bool updated = false;
    if (master) {
        CriticalSectionScope const fileLock(master->m_lock);
        updated = master->m_stream && master->m_stream->UpdateTimestamps();
    }
    m->DecrementAccessCount();
    return updated;
}

namespace {

/// Process-wide folders.
struct Folders
{
    CriticalSectionSpin lock;
    String8 backup; // Guarded by lock, like the other.
    String8 shunt;
};

Folders& GetFolders()
{
    static Folders s_folders;
    return s_folders;
}

} // namespace

void Archive::SetShuntPath(String8 const& path)
{
    Folders& folders = GetFolders();
    CriticalSectionSpinScope const lock(folders.lock);
    folders.shunt = path;
}

String8 Archive::GetShuntPath()
{
    Folders& folders = GetFolders();
    CriticalSectionSpinScope const lock(folders.lock);
    return folders.shunt;
}

void Archive::SetBackupPath(String8 const& path)
{
    ArchiveImpl::EnsureBucketStore();
    Folders& folders = GetFolders();
    CriticalSectionSpinScope const lock(folders.lock);
    folders.backup = path;
}

String8 Archive::GetBackupPath()
{
    Folders& folders = GetFolders();
    CriticalSectionSpinScope const lock(folders.lock);
    return folders.backup;
}

} // namespace Kernel

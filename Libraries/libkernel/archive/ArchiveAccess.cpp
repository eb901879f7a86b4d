#include "libkernel/archive/internal/ArchiveImpl.h"
#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/core/Endian.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/streams/FileIOException.h"

#include <cassert>

// When the files are open: access blocks, keep-open, suspension, and reopening a handle onto the very file that was
// held before. An archive's tables live in memory, so a file that was rolled back or replaced meanwhile must not be
// used.

namespace Kernel {

using namespace ArchiveFormat;

Archive::AccessBlockAdorner::~AccessBlockAdorner() = default;
Archive::OffliningUpdater::~OffliningUpdater() = default;

Archive::AccessBlock::AccessBlock(Counted<Archive> archive, Counted<AccessBlockAdorner> adorner, bool wasBroken)
    : m_archive(std::move(archive)), m_adorner(std::move(adorner)), m_wasBroken(wasBroken)
{
}

Archive::AccessBlock::~AccessBlock()
{
    m_archive->m->EndAccessBlock(*this);
}

bool Archive::AccessBlock::IsCorrupted() const
{
    return m_archive->IsCorrupted();
}

bool Archive::AccessBlock::ShouldReportBrokenArchive() const
{
    return !m_silent && !m_wasBroken && m_archive->IsBroken();
}

void ArchiveImpl::EndAccessBlock(Archive::AccessBlock const& block)
{
    Counted<MultiSemaphore> exclusive;
    {
        CriticalSectionScope const lock(m_accessLock);
        if (m_exclusiveBlock == &block) {
            m_exclusiveBlock = nullptr;
            exclusive = m_exclusiveWait;
            m_exclusiveWait = nullptr;
        }
        if (block.m_wantsWriteAccess) --m_writeBlocks;
        m_wantsWriteAccess = m_writeBlocks > 0;
    }
    if (exclusive) exclusive->Signal();
    DecrementAccessCount();
}

Counted<Archive::AccessBlock> Archive::CreateAccessBlockCS(Counted<AccessBlockAdorner> const& adorner)
{
    assert(m->m_accessLock.IsHeldByCurrentThread());
    return Counted<AccessBlock>(new AccessBlock(Counted<Archive>(this), adorner, IsBroken()));
}

Counted<Archive::AccessBlock> Archive::CreateAccessBlock(Counted<AccessBlockAdorner> const& adorner)
{
    CriticalSectionScope const lock(m->m_accessLock);
    if (adorner && !adorner->Begin()) return nullptr;
    Counted<AccessBlock> const block = CreateAccessBlockCS(adorner);
    if (!block) return nullptr;
    ++m->m_accessCount;
    if (adorner && adorner->WantsWriteAccess()) {
        block->m_wantsWriteAccess = true;
        ++m->m_writeBlocks;
        m->m_wantsWriteAccess = true;
    }
    return block;
}

Counted<Archive::AccessBlock> Archive::BeginAccessBlockAndOpenFileHandle(Counted<AccessBlockAdorner> const& adorner)
{
    for (;;) {
        m->WaitWhileSuspended();
        Counted<AccessBlock> block; // Ends outside the lock.
        CriticalSectionScope const lock(m->m_accessLock);
        if (m->m_suspended) continue; // Again, between the wait and the lock.
        block = CreateAccessBlock(adorner);
        bool reopened = false;
        return block && m->OpenFileHandleCS(reopened, false, false) == RestoreOk ? block : nullptr;
    }
}

Counted<Archive::AccessBlockAdorner> Archive::CreateAccessBlockAdorner() const
{
    return m->m_adornerFactory ? m->m_adornerFactory(false, false) : nullptr;
}

Counted<Archive::AccessBlockAdorner> Archive::CreateExclusiveAccessBlockAdorner() const
{
    return m->m_adornerFactory ? m->m_adornerFactory(true, false) : nullptr;
}

Counted<Archive::AccessBlockAdorner> Archive::CreateUpgradeableAccessBlockAdorner() const
{
    return m->m_adornerFactory ? m->m_adornerFactory(false, true) : nullptr;
}

Counted<Archive::AccessBlock> ArchiveImpl::CreateExclusiveAccessBlock()
{
    CriticalSectionScope const lock(m_accessLock);
    if (m_exclusiveBlock) return nullptr;
    Counted<Archive::AccessBlock> const block = m_self.CreateAccessBlock(m_self.CreateExclusiveAccessBlockAdorner());
    if (!block) return nullptr;
    m_exclusiveBlock = block.Get();
    m_exclusiveWait = MakeCounted<MultiSemaphore>();
    return block;
}

bool Archive::IsInExclusiveAccessBlock() const
{
    CriticalSectionScope const lock(m->m_accessLock);
    return m->m_exclusiveBlock != nullptr;
}

bool Archive::HaveAccessCount() const
{
    return GetAccessCount() != 0;
}

u32 Archive::GetAccessCount() const
{
    CriticalSectionScope const lock(m->m_accessLock);
    return m->m_accessCount;
}

void Archive::IncrementAccessOverride()
{
    CriticalSectionScope const lock(m->m_accessLock);
    ++m->m_accessOverride;
    m->SignalSuspenderCS();
}

void Archive::DecrementAccessOverride()
{
    CriticalSectionScope const lock(m->m_accessLock);
    if (m->m_accessOverride > 0) --m->m_accessOverride;
}

void Archive::SetKeepOpen(bool keepOpen)
{
    CriticalSectionScope const lock(m->m_accessLock);
    m->m_keepOpen = keepOpen;
    m->CloseFilesIfUnusedCS();
}

bool Archive::GetKeepOpen() const
{
    CriticalSectionScope const lock(m->m_accessLock);
    return m->m_keepOpen;
}

Archive::RestoreResult Archive::GetLastRestoreResult() const
{
    CriticalSectionScope const lock(m->m_accessLock);
    return m->m_lastRestore;
}

// Suspension.

bool ArchiveImpl::TrySuspendCS()
{
    Archive::OffliningState const offlining = GetOffliningState();
    if (m_accessCount > m_accessOverride || offlining == Archive::OffliningRunning) return false;
    CloseFilesCS();
    if (!m_suspended) m_suspendWait = MakeCounted<MultiSemaphore>();
    m_suspended = true;
    return true;
}

bool Archive::Suspend()
{
    for (;;) {
        Counted<Semaphore> wait;
        {
            CriticalSectionScope const lock(m->m_accessLock);
            {
                CriticalSectionScope const state(m->m_stateLock);
                if (!m->m_master || !m->m_master->m_finalPath.IsEmpty()) return false;
            }
            if (m->TrySuspendCS()) return true;
            if (m->GetOffliningState() != OffliningRunning) {
                if (!m->m_suspenderWait) m->m_suspenderWait = MakeCounted<Semaphore>();
                wait = m->m_suspenderWait;
                ++m->m_waitingSuspenders;
            }
        }
        // Offlining works in short steps and leaves off when it is asked to.
        if (!wait) {
            m->WaitForOffliningToPause();
            continue;
        }
        wait->Wait(0);
        CriticalSectionScope const lock(m->m_accessLock);
        --m->m_waitingSuspenders;
    }
}

void Archive::Unsuspend()
{
    Counted<MultiSemaphore> wait;
    {
        CriticalSectionScope const lock(m->m_accessLock);
        m->m_suspended = false;
        wait = m->m_suspendWait;
        m->m_suspendWait = nullptr;
    }
    if (wait) wait->Signal();
    m->ResumeOffliningIfNoReader();
}

bool Archive::IsSuspended() const
{
    CriticalSectionScope const lock(m->m_accessLock);
    return m->m_suspended;
}

void ArchiveImpl::WaitWhileSuspended()
{
    for (;;) {
        Counted<MultiSemaphore> wait;
        {
            CriticalSectionScope const lock(m_accessLock);
            if (!m_suspended) return;
            wait = m_suspendWait;
        }
        if (wait) wait->Wait(0);
    }
}

// Suspends on the waiter's behalf: by the time it runs the next reader would long be at the file, and the one after
// that before the first has left.
void ArchiveImpl::SignalSuspenderCS()
{
    if (m_waitingSuspenders == 0 || m_accessCount > m_accessOverride) return;
    TrySuspendCS();
    m_suspenderWait->Signal();
}

bool ArchiveImpl::GuaranteeFileHandle()
{
    for (;;) {
        WaitWhileSuspended();
        bool suspended = false; // Again, between the wait and the lock.
        bool const isOpen = TryGuaranteeFileHandle(suspended);
        if (!suspended) return isOpen;
    }
}

bool ArchiveImpl::TryGuaranteeFileHandle(bool& suspended)
{
    CriticalSectionScope const lock(m_accessLock);
    suspended = m_suspended;
    if (suspended) return false;
    ++m_accessCount;
    bool reopened = false;
    if (OpenFileHandleCS(reopened, false, false) == Archive::RestoreOk) return true;
    --m_accessCount;
    SignalSuspenderCS();
    return false;
}

void ArchiveImpl::DecrementAccessCount()
{
    CriticalSectionScope const lock(m_accessLock);
    assert(m_accessCount > 0);
    --m_accessCount;
    SignalSuspenderCS();
    CloseFilesIfUnusedCS();
}

Archive::RestoreResult Archive::RecoverArchive(bool openAnyway)
{
    for (;;) {
        m->WaitWhileSuspended();
        CriticalSectionScope const lock(m->m_accessLock);
        if (m->m_suspended) continue; // Again, between the wait and the lock.
        {
            CriticalSectionScope const state(m->m_stateLock);
            if (m->m_master && m->m_master->m_lost) return RestoreNotTheFile;
        }
        m->m_lastRestore = RestoreOk;
        if (!m->m_keepOpen && !openAnyway) return RestoreOk;
        bool reopened = false;
        RestoreResult const result = m->OpenFileHandleCS(reopened, false, false);
        if (result != RestoreOk) return result;
        CriticalSectionScope const state(m->m_stateLock);
        for (Counted<ArchiveFile> const& file : {m->m_master, m->m_scratch})
            if (file) file->m_bad = false;
        return RestoreOk;
    }
}

// The handles.

void ArchiveImpl::CloseFilesCS()
{
    Counted<Archive::ArchiveFile> files[2];
    {
        CriticalSectionScope const lock(m_stateLock);
        files[0] = m_master;
        files[1] = m_scratch;
    }
    for (Counted<Archive::ArchiveFile> const& file : files) {
        if (!file) continue;
        CriticalSectionScope const lock(file->m_lock);
        file->m_stream = nullptr;
    }
}

void ArchiveImpl::CloseFilesIfUnusedCS()
{
    Archive::OffliningState const offlining = GetOffliningState();
    bool const offliningHolds = offlining == Archive::OffliningRunning || offlining == Archive::OffliningPaused;
    bool temporary = false;
    {
        CriticalSectionScope const lock(m_stateLock);
        // A temporary is known to nobody else; giving its handle up gains nothing.
        temporary = m_master && !m_master->m_finalPath.IsEmpty();
    }
    if (!m_keepOpen && m_accessCount == 0 && !offliningHolds && !temporary) CloseFilesCS();
}

namespace {

struct RestorePair
{
    int unmanaged;
    Archive::RestoreResult result;
};

constexpr RestorePair c_restoreResults[] = {
    {2, Archive::RestoreNotFound},        {5, Archive::RestoreAccessDenied}, {6, Archive::RestoreNotPermitted},
    {7, Archive::RestoreLocked},          {8, Archive::RestoreTimedOut},     {9, Archive::RestoreRefused},
    {11, Archive::RestoreReadOnlyVolume},
};

Archive::RestoreResult MapRestore(File::OpenUnmanagedResult result)
{
    for (RestorePair const& pair : c_restoreResults)
        if (pair.unmanaged == static_cast<int>(result)) return pair.result;
    return Archive::RestoreOther;
}

bool IsWorthAnotherTry(Archive::RestoreResult result)
{
    return result == Archive::RestoreLocked || result == Archive::RestoreTimedOut || result == Archive::RestoreRefused;
}

Archive::RestoreResult TryOpen(Archive::ArchiveFile& file, bool readOnly)
{
    File::OpenUnmanagedResult unmanaged{};
    file.m_stream =
        readOnly ? FileInOutStream::OpenReadOnly(file.m_path.GetData(), File::ShareMode::DenyNone, unmanaged, nullptr)
                 : FileInOutStream::Open(file.m_path.GetData(), File::ShareMode::DenyWrite, unmanaged, nullptr);
    return file.m_stream ? Archive::RestoreOk : MapRestore(unmanaged);
}

bool IsNoLower(Archive::ArchiveInfo const& found, Archive::ArchiveInfo const& held)
{
    return found.totalBytes >= held.totalBytes && found.deadBytes >= held.deadBytes &&
           found.saveTimeStamp >= held.saveTimeStamp && found.saveCount >= held.saveCount;
}

bool IsEqual(Archive::ArchiveInfo const& found, Archive::ArchiveInfo const& held)
{
    return found.firstFAT == held.firstFAT && found.fileEnd == held.fileEnd && found.totalBytes == held.totalBytes &&
           found.deadBytes == held.deadBytes && found.saveTimeStamp == held.saveTimeStamp &&
           found.saveCount == held.saveCount;
}

} // namespace

// Is this the file that was held before? Compared with the raw info block, since what the archive works with may have
// been raised from the tables.
bool ArchiveImpl::FitsWhatIsHeld(Archive::ArchiveFile& file)
{
    ArchiveFileSource source(*file.m_stream);
    u8 header[c_headerSize];
    u8 infoBytes[c_infoSize];
    Archive::ArchiveHdr found;
    Archive::ArchiveInfo info;
    if (source.ReadAt(c_headerPos, header, sizeof(header)) != sizeof(header) || !DecodeHeader(header, found))
        return false;
    if (found.fileVersion < c_oldestVersion || found.fileVersion > c_version) return false;
    if (found.archiveUID != file.m_archiveUID) return false;
    if (source.ReadAt(c_infoPos, infoBytes, sizeof(infoBytes)) != sizeof(infoBytes) ||
        DecodeInfo(infoBytes, info) == file.m_infoDamaged)
        return false;
    Archive::ArchiveInfo const& held = file.m_rawInfo;
    if (file.m_infoDamaged) {
        // There is nothing to compare but the damage, and the guard below.
    } else if (file.m_isScratch) {
        if (info.saveTimeStamp < held.saveTimeStamp || info.saveCount < held.saveCount) return false;
    } else if (!(m_keepOpen ? IsEqual(info, held) : IsNoLower(info, held))) {
        return false;
    }
    if (found.fileVersion < c_guardVersion) return true;
    u8 guard[c_guardSize];
    if (source.ReadAt(c_guardPos, guard, sizeof(guard)) != sizeof(guard)) return false;
    u32 const tag = LoadLittleEndian<u32>(guard);
    u32 const counter = LoadLittleEndian<u32>(guard + 4);
    if (tag != c_tagGuard && tag != c_tagBlock) return false;
    if (file.AdoptOwnCounter(counter)) return true;
    if (m_keepOpen || counter < file.m_writeCounter) return false;
    file.m_writeCounter = counter;
    return true;
}

Archive::RestoreResult ArchiveImpl::OpenOneFileCS(Archive::ArchiveFile& file, bool& reopened)
{
    CriticalSectionScope const lock(file.m_lock);
    // A stream that failed once stays broken; its file may be well again.
    if (file.m_stream && file.m_stream->IsBroken()) file.m_stream = nullptr;
    if (file.m_stream) return Archive::RestoreOk;
    if (file.m_closedForUpdate || file.m_moved) return Archive::RestoreNotFound;
    if (file.m_path.IsEmpty()) return Archive::RestoreNotFound;

    constexpr int maxAttempts = 3;
    constexpr int pauseMs = 1000;
    Archive::RestoreResult result = Archive::RestoreOther;
    for (int attempt = 0; attempt < maxAttempts; ++attempt) {
        if (attempt > 0) Dispatch::Sleep(pauseMs);
        switch (file.m_mode) {
        case Archive::OpenModeReadWrite: result = TryOpen(file, false); break;
        case Archive::OpenModeReadOnly: result = TryOpen(file, true); break;
        case Archive::OpenModeReadWriteOrReadOnly:
            result = TryOpen(file, false);
            file.m_readOnlyFallback = false;
            if (result == Archive::RestoreNotPermitted || result == Archive::RestoreReadOnlyVolume) {
                result = TryOpen(file, true);
                file.m_readOnlyFallback = result == Archive::RestoreOk;
            }
            break;
        case Archive::OpenModeCoordinated: result = TryOpen(file, !m_wantsWriteAccess); break;
        default: return Archive::RestoreOther;
        }
        if (!IsWorthAnotherTry(result)) break;
    }
    if (result != Archive::RestoreOk) return result;
    reopened = true;
    try {
        if (FitsWhatIsHeld(file)) return Archive::RestoreOk;
    } catch (FileIOException const&) {
    }
    file.m_stream = nullptr;
    return Archive::RestoreNotTheFile;
}

Archive::RestoreResult ArchiveImpl::OpenFileHandleCS(bool& reopened, bool force, bool ignoreFailure)
{
    assert(m_accessLock.IsHeldByCurrentThread());
    reopened = false;
    Counted<Archive::ArchiveFile> files[2];
    {
        CriticalSectionScope const lock(m_stateLock);
        files[0] = m_master;
        files[1] = m_scratch;
    }
    Archive::ArchiveFile* const master = files[0].Get();
    bool const reopenForWriting = master && !m_keepOpen && m_wantsWriteAccess &&
                                  master->m_mode == Archive::OpenModeCoordinated && master->GetStream() &&
                                  master->GetStream()->IsReadOnly();
    if (force || reopenForWriting) CloseFilesCS();

    bool const masterClosed = master && !master->GetStream();
    bool const offlined = GetOffliningState() == Archive::OffliningComplete;
    if (masterClosed && !force && !ignoreFailure && m_lastRestore != Archive::RestoreOk && !offlined)
        return m_lastRestore;

    Archive::RestoreResult result = Archive::RestoreOk;
    for (Counted<Archive::ArchiveFile> const& file : files) {
        if (!file || result != Archive::RestoreOk) continue;
        result = OpenOneFileCS(*file, reopened);
    }
    m_lastRestore = result;
    if (result != Archive::RestoreOk && m_keepOpen) CloseFilesCS();
    return result;
}

void ArchiveImpl::ThrowFileException(Archive::ArchiveFile const& file, ArchiveFileException::Reason reason)
{
    if (reason != ArchiveFileException::Reason::OutOfSpace && GetOffliningState() == Archive::OffliningComplete)
        const_cast<Archive::ArchiveFile&>(file).m_bad = true;
    throw ArchiveFileException(&m_self, reason,
                               file.m_isScratch ? ArchiveFileException::WhatFile::Scratch
                                                : ArchiveFileException::WhatFile::Master);
}

} // namespace Kernel

#include "libkernel/archive/internal/ArchiveBucket.h"
#include "libkernel/archive/internal/ArchiveInStream.h"
#include "libkernel/archive/internal/ArchiveReadGate.h"
#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/core/Limits.h"
#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/streams/CRC32.h"

#include <algorithm>
#include <exception>
#include <new>

// Copies every file out of the archive's disk files on a background job, so that these may go away. Works a file at a
// time and keeps off the disk while anybody reads.

namespace Kernel {

using namespace ArchiveFormat;

Archive::OffliningState ArchiveImpl::GetOffliningState() const
{
    CriticalSectionSpinScope const lock(m_flagsLock);
    return m_offliningState;
}

void ArchiveImpl::SetOffliningState(Archive::OffliningState state)
{
    CriticalSectionSpinScope const lock(m_flagsLock);
    m_offliningState = state;
}

Archive::OffliningState Archive::GetOffliningState() const
{
    return m->GetOffliningState();
}

bool Archive::IsOfflining() const
{
    OffliningState const state = GetOffliningState();
    return state == OffliningRunning || state == OffliningPaused;
}

bool Archive::IsOffliningCompleted() const
{
    return GetOffliningState() == OffliningComplete;
}

void Archive::StartOffline(Counted<OffliningUpdater> const& updater)
{
    Counted<AccessBlock> block;
    Counted<ArchiveFile> master;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        m->m_updater = updater;
        if (m->GetOffliningState() != OffliningNotStarted) return;
        master = m->m_master;
    }
    if (master && !master->GetStream()) {
        block = BeginAccessBlockAndOpenFileHandle(CreateExclusiveAccessBlockAdorner());
        if (!block) return;
    }
    std::exception_ptr failure;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        try {
            m->CreateOfflineQueueCS();
        } catch (std::bad_alloc const&) {
            failure = std::current_exception();
            m->m_offlineQueue.clear();
            m->m_offlineTotal = 0;
        }
    }
    m->CloseFilesIfUnused();
    if (failure) std::rethrow_exception(failure);
}

void ArchiveImpl::CloseFilesIfUnused()
{
    CriticalSectionScope const lock(m_accessLock);
    CloseFilesIfUnusedCS();
}

void ArchiveImpl::CreateOfflineQueueCS()
{
    Archive::Revision* const working = GetWorkingRevisionCS();
    if (!working) return;
    for (auto const& [path, info] : m_paths) {
        Archive::Revision* where = nullptr;
        Archive::FileRevision* const entry = FindEntryCS(*info, *working, &where);
        if (!entry || entry->IsDeletion() || entry->backData) continue;
        m_offlineQueue[info.Get()] = Counted<Archive::Revision>(where);
        m_offlineTotal += entry->fileCompressedSize;
    }
    StartOfflineThreadCS();
}

void ArchiveImpl::StartOfflineThreadCS()
{
    Archive::OffliningState const state = GetOffliningState();
    if (state == Archive::OffliningRunning || state == Archive::OffliningPaused) return;
    if (m_offlineQueue.empty()) {
        SetOffliningState(Archive::OffliningComplete);
        return;
    }
    m_readInProgress = m_readerCount != 0;
    if (!m_offlineWake) m_offlineWake = MakeCounted<Semaphore>();
    SetOffliningState(Archive::OffliningRunning);
    try {
        // The job keeps the archive until it is done.
        Counted<Archive> const archive(&m_self);
        Dispatch::DispatchAndForget([archive] { archive->m->OffliningProc(); }, Dispatch::DispatchPriority::Default,
                                    Dispatch::ThreadPurpose::Worker);
    } catch (std::bad_alloc const&) {
        // A state of running that nobody ends would be waited for without end.
        SetOffliningState(Archive::OffliningNotStarted);
        throw;
    }
}

void ArchiveImpl::GoOnOffliningCS(bool afresh) noexcept
try {
    if (afresh)
        CreateOfflineQueueCS();
    else
        StartOfflineThreadCS();
} catch (std::bad_alloc const&) {
    m_offlineQueue.clear();
    SetOffliningState(Archive::OffliningFailed);
}

void ArchiveImpl::EndOfflining(Archive::OffliningState state, int failure)
{
    Counted<Archive::OffliningUpdater> updater;
    {
        CriticalSectionScope const lock(m_stateLock);
        updater = m_updater;
        if (state == Archive::OffliningComplete) m_offlineDone = m_offlineTotal;
        if (state == Archive::OffliningFailed) m_offlineQueue.clear();
        SetOffliningState(state);
    }
    CloseFilesIfUnused();
    {
        CriticalSectionScope const lock(m_accessLock);
        SignalSuspenderCS();
    }
    if (!updater) return;
    switch (state) {
    case Archive::OffliningComplete: updater->Complete(); break;
    case Archive::OffliningAborted: updater->Aborted(); break;
    default: updater->Failed(failure); break;
    }
}

void ArchiveImpl::OffliningProc()
{
    constexpr int c_copyFailed = 1;
    constexpr int c_fileGone = 2;
    for (;;) {
        Archive::FileRevision entry;
        Counted<Archive::Revision> revision;
        Counted<Semaphore> pause;
        {
            CriticalSectionScope const lock(m_stateLock);
            if (m_offlineAbort.load()) {
                revision = nullptr;
            } else if (m_readInProgress) {
                SetOffliningState(Archive::OffliningPaused);
                pause = m_offlineWake;
            } else if (!m_offlineQueue.empty()) {
                auto const first = m_offlineQueue.begin();
                Archive::FileRevision* const found = first->second->FindI(*first->first);
                if (!found || found->backData || found->IsDeletion()) {
                    m_offlineQueue.erase(first);
                    continue;
                }
                entry = *found;
                revision = first->second;
            }
        }
        if (pause) {
            pause->Wait(0);
            SetOffliningState(Archive::OffliningRunning);
            continue;
        }
        if (m_offlineAbort.load()) return EndOfflining(Archive::OffliningAborted, 0);
        if (!revision) return EndOfflining(Archive::OffliningComplete, 0);
        if (!revision->m_file || (!revision->m_file->m_isScratch && !HasMaster()))
            return EndOfflining(Archive::OffliningFailed, c_fileGone);
        if (!OfflineOne(entry, revision)) {
            bool const aborted = m_offlineAbort.load();
            return EndOfflining(aborted ? Archive::OffliningAborted : Archive::OffliningFailed, c_copyFailed);
        }
    }
}

bool ArchiveImpl::HasMaster() const
{
    CriticalSectionScope const lock(m_stateLock);
    return static_cast<bool>(m_master);
}

bool ArchiveImpl::OfflineOne(Archive::FileRevision const& entry, Counted<Archive::Revision> const& revision)
try {
    Counted<FileStoreBackData const> copy;
    ArchiveBackDataBucketStore& store = ArchiveBackDataBucketStore::GetInstance();
    try {
        ArchiveReadGate const gate(*this);
        // A streamline that ran meanwhile has moved the bytes and emptied the queue.
        if (!FindRevision(revision.Get())) return true;
        ArchiveAccessScope const access(*this);
        if (!access.IsOpen()) return false;
        // Without a CRC of the stored bytes the only way to test them is to unpack them.
        bool const mustUnpack = entry.crcCompressed == 0 && entry.crcUncompressed != 0;
        if (mustUnpack) {
            Archive::BlockCheck const check = CheckUnpacked(*revision->m_file, entry);
            if (check == Archive::BlockCheck::Unreadable) return false;
            if (check != Archive::BlockCheck::Ok) throw ArchiveCRCException(&m_self);
        }
        copy = store.Copy(*this, *revision->m_file, entry, &m_offlineAbort);
    } catch (ArchiveCRCException const&) {
        try {
            ReportCorruption(true);
        } catch (ArchiveCorruptionException const&) {
        }
        return false;
    } catch (Exception const&) {
        return false;
    }
    if (!copy) return false;
    copy = PublishBackData(*revision, *entry.info, copy);

    u64 done = 0;
    u64 total = 0;
    Counted<Archive::OffliningUpdater> updater;
    {
        CriticalSectionScope const lock(m_stateLock);
        m_offlineQueue.erase(entry.info.Get());
        m_offlineDone = std::min(m_offlineDone + entry.fileCompressedSize, m_offlineTotal);
        done = m_offlineDone;
        total = m_offlineTotal;
        updater = m_updater;
    }
    // A save may have moved the file on while its bytes were copied.
    m_self.AddBackData(entry.info->GetPath(), revision.Get(), copy);
    if (updater) updater->Progress(total, done);
    return true;
} catch (std::bad_alloc const&) {
    // The job has nobody above it to tell.
    return false;
}

void ArchiveImpl::ResumeOfflining()
{
    Counted<Semaphore> wake;
    {
        CriticalSectionScope const lock(m_stateLock);
        if (GetOffliningState() == Archive::OffliningPaused) wake = m_offlineWake;
    }
    if (wake) wake->Signal();
}

void ArchiveImpl::ResumeOffliningIfNoReader()
{
    {
        CriticalSectionScope const lock(m_stateLock);
        if (m_readerCount != 0 || m_activeSession) return;
        m_readInProgress = false;
    }
    ResumeOfflining();
}

void ArchiveImpl::WaitForOffliningToPause()
{
    {
        CriticalSectionScope const lock(m_stateLock);
        m_readInProgress = true;
    }
    while (GetOffliningState() == Archive::OffliningRunning) Dispatch::Yield(Dispatch::YieldPolicy::Default);
}

void ArchiveImpl::WaitForOffliningToAbort()
{
    m_offlineAbort.store(true);
    ResumeOfflining();
    for (;;) {
        Archive::OffliningState const state = GetOffliningState();
        if (state != Archive::OffliningRunning && state != Archive::OffliningPaused) break;
        if (state == Archive::OffliningPaused) ResumeOfflining();
        Dispatch::Yield(Dispatch::YieldPolicy::Default);
    }
    m_offlineAbort.store(false);
}

void Archive::StopOffline()
{
    if (GetOffliningState() == OffliningNotStarted) return;
    m->m_offlineAbort.store(true);
    m->ResumeOfflining();
    m->CloseFilesIfUnused();
}

void Archive::AbortOfflining()
{
    ArchiveAccessCountScope const access(*m);
    m->WaitForOffliningToAbort();
}

void ArchiveImpl::StopAllOfflining()
{
    for (Counted<Archive> const& archive : GetAll()) archive->AbortOfflining();
}

void Archive::PreShutdown()
{
    ArchiveImpl::StopAllOfflining();
}

void Archive::PostShutdown()
{
    ArchiveBackDataBucketStore::GetInstance().Clear();
}

} // namespace Kernel

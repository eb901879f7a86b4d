#include "libkernel/archive/internal/ArchiveSessionState.h"
#include "libkernel/core/Endian.h"
#include "libkernel/streams/FileIOException.h"

#include <algorithm>
#include <cstring>
#include <new>

// Beginning and ending of save sessions.

namespace Kernel {

using namespace ArchiveFormat;

namespace {

/// The time stamp of a session of an archive with a scratch file. The scratch file knows its master by the stamp of its
/// save, even where a torn info block shows the older save count; and tables that an earlier scratch state left behind
/// are told from live ones by being older than the link. So a save of the master comes later than everything before it,
/// though it be in the same second, and one of the scratch file never earlier than its link. A clock that was set back
/// further than a burst of saves differs by itself.
TimeStamp StampOf(bool isMaster, TimeStamp const& last, TimeStamp const& link)
{
    constexpr i64 c_burstSeconds = 60;
    TimeStamp const now = TimeStamp::GetCurrent();
    if (!isMaster) return std::max(now, link);
    return now <= last && now > last - c_burstSeconds ? last + 1 : now;
}

} // namespace

bool Archive::CreateSession(ArchiveSessionHandle& handle, SessionType type, bool const* abort)
{
    return m->CreateSessionI(handle, type, ChoiceMaster, abort, false) == SessionOk;
}

bool Archive::CreateScratchSession(ArchiveSessionHandle& handle, SessionType type, bool const* abort)
{
    return m->CreateSessionI(handle, type, ChoiceScratch, abort, false) == SessionOk;
}

Archive::CreateSessionResult Archive::CreateSessionAdv(ArchiveSessionHandle& handle, SessionType type,
                                                       bool const* abort, bool skipExclusiveWait)
{
    return m->CreateSessionI(handle, type, ChoiceMaster, abort, skipExclusiveWait);
}

bool Archive::CreateFileEnumerationSession(ArchiveSessionHandle& handle, bool const* abort)
{
    return m->CreateSessionI(handle, SessionTypeFull, ChoiceNone, abort, false) == SessionOk;
}

// The first save of a file without a guard makes it one of today's version. Readers of those take a block for the guard
// that is not there, and nothing else: with anything else in that place the save would make the file unreadable.
static bool CanBecomeCurrent(Archive::ArchiveFile& file)
{
    CriticalSectionScope const lock(file.m_lock);
    // With a link or a reference path in that place it stays what it is.
    if ((file.m_flags & (c_flagLink | c_flagReference)) != 0 || file.m_fileEnd <= c_guardPos) return true;
    u8 tag[c_blockTagSize];
    try {
        return file.m_stream && file.m_stream->ReadAt(c_guardPos, tag, sizeof(tag)) == sizeof(tag) &&
               LoadLittleEndian<u32>(tag) == c_tagBlock;
    } catch (FileIOException const&) {
        return false;
    }
}

ArchiveImpl::GuardResult ArchiveImpl::PassWriteGuard(Archive::ArchiveFile& file, bool acceptBlockTag)
{
    CriticalSectionScope const lock(file.m_lock);
    if (!file.m_stream) return GuardResult::Unreadable;
    u8 guard[c_guardSize];
    try {
        if (file.m_stream->ReadAt(c_guardPos, guard, sizeof(guard)) != sizeof(guard)) return GuardResult::Unreadable;
    } catch (FileIOException const&) {
        return GuardResult::Unreadable;
    }
    u32 const tag = LoadLittleEndian<u32>(guard);
    if (tag != c_tagGuard && !(acceptBlockTag && tag == c_tagBlock)) return GuardResult::WrongTag;
    if (!file.AdoptOwnCounter(LoadLittleEndian<u32>(guard + 4))) return GuardResult::WrongCounter;
    StoreLittleEndian(guard + 4, file.m_writeCounter + 1);
    file.m_guardMayBeAhead = true;
    try {
        if (file.m_stream->WriteAt(c_guardPos, guard, sizeof(guard)) != sizeof(guard) || !file.m_stream->Flush())
            return GuardResult::Unwritable;
    } catch (FileIOException const&) {
        return GuardResult::Unwritable;
    }
    ++file.m_writeCounter;
    file.m_guardMayBeAhead = false;
    return GuardResult::Ok;
}

Archive::CreateSessionResult ArchiveImpl::CreateSessionI(ArchiveSessionHandle& handle, Archive::SessionType type,
                                                         Archive::ArchiveChoice choice, bool const* abort,
                                                         bool skipExclusiveWait)
{
    for (;;) {
        bool mustWait = false;
        Archive::CreateSessionResult const result =
            TryCreateSession(handle, type, choice, abort, skipExclusiveWait, mustWait);
        if (!mustWait) return result;
        WaitWhileSuspended();
        Counted<MultiSemaphore> exclusive;
        if (!skipExclusiveWait) {
            CriticalSectionScope const lock(m_accessLock);
            exclusive = m_exclusiveWait;
        }
        if (exclusive) exclusive->Wait(0);
    }
}

Archive::CreateSessionResult ArchiveImpl::TryCreateSession(ArchiveSessionHandle& handle, Archive::SessionType type,
                                                           Archive::ArchiveChoice choice, bool const* abort,
                                                           bool ignoreExclusive, bool& mustWait)
{
    CriticalSectionScope const sessionLock(m_sessionLock);
    if (handle.IsValid()) return Archive::SessionHandleInUse;
    Counted<Archive::ArchiveFile> file;
    {
        CriticalSectionScope const lock(m_stateLock);
        if (m_rewindCount != 0) return Archive::SessionNotAtHead;
        if (m_activeSession) return Archive::SessionActive;
        if ((m_master && m_master->m_bad) || (m_scratch && m_scratch->m_bad)) return Archive::SessionFileBad;
        if (choice == Archive::ChoiceMaster && !m_master) return Archive::SessionNoMaster;
        if (choice == Archive::ChoiceScratch && !m_scratch) return Archive::SessionNoScratch;
        if (choice == Archive::ChoiceMaster) file = m_master;
        if (choice == Archive::ChoiceScratch) file = m_scratch;
    }
    if (choice == Archive::ChoiceMaster && m_self.IsReadOnly()) return Archive::SessionReadOnly;
    if (file && (file->m_moved || file->m_closedForUpdate)) return Archive::SessionMoved;
    if (type < Archive::SessionTypeFull || type > Archive::SessionTypeExport) return Archive::SessionNoMemory;

    try {
        auto state = std::make_unique<ArchiveSession::State>(m_self, *this);
        state->type = type;
        state->enumerationOnly = choice == Archive::ChoiceNone;
        state->file = file;
        if (file) {
            {
                CriticalSectionScope const lock(m_accessLock);
                // Asked where the block is taken: an exclusive one may have begun since the last wait.
                mustWait = m_suspended || (m_exclusiveWait && !ignoreExclusive);
                if (mustWait) return Archive::SessionNoMemory;
                state->access = m_self.CreateAccessBlock(m_self.CreateUpgradeableAccessBlockAdorner());
            }
            if (!state->access) return Archive::SessionNoMemory;
            if (!OpenForSession(*file)) return Archive::SessionFileUnusable;

            auto revision = MakeCounted<Archive::Revision>();
            revision->m_file = file;
            revision->m_timeStamp = TimeStamp::GetCurrent();
            if (m_scratch) {
                CriticalSectionScope const lock(m_stateLock);
                TimeStamp last = file->m_saveTimeStamp;
                if (!m_revisions.empty()) last = std::max(last, m_revisions.back()->m_timeStamp);
                revision->m_timeStamp = StampOf(choice == Archive::ChoiceMaster, last, m_scratch->m_linkSaveTimeStamp);
            }
            revision->m_tag =
                type == Archive::SessionTypeIncremental ? Archive::RevisionTagIncremental : Archive::RevisionTagFull;
            CriticalSectionScope const lock(file->m_lock);
            revision->m_nextFAT = file->m_firstFAT;
            revision->m_fileEnd = FindSessionStart(*file);
            revision->m_totalBytes = file->m_totalBytes;
            revision->m_deadBytes = file->m_deadBytes;
            state->revision = revision;
            state->appender.emplace(*this, file, revision->m_fileEnd);
        }
        {
            CriticalSectionScope const lock(m_stateLock);
            state->nextFreeUID = m_nextFreeUID;
            state->pathCounts = m_pathCounts;
        }
        if (choice == Archive::ChoiceMaster &&
            (GetOffliningState() == Archive::OffliningRunning || GetOffliningState() == Archive::OffliningPaused))
        {
            WaitForOffliningToAbort();
            state->restartOfflining = true;
        }
        auto* const session = new ArchiveSession(std::move(state), abort);
        handle.m_session = session;
        handle.m_archive = Counted<Archive>(&m_self);
        CriticalSectionScope const lock(m_stateLock);
        m_activeSession = session;
        return Archive::SessionOk;
    } catch (std::bad_alloc const&) {
        return Archive::SessionNoMemory;
    }
}

// Behind the newest table; in a scratch file that was emptied also behind what a reader still holds of its old life.
u64 ArchiveImpl::FindSessionStart(Archive::ArchiveFile const& file)
{
    u64 start = file.m_fileEnd;
    if (!file.m_isScratch) return start;
    CriticalSectionScope const lock(m_stateLock);
    std::erase_if(m_staleScratch, [](Counted<Archive::Revision> const& r) { return r->GetReferenceCount() == 1; });
    for (Counted<Archive::Revision> const& revision : m_staleScratch)
        if (revision->m_file == &file) start = std::max(start, revision->m_fatEnd);
    return start;
}

bool ArchiveImpl::HasHeldInfo(Archive::ArchiveFile& file) const
{
    u8 held[c_infoSize];
    u8 found[c_infoSize];
    EncodeInfo(held, file.m_rawInfo);
    CriticalSectionScope const lock(file.m_lock);
    try {
        if (!file.m_stream || file.m_stream->ReadAt(c_infoPos, found, sizeof(found)) != sizeof(found)) return false;
        Archive::ArchiveInfo ignored;
        return file.m_infoDamaged ? !DecodeInfo(found, ignored) : std::memcmp(held, found, sizeof(held)) == 0;
    } catch (FileIOException const&) {
        return false;
    }
}

bool ArchiveImpl::ShowsItself(Archive::ArchiveFile& file) const
{
    return !file.m_infoDamaged && file.m_rawInfo.firstFAT == file.m_firstFAT && HasHeldInfo(file);
}

// The guard is tried a second time on a fresh handle: on a network volume the first one may simply have been lost.
bool ArchiveImpl::OpenForSession(Archive::ArchiveFile& file)
{
    bool force = false;
    for (int attempt = 0; attempt < 2; ++attempt) {
        {
            CriticalSectionScope const lock(m_accessLock);
            if (force) {
                CriticalSectionScope const fileLock(file.m_lock);
                file.m_stream = nullptr;
            }
            bool reopened = false;
            if (OpenFileHandleCS(reopened, force, force) != Archive::RestoreOk) return false;
        }
        // A handle that is opened afresh between accesses may find that somebody else has saved. Reading on is
        // harmless; a save from the old tables would write over the new ones.
        if (!HasHeldInfo(file)) {
            CriticalSectionScope const lock(m_accessLock);
            m_lastRestore = Archive::RestoreNotTheFile;
            return false;
        }
        if (file.m_fileVersion < c_guardVersion) {
            if (CanBecomeCurrent(file)) return true;
            CriticalSectionScope const lock(m_accessLock);
            m_lastRestore = Archive::RestoreNotTheFile;
            return false;
        }
        GuardResult const guard = PassWriteGuard(file, false);
        if (guard == GuardResult::Ok) return true;
        CriticalSectionScope const lock(m_accessLock);
        switch (guard) {
        case GuardResult::Unreadable: m_lastRestore = Archive::RestoreGuardUnreadable; break;
        case GuardResult::Unwritable: m_lastRestore = Archive::RestoreGuardUnwritable; break;
        default: m_lastRestore = Archive::RestoreNotTheFile; return false;
        }
        force = true;
    }
    return false;
}

void Archive::CloseSession(ArchiveSessionHandle& handle, bool updateTimestamps)
{
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    ArchiveSession* const session = handle.m_session;
    if (!session || session != m->m_activeSession) throw OutStream::WriteException();

    // Whatever happens below, the session ends here.
    struct Ender
    {
        ArchiveImpl& impl;
        ArchiveSessionHandle& handle;
        Counted<Archive> const keep;
        ~Ender()
        {
            impl.DropSession(handle.m_session);
            handle.m_session = nullptr;
            handle.m_archive = nullptr;
        }
    } const ender{*m, handle, handle.m_archive};

    if (session->m->fileOpen && !session->WasAborted()) throw OutStream::WriteException();
    bool failed = false;
    {
        CriticalSectionSpinScope const lock(session->m->lock);
        failed = session->m->failed;
    }
    if (!failed) m->FinaliseActiveSessionCS(*session, updateTimestamps);
}

void ArchiveImpl::DropSession(ArchiveSession* session)
{
    std::unique_ptr<ArchiveSession, void (*)(ArchiveSession*)> const owned(session,
                                                                           [](ArchiveSession* s) { delete s; });
    ArchiveSession::State& state = *session->m;
    bool resume = false;
    {
        CriticalSectionScope const lock(m_stateLock);
        m_activeSession = nullptr;
        if (m_readerCount == 0) {
            m_readInProgress = false;
            resume = true;
        }
        if (state.restartOfflining) GoOnOffliningCS(false);
    }
    if (resume) ResumeOfflining();
    for (Counted<Archive> const& source : state.sources) source->m->DecrementAccessCount();
    if (!state.file) return;
    // A stream that failed stays broken; the next access opens the file afresh and compares what it finds.
    CriticalSectionScope const lock(m_accessLock);
    CriticalSectionScope const fileLock(state.file->m_lock);
    if (state.file->m_stream && state.file->m_stream->IsBroken()) state.file->m_stream = nullptr;
}

} // namespace Kernel

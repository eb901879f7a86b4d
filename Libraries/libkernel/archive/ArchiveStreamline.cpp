#include "libkernel/archive/ArchiveStreamline.h"

#include "libkernel/archive/internal/ArchiveStreamliner.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/Trace.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/FileIOException.h"

#include <exception>
#include <new>

// Streamlining in place: what surrounds the writing and the replacing of the file. Holds the session lock throughout,
// so that no session can be active, and from the first look at the stored blocks on keeps readers out.

namespace Kernel {

using namespace ArchiveFormat;
using Result = Archive::StreamlineResult;

ArchiveStreamlineProgress::~ArchiveStreamlineProgress() = default;

bool FlushArchiveFile(FileInOutStream& stream)
{
    try {
        return !stream.IsBroken() && stream.ForceFlush() && !stream.IsBroken();
    } catch (FileIOException const&) {
        return false;
    }
}

bool FlushFolderOf(String8 const& path)
{
    return Platform::GetFileCalls().flushFolder(Platform::GetFolderOf(path.GetData()).c_str()) == 0;
}

bool Archive::RequiresStreamlining() const
{
    CriticalSectionScope const lock(m->m_sessionLock);
    return ArchiveStreamliner(*m).RequiresStreamliningCS();
}

bool Archive::StreamliningAdviseable() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_master && m->m_master->m_fileVersion < c_version;
}

Result Archive::Streamline(bool const* abort, Counted<ArchiveStreamlineProgress> const& progress,
                           MarshalledFileAccess const* marshalled)
{
    return ArchiveStreamliner(*m).StreamlineI({false, nullptr, abort, progress, marshalled});
}

Result Archive::StreamlineAndVerifyFileState(String8& report, bool const* abort,
                                             Counted<ArchiveStreamlineProgress> const& progress,
                                             MarshalledFileAccess const* marshalled)
{
    return ArchiveStreamliner(*m).StreamlineI({true, &report, abort, progress, marshalled});
}

bool Archive::IsMidStreamlineFile(String8 const& path)
{
    return TempFile::IsMidStreamlineFile(path);
}

bool Archive::IsDoingStreamline() const
{
    return m->m_doingStreamline.load();
}

void Archive::SetAlwaysStreamlineOverwrite(bool always)
{
    m->m_alwaysOverwrite.store(always);
}

bool Archive::GetAlwaysStreamlineOverwrite() const
{
    return m->m_alwaysOverwrite.load();
}

bool ArchiveStreamliner::RequiresStreamliningCS() const
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    std::vector<Counted<Archive::Revision>> const& revisions = m_impl.m_revisions;
    if (revisions.size() < 2) return false;
    for (size_t i = revisions.size() - std::min<size_t>(revisions.size(), m_impl.m_rewindCount); i-- > 0;)
        for (Archive::FileRevision const& entry : revisions[i]->GetEntries())
            if (entry.IsDeletion() || !entry.added) return true;
    return false;
}

bool ArchiveStreamliner::IsBusyCS() const
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    return m_impl.m_activeSession || m_impl.m_openInStreams != 0 || m_impl.m_runningStreamlines > 0;
}

u32 ArchiveStreamliner::NextWriteCounter() const
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    File const* const file = m_impl.m_master ? m_impl.m_master.Get() : m_impl.m_scratch.Get();
    return file ? file->m_writeCounter + 1 : 1;
}

Counted<Archive::ArchiveFile> ArchiveStreamliner::MakeFile(u32 saveCount) const
{
    Archive::OpenMode mode = Archive::OpenModeReadWrite;
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        if (m_impl.m_master && m_impl.m_master->m_mode != Archive::OpenModeReadOnly) mode = m_impl.m_master->m_mode;
    }
    auto file = MakeCounted<File>(mode, m_impl.m_archiveUID);
    file->m_saveTimeStamp = TimeStamp::GetCurrent();
    file->m_saveCount = saveCount;
    file->m_writeCounter = NextWriteCounter();
    return file;
}

ArchiveStreamliner::Access ArchiveStreamliner::BeginAccess(Counted<Archive::AccessBlockAdorner> const& adorner,
                                                           bool exclusive, bool& suspended)
{
    Access block; // A block that is given up ends outside the lock.
    CriticalSectionScope const lock(m_impl.m_accessLock);
    suspended = m_impl.m_suspended;
    if (suspended || (exclusive && m_impl.m_exclusiveBlock)) return nullptr;
    block = m_impl.m_self.CreateAccessBlock(adorner);
    if (!block) return nullptr;
    if (exclusive) {
        m_impl.m_exclusiveBlock = block.Get();
        m_impl.m_exclusiveWait = MakeCounted<MultiSemaphore>();
    }
    bool reopened = false;
    return m_impl.OpenFileHandleCS(reopened, false, false) == Archive::RestoreOk ? block : nullptr;
}

Result ArchiveStreamliner::StreamlineI(Request const& request)
{
    return RunInTurn([&](bool& suspended) { return StreamlineFrame(request, suspended); });
}

// Offlining reads the blocks that are about to move, so it is stopped, and goes on when it is known where they lie.
Result ArchiveStreamliner::StreamlineFrame(Request const& request, bool& suspended)
{
    m_impl.WaitForOffliningToAbort();
    m_impl.m_doingStreamline.store(true);
    decltype(m_impl.m_offlineQueue) queue;
    u64 total = 0;
    u64 done = 0;
    Archive::OffliningState before{};
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        before = m_impl.GetOffliningState();
        m_impl.SetOffliningState(Archive::OffliningNotStarted);
        queue.swap(m_impl.m_offlineQueue);
        std::swap(total, m_impl.m_offlineTotal);
        std::swap(done, m_impl.m_offlineDone);
        m_master = m_impl.m_master;
        ++m_impl.m_runningStreamlines;
    }
    m_request = &request;
    Result result = Archive::StreamlineFailed;
    std::exception_ptr failure;
    try {
        result = StreamlineInner(suspended);
    } catch (std::bad_alloc const&) {
    } catch (...) {
        // The host's own, out of its progress object.
        failure = std::current_exception();
    }
    m_newFile = nullptr;
    bool const masterOpen = m_master && m_master->GetStream();
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        --m_impl.m_runningStreamlines;
        bool const startedMeanwhile = m_impl.GetOffliningState() != Archive::OffliningNotStarted;
        if (result == Archive::StreamlineDone) {
            if (before != Archive::OffliningNotStarted || startedMeanwhile) m_impl.GoOnOffliningCS(true);
        } else if (!startedMeanwhile && masterOpen && before != Archive::OffliningNotStarted) {
            m_impl.SetOffliningState(before);
            m_impl.m_offlineQueue.swap(queue);
            m_impl.m_offlineTotal = total;
            m_impl.m_offlineDone = done;
            m_impl.GoOnOffliningCS(false);
        }
    }
    m_master = nullptr;
    m_impl.CloseFilesIfUnused();
    m_impl.m_doingStreamline.store(false);
    if (failure) std::rethrow_exception(failure);
    return result;
}

Result ArchiveStreamliner::StreamlineInner(bool& suspended)
{
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        if (!m_master || m_master->m_readOnly || m_master->m_readOnlyFallback) return Archive::StreamlineFailed;
        // One whose replacement failed half way has no tables left: that nothing needs doing would not be true.
        if (m_master->m_bad) return Archive::StreamlineFailed;
        if (m_master->m_path.IsEmpty()) return Archive::StreamlineFailed;
    }
    if (!RequiresStreamliningCS()) return Archive::StreamlineDone;

    Access const access = BeginAccess(m_impl.m_self.CreateExclusiveAccessBlockAdorner(), true, suspended);
    if (!access) return Archive::StreamlineNoAccess;
    // A handle that was opened afresh may show that somebody else has saved: his work is not to be replaced by ours.
    if (!m_impl.HasHeldInfo(*m_master)) {
        CriticalSectionScope const lock(m_impl.m_accessLock);
        m_impl.m_lastRestore = Archive::RestoreNotTheFile;
        return Archive::StreamlineNoAccess;
    }
    ArchiveReadersOff const readersOff(m_impl);
    if (!readersOff.IsClosed()) return Archive::StreamlineFailed;

    m_newFile = MakeFile(m_master->m_saveCount + 1);
    m_newFile->m_path = m_master->m_path;
    bool overwrite = m_impl.m_alwaysOverwrite.load();
    {
        CriticalSectionScope const lock(m_master->m_lock);
        if (m_master->m_stream && m_master->m_stream->GetReferenceCount() > 1) {
            Trace(Format("Archive::StreamlineInner - the file handle is held open by multiple ref-counts: %1\n",
                         m_master->m_path));
            overwrite = true;
        }
    }
    if (!overwrite) {
        auto const [finished, result] = StreamlineReplacement();
        if (finished) return result;
    }
    return StreamlineToTempAndOverwrite();
}

} // namespace Kernel

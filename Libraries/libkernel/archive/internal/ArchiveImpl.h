#pragma once

#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveErrorCallback.h"
#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/archive/ArchiveSession.h"
#include "libkernel/archive/internal/ArchiveFile.h"
#include "libkernel/archive/internal/ArchiveFileMaps.h"
#include "libkernel/archive/internal/ArchiveFormat.h"
#include "libkernel/archive/internal/ArchiveLocks.h"
#include "libkernel/concurrency/MultiSemaphore.h"
#include "libkernel/concurrency/Semaphore.h"
#include "libkernel/concurrency/ThreadId.h"
#include "libkernel/streams/File.h"

#include <map>
#include <unordered_map>

namespace Kernel {

/// A path count: the highest index handed out for generated paths with one prefix and suffix.
struct ArchivePathCount
{
    u64 counter = 0;
    u8 dirty = 0; // 0 clean, 1 changed since last written, 2 written by an incremental revision.
};
using ArchivePathCounts = std::map<std::pair<String8, String8>, ArchivePathCount>;
using ArchiveRevisionMap = std::unordered_map<FileStoreRevision const*, Archive::Revision*>;

/// What is built up while the files of an archive are read; ArchiveLoader.cpp fills it.
struct ArchiveLoadData
{
    ArchivePathMap paths;
    std::vector<Counted<Archive::Revision>> revisions; // Oldest first.
    ArchivePathCounts pathCounts;
    ArchiveFilesByUID files;
    u32 nextFreeUID = 1;
    bool testLink = false; // The next file must be in the state that the link names.
    bool hasLink = false;
    String8 linkPath;
    TimeStamp linkSaveTimeStamp;
    u32 linkSaveCount = 0;
    bool contradicts = false; // Two tables name one file differently.
};

/// Bytes at a position, from whatever an archive is read out of.
class ArchiveSource
{
public:
    virtual ~ArchiveSource();
    /// Bytes read, fewer at the end or after a failure.
    virtual u64 ReadAt(u64 position, void* to, u64 count) = 0;
    virtual u64 GetSize() = 0;
};

/// Reads files into load data. Every length is held against the size of the file before anything is made from it.
class ArchiveLoader
{
public:
    /// Reads header, info, guard, link, reference path and the chain of tables of @p file, whose stream is open.
    static Archive::OpenResult LoadArchiveFile(Archive::ArchiveFile& file, IDTag tag, ArchiveLoadData& data);
    /// Sets the histories of all files from the revisions, which must be complete, and numbers the revisions from 1.
    static void LinkHistories(ArchiveLoadData& data);
    /// Walks the headers only.
    static Archive::OpenResult TestArchive(ArchiveSource& source, IDTag tag, Archive::ArchiveHdr* header,
                                           Archive::ArchiveInfo* info);

    /// What lies before the blocks of a file.
    struct Front
    {
        Archive::ArchiveHdr header;
        Archive::ArchiveInfo info;
        u32 writeCounter = 0;
        TimeStamp linkSaveTimeStamp;
        u32 linkSaveCount = 0;
        String8 linkPath;
        String8 referencePath;
        u64 contentPos = 0;        ///< Where the first block may lie.
        bool infoDamaged = false;  ///< The info block is unreadable; its fields are 0.
        bool guardIsBlock = false; ///< A file that was of version 7 once has its first block in the place of the guard.

        bool HasLink() const { return header.flags & ArchiveFormat::c_flagLink; }
        bool HasReference() const { return header.flags & ArchiveFormat::c_flagReference; }
        u64 GetFirstBlockPos() const { return guardIsBlock ? ArchiveFormat::c_guardPos : contentPos; }
    };
    /// Reads it. @p expectedLink, if not null, is the link through which the file was reached. With @p tolerant a
    /// damaged info block or guard is no failure.
    static Archive::OpenResult ReadFront(ArchiveSource& source, IDTag tag, ArchiveLoadData const* expectedLink,
                                         Front& front, bool tolerant = false);
    /// True if a file with that info block is in the one state that the link in @p link names.
    static bool IsLinkedState(ArchiveSource& source, Archive::ArchiveInfo const& info, ArchiveLoadData const& link);
    /// LoadArchiveFile for a file whose chain cannot be walked: the newest chain that a search of the file finds.
    static Archive::OpenResult RecoverArchiveFile(Archive::ArchiveFile& file, IDTag tag, ArchiveLoadData& data);
    /// Reads the table's header at @p position, and finds its kind.
    static Archive::OpenResult ReadFATHeader(ArchiveSource& source, u64 position, bool newest,
                                             ArchiveFormat::FATHeader& header, ArchiveFormat::FATKind const*& kind);

    /// The walk of LoadArchiveFile without the front: the chain of tables from @p position on. On a failure
    /// @p failedAt is the table that could not be read, or 0 where two tables contradict each other.
    static Archive::OpenResult LoadFATChain(ArchiveSource& source, Front const& front,
                                            Counted<Archive::ArchiveFile> const& file, ArchiveLoadData& data,
                                            u64 position, u32& highestUID, u64* failedAt = nullptr);
    /// Sets the fields of @p file and @p data that come from the front.
    static void TakeFront(Front const& front, Archive::ArchiveFile& file, ArchiveLoadData& data);
    /// Sets the end of the content, the next free identifier and the place of the thumbnails, raised from the tables;
    /// @p newest is null for a file without tables.
    static void TakeEnd(ArchiveSource& source, Front const& front, Archive::Revision const* newest, u32 highestUID,
                        Archive::ArchiveFile& file, ArchiveLoadData& data);

private:
    static Archive::OpenResult LoadBody(class ArchiveTableCursor& cursor, ArchiveFormat::FATHeader const& header,
                                        ArchiveFormat::FATKind const& kind, u64 firstBlockPos,
                                        Archive::Revision& revision, ArchiveLoadData& data, u32& highestUID);
};

/// A file as a source. Borrows the stream.
class ArchiveFileSource : public ArchiveSource
{
public:
    explicit ArchiveFileSource(FileInOutStream& stream) : m_stream(stream) {}
    u64 ReadAt(u64 position, void* to, u64 count) override;
    u64 GetSize() override;

private:
    FileInOutStream& m_stream;
};

/// All that an Archive holds, grouped by the lock that guards it, and the inner steps of its operations. Each group of
/// functions is defined in the source named.
struct ArchiveImpl
{
    ArchiveImpl(Archive& self, IDTag tag);
    ~ArchiveImpl();

    Archive& m_self;
    IDTag m_archiveUID;
    u64 const m_runtimeUID;
    Archive::AdornerFactory m_adornerFactory; // Set before the archive is handed out.

    // Session lock.
    CriticalSection m_sessionLock{c_rankSession};
    int m_runningStreamlines = 0;

    // Access lock.
    mutable CriticalSection m_accessLock{c_rankAccess};
    bool m_keepOpen = true;
    u32 m_accessCount = 0;
    u32 m_accessOverride = 0;
    u32 m_writeBlocks = 0;           // Access blocks whose adorner wants write access.
    bool m_wantsWriteAccess = false; // There are such.
    Archive::AccessBlock* m_exclusiveBlock = nullptr;
    bool m_suspended = false;
    Counted<MultiSemaphore> m_exclusiveWait; // Waiters for an exclusive block to end; null when there is none.
    Counted<MultiSemaphore> m_suspendWait;   // All access waits here while suspended.
    Counted<Semaphore> m_suspenderWait;      // Suspend waits here for the access count to fall.
    u32 m_waitingSuspenders = 0;
    Archive::RestoreResult m_lastRestore = Archive::RestoreOk;

    // State lock.
    mutable CriticalSection m_stateLock{c_rankState};
    Counted<Archive::ArchiveFile> m_master;  // Null only for an archive that is just a scratch file.
    Counted<Archive::ArchiveFile> m_scratch; // Null for none.
    u64 m_rewindCount = 0;
    ArchivePathMap m_paths;
    std::vector<Counted<Archive::Revision>> m_revisions; // Oldest first, the master's before the scratch file's.
    // Dropped by a roll down. As long as a reader holds one, its bytes stay: the scratch file goes on behind them.
    std::vector<Counted<Archive::Revision>> m_staleScratch;
    ArchivePathCounts m_pathCounts;
    u32 m_nextFreeUID = 1;
    ArchiveSession* m_activeSession = nullptr; // Changes under the session lock and the state lock both.
    u32 m_readerCount = 0;
    bool m_readInProgress = false;
    u32 m_openInStreams = 0;
    u32 m_readsInside = 0;              // Threads in a read gate; see ArchiveReadGate.
    Counted<MultiSemaphore> m_gateWait; // Where they wait while a streamline keeps the gate closed; null while open.
    ThreadId m_gateOwner{nullptr};      // The streamline's thread, which passes.
    Counted<Archive::OffliningUpdater> m_updater;
    std::unordered_map<Archive::FileInfo const*, Counted<Archive::Revision>> m_offlineQueue;
    u64 m_offlineTotal = 0;
    u64 m_offlineDone = 0;
    Counted<Semaphore> m_offlineWake;
    u64 m_nextRevisionOrder = 1;
    ArchiveRevisionMap m_revisionsByAddress; // Those of m_revisions.

    std::atomic<bool> m_offlineAbort{false}; // Asks the offlining job to end.
    std::atomic<bool> m_doingStreamline{false};
    std::atomic<bool> m_alwaysOverwrite{false}; // Streamlining never moves a file over the master.

    // Leaf lock.
    mutable CriticalSectionSpin m_flagsLock{c_rankLeaf};
    bool m_broken = false;
    Archive::OffliningState m_offliningState = Archive::OffliningNotStarted;
    Counted<ArchiveErrorCallback> m_errorCallback;

    // ArchiveOpen.cpp
    static Counted<Archive> MakeArchive(IDTag tag);
    static void Register(ArchiveImpl& impl);
    static void Unregister(ArchiveImpl& impl);
    static std::vector<Counted<Archive>> GetAll();
    /// With @p asScratch a file that turns out to have no master goes to the scratch slot. After a failure the archive
    /// is as it was.
    Archive::OpenResult InitArchive(String8 path, Archive::OpenMode mode, Counted<FileInOutStream> stream,
                                    Counted<ArchiveReferenceInfo> const& referenceInfo, bool asScratch = false,
                                    bool recover = false);
    void TakeOver(ArchiveLoadData& data, Counted<Archive::ArchiveFile> master, Counted<Archive::ArchiveFile> scratch);
    /// Moves the only file of an archive that nobody else knows yet to the scratch slot.
    void MakeJustScratch();
    static Archive::OpenResult MapOpenResult(File::OpenUnmanagedResult result, bool linked);
    static Archive::OpenResult TestForReadOnlyArchive(String8 const& path, IDTag tag);

    // ArchiveCreate.cpp
    static Archive::CreateResult::Code MapCreateResult(File::OpenUnmanagedResult result);
    /// Writes the fresh bytes to @p file's stream and sets its fields.
    bool WriteFreshFile(Archive::ArchiveFile& file, ArchiveFormat::FreshFile& fresh);
    static Counted<Archive> CreatePlain(String8 const& path, IDTag tag,
                                        Counted<ArchiveReferenceInfo> const& referenceInfo,
                                        Archive::CreateResult& result);
    static Counted<Archive> CreateWithTemporaryInner(String8 const& path, IDTag tag, Archive::CreateResult& result,
                                                     Archive::MarshalledFileAccess const* marshalled, bool adjacent);
    static Counted<Archive> CreateTemporaryArchiveInner(String8 const& target, IDTag tag, Archive::CreateResult& result,
                                                        Archive::MarshalledFileAccess const* marshalled, bool adjacent,
                                                        Counted<FileInOutStream> const& targetStream);
    /// Sets the fields that the bytes of @p fresh stand for, once those have been written. Takes the file's lock and
    /// the state lock.
    void SetFreshFields(Archive::ArchiveFile& file, ArchiveFormat::FreshFile const& fresh);
    /// Ties the scratch file to the present state of @p master, with no revision of its own. False, and the archive
    /// goes on without a scratch file, if that fails.
    bool ResetScratch(Archive::ArchiveFile const& master, u32 nextFreeUID);

    // ArchiveMoveTemporary.cpp
    /// Moves a committed temporary over its target and reopens it there. The caller holds the session lock.
    void MoveTemporary(Archive::ArchiveFile& file);
    /// A name beside @p path at which nothing stands; empty to go without a backup, on a volume that cannot be written
    /// to and after @p maxFailures names that could not be tried. ArchiveStreamlineReplace.cpp
    static String8 FindBackupName(String8 const& path, int maxFailures);

    // ArchiveAccess.cpp. The caller holds the access lock where the name ends in CS.
    Archive::RestoreResult OpenFileHandleCS(bool& reopened, bool force, bool ignoreFailure);
    void CloseFilesCS();
    /// Closes the files if nobody needs them: keep-open is off, the count is 0 and offlining does not run.
    void CloseFilesIfUnusedCS();
    /// Waits while suspended, counts one access and opens the handle. False, with nothing counted, if that fails.
    bool GuaranteeFileHandle();
    /// The same for who holds a lock, with which nobody may wait: false, and that told, while suspended.
    bool TryGuaranteeFileHandle(bool& suspended);
    void DecrementAccessCount();
    void WaitWhileSuspended();
    void SignalSuspenderCS();
    /// Closes the files and holds access back, unless somebody uses them.
    bool TrySuspendCS();
    void EndAccessBlock(Archive::AccessBlock const& block);
    /// A block that holds off new sessions for as long as it lives; null if there is one already or it is refused.
    Counted<Archive::AccessBlock> CreateExclusiveAccessBlock();
    Archive::RestoreResult OpenOneFileCS(Archive::ArchiveFile& file, bool& reopened);
    bool FitsWhatIsHeld(Archive::ArchiveFile& file);
    /// Notes @p e's damage to the file: any reason but out of space marks it bad while offlining is complete.
    [[noreturn]] void ThrowFileException(Archive::ArchiveFile const& file, ArchiveFileException::Reason reason);

    // ArchiveRead.cpp. The caller holds the state lock where the name ends in CS.
    Archive::Revision* GetWorkingRevisionCS() const; // Null when there is none.
    Archive::FileInfo* FindFileInfoCS(String8 const& path) const;
    /// The newest entry at or before @p revision; null if there is none. A deletion is returned as it is.
    Archive::FileRevision* FindEntryCS(Archive::FileInfo const& info, Archive::Revision const& revision,
                                       Archive::Revision** where = nullptr) const;
    /// The newest entry of all, or null.
    Archive::FileRevision* FindHeadEntryCS(Archive::FileInfo const& info, Archive::Revision** where = nullptr) const;
    /// Null if @p revision is not one of this archive's.
    Archive::Revision* AsRevisionCS(NonCounted<FileStoreRevision const> revision) const;
    /// The revision as one of this archive's, or null.
    Counted<Archive::Revision const> FindRevision(NonCounted<FileStoreRevision const> revision) const;
    /// The item is loaded outside @p gate, which the caller entered before the look-up.
    bool LoadFileI(Archive::FileRevision const& entry, Archive::Revision const& revision, FileStoreItem& item,
                   bool reportToCallback, class ArchiveReadGate& gate);
    enum class InStreamResult
    {
        Success = 0,
        Failure = 1,
        Corrupt = 2
    };
    Counted<InStream> CreateInStream(Counted<Archive::Revision const> const& revision,
                                     Archive::FileRevision const& entry, InStreamResult& result);
    void CloseInStream();
    using BlockCheck = Archive::BlockCheck;
    BlockCheck CheckBlockTag(Archive::ArchiveFile& file, Archive::FileRevision const& entry) const;
    BlockCheck CheckStoredBytes(Archive::ArchiveFile& file, Archive::FileRevision const& entry);
    BlockCheck CheckUnpacked(Archive::ArchiveFile& file, Archive::FileRevision const& entry);
    /// The whole file to memory, checked. False if anything is wrong; @p data is then unchanged.
    bool ReadEntry(Archive::ArchiveFile& file, Archive::FileRevision const& entry, RawDataBlock& data);
    static bool ReadEntryI(FileInOutStream& stream, Archive::FileRevision const& entry, RawDataBlock& data);
    /// Sets the broken flag; then either tells the callback, if asked to and there is one, or throws.
    void ReportCorruption(bool reportToCallback);

    // ArchiveMigrate.cpp
    /// A session or a streamline is at work. The caller holds the session lock.
    bool IsBusyCSSession() const;

    // ArchiveBackData.cpp
    /// Makes the process-wide store of buckets if it is not there yet.
    static void EnsureBucketStore();
    /// Puts a finished copy into the entry; gives the one that stands there from now on.
    Counted<FileStoreBackData const> PublishBackData(Archive::Revision& revision, Archive::FileInfo const& info,
                                                     Counted<FileStoreBackData const> const& copy);

    // ArchiveOfflining.cpp
    void CreateOfflineQueueCS();
    void StartOfflineThreadCS();
    /// Begins again after what had stopped it, with a new queue if @p afresh. Without memory offlining has failed.
    void GoOnOffliningCS(bool afresh) noexcept;
    void OffliningProc();
    void ResumeOfflining();
    /// Lets paused offlining go on unless a reader or a session is at work.
    void ResumeOffliningIfNoReader();
    void WaitForOffliningToPause();
    void WaitForOffliningToAbort();
    Archive::OffliningState GetOffliningState() const;
    void SetOffliningState(Archive::OffliningState state);
    void EndOfflining(Archive::OffliningState state, int failure);
    /// Copies one file. False if it failed or was aborted.
    bool OfflineOne(Archive::FileRevision const& entry, Counted<Archive::Revision> const& revision);
    bool HasMaster() const;
    /// Asks the jobs of all archives to end, and waits for them.
    static void StopAllOfflining();
    void CloseFilesIfUnused();

    // ArchiveSession*.cpp, ArchiveCommit.cpp
    Archive::CreateSessionResult CreateSessionI(ArchiveSessionHandle& handle, Archive::SessionType type,
                                                Archive::ArchiveChoice choice, bool const* abort,
                                                bool skipExclusiveWait);
    /// One try. With @p mustWait the result means nothing: access is held back, by a suspension or by an exclusive
    /// block unless @p ignoreExclusive, and the caller waits without locks.
    Archive::CreateSessionResult TryCreateSession(ArchiveSessionHandle& handle, Archive::SessionType type,
                                                  Archive::ArchiveChoice choice, bool const* abort,
                                                  bool ignoreExclusive, bool& mustWait);
    /// Where a session on the file begins to write.
    u64 FindSessionStart(Archive::ArchiveFile const& file);
    /// Opens the session's file and passes its write guard; false with the cause in m_lastRestore.
    bool OpenForSession(Archive::ArchiveFile& file);
    /// The info block on disk is the one this archive read or wrote last.
    bool HasHeldInfo(Archive::ArchiveFile& file) const;
    /// And it leads to the tables that the archive holds: not where these had to be recovered.
    bool ShowsItself(Archive::ArchiveFile& file) const;
    /// Compares the guard with what this archive left there, and steps it.
    enum class GuardResult
    {
        Ok,
        WrongTag,
        WrongCounter,
        Unreadable,
        Unwritable
    };
    GuardResult PassWriteGuard(Archive::ArchiveFile& file, bool acceptBlockTag);
    /// Commits, or finds that there is nothing to commit. The caller holds the session lock.
    void FinaliseActiveSessionCS(ArchiveSession& session, bool updateTimestamps);
    /// Lets go of a session without a commit.
    void DropSession(ArchiveSession* session);
};

/// Guaranteed access to the files for a scope: one access counted and the handle open, unless IsOpen says no.
class ArchiveAccessScope
{
public:
    explicit ArchiveAccessScope(ArchiveImpl& impl) : m_impl(impl), m_open(impl.GuaranteeFileHandle()) {}
    ArchiveAccessScope(ArchiveImpl& impl, bool& suspended)
        : m_impl(impl), m_open(impl.TryGuaranteeFileHandle(suspended))
    {
    }
    ArchiveAccessScope(ArchiveAccessScope const&) = delete;
    ArchiveAccessScope& operator=(ArchiveAccessScope const&) = delete;
    ~ArchiveAccessScope()
    {
        if (m_open) m_impl.DecrementAccessCount();
    }
    bool IsOpen() const { return m_open; }

private:
    ArchiveImpl& m_impl;
    bool const m_open;
};

/// One access counted for a scope, whether or not the files are open: no suspension begins and no file is closed.
class ArchiveAccessCountScope
{
public:
    explicit ArchiveAccessCountScope(ArchiveImpl& impl) : m_impl(impl)
    {
        CriticalSectionScope const lock(impl.m_accessLock);
        ++impl.m_accessCount;
    }
    ArchiveAccessCountScope(ArchiveAccessCountScope const&) = delete;
    ArchiveAccessCountScope& operator=(ArchiveAccessCountScope const&) = delete;
    ~ArchiveAccessCountScope() { m_impl.DecrementAccessCount(); }

private:
    ArchiveImpl& m_impl;
};

/// A reader at work: offlining keeps off the disk while one lives.
class ArchiveReadCounterScope
{
public:
    explicit ArchiveReadCounterScope(Counted<Archive> archive, ArchiveImpl& impl);
    ArchiveReadCounterScope(ArchiveReadCounterScope const&) = delete;
    ArchiveReadCounterScope& operator=(ArchiveReadCounterScope const&) = delete;
    virtual ~ArchiveReadCounterScope();

private:
    Counted<Archive> const m_archive;
    ArchiveImpl& m_impl;
};

} // namespace Kernel

#pragma once

#include "libkernel/archive/ArchiveCreateResult.h"
#include "libkernel/archive/ArchiveReferenceInfo.h"
#include "libkernel/concurrency/TimeStamp.h"
#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/RawData.h"
#include "libkernel/core/String.h"
#include "libkernel/filestore/FileStore.h"

#include <functional>
#include <memory>
#include <set>
#include <vector>

namespace Kernel {

class ArchiveErrorCallback;
class ArchiveSession;
class ArchiveSessionHandle;
class ArchiveStreamlineProgress;
class ArchiveThumbnails;
class InStream;
class InStreamSeekable;
class OutStream;
struct ArchiveImpl;

/// The document container on disk: a file store over one append-only master file and, optionally, a scratch file beside
/// it that holds what was saved since the master was last saved. Docs/formats has the bytes.
///
/// A save appends and then makes itself live by rewriting one record of 52 bytes, so a crash at any moment leaves the
/// last committed state. Saves are sessions: see ArchiveSession.
///
/// Any thread may read, query and load; at most one session exists at a time. Objects are made by the static functions
/// only, which give null on failure with the reason in an out-parameter. A file of format version 7 has no write guard
/// block: its first save makes it version 11, and later sessions on it get SessionFileUnusable until it is rewritten.
class KERNEL_API Archive : public FileStore
{
public:
    class ArchiveFile; // The disk files themselves are the archive's own.
    class FileInfo;
    class Revision;
    struct FileRevision;
    class AccessBlock;
    class AccessBlockAdorner;
    class OffliningUpdater;
    struct StreamlineData; // What a streamline has written: the archive's own.

    enum OpenMode
    {
        OpenModeReadWrite = 0,           ///< Read-write or fail.
        OpenModeReadOnly = 1,            ///< Read-only, shared with everybody.
        OpenModeReadWriteOrReadOnly = 2, ///< Read-write, read-only when that is refused.
        OpenModeCoordinated = 3          ///< Read-write now; reopened so only while the adorner asks for it.
    };

    enum OpenResult
    {
        OpenOk = 0,
        OpenBadPath = 1,
        OpenNotFound = 2, ///< Not there, or an error that no other value names.
        OpenIOError = 3,
        OpenInUse = 4,
        OpenLinkedNotFound = 5,
        OpenLinkMismatch = 6, ///< The master is not in the state that the scratch file belongs to.
        OpenReadOnlyArchive = 7,
        OpenNotArchive = 8,
        OpenTooOld = 9,
        OpenTooNew = 10,
        OpenWrongType = 11,
        OpenCorrupt = 12,
        OpenBadInfo = 13,
        OpenTruncated = 14,
        OpenNoMemory = 15,
        OpenNoTemporary = 16, ///< A throw-away archive's temporary file could not be made or filled.
        OpenAccessDenied = 17,
        OpenLinkedAccessDenied = 18,
        OpenLocked = 19,
        OpenLinkedLocked = 20,
        OpenNotPermitted = 21,
        OpenReadOnlyVolume = 22,
        OpenTimedOut = 23,
        OpenRefused = 24,
        OpenMoveFailed = 25,
        OpenIsDirectory = 26,
        OpenTooManyFiles = 27,
        OpenTooLarge = 28,
        OpenNoSpace = 29,
        OpenNotSupported = 30,
        OpenUnknownError = 31
    };

    using CreateResult = ArchiveCreateResult;

    /// What a reopening of the file handle found.
    enum RestoreResult
    {
        RestoreOk = 0,
        RestoreNotFound = 5,
        RestoreAccessDenied = 6,
        RestoreNotPermitted = 7,
        RestoreLocked = 8,
        RestoreTimedOut = 9,
        RestoreRefused = 10,
        RestoreReadOnlyVolume = 11,
        RestoreNotTheFile = 12, ///< Header, info block or write guard block do not fit what was open before.
        RestoreGuardUnreadable = 13,
        RestoreGuardUnwritable = 14,
        RestoreOther = 19
    };

    enum RevisionTag : u8
    {
        RevisionTagFull = 0,
        RevisionTagIncremental = 1,
        RevisionTagStreamlined = 2
    };

    /// Which items a session writes, and in which state they are afterwards.
    enum SessionType
    {
        SessionTypeFull = 0,        ///< Items that have changed; clean afterwards.
        SessionTypeIncremental = 1, ///< Items that no incremental revision holds; incremental afterwards.
        SessionTypeRewrite = 2,     ///< All items offered; clean afterwards.
        SessionTypeExport = 3       ///< All items offered; no object is told.
    };

    enum CreateSessionResult
    {
        SessionOk = 0,
        SessionHandleInUse = 1,
        SessionNotAtHead = 2,
        SessionActive = 3,
        SessionFileBad = 4,
        SessionNoMaster = 5,
        SessionNoScratch = 6,
        SessionReadOnly = 7, ///< Not asked of a scratch session.
        SessionMoved = 8,
        SessionFileUnusable = 9, ///< GetLastRestoreResult has the cause.
        SessionNoMemory = 10     ///< Or no access block could be had.
    };

    enum ArchiveChoice
    {
        ChoiceMaster = 0,
        ChoiceScratch = 1,
        ChoiceNone = 2
    };

    enum OffliningState
    {
        OffliningNotStarted = 0,
        OffliningRunning = 1,
        OffliningPaused = 2,
        OffliningComplete = 3, ///< All data is held outside the file.
        OffliningAborted = 4,
        OffliningFailed = 5
    };

    enum MigrateResult
    {
        MigrateDone = 0,
        MigrateEmptyPath = 1,
        MigrateNoScratch = 2,
        MigrateBusy = 3,
        MigrateMoveFailed = 4, ///< The file was reopened at its old place.
        MigrateTemporaryTarget = 5,
        MigrateLost = 6 ///< The move failed and the file cannot be reopened.
    };

    enum ExternalUpdateResult
    {
        ExternalUpdateDone = 0,
        ExternalUpdateAlreadyPrepared = 1,
        ExternalUpdateBusy = 2,
        ExternalUpdateNoMaster = 3 ///< Or it has a temporary target.
    };

    enum CaptureResult
    {
        CaptureDone = 0,
        CaptureNoAccess = 1,
        CaptureFailed = 2 ///< Or there is a scratch file.
    };

    enum ConvertToThrowAwayResult
    {
        ConvertDone = 0,
        ConvertNoAccess = 1,
        ConvertFailed = 2,
        ConvertNoMemory = 3
    };

    enum StreamlineResult
    {
        StreamlineDone = 0, ///< Or nothing needed doing.
        StreamlineAborted = 1,
        StreamlineFailed = 2,     ///< A session or stream is active, no master, read-only, a bad block, ...
        StreamlineNotCreated = 3, ///< The new file could not be created.
        StreamlineNoAccess = 4,   ///< The file cannot be had, is no longer the one that was opened, or a write failed.
        StreamlineNotVerified = 6,
        StreamlineOverwriteFailed = 7, ///< The temporary stays: it is the only whole copy.
        StreamlineNoSpace = 8          ///< The same, for lack of space.
    };

    /// What a check of the files against the archive's own tables found.
    enum VerifyResult
    {
        VerifyMatch = 0,
        VerifyNotRun = 1,  ///< There is no memory, or the files cannot be had.
        VerifyMismatch = 2 ///< The files have been shunted.
    };

    /// What a scratch file says about its master, read without opening an archive.
    struct LinkInfo
    {
        String8 linkPath;
        String8 referencePath;
        bool isEmpty = false; ///< The file has no revision.
        bool isMidStreamline = false;
    };

    /// Where a temporary goes when the host has to choose the place.
    struct MarshalledFileAccess
    {
        String8 path;       ///< Empty: the library chooses.
        String8 backupPath; ///< Where the replaced file goes; empty for none or a name of the library's own.
        bool keepBackup = false;
    };

    /// The fields of one of the two files, for people who inspect documents.
    struct FileState
    {
        String8 path;
        u16 fileVersion = 0;
        u16 flags = 0;
        u64 firstFAT = 0;
        u64 fileEnd = 0;
        u64 totalBytes = 0;
        u64 deadBytes = 0;
        TimeStamp saveTimeStamp;
        u32 saveCount = 0;
        u32 nextFreeUID = 0;
        u32 writeCounter = 0;
        u64 thumbnailsPos = 0;
        bool hasLink = false;
        String8 linkPath;
        TimeStamp linkSaveTimeStamp;
        u32 linkSaveCount = 0;
        bool hasReferencePath = false;
        String8 referencePath;
    };

    /// The header and the info block as they lie in a file, decoded.
    struct ArchiveHdr
    {
        u16 fileVersion = 0;
        u16 flags = 0;
        IDTag archiveUID;
    };
    struct ArchiveInfo
    {
        u64 firstFAT = 0;
        u64 fileEnd = 0;
        u64 totalBytes = 0;
        u64 deadBytes = 0;
        TimeStamp saveTimeStamp;
        u32 saveCount = 0;
        u32 nextFreeUID = 0;
    };

    /// What a check of one stored block found.
    enum class BlockCheck
    {
        Ok = 0,
        Unreadable = 1,   ///< The file could not be read there.
        BadTag = 2,       ///< No block lies there, or its terminator is missing.
        BadStoredCRC = 3, ///< The stored bytes are not those that were written.
        BadData = 4,      ///< The bytes do not unpack to the size that is recorded.
        BadCRC = 5        ///< They unpack, to other bytes than were written.
    };

    /// A file that a salvage had to leave behind.
    struct LostFile
    {
        String8 path;
        BlockCheck problem = BlockCheck::Ok;
    };

    /// Makes an adorner for each access block; the flags are exclusive and upgradeable.
    using AdornerFactory = std::function<Counted<AccessBlockAdorner>(bool exclusive, bool upgradeable)>;

    // Opening. The tag is the expected kind of document; IDTag() accepts any.

    /// Opens @p path and, if it is a scratch file, the master that it names.
    static Counted<Archive> Open(String8 const& path, OpenMode mode, IDTag tag, OpenResult& result);
    /// The same; with a reference, the file at @p path is the scratch file of that reference, which is stored in it.
    static Counted<Archive> Open(String8 const& path, OpenMode mode, IDTag tag, OpenResult& result,
                                 AdornerFactory adornerFactory, Counted<ArchiveReferenceInfo> const& referenceInfo);
    /// Opens for reading and writing; a file without a link becomes the scratch file of an archive that has no master.
    static Counted<Archive> OpenAsScratch(String8 const& path, IDTag tag, OpenResult& result);
    /// Works on a copy of the data in a temporary file. A file with a link gives OpenLinkedNotFound.
    static Counted<Archive> OpenAsThrowaway(InStream& in, u64 size, IDTag tag, OpenResult& result);
    static Counted<Archive> OpenAsThrowaway(FragmentedRawData const& data, IDTag tag, OpenResult& result);
    /// Moves a file, or writes a block, to @p to and opens it there for reading and writing.
    static Counted<Archive> OpenMigrate(String8 const& from, String8 const& to, IDTag tag, OpenResult& result);
    static Counted<Archive> OpenMigrate(void const* data, u64 size, String8 const& to, IDTag tag, OpenResult& result);
    /// The same as OpenAsScratch does it, with an optional reference.
    static Counted<Archive> OpenMigrateAsScratch(String8 const& from, String8 const& to, IDTag tag,
                                                 Counted<ArchiveReferenceInfo> const& referenceInfo,
                                                 OpenResult& result);
    static Counted<Archive> OpenMigrateAsScratch(void const* data, u64 size, String8 const& to, IDTag tag,
                                                 Counted<ArchiveReferenceInfo> const& referenceInfo,
                                                 OpenResult& result);

    /// Opens as Open does, and where the chain of tables cannot be walked or the info block is damaged, at the newest
    /// state that a search of the file finds. At most what was saved behind that state is lost. Nothing is written; the
    /// next save makes the state lasting. A master that is reached through a scratch file must be in the state that
    /// the scratch file names: one that has to be searched gives OpenCorrupt, and can be recovered by its own path.
    /// Tables of a later version are no damage: they give OpenTooNew, as the next save would lose them.
    static Counted<Archive> RecoverArchive(String8 const& path, OpenMode mode, IDTag tag, OpenResult& result);

    /// Walks header, info block, guard and the chain of tables without making an archive. Both outputs may be null.
    static OpenResult TestArchive(InStreamSeekable& in, IDTag tag, ArchiveHdr* header, ArchiveInfo* info);
    /// The kind of document at @p path, from its first 12 bytes.
    static OpenResult GetArchiveUID(String8 const& path, IDTag& tag);
    /// Reads a file's link without opening an archive; @p followLinks goes to the end of the chain first.
    static OpenResult TestForScratchLinkAndReferenceInfo(String8 const& path, bool followLinks, LinkInfo& info);
    /// True if every link from @p path on names a master that is there and in the state named.
    static bool VerifyLinks(String8 const& path);

    // Creating.

    static Counted<Archive> Create(String8 const& path, IDTag tag, CreateResult& result);
    static Counted<Archive> Create(String8 const& path, IDTag tag, CreateResult& result, AdornerFactory adornerFactory);
    /// A scratch file that has no master yet. @p referenceInfo may be null.
    static Counted<Archive> CreateAsScratch(String8 const& path, IDTag tag,
                                            Counted<ArchiveReferenceInfo> const& referenceInfo, CreateResult& result);
    /// In a temporary file that goes with the archive.
    static Counted<Archive> CreateAsThrowAway(IDTag tag, CreateResult& result);
    /// In a temporary file, in the temporary folder or beside the target; the first commit moves it over @p path, which
    /// stays reserved until then.
    static Counted<Archive> CreateWithTemporary(String8 const& path, IDTag tag, CreateResult& result);
    static Counted<Archive> CreateWithAdjacentTemporary(String8 const& path, IDTag tag, CreateResult& result,
                                                        MarshalledFileAccess const& marshalled);
    /// A new archive whose target is this archive's master; it takes over the file handle.
    Counted<Archive> CreateReplacementWithTemporary(CreateResult& result, MarshalledFileAccess const& marshalled);
    /// Creates a scratch file for this open master.
    bool AddScratchFile(String8 const& path, CreateResult& result);

    // State.

    IDTag GetArchiveIDTag() const;
    /// Unique in this process; the first archive has 1.
    u64 GetArchiveRuntimeUID() const;
    String8 GetArchivePath() const;
    String8 GetScratchPath() const;
    bool MainFileHasPath() const;
    bool HasScratchFile() const;
    bool IsJustScratchFile() const;
    bool HaveScratchRevisions() const;
    bool IsThrowAway() const;
    /// No revision in either file.
    bool IsEmpty() const;
    bool IsReadOnly() const;
    bool IsBroken() const override;
    bool IsCorrupted() const;
    bool IsDead() const;
    bool IsMainFileDead() const;
    RestoreResult GetLastRestoreResult() const;
    /// Forgets the failure for which the files could not be opened again, and opens them unless they are not kept open
    /// and @p openAnyway is false. On success the files count as good again. Waits for a suspension to end. What a
    /// streamline has left half way is not mended so: RestoreNotTheFile.
    RestoreResult RecoverArchive(bool openAnyway);
    /// Outside a session: reads the file's read-only attribute again; true if it changed.
    bool CheckForReadOnlyChange();
    /// Reads header and info block afresh; true if they differ from those held.
    bool CheckForReplacedFile();
    bool UpdateModifiedTimestamp();
    /// Off: the handle is closed whenever nobody uses it, so that the file is free between accesses.
    void SetKeepOpen(bool keepOpen);
    bool GetKeepOpen() const;
    void SetErrorCallback(Counted<ArchiveErrorCallback> const& callback);
    void SetReferenceInfo(Counted<ArchiveReferenceInfo> const& info);
    Counted<ArchiveReferenceInfo> GetReferenceInfo() const;
    /// The fields of one file; false if the archive has no such file.
    bool GetFileState(ArchiveChoice which, FileState& state) const;

    // Access.

    /// Waits until nobody uses the files, closes them and holds all access back until Unsuspend. False if there is no
    /// master or a temporary target is held.
    bool Suspend();
    void Unsuspend();
    bool IsSuspended() const;
    /// A scope of guaranteed file access; null if the adorner refuses. A null adorner always succeeds.
    Counted<AccessBlock> CreateAccessBlock(Counted<AccessBlockAdorner> const& adorner);
    /// The same, waiting for a suspension to end and opening the files.
    Counted<AccessBlock> BeginAccessBlockAndOpenFileHandle(Counted<AccessBlockAdorner> const& adorner);
    Counted<AccessBlockAdorner> CreateAccessBlockAdorner() const;
    Counted<AccessBlockAdorner> CreateExclusiveAccessBlockAdorner() const;
    Counted<AccessBlockAdorner> CreateUpgradeableAccessBlockAdorner() const;
    bool IsInExclusiveAccessBlock() const;
    bool HaveAccessCount() const;
    u32 GetAccessCount() const;
    void IncrementAccessOverride();
    void DecrementAccessOverride();

    // Moving the files.

    MigrateResult MigratePrepare(String8 const& newPath);
    OpenResult MigrateRestore(String8 const& path);
    ExternalUpdateResult ExternalUpdatePrepare();
    bool ReadyForExternalUpdate() const;
    void ExternalUpdateChangePath(String8 const& path);
    bool ExternalUpdateRestore();
    bool ExternalUpdateRestore(String8 const& path);
    /// The master is gone for good: the archive goes on with its scratch file alone.
    bool ExternalUpdateRestoreToUnsaved();
    /// Moves the archive's single file into a temporary path and makes the archive throw-away.
    CaptureResult CaptureToThrowaway();
    /// Writes what the archive holds to a new temporary file, without history or thumbnails, and goes on with that. The
    /// old files stay on disk and are no longer the archive's. An archive that is throw-away already stays as it is.
    ConvertToThrowAwayResult ConvertToThrowAway();

    // Sessions. The abort flag may be null; another thread may set it at any time.

    bool CreateSession(ArchiveSessionHandle& handle, SessionType type, bool const* abort);
    bool CreateScratchSession(ArchiveSessionHandle& handle, SessionType type, bool const* abort);
    CreateSessionResult CreateSessionAdv(ArchiveSessionHandle& handle, SessionType type, bool const* abort,
                                         bool skipExclusiveWait);
    /// Only collects paths.
    bool CreateFileEnumerationSession(ArchiveSessionHandle& handle, bool const* abort);
    /// Commits and releases the session. Returns only when the save is on the device; a throw means that the last
    /// committed state stands, but for failures of the final move of a temporary.
    void CloseSession(ArchiveSessionHandle& handle, bool updateTimestamps);
    /// The same; then reads the tables of both files back and compares them with those in memory, before anybody else
    /// can save. After a mismatch @p report is the id under which the files were shunted, see SetShuntPath.
    VerifyResult CloseSessionAndVerifyFileState(ArchiveSessionHandle& handle, String8& report, bool updateTimestamps);

    // Reading. Paths are looked up at the working revision: the head, unless the archive has been rewound.

    bool LoadFile(String8 const& path, NonCounted<FileStoreRevision const> revision, FileStoreItem& item,
                  bool reportToCallback) override;
    bool LoadFile(String8 const& path, FileStoreItem& item) override;
    Counted<FileStoreBackData const> CreateBackData(NonCounted<FileStoreRevision const> revision,
                                                    String8 const& path) override;
    /// Null if there is no such file; ArchiveCorruptionException if its block is bad. The stream checks the CRC when
    /// its last byte has been delivered, throws MemoryException where it has none to unpack with, and keeps the archive
    /// alive.
    Counted<InStream> OpenFileInStream(String8 const& path);
    Counted<InStream> OpenFileInStream(String8 const& path, NonCounted<FileStoreRevision const> revision);
    /// The whole file, unpacked and checked; null or false if it is not there, damaged or too large for memory.
    Counted<RawDataMalloc> ReadFile(String8 const& path);
    bool ReadFile(String8 const& path, RawDataBlock& data);
    bool HasFile(String8 const& path) const;
    bool HasFileRevision(String8 const& path, NonCounted<FileStoreRevision const> revision) const;
    bool HasFileRevision(FileInfo const& info, NonCounted<FileStoreRevision const> revision) const;
    /// Every path with data, sorted.
    void GetFileList(std::vector<String8>& paths) const;
    Counted<FileInfo const> GetFileInfo(String8 const& path) const;
    Counted<Revision const> GetHeadRevisionForFile(String8 const& path) const;
    Counted<Revision const> GetHeadRevisionForFile(FileInfo const& info) const;
    u32 GetFileCodeBaseBuildIndex(String8 const& path) const;
    u32 GetFileCodeBaseBuildIndex(FileInfo const& info) const;
    /// The newest entry at the working revision and the revision that has it; false if there is no data.
    bool GetFileRevision(String8 const& path, FileRevision& entry, Counted<Revision const>& revision) const;
    /// True if the newest entry of a known path is a deletion.
    bool FileWasDeleted(String8 const& path) const;
    /// All revisions, oldest first, whatever the working revision is.
    void GetRevisions(std::vector<Counted<Revision const>>& revisions) const;
    /// Reads one stored block and checks its framing and both CRCs. Throws MemoryException or std::bad_alloc.
    BlockCheck CheckStoredBlock(Revision const& revision, FileRevision const& entry);
    u64 GetTotalBytes() const;
    u64 GetDeadByteCount() const;
    TimeStamp GetSaveTimestamp() const;
    u32 GetSaveCount() const;
    RevisionTag GetLastSaveType() const;
    /// One step back; true while a revision remains.
    bool RewindWorkingRevision();
    void ResetWorkingRevisionToHead();
    bool IsWorkingRevisionAtHead() const;
    u64 GetRewindCount() const;
    Counted<ArchiveThumbnails const> LoadThumbnails();

    /// True if every path exists at the working revision. Otherwise shunts the files, with the missing paths in the
    /// log, and gives the id in @p report.
    bool VerifyExistingFiles(std::set<String8> const& paths, String8& report) const;
    /// True if some revision has data for a path that is not in @p paths.
    bool TestForAdditionalFiles(std::set<String8> const& paths) const;

    // Streamlining: the newest version of each file, as the working revision shows it, in a compact file without
    // history or user data. Stored bytes are copied, never packed again, in one pass through one buffer of 1 MiB.
    // Everybody else's reads and saves wait until it is done. While a session runs or a stream is open it is refused.

    /// True if the history holds something that a rewrite would drop: a deletion, or a file saved again.
    bool RequiresStreamlining() const;
    /// True if the master is of an older format version.
    bool StreamliningAdviseable() const;
    /// Makes the master compact in place; does nothing where that is not required. The compact file is on the device
    /// before anything is replaced. Then it is moved over the master, or where that cannot be done its bytes are
    /// written over the master's, which meanwhile carries a mark: see IsMidStreamlineFile. Every pointer may be null.
    ///
    /// A failure leaves the master as it was, but for a replacement or overwriting that fails half way: the archive is
    /// then empty or its file suspect, no session starts any more, and it must be opened again.
    StreamlineResult Streamline(bool const* abort, Counted<ArchiveStreamlineProgress> const& progress,
                                MarshalledFileAccess const* marshalled);
    /// The same, and the compact file is checked against the archive before anything is replaced. @p report receives
    /// the id of the shunt on a mismatch.
    StreamlineResult StreamlineAndVerifyFileState(String8& report, bool const* abort,
                                                  Counted<ArchiveStreamlineProgress> const& progress,
                                                  MarshalledFileAccess const* marshalled);
    /// Writes a compact copy to @p path, over what stands there; the archive stays as it is.
    StreamlineResult StreamlineToNew(String8 const& path) const;
    /// Writes a compact copy of a damaged archive: without the files whose data cannot be had as they were written.
    /// These are given in @p lost, by path; all others read with a good CRC from the copy. Reads every block twice.
    StreamlineResult SalvageToNew(String8 const& path, std::vector<LostFile>& lost) const;
    /// Writes a compact copy, front to back, without thumbnails. An archive that needs no streamlining is copied as it
    /// stands up to its end, if its file says what the archive shows.
    StreamlineResult StreamlineToOutStream(OutStream& out) const;
    StreamlineResult StreamlineToFragmentedRawData(FragmentedRawData& data) const;
    /// Writes a compact copy to @p path and goes on with that as master. The old file stays on disk and is no longer
    /// the archive's.
    StreamlineResult StreamlineAndSwitch(String8 const& path);
    /// The same, as scratch file of an archive that has no master any more.
    StreamlineResult StreamlineAndSwitchAsScratch(String8 const& path);
    /// The file has the mark of a streamline's temporary, or of a master that was being overwritten by one. A host asks
    /// this before it trusts such a master.
    static bool IsMidStreamlineFile(String8 const& path);
    /// The archive's one file up to its end, byte for byte. Null when there are two, during a session, and when the
    /// file cannot be read or somebody else has saved into it.
    Counted<RawData> ExtractToRawData() const;
    bool IsDoingStreamline() const;
    /// Off by default. On: Streamline always overwrites the master and never moves a file over it.
    void SetAlwaysStreamlineOverwrite(bool always);
    bool GetAlwaysStreamlineOverwrite() const;

    // Keeping data without the file.

    /// Copies all data out of the file on a background job. @p updater may be null.
    void StartOffline(Counted<OffliningUpdater> const& updater);
    void StopOffline();
    void AbortOfflining();
    OffliningState GetOffliningState() const;
    bool IsOfflining() const;
    bool IsOffliningCompleted() const;

    static void SetBackupPath(String8 const& path);
    static String8 GetBackupPath();
    /// The folder that files are copied to, with a log, when a check of them fails; empty, as at first, for none. What
    /// the check reports is then the id that the copies' names begin with, with "-NOLOG" behind it when the log could
    /// not be written; and "NOLOG" without a folder.
    static void SetShuntPath(String8 const& path);
    static String8 GetShuntPath();
    /// Around the end of the process: the first stops background work of every archive, the second drops what is shared
    /// between archives.
    static void PreShutdown();
    static void PostShutdown();

protected:
    ~Archive() override;

    NonCounted<FileStoreRevision const> GetHeadRevisionI() const override;
    NonCounted<FileStoreRevision const> GetHeadRevisionForFileI(String8 const& path) const override;
    /// Makes the block once the adorner has agreed; the caller holds the access lock.
    virtual Counted<AccessBlock> CreateAccessBlockCS(Counted<AccessBlockAdorner> const& adorner);

private:
    friend struct ArchiveImpl;
    friend class ArchiveSession;
    friend class ArchiveSessionHandle;
    friend class ArchiveCommit;
    friend class ArchiveStreamliner;

    explicit Archive(IDTag tag);

    std::unique_ptr<ArchiveImpl> m;
};

/// Takes part in access blocks: supplied by a host that coordinates file access with others.
class KERNEL_API Archive::AccessBlockAdorner : public Countable
{
public:
    /// A block is about to start; false refuses it.
    virtual bool Begin() = 0;
    /// True when the block wants write access.
    virtual bool WantsWriteAccess() const = 0;

protected:
    ~AccessBlockAdorner() override;
};

/// A scope in which the archive's files stay reachable. Ends with its last reference, on any thread.
class KERNEL_API Archive::AccessBlock : public Countable
{
public:
    Counted<AccessBlockAdorner> const& GetAdorner() const { return m_adorner; }
    /// The archive's damage as it stood when the block began, and now.
    bool IsCorrupted() const;
    /// True if the archive broke during the block and the owner did not ask for silence.
    bool ShouldReportBrokenArchive() const;
    void SetDoNotReportNewlyBrokenArchive() { m_silent = true; }

private:
    friend class Archive;
    friend struct ArchiveImpl;
    AccessBlock(Counted<Archive> archive, Counted<AccessBlockAdorner> adorner, bool wasBroken);
    ~AccessBlock() override;

    Counted<Archive> const m_archive;
    Counted<AccessBlockAdorner> const m_adorner;
    bool const m_wasBroken;
    bool m_silent = false;
    bool m_wantsWriteAccess = false; // As the adorner said when the block began. Guarded by the access lock.
};

/// Told how copying data out of the file goes. Calls come on a background thread, one at a time.
class KERNEL_API Archive::OffliningUpdater : public Countable
{
public:
    virtual void Progress(u64 total, u64 done) = 0;
    virtual void Complete() = 0;
    virtual void Aborted() = 0;
    /// @p reason 1: a file could not be read or copied; 2: the file that held the data is gone.
    virtual void Failed(int reason) = 0;

protected:
    ~OffliningUpdater() override;
};

} // namespace Kernel

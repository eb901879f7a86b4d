#pragma once

#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveThumbnails.h"
#include "libkernel/filestore/FileStoreOut.h"

#include <memory>
#include <set>

namespace Kernel {

/// Told how far a session's queue is. The host derives from it; calls come on the thread that runs the queue.
class KERNEL_API ArchiveSessionProgress : public Countable
{
public:
    /// A session was given this object.
    virtual void OnBegin();
    /// @p done of @p total queued files have been written, copied or deleted.
    virtual void OnProgress(u32 done, u32 total) = 0;

protected:
    ~ArchiveSessionProgress() override;
};

/// One save: collects files in a queue, writes them behind the end of one disk file, and is committed or dropped as a
/// whole by Archive::CloseSession. Until the commit nothing that a reader depends on changes.
///
/// Several threads may offer files: the thread that finds the queue idle runs it, the others return at once. An item's
/// Save runs on the thread that runs the queue. Everything else belongs to the thread that made the session.
///
/// All operations that write fail alike: OutStream::WriteException for a short write or a path of 65,536 bytes or more,
/// ArchiveFileException for a failing file, AbortException once the abort flag is set, NestedException while an item
/// that is not nestable is being saved, ArchiveBackingException for a holder with nothing to write from. After any of
/// them CloseSession commits nothing.
class KERNEL_API ArchiveSession : public FileStoreOut
{
public:
    /// Chooses files for DeleteSelectedFiles.
    class KERNEL_API FileDeleteSelector
    {
    public:
        virtual ~FileDeleteSelector();
        virtual bool operator()(String8 const& path) = 0;
    };

    ArchiveSession(ArchiveSession const&) = delete;
    ArchiveSession& operator=(ArchiveSession const&) = delete;

    void CreateFile(Counted<DelayLoadHolder> holder, Counted<FileStoreCompressionHint> const& hint) override;
    void CreateFile(Counted<DelayLoadHolder> holder) override;
    void CreateFile(String8 const& path, Counted<FileStoreItem const> const& item,
                    Counted<FileStoreCompressionHint> const& hint) override;
    void CreateFile(String8 const& path, Counted<FileStoreItem const> const& item) override;
    void DeleteFile(String8 const& path) override;
    void AddObjectToClean(Counted<FileStoreStateObject> object) override;
    void AddPostSaveObject(Counted<FileStorePostSaveInterface> object) override;
    bool GenerateIndexedPath(IndexedPathParts const& parts, NonCounted<FileStoreItem const> item,
                             NonCounted<DelayLoadHolder const> holder, String8& path) override;
    void AssignDelayLoadHolderPath(Counted<DelayLoadHolder> holder, String8 const& path) override;
    FileStore& GetFileStore() const override;

    /// Queues a deletion of every file whose last entry is not one and for which @p selector yields true.
    void DeleteSelectedFiles(FileDeleteSelector& selector);
    /// Marks @p path and everything that saving @p item would name as used. Writes nothing.
    void EnumerateUsedPaths(String8 const& path, Counted<FileStoreItem const> const& item);
    /// With the flag on, each path offered is recorded in GetEnumeratedPaths.
    void SetEnumerateUsedFiles(bool on);
    bool GetEnumerateUsedFiles() const;
    /// Paths queued so far, and paths enumerated so far. Stable only while no thread offers files.
    std::set<String8> const& GetAddedPaths() const;
    std::set<String8> const& GetEnumeratedPaths() const;
    /// True when the new revision has entries.
    bool HasChanges() const;
    /// The block to write behind the table at the commit; null for none. Alone it is no reason to commit.
    void SetThumbnails(Counted<ArchiveThumbnails const> const& thumbnails);
    /// Copies @p size bytes, which the table takes with it; the store never looks inside. False, with nothing set, for
    /// a size of 4 GiB or more or when there is no memory.
    bool SetUserData(void const* data, u64 size);
    void SetProgressCallback(Counted<ArchiveSessionProgress> const& progress);
    /// Declares another archive from which stored files may be copied as they are, and opens its file if need be. One
    /// whose file cannot be opened is not added.
    void AddSourceArchive(Counted<Archive> const& archive);

private:
    friend class Archive;
    friend struct ArchiveImpl;
    friend class ArchiveSessionHandle;
    friend class ArchiveCommit;
    struct State;

    ArchiveSession(std::unique_ptr<State> state, bool const* abort);
    ~ArchiveSession() override;

    void RunQueue();
    void ProcessQueueEntries();
    /// Throws what a call at this moment has to throw; false if the call has nothing left to do.
    bool BeginOffer();
    [[noreturn]] void Fail();
    bool FastMigrateFile(DelayLoadHolder& holder, Counted<DelayLoadHolder> const& counted, String8 const& path);
    void EnumeratePaths(FileStoreItem const& item);

    std::unique_ptr<State> m;
};

/// Owns a session. Letting go of one without Archive::CloseSession drops the save: nothing is committed.
class KERNEL_API ArchiveSessionHandle
{
public:
    ArchiveSessionHandle() = default;
    ArchiveSessionHandle(ArchiveSessionHandle const&) = delete;
    ArchiveSessionHandle& operator=(ArchiveSessionHandle const&) = delete;
    ~ArchiveSessionHandle() { Release(); }

    bool IsValid() const { return m_session != nullptr; }
    /// Drops the session without a commit.
    void Release();
    ArchiveSession& operator*() const { return *m_session; }
    ArchiveSession* operator->() const { return m_session; }

private:
    friend class Archive;
    friend struct ArchiveImpl;

    ArchiveSession* m_session = nullptr;
    Counted<Archive> m_archive; // Keeps the archive alive as long as the session needs it.
};

} // namespace Kernel

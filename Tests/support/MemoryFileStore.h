#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStore.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/filestore/FileStoreLoadContext.h"
#include "libkernel/filestore/FileStoreOut.h"

#include <atomic>
#include <functional>
#include <map>
#include <optional>
#include <vector>

namespace KernelTest {

using namespace Kernel;

/// An item of one line of text and the parts it names. Its bytes are the text, then a line for each part's path. A path
/// that begins with "nest/" is of the nestable type, one with "opt/" of the recoverable type, others of the plain one;
/// "!" before a path has the part loaded at once, and what came of it goes to `eager`.
class MemoryItem : public FileStoreItem
{
public:
    static FileStoreItemType const c_plain;
    static FileStoreItemType const c_recoverable;
    static FileStoreItemType const c_nestable;
    static FileStoreItemType const* TypeOf(String8 const& path);
    static std::atomic<int> s_living;

    explicit MemoryItem(String8 const& t = String8(), FileStoreItemType const* type = &c_plain);

    void Save(OutStream& stream, FileStoreOut& out) const override;
    bool Load(InStream& stream, FileStore& store) override;
    FileStoreItemType const* GetObjectFileStoreItemType() const override { return m_type; }
    void AboutToMakeDirty() override { onAboutToMakeDirty(); }
    void PostMarkAsDirty() override { FileStoreItem::PostMarkAsDirty(), onPostMarkAsDirty(); }
    using FileStoreStateObject::MarkAsClean;

    String8 text;
    std::vector<Counted<DelayLoadHolder>> parts;
    std::vector<bool> eager;
    std::function<void()> onAboutToMakeDirty = [] {};
    std::function<void()> onPostMarkAsDirty = [] {};

protected:
    ~MemoryItem() override;

private:
    FileStoreItemType const* const m_type;
};

/// Bytes kept beside any store.
class MemoryBackData : public FileStoreBackData
{
public:
    explicit MemoryBackData(String8 const& bytes) : m_bytes(bytes) {}
    bool LoadItem(FileStoreItem& item) const override;

private:
    String8 const m_bytes;
};

struct MemoryRevision : FileStoreRevision
{
    std::map<String8, std::optional<String8>> files; // No bytes: deleted.
    bool incremental = false;
};

/// A store in memory with a history, and with places for a test to step in. The operations that a concrete store is
/// given are public here.
class MemoryFileStore : public FileStore
{
public:
    using Revision = NonCounted<FileStoreRevision const>;

    static Counted<MemoryFileStore> Create() { return Counted<MemoryFileStore>(new MemoryFileStore); }

    /// Commits a revision with this one change.
    Revision Put(char const* path, String8 const& bytes, bool incremental = false)
    {
        return Commit(path, bytes, incremental);
    }
    Revision Delete(char const* path) { return Commit(path, std::nullopt, false); }
    /// A holder of the type that goes with the path.
    Counted<DelayLoadHolder> Hold(char const* path, FileStoreLoadContext* context = nullptr)
    {
        return CreateDelayLoadHolderDirect(path, MemoryItem::TypeOf(path), context);
    }
    /// Both: commits the bytes, and holds them.
    Counted<DelayLoadHolder> Store(char const* path, String8 const& bytes, bool incremental = false)
    {
        Put(path, bytes, incremental);
        return Hold(path);
    }

    bool LoadFile(String8 const& path, Revision revision, FileStoreItem& item, bool reportToCallback) override;
    bool LoadFile(String8 const& path, FileStoreItem& item) override { return LoadFile(path, nullptr, item, false); }
    bool IsBroken() const override { return broken; }
    Counted<FileStoreBackData const> CreateBackData(Revision revision, String8 const& path) override;

    using FileStore::AddBackData;
    using FileStore::BreakFileStoreAssociations;
    using FileStore::ClearObjectDirtyState;
    using FileStore::PreDestruction;
    using FileStore::ProcessPreFileDelete;
    using FileStore::RelinkFileStoreAssociations;
    using FileStore::RemoveDelayLoadLinks;
    using FileStore::RemoveDirtyStates;
    using FileStore::SetDelayLoadOwner;
    using FileStore::SetObjectDirtyStatePostLoad;
    using FileStore::UpdateDelayLoadOwners;

    std::function<void()> onLoad;             // Inside LoadFile, before the bytes are read.
    std::function<void()> onCreateBackData;   // Inside CreateBackData; may throw.
    mutable std::function<void()> onFindHead; // Behind GetHeadRevisionForFileI's look, before it answers.
    std::atomic<int> loads{0};
    std::atomic<int> copies{0};
    std::atomic<bool> broken{false};
    bool diesSuddenly = false; // The destructor leaves out PreDestruction.

protected:
    MemoryFileStore() = default;
    ~MemoryFileStore() override;
    Revision GetHeadRevisionI() const override;
    Revision GetHeadRevisionForFileI(String8 const& path) const override;

private:
    Revision Commit(char const* path, std::optional<String8> bytes, bool incremental);
    /// The bytes at or before a revision; null stands for the newest.
    std::optional<String8> Find(String8 const& path, Revision revision, Counted<MemoryRevision>* at = nullptr) const;

    CriticalSection m_lock;
    std::vector<Counted<MemoryRevision>> m_revisions; // Guarded by m_lock.
};

/// Keeps the problems it is told.
class CollectingContext : public FileStoreLoadContext
{
public:
    void ReportProblem(String8 const& text) override { problems.push_back(text); }
    std::vector<String8> problems;
};

/// Notes what a save asks of it. The first indexed path is taken, for items alone.
class RecordingOut : public FileStoreOut
{
public:
    explicit RecordingOut(FileStore& store, Purpose purpose = PurposeSave, bool const* abort = nullptr)
        : FileStoreOut(purpose, abort), m_store(store)
    {
    }
    RecordingOut(RecordingOut const& outer, Purpose purpose) : FileStoreOut(outer, purpose), m_store(outer.m_store) {}

    using FileStoreOut::CreateFile;
    void CreateFile(Counted<DelayLoadHolder> holder, Counted<FileStoreCompressionHint> const&) override
    {
        files.push_back(holder);
    }
    void CreateFile(String8 const&, Counted<FileStoreItem const> const&,
                    Counted<FileStoreCompressionHint> const&) override
    {
    }
    void DeleteFile(String8 const&) override {}
    void AddObjectToClean(Counted<FileStoreStateObject>) override {}
    void AddPostSaveObject(Counted<FileStorePostSaveInterface>) override {}
    bool GenerateIndexedPath(IndexedPathParts const& parts, NonCounted<FileStoreItem const> item,
                             NonCounted<DelayLoadHolder const>, String8& path) override
    {
        if (item) path = parts.prefix + "1" + parts.suffix;
        return static_cast<bool>(item);
    }
    void AssignDelayLoadHolderPath(Counted<DelayLoadHolder> holder, String8 const& path) override
    {
        assigned.emplace_back(holder, path);
    }
    FileStore& GetFileStore() const override { return m_store; }

    std::vector<Counted<DelayLoadHolder>> files;
    std::vector<std::pair<Counted<DelayLoadHolder>, String8>> assigned;

private:
    FileStore& m_store;
};

/// The text of the holder's item, loaded if needed; "(none)" if it can't be had.
String8 TextOf(Counted<DelayLoadHolder> const& holder);

} // namespace KernelTest

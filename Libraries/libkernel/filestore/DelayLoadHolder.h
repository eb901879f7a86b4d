#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"
#include "libkernel/filestore/FileStoreBackData.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/filestore/FileStoreRevision.h"
#include "libkernel/filestore/LinkMap.h"

#include <atomic>
#include <set>
#include <vector>

namespace Kernel {

class FileStore;
class FileStoreItemType;

/// Stands for one item whether or not the item is in memory, and knows where its bytes can be had: in which stores,
/// under which paths, at which revisions, or from back data. Brings the item in on first use; lets a clean one go.
///
/// | loaded flag | item | state                  |
/// |-------------|------|------------------------|
/// | clear       | null | not in memory          |
/// | set         | item | in memory              |
/// | set         | null | load attempted, failed |
///
/// Any thread may call all operations. Two threads that want one item do the work once: the second sleeps meanwhile.
/// A load runs under no lock but the holder's load lock; threads that would wait for each other's loads in a circle,
/// and a load that comes back to its own holder, get false instead. No lock that a store takes in LoadFile may be held
/// over GetItemBase, a TempLoadItem or EnsureItemIsBacked.
class KERNEL_API DelayLoadHolder : public Countable
{
public:
    /// An item for reading, for a scope. If this object is what brought the item in, and nobody has touched its states
    /// when the scope ends, it is let go again.
    class KERNEL_API TempLoadItem
    {
    public:
        /// @p holder may be null; there is no item then.
        explicit TempLoadItem(Counted<DelayLoadHolder> holder);
        ~TempLoadItem();
        TempLoadItem(TempLoadItem const&) = delete;
        TempLoadItem& operator=(TempLoadItem const&) = delete;

        /// The item; null if it can't be had.
        JailCounted<FileStoreItem> const& GetItem() const { return m_item; }
        bool WasLoadedBefore() const { return m_wasLoaded; }

    private:
        Counted<DelayLoadHolder> const m_holder;
        JailCounted<FileStoreItem> m_item;
        FileStoreStateObject::StateSnapshot m_snapshot;
        bool m_wasLoaded = true;
    };

    /// The holder of an item that exists only in memory: the one that it has already, or a new one. Null if either is
    /// null.
    static Counted<DelayLoadHolder> Create(FileStoreItemType const* type, Counted<FileStoreItem> const& item);
    /// The same, for an item that replaces that of @p otherHolder (may be null): it takes over the path in @p store, so
    /// that the next save writes to the same place.
    static Counted<DelayLoadHolder> Create(FileStoreItemType const* type, Counted<FileStoreItem> const& item,
                                           NonCounted<DelayLoadHolder const> otherHolder, FileStore const& store);

    /// Never null.
    FileStoreItemType const* GetFileStoreItemType() const { return m_type; }

    /// The item, loaded if needed. False, with @p item null, if the load failed; the holder does not try again until
    /// ReleaseItem, and then yields true with a null item. False without a mark, so that a later call tries again, for
    /// a load inside itself, deeper than c_maxNesting, or from a store that is just being destroyed. Throws nothing.
    bool GetItemBase(JailCounted<FileStoreItem>& item);
    /// The item or null; never loads.
    JailCounted<FileStoreItem> GetItemBaseIfLoaded() const;
    /// True if a load has been done, whatever came of it.
    bool IsLoaded() const;
    /// Lets go of a clean item. False, with the item kept, if a living store still needs it, or if there is neither
    /// back data nor any owner. A store that is remembered but dead counts as owner: ask HasLivingOwner first.
    bool ReleaseItem();

    Counted<FileStoreBackData const> GetBackData() const;
    /// Keeps the first back data: changes nothing for null, for a holder that has some, for a nestable type, and while
    /// the item in memory differs from what a store holds.
    void SetBackData(Counted<FileStoreBackData const> const& data);
    /// The same, only while the item still stands at @p revision of @p store: what was copied from there is outdated
    /// once a save has moved the item on.
    void SetBackData(FileStore const& store, NonCounted<FileStoreRevision const> revision,
                     Counted<FileStoreBackData const> const& data);
    /// Makes sure that the item can be had after its stores have gone: true if it is in memory, or has or gets back
    /// data. Throws BackstoreException if copying failed. Slow.
    bool EnsureItemIsBacked();

    /// The path under which the store knows this holder, whether or not it has the bytes. False if it does not.
    bool GetPath(FileStore const& store, String8& path) const;
    /// True if the store has the bytes; @p revision is then where.
    bool IsBackedBy(FileStore const& store) const;
    bool IsBackedBy(FileStore const& store, NonCounted<FileStoreRevision const>& revision) const;
    /// True if a store that lives and is not broken has the bytes.
    bool HasLivingOwner() const;
    /// True if there is no item, no back data and no store that has or had the bytes.
    bool IsDead() const;
    /// True if there is neither back data nor a store that has the bytes: what is not in memory can't be had.
    bool ExistsOnlyInMemory() const;

    /// Asked of the item in memory; false if there is none.
    bool ObjectIsLinkedToFileStore(FileStore const& store) const;
    bool GetDirtyStateForFileStore(FileStore const& store, FileStoreStateObject::DirtyState& state) const;

    /// Appends one text for each owner, comma separated: path and address of the link, and whether the store lacks the
    /// bytes. For diagnosis.
    void DumpPaths(String8& text) const;

private:
    friend class FileStore;
    friend class FileStoreItem;

    struct Owner
    {
        String8 path;
        NonCounted<FileStoreRevision const> revision;
        bool valid = false; // The store holds the bytes at that revision and path. Otherwise it only knows the path.
    };
    using OwnerMap = LinkMapT<Owner, 1>;
    class LoadScope;

    explicit DelayLoadHolder(FileStoreItemType const* type) : m_type(type) {}
    ~DelayLoadHolder() override;

    /// As GetItemBase. @p wasLoaded tells that the load was done before; only if not, @p snapshot (may be null) gets
    /// the states that the item came with.
    bool GetItemI(JailCounted<FileStoreItem>& item, bool& wasLoaded, FileStoreStateObject::StateSnapshot* snapshot);
    bool TakeLoadedItem(JailCounted<FileStoreItem>& item) const;
    Counted<FileStoreItem> LoadItemCSLoad(FileStoreStateObject::StateSnapshot* snapshot);
    struct LoadAttempt;
    void LoadFromBackData(LoadAttempt& attempt) const;
    void LoadFromStores(LoadAttempt& attempt) const;
    bool TakeNextOwner(LoadAttempt const& attempt, Counted<FileStoreLink>& link, Owner& owner) const;
    void FinishLoad(LoadAttempt const& attempt, FileStoreStateObject::StateSnapshot* snapshot);
    bool ReleaseItemI(FileStoreStateObject::StateSnapshot const* snapshot);
    bool ReleaseTempItem(FileStoreStateObject::StateSnapshot const& snapshot);
    void DetachCSItem(FileStoreItem& item) const;
    bool HasValidOwnerCSOwners() const;
    void DropBackData(FileStoreItem const& item);
    void SetBackDataCSItem(Counted<FileStoreBackData const> const& data);

    // The stores' side. These take the owners lock and the item lock, never the load lock: a store that commits must
    // not wait for a load that may be waiting for the store.
    void SetOwner(FileStoreLink& link, NonCounted<FileStoreRevision const> revision, String8 const& path, bool valid);
    void UpdateOwner(FileStoreLink& link, NonCounted<FileStoreRevision const> revision);
    void MoveOwner(FileStoreLink& link, NonCounted<FileStoreRevision const> from,
                   NonCounted<FileStoreRevision const> to);
    Owner FindOrCreateOwner(FileStoreLink& link, String8 const& path);
    bool IsOwnedAt(FileStoreLink const& link, std::set<NonCounted<FileStoreRevision const>> const& revisions) const;
    /// The store goes away.
    void ClearOwner(FileStore& store);
    /// The store has dropped these revisions. False if the holder's bytes lie elsewhere.
    bool BreakDeadLink(FileStore& store, std::set<NonCounted<FileStoreRevision const>> const& revisions);
    /// The store is about to delete the file.
    void FileRemoveFromFileStore(FileStore& store);
    void RemoveDirtyState(FileStoreLink& link);

    enum class Entry
    {
        Invalidate, // The store goes on knowing the path.
        Erase
    };
    void Backstore(FileStore& store, Entry entry);
    void LeaveCSBoth(FileStoreLink& link, Entry entry);
    bool IsLastMeansCSBoth(FileStoreLink const& leaving) const;
    void RemoveDirtyStateCSItem(FileStoreLink& link);

    FileStoreItemType const* const m_type;
    CriticalSection m_loadLock;                  // Held over loads and backing. Outside every lock of a store.
    mutable std::atomic<void const*> m_loader{}; // Mark of the thread that holds m_loadLock, or null.
    CriticalSectionSpin m_ownersLock{FileStoreLockRank::c_owners}; // Inside the store lock.
    OwnerMap m_owners;                                             // Guarded by m_ownersLock.
    CriticalSectionSpin m_itemLock{FileStoreLockRank::c_item};     // Inside the owners lock. Guards all that follows.
    bool m_loaded = false;
    bool m_loading = false;                          // A load is running; its item is not here yet.
    std::vector<Counted<FileStoreLink>> m_forgotten; // Stores that took their state back while a load was running.
    JailCounted<FileStoreItem> m_item;
    Counted<FileStoreBackData const> m_backData;
};

} // namespace Kernel

#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/String.h"
#include "libkernel/filestore/FileStoreBackData.h"
#include "libkernel/filestore/FileStoreLink.h"
#include "libkernel/filestore/FileStoreRevision.h"
#include "libkernel/filestore/FileStoreStateObject.h"

#include <set>
#include <unordered_map>
#include <utility>
#include <vector>

namespace Kernel {

class DelayLoadHolder;
class FileStoreItem;
class FileStoreItemType;
class FileStoreLoadContext;

/// A set of named items with a history. Any thread may call the operations. Stores are held by Counted from the moment
/// they are in use: to an object at count 0 a store is one that is being destroyed.
///
/// Ranks of the locks, outermost first: a holder's load lock; whatever locks a concrete store has; the link's lock; the
/// store lock here; a holder's owners lock; its item lock; an item's lock of its holder; an object's state lock. From
/// the link's lock on nothing virtual is called, so a concrete store may call everything here under its own locks.
class KERNEL_API FileStore : public Countable
{
public:
    /// Decides about one file of a store.
    class KERNEL_API ProcessPreFileDeleteFunctor
    {
    public:
        virtual ~ProcessPreFileDeleteFunctor();
        /// True if the file at that revision and path is about to go from the store.
        virtual bool operator()(NonCounted<FileStoreRevision const> revision, String8 const& path) = 0;
    };

    /// Reads the bytes at @p path, as of @p revision, into @p item, and sets the item's state for this store. False if
    /// path or revision is unknown or the file was deleted, and when the item's Load refuses. With @p reportToCallback
    /// damage goes to the store's error callback, where there is one, otherwise to an exception.
    virtual bool LoadFile(String8 const& path, NonCounted<FileStoreRevision const> revision, FileStoreItem& item,
                          bool reportToCallback) = 0;
    /// The same, with the newest revision and without the callback.
    virtual bool LoadFile(String8 const& path, FileStoreItem& item) = 0;
    /// True once the store was found damaged.
    virtual bool IsBroken() const;
    /// Copies an item's stored bytes to where they survive the store. Null if there are none to be had; throws
    /// BackstoreException if the copy failed. Slow.
    virtual Counted<FileStoreBackData const> CreateBackData(NonCounted<FileStoreRevision const> revision,
                                                            String8 const& path) = 0;

    Counted<FileStoreLink> const& GetFileStoreLink() const { return m_link; }

    /// The holder that stands for @p path, made if there is none: one path has one holder in a store. Null for a null
    /// @p type. For a path that the store does not have, @p context (may be null) is told "Missing file: %1", and the
    /// result is null, or for a recoverable type a holder that this store can't serve.
    Counted<DelayLoadHolder> CreateDelayLoadHolderDirect(String8 const& path, FileStoreItemType const* type,
                                                         FileStoreLoadContext* context);

protected:
    FileStore();
    ~FileStore() override;

    virtual NonCounted<FileStoreRevision const> GetHeadRevisionI() const = 0;
    /// Null if the head does not have the file.
    virtual NonCounted<FileStoreRevision const> GetHeadRevisionForFileI(String8 const& path) const = 0;

    /// Gives the holder of @p path the back data. Does nothing for null, or without such a holder.
    void AddBackData(String8 const& path, Counted<FileStoreBackData const> const& backData);
    /// The same for back data copied from @p revision: does nothing if the holder no longer stands there.
    void AddBackData(String8 const& path, NonCounted<FileStoreRevision const> revision,
                     Counted<FileStoreBackData const> const& backData);
    /// Records that this store holds the holder's item at @p path and @p revision; an earlier path of it is forgotten.
    void SetDelayLoadOwner(Counted<DelayLoadHolder> const& holder, NonCounted<FileStoreRevision const> revision,
                           String8 const& path);
    /// Moves every holder of this store to @p revision.
    void UpdateDelayLoadOwners(NonCounted<FileStoreRevision const> revision);
    /// The bytes of each path now lie at @p revision: the holder that has the path at the revision given with it moves
    /// there. For a store that copies bytes of a revision it is about to drop.
    void MoveDelayLoadOwners(NonCounted<FileStoreRevision const> revision,
                             std::unordered_map<String8, NonCounted<FileStoreRevision const>> const& moved);
    /// Removes a holder from the maps.
    void DelayLoadHolderDestroyed(DelayLoadHolder& holder);
    /// Erases the states for this store of those items at @p paths that holders have in memory.
    void RemoveDirtyStates(std::set<String8> const& paths);
    /// Takes this store from every holder whose bytes lie at one of these revisions, which are about to be dropped. A
    /// holder that has no other means takes back data. The first exception of CreateBackData is passed on in the end.
    void RemoveDelayLoadLinks(std::set<NonCounted<FileStoreRevision const>> const& revisions);
    /// Takes this store from every holder for which @p functor says so, with back data as above. The functor is called
    /// without any lock.
    void ProcessPreFileDelete(ProcessPreFileDeleteFunctor& functor);

    /// Makes the store dead to all other objects though it stays in memory.
    void BreakFileStoreAssociations();
    /// Undoes BreakFileStoreAssociations.
    void RelinkFileStoreAssociations();
    /// Takes this store from every holder, with back data as above, as far as it can be had. To be called first in the
    /// destructor of a concrete store, while the virtual operations still work; a store whose files move away calls it
    /// too, and goes on. Throws nothing.
    void PreDestruction();

    /// Sets the object's state for this store after a commit; a clean one stays clean.
    void ClearObjectDirtyState(FileStoreStateObject& object, FileStoreStateObject::DirtyState state);
    /// Sets the object's state for this store.
    void SetObjectDirtyStatePostLoad(FileStoreStateObject& object, FileStoreStateObject::DirtyState state);

private:
    friend class DelayLoadHolder;
    friend class FileStoreLink;

    // The hash is of the library's strongest cheap kind, since paths come from files.
    struct PathKey
    {
        explicit PathKey(String8 const& p);
        friend bool operator==(PathKey const& a, PathKey const& b) { return a.hash == b.hash && a.path == b.path; }

        size_t hash;
        String8 path;
    };
    struct PathKeyHash
    {
        size_t operator()(PathKey const& key) const { return key.hash; }
    };
    using PathMap = std::unordered_map<PathKey, DelayLoadHolder*, PathKeyHash>;
    using HolderMap = std::unordered_map<DelayLoadHolder*, PathKey>;

    Counted<DelayLoadHolder> FindCS(PathKey const& key) const;
    void EnterCS(DelayLoadHolder& holder, PathKey const& key);
    void RemoveCS(DelayLoadHolder& holder);

    Counted<FileStoreLink> const m_link;
    CriticalSectionSpin m_storeLock{FileStoreLockRank::c_store}; // Guards all that follows.
    // The two directions of one relation. Holders are not kept alive: one takes itself out when it dies. A path may
    // have passed to another holder, and its first one is then in m_pathOfHolder alone.
    PathMap m_holderOfPath;
    HolderMap m_pathOfHolder;
    u64 m_ownerChanges = 0; // Counts what may make a head revision stale that was asked for outside the lock.
};

} // namespace Kernel

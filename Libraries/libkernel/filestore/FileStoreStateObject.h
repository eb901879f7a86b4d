#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Countable.h"
#include "libkernel/filestore/LinkMap.h"

namespace Kernel {

class FileStore;

/// A persistent object that knows, for each store it has been loaded from or saved to, whether it still has to be
/// written there. Any thread may call the public operations; each takes the state lock for a look at a small map.
///
/// An entry whose link is dead counts as no entry, except where said. Nothing walks the objects when a store dies:
/// MarkAsDirty drops dead entries when it comes by.
class KERNEL_API FileStoreStateObject : public virtual Countable
{
public:
    enum DirtyState : u32
    {
        DirtyStateClean = 0, ///< The store's head holds exactly this object.
        DirtyStateFull = 1,  ///< Changed since it was last written to that store.
        /// An incremental revision of that store holds the present state: a later incremental save need not write it, a
        /// full one must.
        DirtyStateIncremental = 2
    };

private:
    using DirtyMap = LinkMapT<DirtyState, 2>;

public:
    /// The states of an object at one moment, to see later whether somebody has touched it.
    class StateSnapshot
    {
        friend class FileStoreStateObject;
        DirtyMap m_states;
    };

    /// True if two places of a document may refer to one such object.
    virtual bool CanShare() const;

    /// Says that the object has changed: every store that it knows needs it again. AboutToMakeDirty is called before
    /// and PostMarkAsDirty after, neither under the state lock.
    void MarkAsDirty();

    /// True if there is no entry for the store or the entry is not clean.
    bool IsDirty(FileStore const& store) const;
    /// True if the store has to be given the object in a full save, or, with @p fullOnly, in an incremental one.
    bool RequiresSave(FileStore const& store, bool fullOnly) const;
    /// False, with @p state untouched, if there is no entry.
    bool GetDirtyStateForFileStore(FileStore const& store, DirtyState& state) const;
    /// True if no living store needs the object; so also for an object that has never been in a store.
    bool IsFullyClean() const;
    /// True if a living store has DirtyStateFull.
    bool IsAnyFullDirty() const;
    /// The same, with one store left out; null leaves out none.
    bool IsAnyFullDirtyExcluding(NonCounted<FileStoreLink> link) const;
    /// True if more than one living store knows the object.
    bool IsShared() const;
    /// True if there is an entry for the store, whatever it says and whether or not the store lives.
    bool IsLinkedToFileStore(FileStore const& store) const;
    /// Forgets the store.
    void BreakLinkToFileStore(FileStore const& store);

    StateSnapshot GetStateSnapshot() const;
    /// True if the states are the same as when @p snapshot was taken, store by store.
    bool EqualsSnapshot(StateSnapshot const& snapshot) const;

protected:
    FileStoreStateObject() = default;
    /// A copy is a new object, which no store knows.
    FileStoreStateObject(FileStoreStateObject const&) : Countable() {}
    /// Takes no states over: the target stays known where it was known. The caller marks it dirty.
    FileStoreStateObject& operator=(FileStoreStateObject const&) { return *this; }
    ~FileStoreStateObject() override;

    /// For the object's own knowledge that the store holds it.
    void MarkAsClean(FileStore const& store);

    virtual void PostMarkAsDirty();
    virtual void AboutToMakeDirty();

private:
    // Only a store, through FileStore's protected operations, and holders change an object's state for that store.
    friend class FileStore;
    friend class DelayLoadHolder;
    bool IsLinkedToFileStore(NonCounted<FileStoreLink> link) const;
    /// A clean entry stays clean; any other, and a new one, gets @p state.
    void ClearDirtyState(NonCounted<FileStoreLink> link, DirtyState state);
    /// Sets the entry if there is none or with @p overwrite.
    void SetDirtyStatePostLoad(NonCounted<FileStoreLink> link, DirtyState state, bool overwrite);
    void RemoveDirtyState(NonCounted<FileStoreLink> link);

    CriticalSectionSpin m_stateLock{
        FileStoreLockRank::c_state}; // The innermost lock of all: nothing is called under it.
    DirtyMap m_states;
};

} // namespace Kernel

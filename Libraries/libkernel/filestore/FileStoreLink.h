#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Countable.h"
#include "libkernel/filestore/FileStoreLockRank.h"

#include <atomic>

namespace Kernel {

class FileStore;

/// The identity of a store as everyone else sees it. Objects hold links, never stores, so they may outlive the store
/// and can tell that it has gone. Links are compared by address. Any thread may call all operations.
class KERNEL_API FileStoreLink : public Countable
{
public:
    /// The store, kept alive by the result. Null once the store has gone, while its destructor runs, and while it has
    /// broken its associations. Must not be asked under a store lock or a holder's locks.
    Counted<FileStore> GetFileStore() const;

    /// True if the store is living to the outside. It may end at any moment: who needs the store asks GetFileStore.
    bool IsAlive() const { return m_store.load(std::memory_order_acquire) != nullptr; }

private:
    friend class FileStore;
    friend class DelayLoadHolder;
    explicit FileStoreLink(FileStore* store);
    ~FileStoreLink() override;

    /// Tells the store that @p holder is being destroyed. Also while the store has broken its associations, since its
    /// maps still name the holder then.
    void TellHolderDestroyed(class DelayLoadHolder& holder);
    /// The store's memory is about to go.
    void StoreDestroyed();

    CriticalSectionSpin m_lock{FileStoreLockRank::c_link}; // Keeps the store's memory valid while a pointer to it is in
                                                           // use. Before store locks.
    std::atomic<FileStore*> m_store;                       // Null: dead to the outside.
    FileStore* m_storeInMemory;                            // Guarded by m_lock. Null once the store is destroyed.
};

} // namespace Kernel

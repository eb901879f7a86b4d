#include "libkernel/filestore/FileStoreLink.h"

#include "libkernel/filestore/FileStore.h"

namespace Kernel {

FileStoreLink::FileStoreLink(FileStore* store) : m_store(store), m_storeInMemory(store) {}

FileStoreLink::~FileStoreLink() = default;

Counted<FileStore> FileStoreLink::GetFileStore() const
{
    if (!IsAlive()) return nullptr;
    CriticalSectionSpinScope const scope(m_lock);
    return CountedIfAlive(m_store.load(std::memory_order_acquire));
}

void FileStoreLink::TellHolderDestroyed(DelayLoadHolder& holder)
{
    CriticalSectionSpinScope const scope(m_lock);
    if (m_storeInMemory) m_storeInMemory->DelayLoadHolderDestroyed(holder);
}

void FileStoreLink::StoreDestroyed()
{
    CriticalSectionSpinScope const scope(m_lock);
    m_store.store(nullptr, std::memory_order_release);
    m_storeInMemory = nullptr;
}

} // namespace Kernel

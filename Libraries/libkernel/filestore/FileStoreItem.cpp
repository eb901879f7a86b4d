#include "libkernel/filestore/FileStoreItem.h"

#include "libkernel/filestore/DelayLoadHolder.h"

namespace Kernel {

FileStoreItem::~FileStoreItem() = default;

Counted<DelayLoadHolder> FileStoreItem::GetDelayLoadHolder() const
{
    // A holder takes its pointer back under this lock before its memory goes.
    CriticalSectionSpinScope const scope(m_holderLock);
    return CountedIfAlive(m_holder);
}

void FileStoreItem::PostMarkAsDirty()
{
    if (Counted<DelayLoadHolder> const holder = GetDelayLoadHolder()) holder->DropBackData(*this);
}

} // namespace Kernel

#pragma once

#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/filestore/FileStoreStateObject.h"

namespace Kernel {

class DelayLoadHolder;
class FileStoreOut;
class InStream;
class OutStream;

/// The unit that a store holds under a path.
class KERNEL_API FileStoreItem : public FileStoreStateObject
{
public:
    /// Writes the item's bytes to @p stream and names its parts to @p out. Both are borrowed for the call. Failures are
    /// exceptions. May run on several threads at once for one item, for enumerations.
    virtual void Save(OutStream& stream, FileStoreOut& out) const = 0;
    /// Fills a new item from @p stream; @p store serves the parts that the item names. False if the bytes are not such
    /// an item, which is then dropped.
    virtual bool Load(InStream& stream, FileStore& store) = 0;
    /// The description of the item's kind; never null.
    virtual FileStoreItemType const* GetObjectFileStoreItemType() const = 0;

    /// The holder that owns the item, or null. Any thread.
    Counted<DelayLoadHolder> GetDelayLoadHolder() const;

protected:
    FileStoreItem() = default;
    /// A copy belongs to no holder.
    FileStoreItem(FileStoreItem const& o) : Countable(), FileStoreStateObject(o) {}
    FileStoreItem& operator=(FileStoreItem const& o)
    {
        FileStoreStateObject::operator=(o);
        return *this;
    }
    ~FileStoreItem() override;

    /// Makes the holder drop its back data, whose bytes no longer match the item. An override calls this one.
    void PostMarkAsDirty() override;

private:
    friend class DelayLoadHolder;

    CriticalSectionSpin m_holderLock{FileStoreLockRank::c_holderOfItem}; // Inside a holder's item lock.
    DelayLoadHolder* m_holder = nullptr;
};

} // namespace Kernel

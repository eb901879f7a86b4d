#pragma once

#include "libkernel/core/Countable.h"

namespace Kernel {

class FileStoreItem;

/// A means of reading an item's bytes that stays valid when the item's store has gone or has deleted the item.
class KERNEL_API FileStoreBackData : public Countable
{
public:
    /// Reads the bytes into @p item, which was just made by its type's create function. False if that failed; the item
    /// is then in no usable state. Exceptions of the item's Load pass through. Any thread.
    virtual bool LoadItem(FileStoreItem& item) const = 0;

protected:
    ~FileStoreBackData() override;
};

} // namespace Kernel

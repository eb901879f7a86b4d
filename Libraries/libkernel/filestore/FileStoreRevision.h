#pragma once

#include "libkernel/core/Countable.h"

namespace Kernel {

/// One state in a store's history. Outside its store a revision is only an identity, passed as
/// NonCounted<FileStoreRevision const> and compared by address.
class KERNEL_API FileStoreRevision : public Countable
{
protected:
    ~FileStoreRevision() override;
};

} // namespace Kernel

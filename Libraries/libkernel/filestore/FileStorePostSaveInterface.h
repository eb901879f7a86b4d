#pragma once

#include "libkernel/core/Countable.h"

namespace Kernel {

/// An object that wants to hear that a save has become final.
class KERNEL_API FileStorePostSaveInterface : public Countable
{
public:
    /// Called once for each session in which the object was registered with FileStoreOut::AddPostSaveObject, after that
    /// session's revision has been committed. Not called for a session that was abandoned.
    virtual void PostSave() = 0;

protected:
    ~FileStorePostSaveInterface() override;
};

} // namespace Kernel

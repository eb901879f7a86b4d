#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// Told how Archive::Streamline goes. Calls come on its thread, with the archive's session lock held: the host must not
/// save, streamline or load from the archive in them. An exception ends the writing and passes on to the caller, with
/// everything as it was; once the master is being written over it makes that fail.
class KERNEL_API ArchiveStreamlineProgress : public Countable
{
public:
    /// While the compact file is written: @p done of its files, of a total of one more than there are. While a master
    /// is overwritten with it: bytes.
    virtual void OnProgress(u64 done, u64 total) = 0;

protected:
    ~ArchiveStreamlineProgress() override;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Countable.h"

namespace Kernel {

class FileStore;
class FileStoreItem;
class Serialisable;

/// Makes sure that what an object refers to survives the loss of its store: every delay-loaded item that the object
/// names, directly or through nested items, is in memory or has back data afterwards.
///
/// Slow: runs the object's save without output, loads nested items, and copies stored bytes. Exceptions of the save
/// other than BackstoreException pass through.
class KERNEL_API BackstoreGuarantor
{
public:
    BackstoreGuarantor() = delete;

    /// True if all of it is safe, and for a null item.
    static bool Process(Counted<FileStoreItem const> const& item);
    /// The same, where @p store stays: what is clean in it, or was never loaded, needs no copy.
    static bool Process(Counted<FileStoreItem const> const& item, Counted<FileStore const> const& store);
    static bool Process(Serialisable const& object);
};

} // namespace Kernel

#pragma once

#include "libkernel/archive/internal/ArchiveImpl.h"

namespace Kernel {

class ArchiveBackDataBucket;

/// A private copy of one stored file, outside its archive, in a bucket: a temporary file that holds many. The copy has
/// neither tag nor terminator. Never changes; any thread may read it.
class ArchiveBackData : public FileStoreBackData
{
public:
    ArchiveBackData(Counted<ArchiveBackDataBucket> bucket, Archive::FileRevision entry);

    bool LoadItem(FileStoreItem& item) const override;

    /// Describes the copy; its filePos is the offset in the bucket.
    Archive::FileRevision const& GetEntry() const { return m_entry; }
    /// Reads @p count stored bytes from @p offset within the copy. False if they cannot all be had.
    bool ReadStored(u64 offset, void* to, u64 count) const;

private:
    ~ArchiveBackData() override;

    Counted<ArchiveBackDataBucket> const m_bucket;
    Archive::FileRevision const m_entry;
};

} // namespace Kernel

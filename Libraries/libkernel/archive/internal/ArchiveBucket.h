#pragma once

#include "libkernel/archive/internal/ArchiveBackData.h"

#include <atomic>

namespace Kernel {

/// One temporary file that holds the stored bytes of many files, one behind the other. Deleted with its last user.
class ArchiveBackDataBucket : public Countable
{
public:
    /// A bucket takes no file that would pass the first limit; one up to the second that has emptied is used again.
    static constexpr u64 c_maxSize = 134217728;
    static constexpr u64 c_maxReusedSize = 67108864;

    ArchiveBackDataBucket(Counted<FileInOutStream> stream, String8 const& path);

    /// Reads at @p position; from any thread.
    bool Read(u64 position, void* to, u64 count);
    /// Bytes of a copy have died.
    void AddDeadBytes(u64 count);
    void BeginRead() { m_readers.fetch_add(1, std::memory_order_acquire); }
    void EndRead() { m_readers.fetch_sub(1, std::memory_order_release); }
    String8 const& GetPath() const { return m_path; }
    u64 GetWritePosition() const;

private:
    friend class ArchiveBackDataBucketStore;
    ~ArchiveBackDataBucket() override;

    CriticalSection m_lock{c_rankBucket};
    std::atomic<u32> m_readers{0};
    Counted<FileInOutStream> const m_stream; // For reading only: no failed write may cost the copies that are there.
    String8 const m_path;
    Counted<FileInOutStream> m_writer; // The same file, opened for the first copy. Guarded by m_lock.
    u64 m_position = 0;                // Where the next copy goes. Guarded by m_lock.
    u64 m_deadBytes = 0;               // Guarded by m_lock.
};

/// All buckets of the process, made at first use.
class ArchiveBackDataBucketStore
{
public:
    static ArchiveBackDataBucketStore& GetInstance();

    /// With back data switched off this shared empty one is given out.
    Counted<FileStoreBackData const> const& GetVoid() const { return m_void; }
    bool IsSwitchedOff() const { return m_off.load(std::memory_order_relaxed); }
    void SetSwitchedOff(bool off) { m_off.store(off, std::memory_order_relaxed); }

    /// Copies a stored file into a bucket. Null if no bucket can be had, or @p abort turned true. Throws
    /// ArchiveCRCException if the stored bytes are not those that were written, ArchiveFileException if the source
    /// cannot be read, BackstoreException if the bucket cannot be written. The caller holds none of the archive's
    /// locks.
    Counted<ArchiveBackData> Copy(ArchiveImpl& impl, Archive::ArchiveFile& file, Archive::FileRevision const& entry,
                                  std::atomic<bool> const* abort);

    std::vector<Counted<ArchiveBackDataBucket>> GetBuckets() const;
    /// Lets go of every bucket; those in use live on until their last copy dies.
    void Clear();

private:
    ArchiveBackDataBucketStore();
    friend class ArchiveBackDataBucket;

    Counted<ArchiveBackDataBucket> FindBucket(u64 size);
    void Remove(ArchiveBackDataBucket const& bucket);
    Counted<ArchiveBackData> CopyInto(ArchiveBackDataBucket& bucket, ArchiveImpl& impl, Archive::ArchiveFile& file,
                                      Archive::FileRevision const& entry, std::atomic<bool> const* abort);

    mutable CriticalSection m_lock{c_rankBucketStore};
    std::vector<Counted<ArchiveBackDataBucket>> m_buckets; // Guarded by m_lock.
    Counted<FileStoreBackData const> m_void;
    std::atomic<bool> m_off{false};
};

} // namespace Kernel

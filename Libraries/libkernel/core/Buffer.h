#pragma once

#include "libkernel/core/RawData.h"

namespace Kernel {

/// Append-only list of byte buckets, for output whose size is not known beforehand. One thread at a time.
class KERNEL_API Buffer
{
public:
    Buffer() = default;
    Buffer(Buffer&& o) noexcept;
    /// Drops what it holds and takes over the other's buckets.
    Buffer& operator=(Buffer&& o) noexcept;
    ~Buffer();

    /// Copies @p count bytes into one new bucket of exactly that size. Nothing happens for null or for a count of 0.
    /// Throws MemoryException, with nothing appended, if the bucket cannot be allocated.
    void Append(unsigned char const* bytes, u64 count);

    /// Sum of the buckets, in bytes.
    u64 GetSize() const;

    /// All the bytes, in order, in one block; the buffer is empty afterwards. Each bucket is freed as soon as it is
    /// copied. An empty buffer gives a block of size 0 with null data. If the block cannot be allocated its data is
    /// null, its size is the size that was needed, and the buffer keeps its bytes.
    Counted<RawData> Consolidate();

private:
    struct Bucket
    {
        Bucket* next;
        u64 count;
        // The bytes follow.
    };
    static_assert(sizeof(Bucket) == 16);

    void DeleteBuckets() noexcept;

    Bucket* m_head = nullptr;
    Bucket* m_tail = nullptr; // The last bucket; null exactly when m_head is.
};

} // namespace Kernel

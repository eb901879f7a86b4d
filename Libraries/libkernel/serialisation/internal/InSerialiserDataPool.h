#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Types.h"

#include <vector>

namespace Kernel {

class InSerialiserSource;

/// One block of a pool. Bytes are taken from the front.
class InSerialiserDataPoolBucket : public Countable
{
public:
    /// Null if there is no memory.
    static Counted<InSerialiserDataPoolBucket> Create(u64 size);

private:
    friend class InSerialiserDataPool;
    InSerialiserDataPoolBucket(u8* block, u64 size) : m_block(block), m_free(block), m_left(size) {}
    ~InSerialiserDataPoolBucket() override;

    u8* m_block; // From malloc.
    u8* m_free;
    u64 m_left;
};

/// Where the properties of a parse live: a bump allocator over blocks of 32 KiB, or of exactly the size of a larger
/// piece. Memory goes back by returning to an earlier mark. What is put into it and needs a destructor is destroyed by
/// whoever put it there, before that.
class InSerialiserDataPool
{
public:
    static constexpr u64 c_bucketSize = 32 * 1024;

    struct Mark
    {
        size_t buckets = 0;
        u64 used = 0; // Bytes of the last of them.
    };

    InSerialiserDataPool() = default;
    InSerialiserDataPool(InSerialiserDataPool const&) = delete;
    InSerialiserDataPool& operator=(InSerialiserDataPool const&) = delete;

    /// @p size bytes aligned to 8. Null if there is no memory.
    u8* Allocate(u64 size)
    {
        u64 const rounded = (size + 7) & ~u64(7);
        if (!m_last || rounded > m_last->m_left || rounded < size) return AllocateSlow(size);
        u8* const at = m_last->m_free;
        m_last->m_free += rounded;
        m_last->m_left -= rounded;
        return at;
    }
    /// Room for @p size bytes with @p count bytes read from the source behind a head of size - count bytes: one piece,
    /// aligned to 8. The bytes are read straight into it. Null if the source ends before, or says that it will, or if
    /// there is no memory.
    u8* AllocateRead(InSerialiserSource& source, u64 headSize, u64 count);

    /// A piece at the end of the pool that grows. Nothing else is allocated meanwhile.
    class Tail
    {
    public:
        explicit Tail(InSerialiserDataPool& pool) : m_pool(pool) {}
        /// Room for @p count bytes more behind those there are; null if there is no memory. Earlier bytes may move.
        u8* Extend(u64 count);
        /// Reads @p count bytes to the end; false as AllocateRead is null.
        bool Read(InSerialiserSource& source, u64 count);
        u8* GetData() const { return m_start; }
        u64 GetSize() const { return m_size; }

    private:
        InSerialiserDataPool& m_pool;
        u8* m_start = nullptr;
        u64 m_size = 0;
    };

    Mark GetMark() const { return {m_buckets.size(), m_last ? static_cast<u64>(m_last->m_free - m_last->m_block) : 0}; }
    /// Gives everything back that was allocated since the mark; blocks that become empty are dropped, but one is kept
    /// at hand.
    void GiveBack(Mark const& mark)
    {
        if (mark.buckets != m_buckets.size()) DropBuckets(mark.buckets);
        if (!m_last) return;
        u8* const free = m_last->m_block + mark.used;
        m_last->m_left += static_cast<u64>(m_last->m_free - free);
        m_last->m_free = free;
    }

private:
    u8* AllocateSlow(u64 size);
    bool Push(u64 size);
    void DropBuckets(size_t kept);

    std::vector<Counted<InSerialiserDataPoolBucket>> m_buckets;
    InSerialiserDataPoolBucket* m_last = nullptr; // The one in use: the last of m_buckets, or null.
    Counted<InSerialiserDataPoolBucket> m_spare;  // Empty, of c_bucketSize.
};

} // namespace Kernel

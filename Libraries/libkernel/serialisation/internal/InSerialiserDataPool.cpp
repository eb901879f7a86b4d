#include "libkernel/serialisation/internal/InSerialiserDataPool.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Limits.h"
#include "libkernel/serialisation/internal/InSerialiserSource.h"

#include <algorithm>
#include <cstdlib>
#include <new>

namespace Kernel {

Counted<InSerialiserDataPoolBucket> InSerialiserDataPoolBucket::Create(u64 size)
{
    if (size > static_cast<u64>(PTRDIFF_MAX)) return nullptr;
    u8* const block = static_cast<u8*>(std::malloc(size));
    if (!block) return nullptr;
    auto* const bucket = new (std::nothrow) InSerialiserDataPoolBucket(block, size);
    if (!bucket) std::free(block);
    return Counted<InSerialiserDataPoolBucket>(bucket);
}

InSerialiserDataPoolBucket::~InSerialiserDataPoolBucket()
{
    std::free(m_block);
}

bool InSerialiserDataPool::Push(u64 size)
{
    Counted<InSerialiserDataPoolBucket> bucket;
    if (size <= c_bucketSize && m_spare)
        bucket = std::move(m_spare);
    else
        bucket = InSerialiserDataPoolBucket::Create(std::max(size, c_bucketSize));
    if (!bucket) return false;
    m_buckets.push_back(std::move(bucket));
    m_last = m_buckets.back().Get();
    return true;
}

u8* InSerialiserDataPool::AllocateSlow(u64 size)
{
    u64 rounded = 0;
    if (!CheckedAdd(size, 7, rounded) || !Push(rounded & ~u64(7))) return nullptr;
    return Allocate(size);
}

u8* InSerialiserDataPool::AllocateRead(InSerialiserSource& source, u64 headSize, u64 count)
{
    if (!source.Fits(count)) return nullptr;
    if (source.IsSized() || count <= c_unsizedReadAhead) {
        u8* const at = Allocate(headSize + count);
        return at && source.Read(at + headSize, count) ? at : nullptr;
    }
    Tail tail(*this);
    return tail.Extend(headSize) && tail.Read(source, count) ? tail.GetData() : nullptr;
}

u8* InSerialiserDataPool::Tail::Extend(u64 count)
{
    u64 size = 0;
    u64 padded = 0;
    if (!CheckedAdd(m_size, count, size) || !CheckedAdd(size, 7, padded)) return nullptr;
    InSerialiserDataPoolBucket* bucket = m_pool.m_last;
    if (bucket && !m_start) m_start = bucket->m_free;
    // The bytes in use are always rounded up, so that the next piece of the pool is aligned.
    u64 const used = bucket ? static_cast<u64>(bucket->m_free - m_start) : 0;
    u64 const needed = padded & ~u64(7);
    if (!bucket || needed - used > bucket->m_left) {
        // Ahead of the bytes there are, not of those that were only promised.
        u64 const capacity = std::max(needed, used + std::min(used, c_unsizedReadAhead));
        if (bucket && m_start == bucket->m_block) {
            u8* const moved = static_cast<u8*>(std::realloc(bucket->m_block, capacity));
            if (!moved) return nullptr;
            bucket->m_block = m_start = moved;
            bucket->m_free = moved + used;
            bucket->m_left = capacity - used;
        } else {
            u8 const* const old = m_start;
            if (bucket) {
                bucket->m_left += used;
                bucket->m_free -= used;
            }
            if (!m_pool.Push(capacity)) return nullptr;
            bucket = m_pool.m_last;
            m_start = bucket->m_block;
            if (m_size) std::memcpy(m_start, old, m_size);
            bucket->m_free += used;
            bucket->m_left -= used;
        }
    }
    bucket->m_left -= needed - used;
    bucket->m_free += needed - used;
    u8* const at = m_start + m_size;
    m_size = size;
    return at;
}

bool InSerialiserDataPool::Tail::Read(InSerialiserSource& source, u64 count)
{
    if (!source.Fits(count)) return false;
    while (count > 0) {
        u64 const piece = source.IsSized() ? count : std::min(count, c_unsizedReadAhead);
        u8* const at = Extend(piece);
        if (!at || !source.Read(at, piece)) return false;
        count -= piece;
    }
    return true;
}

void InSerialiserDataPool::DropBuckets(size_t kept)
{
    while (m_buckets.size() > kept) {
        Counted<InSerialiserDataPoolBucket> bucket = std::move(m_buckets.back());
        m_buckets.pop_back();
        bucket->m_left += static_cast<u64>(bucket->m_free - bucket->m_block);
        bucket->m_free = bucket->m_block;
        if (!m_spare && bucket->m_left == c_bucketSize) m_spare = std::move(bucket);
    }
    m_last = m_buckets.empty() ? nullptr : m_buckets.back().Get();
}

} // namespace Kernel

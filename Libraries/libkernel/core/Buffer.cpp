#include "libkernel/core/Buffer.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Exception.h"

#include <cstring>

namespace Kernel {

Buffer::Buffer(Buffer&& o) noexcept : m_head(std::exchange(o.m_head, nullptr)), m_tail(std::exchange(o.m_tail, nullptr))
{
}

Buffer& Buffer::operator=(Buffer&& o) noexcept
{
    Buffer taken(std::move(o));
    std::swap(m_head, taken.m_head);
    std::swap(m_tail, taken.m_tail);
    return *this;
}

Buffer::~Buffer()
{
    DeleteBuckets();
}

void Buffer::Append(unsigned char const* bytes, u64 count)
{
    if (!bytes || count == 0) return;
    u64 size;
    if (!CheckedAdd(count, sizeof(Bucket), size)) throw MemoryException();
    auto* const bucket = static_cast<Bucket*>(AllocatorMalloc::Allocate(size));
    if (!bucket) throw MemoryException();
    bucket->next = nullptr;
    bucket->count = count;
    std::memcpy(bucket + 1, bytes, count);
    (m_tail ? m_tail->next : m_head) = bucket;
    m_tail = bucket;
}

u64 Buffer::GetSize() const
{
    u64 size = 0;
    for (Bucket const* b = m_head; b; b = b->next) size += b->count;
    return size;
}

Counted<RawData> Buffer::Consolidate()
{
    auto result = MakeCounted<RawData>(GetSize());
    if (!result->GetData()) return result;
    u8* to = result->GetBytes();
    while (Bucket* const b = m_head) {
        std::memcpy(to, b + 1, b->count);
        to += b->count;
        m_head = b->next;
        AllocatorMalloc::Free(b);
    }
    m_tail = nullptr;
    return result;
}

// A loop, since a recursion as deep as the list is long would run out of stack.
void Buffer::DeleteBuckets() noexcept
{
    while (Bucket* const b = m_head) {
        m_head = b->next;
        AllocatorMalloc::Free(b);
    }
    m_tail = nullptr;
}

} // namespace Kernel

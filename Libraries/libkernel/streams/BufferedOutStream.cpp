#include "libkernel/streams/BufferedOutStream.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/StreamCopyProgress.h"
#include "libkernel/streams/internal/GenericCopy.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace Kernel {

BufferedOutStream::BufferedOutStream(OutStream& target, u64 blockSize)
    : m_target(target), m_blockSize(std::max(blockSize, c_smallestBlockSize))
{
}

BufferedOutStream::~BufferedOutStream()
{
    Commit(CommitErrors::Swallow);
}

bool BufferedOutStream::SetBlockSize(u64 blockSize)
{
    if (m_blockSize == 0 || !m_blocks.empty()) return false;
    m_blockSize = std::max(blockSize, c_smallestBlockSize);
    return true;
}

bool BufferedOutStream::AllocateTo(u64 end)
{
    u64 allocated = m_blocks.size() * m_blockSize;
    if (end <= allocated) return true;
    if (m_blockSize == 0 || end > MemoryInOutStreamBase::c_maxCapacity ||
        m_blockSize > MemoryInOutStreamBase::c_maxCapacity)
        return false;
    size_t const before = m_blocks.size();
    size_t const needed = (end - 1) / m_blockSize + 1;
    try {
        if (needed > m_blocks.capacity()) m_blocks.reserve(std::max(2 * m_blocks.capacity(), needed));
        while (m_blocks.size() < needed) m_blocks.emplace_back(new u8[m_blockSize]);
    } catch (std::bad_alloc const&) {
        m_blocks.resize(before);
        return false;
    }
    return true;
}

void BufferedOutStream::SetPosition(u64 position)
{
    m_position = position;
    u64 const offset = position % m_blockSize;
    m_room = offset != 0 ? m_blockSize - offset : 0;
    m_write = offset != 0 ? m_blocks[position / m_blockSize].get() + offset : nullptr;
}

// Copies into blocks that exist; a null source means zeros.
void BufferedOutStream::Put(u64 position, u8 const* from, u64 count)
{
    while (count > 0) {
        u64 const offset = position % m_blockSize;
        u64 const n = std::min(count, m_blockSize - offset);
        u8* const to = m_blocks[position / m_blockSize].get() + offset;
        if (from) {
            std::memcpy(to, from, n);
            from += n;
        } else
            std::memset(to, 0, n);
        position += n;
        count -= n;
    }
}

bool BufferedOutStream::ZeroFillTo(u64 end)
{
    if (end <= m_size) return true;
    if (!AllocateTo(end)) return false;
    Put(m_size, nullptr, end - m_size);
    m_size = end;
    return true;
}

u64 BufferedOutStream::WriteBlock(void const* from, u64 count)
{
    if (count == 0) return 0;
    if (count <= m_room) {
        std::memcpy(m_write, from, count);
        m_write += count;
        m_room -= count;
        m_position += count;
        m_size = std::max(m_size, m_position);
        return count;
    }
    u64 end;
    if (m_blockSize == 0 || !CheckedAdd(m_position, count, end) || !AllocateTo(end)) return 0;
    Put(m_position, static_cast<u8 const*>(from), count);
    SetPosition(end);
    m_size = std::max(m_size, end);
    return count;
}

void BufferedOutStream::Reserve(u64 count)
{
    u64 end;
    if (CheckedAdd(m_position, count, end)) AllocateTo(end);
}

bool BufferedOutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    if (m_blockSize == 0) return false;
    if (IsUnsized(in)) return GenericCopy(in, *this, progress);
    u64 const total = BytesLeft(in);
    if (progress && total == 0) progress->ReportProgress(0, 0);
    for (u64 done = 0; done < total;) {
        u64 const offset = m_position % m_blockSize;
        u64 const count = std::min(total - done, m_blockSize - offset);
        if (!AllocateTo(m_position + count)) return false;
        u64 const read = std::min(in.ReadBlock(m_blocks[m_position / m_blockSize].get() + offset, count), count);
        SetPosition(m_position + read);
        m_size = std::max(m_size, m_position);
        if (read != count) return false;
        done += read;
        if (progress) progress->ReportProgress(done, total);
    }
    return true;
}

bool BufferedOutStream::WriteBlockAtPos(u64 position, void const* from, u64 count)
{
    if (m_blockSize == 0) return false;
    if (count == 0) return true;
    u64 end;
    if (!CheckedAdd(position, count, end) || !AllocateTo(end)) return false;
    ZeroFillTo(position);
    Put(position, static_cast<u8 const*>(from), count);
    m_size = std::max(m_size, end);
    return true;
}

bool BufferedOutStream::Truncate(u64 size)
{
    if (m_blockSize == 0) return false;
    m_size = std::min(m_size, size);
    SetPosition(m_size);
    return true;
}

bool BufferedOutStream::SeekOutStream(SeekMethod method, i64 offset)
{
    u64 target;
    if (m_blockSize == 0 || !ResolveSeek(method, offset, m_position, m_size, target) || !ZeroFillTo(target))
        return false;
    SetPosition(target);
    return true;
}

bool BufferedOutStream::Commit(CommitErrors errors)
{
    try {
        return CommitI();
    } catch (...) {
        if (errors == CommitErrors::Rethrow) throw;
        return false;
    }
}

bool BufferedOutStream::CommitI()
{
    if (m_size != 0) m_target.Reserve(m_size);
    for (u64 position = 0; position < m_size; position += m_blockSize) {
        u64 const count = std::min(m_blockSize, m_size - position);
        if (m_target.WriteBlock(m_blocks[position / m_blockSize].get(), count) != count) return false;
    }
    m_blocks.clear();
    m_blockSize = 0;
    m_position = 0;
    m_size = 0;
    m_write = nullptr;
    m_room = 0;
    return true;
}

} // namespace Kernel

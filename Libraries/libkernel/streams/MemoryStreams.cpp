#include "libkernel/streams/MemoryStreams.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Limits.h"
#include "libkernel/streams/StreamCopyProgress.h"
#include "libkernel/streams/internal/GenericCopy.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <utility>

namespace Kernel {

namespace {

constexpr u64 c_smallestBuffer = 256;

// Moves what lies at data to a target that takes it in one piece, or in pieces of 1 MiB where each piece is slow enough
// to be worth a report. position moves by what was taken.
bool CopyMemoryOut(u8 const* data, u64 size, u64& position, OutStream& out, StreamCopyProgress* progress)
{
    u64 const total = size - position;
    u64 const piece = progress && out.SlowProgressOutStream() ? c_copyBufferSize : total;
    u64 done = 0;
    if (progress && total == 0) progress->ReportProgress(0, 0);
    while (done < total) {
        u64 const count = std::min(piece, total - done);
        u64 const written = out.WriteBlock(data + position, count);
        position += std::min(written, count);
        if (written != count) return false;
        done += written;
        if (progress) progress->ReportProgress(done, total);
    }
    return true;
}

} // namespace

MemCourier::MemCourier(MemCourier&& o) noexcept
    : m_data(std::exchange(o.m_data, nullptr)), m_size(std::exchange(o.m_size, 0))
{
}

MemCourier& MemCourier::operator=(MemCourier&& o) noexcept
{
    std::swap(m_data, o.m_data);
    std::swap(m_size, o.m_size);
    return *this;
}

MemCourier::~MemCourier()
{
    std::free(m_data);
}

void* MemCourier::Detach() noexcept
{
    m_size = 0;
    return std::exchange(m_data, nullptr);
}

MemoryInStream::MemoryInStream(void const* data, u64 size, bool copy)
    : m_data(static_cast<u8 const*>(data)), m_size(size), m_owning(copy && size != 0)
{
    if (!m_owning) return;
    void* const own = size <= MemoryInOutStreamBase::c_maxCapacity ? std::malloc(size) : nullptr;
    if (!own) throw MemoryException();
    std::memcpy(own, data, size);
    m_data = static_cast<u8 const*>(own);
}

MemoryInStream::MemoryInStream(MemCourier courier) : m_size(courier.GetSize()), m_owning(true)
{
    m_data = static_cast<u8 const*>(courier.Detach());
}

MemoryInStream::~MemoryInStream()
{
    if (m_owning) std::free(const_cast<u8*>(m_data));
}

u64 MemoryInStream::ReadBlock(void* to, u64 count)
{
    u64 const n = std::min(count, m_size - m_position);
    if (n == 0) return 0;
    std::memcpy(to, m_data + m_position, n);
    m_position += n;
    return n;
}

bool MemoryInStream::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    return CopyMemoryOut(m_data, m_size, m_position, out, progress);
}

bool MemoryInStream::SeekInStream(SeekMethod method, i64 offset)
{
    if (method < SeekMethod::Current || method > SeekMethod::End) return false;
    u64 target;
    m_position = ResolveSeek(method, offset, m_position, m_size, target) ? std::min(target, m_size) : m_size;
    return true;
}

MemoryInOutStreamBase::MemoryInOutStreamBase(u64 capacity)
{
    if (capacity == 0 || capacity > c_maxCapacity) return;
    m_buffer = static_cast<u8*>(std::malloc(capacity));
    if (m_buffer) m_capacity = capacity;
}

MemoryInOutStreamBase::~MemoryInOutStreamBase()
{
    std::free(m_buffer);
}

bool MemoryInOutStreamBase::ResizeBuffer(u64 required)
{
    if (required <= m_capacity) return true;
    if (required > c_maxCapacity) return false;
    u64 const capacity = std::max(GetNewCapacity(m_capacity, required), required);
    // realloc, because it moves pages instead of bytes once the buffer is large.
    void* const grown = std::realloc(m_buffer, capacity);
    if (!grown) return false;
    m_buffer = static_cast<u8*>(grown);
    m_capacity = capacity;
    return true;
}

bool MemoryInOutStreamBase::ZeroFillTo(u64 end)
{
    if (end <= m_size) return true;
    if (!ResizeBuffer(end)) return false;
    std::memset(m_buffer + m_size, 0, end - m_size);
    m_size = end;
    return true;
}

u64 MemoryInOutStreamBase::ReadBlock(void* to, u64 count)
{
    u64 const n = std::min(count, m_size - m_position);
    if (n == 0) return 0;
    std::memcpy(to, m_buffer + m_position, n);
    m_position += n;
    return n;
}

bool MemoryInOutStreamBase::SkipBlock(u64 count)
{
    if (count > m_size - m_position) return false;
    m_position += count;
    return true;
}

bool MemoryInOutStreamBase::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    return CopyMemoryOut(m_buffer, m_size, m_position, out, progress);
}

u64 MemoryInOutStreamBase::WriteBlock(void const* from, u64 count)
{
    if (count == 0) return 0;
    u64 end;
    if (!CheckedAdd(m_position, count, end) || !ResizeBuffer(end)) return 0;
    std::memcpy(m_buffer + m_position, from, count);
    m_position = end;
    m_size = std::max(m_size, end);
    return count;
}

void MemoryInOutStreamBase::Reserve(u64 count)
{
    u64 end;
    if (CheckedAdd(m_position, count, end)) ResizeBuffer(end);
}

bool MemoryInOutStreamBase::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    if (IsUnsized(in)) return GenericCopy(in, *this, progress);
    u64 const total = BytesLeft(in);
    if (total == 0) {
        if (progress) progress->ReportProgress(0, 0);
        return true;
    }
    u64 end;
    if (!CheckedAdd(m_position, total, end) || !ResizeBuffer(end)) return false;

    u64 const piece = progress && in.SlowProgressInStream() ? c_copyBufferSize : total;
    for (u64 done = 0; done < total;) {
        u64 const count = std::min(piece, total - done);
        u64 const read = in.ReadBlock(m_buffer + m_position, count);
        m_position += std::min(read, count);
        m_size = std::max(m_size, m_position);
        if (read != count) return false;
        done += read;
        if (progress) progress->ReportProgress(done, total);
    }
    return true;
}

bool MemoryInOutStreamBase::WriteBlockAtPos(u64 position, void const* from, u64 count)
{
    if (count == 0) return true;
    u64 end;
    if (!CheckedAdd(position, count, end) || !ResizeBuffer(end)) return false;
    ZeroFillTo(position);
    std::memcpy(m_buffer + position, from, count);
    m_size = std::max(m_size, end);
    return true;
}

bool MemoryInOutStreamBase::Truncate(u64 size)
{
    m_size = std::min(m_size, size);
    m_position = m_size;
    return true;
}

bool MemoryInOutStreamBase::SeekI(SeekMethod method, i64 offset)
{
    u64 target;
    if (!ResolveSeek(method, offset, m_position, m_size, target) || !ZeroFillTo(target)) return false;
    m_position = target;
    return true;
}

bool MemoryInOutStreamBase::SeekInStream(SeekMethod method, i64 offset)
{
    return SeekI(method, offset);
}

bool MemoryInOutStreamBase::SeekOutStream(SeekMethod method, i64 offset)
{
    return SeekI(method, offset);
}

MemCourier MemoryInOutStreamBase::ReleaseBuffer()
{
    m_capacity = 0;
    m_position = 0;
    return MemCourier(std::exchange(m_buffer, nullptr), std::exchange(m_size, 0));
}

MemoryInOutStream::~MemoryInOutStream() = default;

u64 MemoryInOutStream::GetNewCapacity(u64 capacity, u64 required) const
{
    return std::max({required, 2 * capacity, c_smallestBuffer}); // The limit on capacities keeps the double in 64 bits.
}

} // namespace Kernel

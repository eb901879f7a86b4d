#include "libkernel/streams/BufferedInStream.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/streams/MemoryStreams.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace Kernel {

BufferedInStream::BufferedInStream(Counted<InStream> const& source, u64 bufferSize)
    : m_source(source), m_start(source->TellInStream()), m_bufferSize(bufferSize), m_buffer(new u8[bufferSize])
{
}

BufferedInStream::~BufferedInStream() = default;

Counted<BufferedInStream> BufferedInStream::Create(Counted<InStream> const& source, u64 bufferSize)
{
    if (!source) return nullptr;
    if (bufferSize > MemoryInOutStreamBase::c_maxCapacity) throw std::bad_alloc();
    return new BufferedInStream(source, std::max(bufferSize, c_smallestBuffer));
}

u64 BufferedInStream::CutToLimit(u64 count) const
{
    if (m_limit == 0) return count;
    return m_position < m_limit ? std::min(count, m_limit - m_position) : 0;
}

u64 BufferedInStream::TakeAvailable(void* to, u64 count)
{
    u64 const n = std::min(count, m_available);
    if (n == 0) return 0;
    std::memcpy(to, m_read, n);
    m_read += n;
    m_available -= n;
    m_position += n;
    return n;
}

u64 BufferedInStream::ReadBlock(void* to, u64 count)
{
    count = CutToLimit(count);
    u64 const taken = TakeAvailable(to, count);
    if (taken == count) return taken;

    u8* const rest = static_cast<u8*>(to) + taken;
    u64 const wanted = count - taken;
    bool const reachesLimit = m_limit != 0 && wanted == m_limit - m_position;
    if (wanted < m_bufferSize && !reachesLimit) {
        m_read = m_buffer.get();
        m_available = m_source->ReadBlock(m_buffer.get(), CutToLimit(m_bufferSize));
        return taken + TakeAvailable(rest, wanted);
    }
    u64 const read = m_source->ReadBlock(rest, wanted);
    m_position += read;
    return taken + read;
}

bool BufferedInStream::SkipBlock(u64 count)
{
    count = CutToLimit(count);
    u64 const buffered = std::min(count, m_available);
    m_read += buffered;
    m_available -= buffered;
    m_position += buffered;
    u64 const rest = count - buffered;
    if (rest == 0) return true;
    if (!m_source->SkipBlock(rest)) return false;
    m_position += rest;
    return true;
}

bool BufferedInStream::EOS() const
{
    if (m_limit != 0 && m_position >= m_limit) return true;
    return m_available == 0 && m_source->EOS();
}

bool BufferedInStream::SlowProgressInStream() const
{
    return m_source->SlowProgressInStream();
}

u64 BufferedInStream::GetSizeInStream() const
{
    u64 const sourceSize = m_source->GetSizeInStream();
    u64 const size = sourceSize > m_start ? sourceSize - m_start : 0;
    return m_limit != 0 ? std::min(size, m_limit) : size;
}

} // namespace Kernel

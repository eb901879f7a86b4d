#include "libkernel/serialisation/OutSerialiserTarget.h"

#include "libkernel/streams/OutStream.h"

namespace Kernel {

OutSerialiserTarget::OutSerialiserTarget(OutStream& stream)
    : m_stream(stream), m_next(m_buffer), m_end(m_buffer + c_bufferSize)
{
}

bool OutSerialiserTarget::Flush()
{
    if (m_failed) return false;
    u64 const held = static_cast<u64>(m_next - m_buffer);
    m_next = m_buffer;
    if (held == 0 || m_stream.WriteBlock(m_buffer, held) == held) return true;
    MarkAsFailed();
    return false;
}

bool OutSerialiserTarget::PutLarge(void const* bytes, u64 count)
{
    if (!Flush()) return false;
    if (count < c_bufferSize / 2) {
        std::memcpy(m_next, bytes, count);
        m_next += count;
        return true;
    }
    if (m_stream.WriteBlock(bytes, count) == count) return true;
    MarkAsFailed();
    return false;
}

u64 OutSerialiserTarget::GetSize() const
{
    return m_stream.GetSize() + static_cast<u64>(m_next - m_buffer);
}

OutStream* OutSerialiserTarget::GetFlushedStream()
{
    return Flush() ? &m_stream : nullptr;
}

void OutSerialiserTarget::MarkAsFailed()
{
    m_failed = true;
    m_next = m_end = m_buffer;
}

} // namespace Kernel

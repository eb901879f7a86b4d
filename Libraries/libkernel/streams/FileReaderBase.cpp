#include "libkernel/streams/FileReaderBase.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <utility>

namespace Kernel {

FileReaderBase::FileReaderBase(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize)
    : FileStreamBase(handle), m_buffer(std::move(buffer)), m_bufferSize(bufferSize), m_read(m_buffer.get())
{
}

FileReaderBase::~FileReaderBase() = default;

u64 FileReaderBase::TakeAvailable(void* to, u64 count)
{
    u64 const n = std::min(count, m_available);
    if (n == 0) return 0;
    std::memcpy(to, m_read, n);
    m_read += n;
    m_available -= n;
    m_position += n;
    return n;
}

u64 FileReaderBase::ReadI(void* to, u64 count)
{
    if (!IsUsable() || !to || count == 0) return 0;
    u64 taken = TakeAvailable(to, count);
    if (taken == count) return taken;

    u8* const rest = static_cast<u8*>(to) + taken;
    u64 const wanted = count - taken;
    m_read = m_buffer.get();
    Platform::IoResult result;
    if (wanted >= m_bufferSize) {
        result = Platform::GetFileCalls().readAt(GetHandle(), rest, wanted, m_position);
        m_fileHitEnd = result.count < wanted && result.error == 0;
        m_position += result.count;
        taken += result.count;
    } else {
        result = Platform::GetFileCalls().readAt(GetHandle(), m_buffer.get(), m_bufferSize, m_position);
        m_fileHitEnd = result.count < m_bufferSize && result.error == 0;
        m_available = result.count;
        taken += TakeAvailable(rest, wanted);
    }
    // An error behind the bytes that were asked for waits until somebody asks for the bytes it hides.
    if (taken < count && result.error != 0) OnErrorI(result.error);
    return taken;
}

bool FileReaderBase::MoveTo(u64 target)
{
    if (!IsUsable() || target > static_cast<u64>(std::numeric_limits<i64>::max())) return false;
    if (target == m_position) return true;
    u64 const behind = static_cast<u64>(m_read - m_buffer.get());
    if (target < m_position ? m_position - target <= behind : target - m_position <= m_available) {
        m_read += static_cast<i64>(target - m_position);
        m_available -= target - m_position; // Grows on the way back: the difference wraps.
    } else {
        m_read = m_buffer.get();
        m_available = 0;
        m_fileHitEnd = false;
    }
    m_position = target;
    return true;
}

} // namespace Kernel

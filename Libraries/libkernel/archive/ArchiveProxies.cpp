#include "libkernel/archive/internal/ArchiveProxies.h"

#include <algorithm>

namespace Kernel {

OutStreamProxy::~OutStreamProxy() = default;
DataOutStreamProxy::~DataOutStreamProxy() = default;

u64 DataOutStreamProxy::WriteBlock(void const* from, u64 count)
{
    if (!m_data.SetData(m_position, from, count, true)) return 0;
    m_position += count;
    return count;
}

// A target before the start is the start; one past the end lengthens the data.
bool DataOutStreamProxy::SeekInStream(SeekMethod method, i64 offset)
{
    u64 base = 0;
    switch (method) {
    case SeekMethod::Beginning: break;
    case SeekMethod::Current: base = m_position; break;
    case SeekMethod::End: base = m_data.GetSize(); break;
    default: return false;
    }
    u64 const back = offset < 0 ? u64{0} - static_cast<u64>(offset) : 0;
    u64 const target = offset < 0 ? base - std::min(base, back) : base + static_cast<u64>(offset);
    if (target > m_data.GetSize() && !m_data.SetSize(target, true)) return false;
    m_position = target;
    return true;
}

bool DataOutStreamProxy::Truncate(u64 size)
{
    if (size < m_data.GetSize() && !m_data.SetSize(size, false)) return false;
    m_position = std::min(m_position, m_data.GetSize());
    return true;
}

} // namespace Kernel

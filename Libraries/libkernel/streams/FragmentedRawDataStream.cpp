#include "libkernel/streams/FragmentedRawDataStream.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/streams/internal/SeekTarget.h"

namespace Kernel {

FragmentedRawDataStream::FragmentedRawDataStream(Counted<FragmentedRawData> const& data)
    : m_data(data), m_position(data->GetSize())
{
}

FragmentedRawDataStream::~FragmentedRawDataStream() = default;

Counted<FragmentedRawDataStream> FragmentedRawDataStream::Create(Counted<FragmentedRawData> const& data)
{
    return data ? new FragmentedRawDataStream(data) : nullptr;
}

u64 FragmentedRawDataStream::ReadBlock(void* to, u64 count)
{
    u64 const read = m_data->GetData(m_position, to, count);
    m_position += read;
    return read;
}

u64 FragmentedRawDataStream::GetSizeInStream() const
{
    return m_data->GetSize();
}

bool FragmentedRawDataStream::SeekI(SeekMethod method, i64 offset)
{
    u64 target;
    if (!ResolveSeek(method, offset, m_position, m_data->GetSize(), target)) return false;
    if (target > m_data->GetSize() && !m_data->SetSize(target, false)) return false;
    m_position = target;
    return true;
}

bool FragmentedRawDataStream::SeekInStream(SeekMethod method, i64 offset)
{
    return SeekI(method, offset);
}

u64 FragmentedRawDataStream::WriteBlock(void const* from, u64 count)
{
    u64 end;
    if (count == 0 || !CheckedAdd(m_position, count, end)) return 0;
    // The data may have been cut behind our back: then the gap up to the position is zeros.
    if (!m_data->SetData(m_position, from, count, true)) return 0;
    m_position = end;
    return count;
}

u64 FragmentedRawDataStream::GetSizeOutStream() const
{
    return m_data->GetSize();
}

bool FragmentedRawDataStream::Truncate(u64 size)
{
    if (m_data->GetSize() > size && !m_data->SetSize(size, false)) return false;
    m_position = m_data->GetSize();
    return true;
}

bool FragmentedRawDataStream::SeekOutStream(SeekMethod method, i64 offset)
{
    return SeekI(method, offset);
}

} // namespace Kernel

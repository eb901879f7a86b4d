#include "libkernel/serialisation/internal/InSerialiserSource.h"

#include "libkernel/streams/ForwardBiasedSeekableInStream.h"
#include "libkernel/streams/MemoryStreams.h"

#include <algorithm>

namespace Kernel {

InSerialiserSource::InSerialiserSource(InStream& in)
    : m_in(in), m_start(in.TellInStream()), m_size(in.GetSizeInStream())
{
    m_sized = m_size != 0;
    m_unread = m_size > m_start ? m_size - m_start : 0;
    if (auto* const memory = dynamic_cast<MemoryInStream*>(&in)) {
        m_seekable = memory;
        m_inPlace = m_sized = true;
        m_at = static_cast<u8 const*>(memory->GetBuffer()) + m_start;
        m_end = m_at + memory->GetRem();
        m_fetched = memory->GetRem();
        m_unread = 0;
    }
    // A forward-biased stream goes back only by starting over, if at all.
    else if (!dynamic_cast<ForwardBiasedSeekableInStream*>(&in))
        m_seekable = dynamic_cast<InStreamSeekable*>(&in);
}

float InSerialiserSource::GetProgress() const
{
    return m_size ? static_cast<float>(m_start + GetTaken()) / static_cast<float>(m_size) : 0.0f;
}

u64 InSerialiserSource::Fetch(u8* to, u64 count)
{
    if (m_inPlace) return 0;
    if (m_sized) count = std::min(count, m_unread);
    u64 const got = std::min(m_in.ReadBlock(to, count), count);
    m_fetched += got;
    if (m_sized) m_unread -= got;
    return got;
}

// Behind the @p count bytes that are wanted, @p sure more must follow in any sound stream.
bool InSerialiserSource::FillSlow(u64 count, u64 sure)
{
    if (m_inPlace) return false;
    if (!m_buffer) m_buffer = std::make_unique_for_overwrite<u8[]>(c_blockSize);
    u64 have = static_cast<u64>(m_end - m_at);
    if (have) std::memmove(m_buffer.get(), m_at, have);
    m_at = m_buffer.get();
    u64 const wanted = m_seekable ? c_blockSize : std::min<u64>(count + sure, c_blockSize);
    while (have < count) {
        u64 const got = Fetch(m_buffer.get() + have, wanted - have);
        if (got == 0) break;
        have += got;
    }
    m_end = m_at + have;
    return have >= count;
}

bool InSerialiserSource::ReadSlow(u8* to, u64 count)
{
    u64 const have = static_cast<u64>(m_end - m_at);
    if (have) std::memcpy(to, m_at, have);
    m_at = m_end;
    to += have;
    count -= have;
    if (count <= c_blockSize / 2) {
        if (!FillSlow(count, m_openLists)) return false;
        std::memcpy(to, m_at, count);
        m_at += count;
        return true;
    }
    while (count > 0) {
        u64 const got = Fetch(to, count);
        if (got == 0) return false;
        to += got;
        count -= got;
    }
    return true;
}

bool InSerialiserSource::Skip(u64 count)
{
    if (!Fits(count)) return false;
    u64 const buffered = std::min(count, static_cast<u64>(m_end - m_at));
    m_at += buffered;
    count -= buffered;
    if (count == 0) return true;
    // Small gaps are cheaper to read over than to seek over.
    if (count <= c_blockSize / 2) {
        if (!FillSlow(count, m_openLists)) return false;
        m_at += count;
        return true;
    }
    if (m_inPlace || !m_in.SkipBlock(count)) return false;
    m_fetched += count;
    if (m_sized) m_unread -= count;
    return true;
}

bool InSerialiserSource::Release()
{
    u64 const ahead = static_cast<u64>(m_end - m_at);
    if (m_inPlace) return m_seekable->SeekInStream(SeekMethod::Current, static_cast<i64>(GetTaken()));
    return ahead == 0 || (m_seekable && m_seekable->SeekInStream(SeekMethod::Current, -static_cast<i64>(ahead)));
}

} // namespace Kernel

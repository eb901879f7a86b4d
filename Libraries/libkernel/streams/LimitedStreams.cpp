#include "libkernel/streams/LimitedStreams.h"

#include <algorithm>

namespace Kernel {

LimitedInStream::LimitedInStream(Counted<InStream> const& source, u64 limit)
    : m_source(source), m_start(source->TellInStream()), m_limit(limit)
{
}

LimitedInStream::~LimitedInStream() = default;

Counted<LimitedInStream> LimitedInStream::Create(Counted<InStream> const& source, u64 limit)
{
    return source ? new LimitedInStream(source, limit) : nullptr;
}

u64 LimitedInStream::ReadBlock(void* to, u64 count)
{
    u64 const wanted = std::min(count, Remaining());
    if (wanted == 0) return 0;
    u64 const read = m_source->ReadBlock(to, wanted);
    m_consumed += std::min(read, wanted);
    return read;
}

bool LimitedInStream::SkipBlock(u64 count)
{
    u64 const wanted = std::min(count, Remaining());
    if (!m_source->SkipBlock(wanted)) return false;
    m_consumed += wanted;
    return true;
}

bool LimitedInStream::EOS() const
{
    return m_consumed == m_limit || m_source->EOS();
}

bool LimitedInStream::SlowProgressInStream() const
{
    return m_source->SlowProgressInStream();
}

u64 LimitedInStream::GetSizeInStream() const
{
    u64 const size = m_source->GetSizeInStream();
    return std::min(size > m_start ? size - m_start : 0, m_limit);
}

LimitedOutStream::LimitedOutStream(OutStream& target, Counted<OutStream> const& owner, u64 limit)
    : m_target(target), m_owner(owner), m_allowed(limit), m_limit(limit)
{
}

LimitedOutStream::~LimitedOutStream() = default;

Counted<LimitedOutStream> LimitedOutStream::Create(Counted<OutStream> const& target, u64 limit)
{
    return target ? new LimitedOutStream(*target, target, limit) : nullptr;
}

Counted<LimitedOutStream> LimitedOutStream::Create(OutStream& target, u64 limit)
{
    return new LimitedOutStream(target, nullptr, limit);
}

u64 LimitedOutStream::WriteBlock(void const* from, u64 count)
{
    if (count > m_allowed) {
        m_exceeded = true;
        count = m_allowed;
    }
    if (count == 0) return 0;
    u64 const written = m_target.WriteBlock(from, count);
    m_allowed -= std::min(written, count);
    return written;
}

bool LimitedOutStream::Flush()
{
    return m_target.Flush();
}

bool LimitedOutStream::ForceFlush()
{
    return m_target.ForceFlush();
}

bool LimitedOutStream::SlowProgressOutStream() const
{
    return m_target.SlowProgressOutStream();
}

} // namespace Kernel

#include "libkernel/streams/ForwardBiasedSeekableInStream.h"

namespace Kernel {

ForwardBiasedSeekableInStream::~ForwardBiasedSeekableInStream() = default;

u64 ForwardBiasedSeekableInStream::ReadBlock(void* to, u64 count)
{
    return m_source.ReadBlock(to, count);
}

bool ForwardBiasedSeekableInStream::SkipBlock(u64 count)
{
    return m_source.SkipBlock(count);
}

bool ForwardBiasedSeekableInStream::EOS() const
{
    return m_source.EOS();
}

bool ForwardBiasedSeekableInStream::SlowProgressInStream() const
{
    return m_source.SlowProgressInStream();
}

bool ForwardBiasedSeekableInStream::CanRewindInStream() const
{
    return m_source.CanRewindInStream();
}

u64 ForwardBiasedSeekableInStream::GetSizeInStream() const
{
    return m_source.GetSizeInStream();
}

u64 ForwardBiasedSeekableInStream::TellInStream() const
{
    return m_source.TellInStream();
}

bool ForwardBiasedSeekableInStream::SeekInStream(SeekMethod method, i64 offset)
{
    i64 const position = static_cast<i64>(m_source.TellInStream());
    i64 relative = offset;
    switch (method) {
    case SeekMethod::Current: break;
    case SeekMethod::Beginning:
        if (__builtin_sub_overflow(offset, position, &relative)) return false;
        break;
    case SeekMethod::End: {
        i64 const rest = static_cast<i64>(m_source.GetSizeInStream() - m_source.TellInStream());
        if (__builtin_add_overflow(offset, rest, &relative)) return false;
        break;
    }
    default: return false;
    }
    if (relative >= 0) return m_source.SkipBlock(static_cast<u64>(relative));

    i64 target;
    if (__builtin_add_overflow(position, relative, &target) || target < 0) return false;
    if (!m_source.CanRewindInStream() || !m_source.RewindInStream()) return false;
    return m_source.SkipBlock(static_cast<u64>(target));
}

} // namespace Kernel

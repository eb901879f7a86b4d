#include "libkernel/streams/NullOutStream.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/streams/StreamCopyProgress.h"
#include "libkernel/streams/internal/GenericCopy.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>

namespace Kernel {

NullOutStream::~NullOutStream() = default;

bool NullOutStream::MoveTo(u64 position)
{
    m_position = position;
    m_size = std::max(m_size, position);
    return true;
}

u64 NullOutStream::WriteBlock(void const*, u64 count)
{
    u64 end;
    return CheckedAdd(m_position, count, end) && MoveTo(end) ? count : 0;
}

bool NullOutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    if (IsUnsized(in)) return GenericCopy(in, *this, progress);
    u64 const total = BytesLeft(in);
    if (WriteBlock(nullptr, total) != total) return false;
    if (progress) progress->ReportProgress(total, total);
    return in.SkipBlock(total);
}

bool NullOutStream::Truncate(u64 size)
{
    m_size = std::min(m_size, size);
    m_position = m_size;
    return true;
}

bool NullOutStream::SeekOutStream(SeekMethod method, i64 offset)
{
    u64 target;
    return ResolveSeek(method, offset, m_position, m_size, target) && MoveTo(target);
}

} // namespace Kernel

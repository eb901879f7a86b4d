#pragma once

#include "libkernel/core/CheckedMath.h"
#include "libkernel/streams/InStream.h"

namespace Kernel {

/// Turns a seek into a position. A target below the start becomes the start. False for an unknown method, or when the
/// position does not fit 64 bits.
inline bool ResolveSeek(SeekMethod method, i64 offset, u64 position, u64 size, u64& target)
{
    u64 from = 0;
    switch (method) {
    case SeekMethod::Current: from = position; break;
    case SeekMethod::Beginning: break;
    case SeekMethod::End: from = size; break;
    default: return false;
    }
    if (offset >= 0) return CheckedAdd(from, static_cast<u64>(offset), target);
    u64 const back = 0 - static_cast<u64>(offset); // Right for the lowest offset too, whose negative does not fit.
    target = back < from ? from - back : 0;
    return true;
}

/// The same for files: a target below the start, or beyond what a file offset can be, is refused.
inline bool ResolveSeekStrictly(SeekMethod method, i64 offset, u64 position, u64 size, u64& target)
{
    u64 const from = method == SeekMethod::Current ? position : method == SeekMethod::End ? size : 0;
    if (offset < 0 && 0 - static_cast<u64>(offset) > from) return false;
    return ResolveSeek(method, offset, position, size, target) && target <= static_cast<u64>(INT64_MAX);
}

/// What a source says is left. 0 also where it does not know its size.
inline u64 BytesLeft(InStream const& in)
{
    u64 const size = in.GetSizeInStream();
    u64 const position = in.TellInStream();
    return size > position ? size - position : 0;
}

/// True for a source that has bytes left but can't say how many, so that no room can be made for them ahead.
inline bool IsUnsized(InStream const& in)
{
    u64 const size = in.GetSizeInStream();
    return (size == 0 || in.TellInStream() > size) && !in.EOS();
}

} // namespace Kernel

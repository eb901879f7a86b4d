#pragma once

#include "libkernel/core/Types.h"
#include "libkernel/streams/MemoryStreams.h"

#include <memory>
#include <new>

namespace Kernel {

/// A buffer of @p size bytes, null without memory for it.
inline std::unique_ptr<u8[]> MakeBuffer(u64 size)
{
    if (size > MemoryInOutStreamBase::c_maxCapacity) return nullptr;
    return std::unique_ptr<u8[]>(new (std::nothrow) u8[size]);
}

} // namespace Kernel

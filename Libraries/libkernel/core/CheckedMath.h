#pragma once

#include "libkernel/core/Types.h"

namespace Kernel {

/// Sum in 64 bits. False, with @p out unspecified, when it does not fit: every sum over lengths and offsets that come
/// from outside goes through here.
[[nodiscard]] inline bool CheckedAdd(u64 a, u64 b, u64& out)
{
    return !__builtin_add_overflow(a, b, &out);
}

/// Product in 64 bits; false when it does not fit.
[[nodiscard]] inline bool CheckedMul(u64 a, u64 b, u64& out)
{
    return !__builtin_mul_overflow(a, b, &out);
}

/// True if [offset, offset + count) lies inside [0, size), without overflow.
[[nodiscard]] inline bool RangeFits(u64 offset, u64 count, u64 size)
{
    return offset <= size && count <= size - offset;
}

} // namespace Kernel

#pragma once

#include "libkernel/core/Types.h"

#include <bit>
#include <cstring>
#include <type_traits>

namespace Kernel {

/// Numbers on any medium are little-endian. These are the one place that knows how this machine differs.

template <class T>
constexpr T ToLittleEndian(T value)
{
    static_assert(std::is_integral_v<T>);
    if constexpr (std::endian::native == std::endian::little || sizeof(T) == 1)
        return value;
    else if constexpr (sizeof(T) == 2)
        return static_cast<T>(__builtin_bswap16(static_cast<u16>(value)));
    else if constexpr (sizeof(T) == 4)
        return static_cast<T>(__builtin_bswap32(static_cast<u32>(value)));
    else
        return static_cast<T>(__builtin_bswap64(static_cast<u64>(value)));
}

/// Writes @p value at @p to, which need not be aligned.
template <class T>
void StoreLittleEndian(void* to, T value)
{
    value = ToLittleEndian(value);
    std::memcpy(to, &value, sizeof(T));
}

/// Reads a number from @p from, which need not be aligned.
template <class T>
T LoadLittleEndian(void const* from)
{
    T value;
    std::memcpy(&value, from, sizeof(T));
    return ToLittleEndian(value);
}

} // namespace Kernel

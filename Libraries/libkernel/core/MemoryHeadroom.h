#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// What a call of ICU that reads tables or makes formatters takes at most, amply.
constexpr u64 c_icuHeadroom = 1u << 20;

/// Throws std::bad_alloc unless @p size bytes can be had at this moment; they are given back at once. To be called
/// before a library that goes on with null pointers where it was refused memory, as ICU's formatters and its charset
/// detector do. No promise, since another thread may be quicker, but where memory is short it is the difference between
/// an exception and the end of the process.
KERNEL_API void RequireMemory(u64 size);

} // namespace Kernel

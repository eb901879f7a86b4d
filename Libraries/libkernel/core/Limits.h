#pragma once

#include "libkernel/core/Types.h"

namespace Kernel {

// Limits that readers of outside bytes share. A length is always checked against the bytes that are left first; what
// stands here bounds what no byte count can.

/// Levels of objects, inline classes, parent records, default objects and delay loads in one parse or save.
constexpr u32 c_maxNesting = 1024;

/// No block is asked for above this size: no machine that runs this has it, and refusing early gives one answer, "no
/// memory", on systems that would promise the pages and on tools that end the process over such a request. Nor is a
/// range of blocks that is larger in all.
constexpr u64 c_maxAllocation = u64{1} << 39;

/// The most that memory may run ahead of the bytes delivered by a source that does not know its size.
constexpr u64 c_unsizedReadAhead = 1u << 20;

/// The most that one stored byte can unpack to, by method, and the slack that both get.
constexpr u64 c_maxZlibRatio = 1032;
constexpr u64 c_maxZstdRatio = 32768;
constexpr u64 c_codecSlack = 128 * 1024;

/// Largest zstd window accepted, as a power of two.
constexpr int c_maxZstdWindowLog = 27;

/// Size of every copy buffer.
constexpr u64 c_copyBufferSize = 1u << 20;

} // namespace Kernel

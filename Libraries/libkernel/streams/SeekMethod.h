#pragma once

#include "libkernel/core/Types.h"

namespace Kernel {

/// What an offset of a seek is measured from. The same numbers for input and output.
enum class SeekMethod : int
{
    Current = 0,   ///< The present position.
    Beginning = 1, ///< The start of the stream.
    End = 2        ///< The end of the stream; the offset is negative to reach into it.
};

} // namespace Kernel

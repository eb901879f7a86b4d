#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// The build number of the code base, as it is stored with each file in a document.
class KERNEL_API BuildNumber
{
public:
    /// Of this library: 24.
    static u32 ProductionIndex();
    /// True for a number of the first generation, below 20.
    static bool IsV1ProductionIndex(u32 index);
};

} // namespace Kernel

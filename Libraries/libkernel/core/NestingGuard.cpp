#include "libkernel/core/NestingGuard.h"

namespace Kernel {

u32& NestingGuard::GetDepth()
{
    thread_local u32 depth = 0;
    return depth;
}

} // namespace Kernel

#include "libkernel/concurrency/ThreadId.h"

#include "libkernel/platform/Thread.h"

namespace Kernel {

ThreadId ThreadId::GetCurrent()
{
    return ThreadId(Platform::GetCurrentThreadId());
}

} // namespace Kernel

#include "libkernel/platform/OpenFileLimit.h"

#include <algorithm>
#include <sys/resource.h>

namespace Kernel::Platform {

void RaiseOpenFileLimit(u64 count)
{
    struct ::rlimit limit;
    if (::getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur >= count) return;
    rlim_t const most = std::min<rlim_t>(count, limit.rlim_max);
    if (most <= limit.rlim_cur) return;
    limit.rlim_cur = most;
    ::setrlimit(RLIMIT_NOFILE, &limit);
}

} // namespace Kernel::Platform

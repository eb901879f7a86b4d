#include "libkernel/platform/Random.h"

#include <algorithm>
#include <cerrno>
#include <sys/random.h>

namespace Kernel::Platform {

bool RandomBytes(void* data, u64 size)
{
    char* at = static_cast<char*>(data);
    while (size > 0) {
        ssize_t const n = ::getrandom(at, std::min<u64>(size, 1u << 20), 0);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        at += n;
        size -= static_cast<u64>(n);
    }
    return true;
}

} // namespace Kernel::Platform

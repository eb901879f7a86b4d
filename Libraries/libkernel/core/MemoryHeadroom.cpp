#include "libkernel/core/MemoryHeadroom.h"

#include <cstdlib>
#include <new>

namespace Kernel {

void RequireMemory(u64 size)
{
    // Volatile, or the compiler may take a block that nobody uses for granted.
    void* volatile block = std::malloc(size);
    if (!block) throw std::bad_alloc();
    std::free(block);
}

} // namespace Kernel

#include "serialisation/AllocationWatch.h"

#include <cstddef>

namespace Kernel::Test {

static bool s_isWatching = false;
static i64 s_inUse = 0;
static i64 s_peak = 0;

AllocationWatch::AllocationWatch()
{
    s_inUse = s_peak = 0;
    s_isWatching = true;
}

AllocationWatch::~AllocationWatch()
{
    s_isWatching = false;
}

u64 AllocationWatch::GetPeak()
{
    return static_cast<u64>(s_peak);
}

} // namespace Kernel::Test

#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)

// The C library's own entry points lie behind its public ones, which these stand in for.
extern "C" {
void* __libc_malloc(size_t);
void* __libc_calloc(size_t, size_t);
void* __libc_realloc(void*, size_t);
void __libc_free(void*);
size_t malloc_usable_size(void*);
}

// Takes a block into the account, or out of it. What is asked for counts, not what is there: a block that is never
// touched costs nothing, but nobody promised that.
static void* Count(void* block, Kernel::i64 sign)
{
    using namespace Kernel::Test;
    if (s_isWatching && block) s_inUse += sign * static_cast<Kernel::i64>(malloc_usable_size(block));
    if (s_inUse > s_peak) s_peak = s_inUse;
    return block;
}

extern "C" {
void* malloc(size_t size)
{
    return Count(__libc_malloc(size), 1);
}
void* calloc(size_t count, size_t size)
{
    return Count(__libc_calloc(count, size), 1);
}
void* realloc(void* old, size_t size)
{
    return Count(__libc_realloc(Count(old, -1), size), 1);
}
void free(void* block)
{
    __libc_free(Count(block, -1));
}
}

#endif

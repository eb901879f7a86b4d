#include "serialisation/AllocationWatch.h"

#include <cstddef>

namespace Kernel::Test {

namespace {

bool s_isWatching = false;
i64 s_inUse = 0;
i64 s_peak = 0;

} // namespace

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

namespace {

using namespace Kernel::Test;

// What is asked for counts, not what is there: a block that is never touched costs nothing, but nobody promised that.
void* Enter(void* block)
{
    if (s_isWatching && block) s_inUse += static_cast<Kernel::i64>(malloc_usable_size(block));
    if (s_inUse > s_peak) s_peak = s_inUse;
    return block;
}

void* Leave(void* block)
{
    if (s_isWatching && block) s_inUse -= static_cast<Kernel::i64>(malloc_usable_size(block));
    return block;
}

} // namespace

extern "C" {
void* malloc(size_t size)
{
    return Enter(__libc_malloc(size));
}
void* calloc(size_t count, size_t size)
{
    return Enter(__libc_calloc(count, size));
}
void* realloc(void* old, size_t size)
{
    return Enter(__libc_realloc(Leave(old), size));
}
void free(void* block)
{
    __libc_free(Leave(block));
}
}

#endif

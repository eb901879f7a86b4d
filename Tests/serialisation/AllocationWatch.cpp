#include "serialisation/AllocationWatch.h"

#include <cstddef>

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define KERNEL_WATCHES_HEAP 0
#else
#define KERNEL_WATCHES_HEAP 1
#endif

namespace Kernel::Test {

namespace {

bool s_isWatching = false;
i64 s_inUse = 0;
i64 s_peak = 0;
u64 s_count = 0;

} // namespace

AllocationWatch::AllocationWatch()
{
    s_inUse = s_peak = 0;
    s_count = 0;
    s_isWatching = true;
}

AllocationWatch::~AllocationWatch()
{
    s_isWatching = false;
}

bool AllocationWatch::IsAvailable()
{
    return KERNEL_WATCHES_HEAP != 0;
}

u64 AllocationWatch::GetPeak()
{
    return static_cast<u64>(s_peak);
}

u64 AllocationWatch::GetCount()
{
    return s_count;
}

#if KERNEL_WATCHES_HEAP

namespace {

// What is asked for counts, not what is there: a block that is never touched costs nothing, but nobody promised that.
template <class Block>
Block* Enter(Block* block, size_t size)
{
    if (!s_isWatching || !block) return block;
    s_inUse += static_cast<i64>(size);
    ++s_count;
    if (s_inUse > s_peak) s_peak = s_inUse;
    return block;
}

} // namespace

void NoteAllocation(void* block, size_t size)
{
    Enter(block, size);
}

void NoteFree(size_t size)
{
    if (s_isWatching) s_inUse -= static_cast<i64>(size);
}

#endif

} // namespace Kernel::Test

#if KERNEL_WATCHES_HEAP

// The C library's own entry points lie behind its public ones, which these stand in for.
extern "C" {
void* __libc_malloc(size_t);
void* __libc_calloc(size_t, size_t);
void* __libc_realloc(void*, size_t);
void __libc_free(void*);
size_t malloc_usable_size(void*);

void* malloc(size_t size)
{
    void* const block = __libc_malloc(size);
    if (block) Kernel::Test::NoteAllocation(block, malloc_usable_size(block));
    return block;
}

void* calloc(size_t count, size_t size)
{
    void* const block = __libc_calloc(count, size);
    if (block) Kernel::Test::NoteAllocation(block, malloc_usable_size(block));
    return block;
}

void* realloc(void* old, size_t size)
{
    size_t const before = old ? malloc_usable_size(old) : 0;
    void* const block = __libc_realloc(old, size);
    if (block) {
        Kernel::Test::NoteFree(before);
        Kernel::Test::NoteAllocation(block, malloc_usable_size(block));
    }
    return block;
}

void free(void* block)
{
    if (block) Kernel::Test::NoteFree(malloc_usable_size(block));
    __libc_free(block);
}
}

#endif

#include "memory/RefusedMemory.h"

#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/NullOutStream.h"
#include "libkernel/streams/ZStandardInStream.h"
#include "libkernel/streams/ZStandardOutStream.h"
#include "libkernel/streams/ZipInStream.h"
#include "libkernel/streams/ZipOutStream.h"

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <new>

// What stands here takes the place of the C library's own functions in the whole program, those of the shared libraries
// that it has loaded included. Nothing here may allocate.

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define KERNEL_OWN_MALLOC 0
#elif defined(__has_feature)
#define KERNEL_OWN_MALLOC !(__has_feature(address_sanitizer) || __has_feature(thread_sanitizer))
#else
#define KERNEL_OWN_MALLOC 1
#endif

namespace {

std::atomic<long> s_left{0}; // Allocations until the one that is refused; 0 for none.
std::atomic<bool> s_forEver{false};
std::atomic<bool> s_refused{false};
std::atomic<long> s_live{0};
thread_local int s_quiet = 0;

bool IsRefused()
{
    if (s_left.load(std::memory_order_relaxed) <= 0 || s_quiet != 0) return false;
    if (s_left.fetch_sub(1) != 1) return false;
    s_refused = true;
    if (s_forEver) s_left = 1;
    return true;
}

void* Count(void* block)
{
    if (block) s_live.fetch_add(1, std::memory_order_relaxed);
    return block;
}

} // namespace

#if KERNEL_OWN_MALLOC

extern "C" {
void* __libc_malloc(size_t size);
void* __libc_calloc(size_t count, size_t size);
void* __libc_realloc(void* block, size_t size);
void* __libc_memalign(size_t alignment, size_t size);
void __libc_free(void* block);

#define KERNEL_REPLACES __attribute__((visibility("default")))

static void* Refuse()
{
    errno = ENOMEM;
    return nullptr;
}

KERNEL_REPLACES void* malloc(size_t size) noexcept
{
    return IsRefused() ? Refuse() : Count(__libc_malloc(size));
}
KERNEL_REPLACES void* calloc(size_t count, size_t size) noexcept
{
    return IsRefused() ? Refuse() : Count(__libc_calloc(count, size));
}
KERNEL_REPLACES void* realloc(void* block, size_t size) noexcept
{
    if (IsRefused()) return Refuse();
    void* const moved = __libc_realloc(block, size);
    if (!block) return Count(moved);
    if (!moved && size == 0) s_live.fetch_sub(1, std::memory_order_relaxed);
    return moved;
}
KERNEL_REPLACES void* aligned_alloc(size_t alignment, size_t size) noexcept
{
    return IsRefused() ? Refuse() : Count(__libc_memalign(alignment, size));
}
KERNEL_REPLACES void* memalign(size_t alignment, size_t size) noexcept
{
    return aligned_alloc(alignment, size);
}
KERNEL_REPLACES int posix_memalign(void** to, size_t alignment, size_t size) noexcept
{
    void* const block = aligned_alloc(alignment, size);
    if (block) *to = block;
    return block ? 0 : ENOMEM;
}
KERNEL_REPLACES void free(void* block) noexcept
{
    if (block) s_live.fetch_sub(1, std::memory_order_relaxed);
    __libc_free(block);
}
}

#else

namespace {

void* Allocate(size_t size, size_t alignment)
{
    if (IsRefused()) throw std::bad_alloc();
    size_t const rounded = (size + alignment - 1) / alignment * alignment;
    void* const block = alignment > alignof(std::max_align_t) ? std::aligned_alloc(alignment, rounded)
                                                              : std::malloc(size == 0 ? 1 : size);
    if (!block) throw std::bad_alloc();
    return Count(block);
}

void Free(void* block) noexcept
{
    if (block) s_live.fetch_sub(1, std::memory_order_relaxed);
    std::free(block);
}

} // namespace

// Those for arrays call these.
void* operator new(size_t size)
{
    return Allocate(size, 1);
}
void* operator new(size_t size, std::align_val_t alignment)
{
    return Allocate(size, static_cast<size_t>(alignment));
}
void* operator new(size_t size, std::nothrow_t const&) noexcept
try {
    return Allocate(size, 1);
} catch (std::bad_alloc const&) {
    return nullptr;
}
void* operator new(size_t size, std::align_val_t alignment, std::nothrow_t const&) noexcept
try {
    return Allocate(size, static_cast<size_t>(alignment));
} catch (std::bad_alloc const&) {
    return nullptr;
}
void operator delete(void* block) noexcept
{
    Free(block);
}
void operator delete(void* block, size_t) noexcept
{
    Free(block);
}
void operator delete(void* block, std::align_val_t) noexcept
{
    Free(block);
}
void operator delete(void* block, size_t, std::align_val_t) noexcept
{
    Free(block);
}

#endif

namespace KernelTest {

RefusedMemory::RefusedMemory(long n, bool forEver)
{
    s_refused = false;
    s_forEver = forEver;
    s_left = n;
}

RefusedMemory::~RefusedMemory()
{
    s_left = 0;
}

bool RefusedMemory::HasRefused()
{
    return s_refused;
}

QuietMemory::QuietMemory()
{
    ++s_quiet;
}

QuietMemory::~QuietMemory()
{
    --s_quiet;
}

EmptyCodecPools::EmptyCodecPools()
{
    using namespace Kernel;
    constexpr int kept = 8;
    auto const none = CompressionPredictorType::None;
    auto const flat = CompressionPredictorStripingType::None;
    Counted<InStream> const from = MakeCounted<MemoryInStream>("", 0, false);
    Counted<OutStream> const to = MakeCounted<NullOutStream>();
    for (int i = 0; i < kept; ++i) {
        m_in.push_back(ZipInStream::Create(from, none, flat, false));
        m_in.push_back(ZStandardInStream::Create(from, none, flat, false));
        m_out.push_back(ZipOutStream::Create(to, none, flat));
        m_out.push_back(ZStandardOutStream::Create(to, none, flat));
    }
}

long GetLiveBlocks()
{
    return s_live;
}

} // namespace KernelTest

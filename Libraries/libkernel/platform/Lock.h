#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <atomic>

namespace Kernel::Platform {

/// Sleeps in the kernel while @p word holds @p expected, until a wake or @p timeoutNs nanoseconds have passed (below 0:
/// for ever). May come back early for no reason, so the caller asks the word again. False if the time ran out.
KERNEL_API bool WaitOnWord(std::atomic<u32> const& word, u32 expected, i64 timeoutNs);

/// Wakes up to @p count threads that sleep on the word.
KERNEL_API void WakeWord(std::atomic<u32> const& word, i32 count);

/// Tells the processor that this is a wait loop.
inline void PauseProcessor()
{
#if defined(__x86_64__) || defined(__i386__)
    __builtin_ia32_pause();
#elif defined(__aarch64__)
    asm volatile("yield");
#endif
}

/// Re-entrant lock in 24 bytes: one compare-and-swap when nobody is in the way, then @p spins tries, then sleep in the
/// kernel. The rank orders locks: with assertions on, taking a lock whose rank is below one that the thread holds ends
/// the process, unless it holds that very lock already. Rank 0 is outside the order.
class KERNEL_API RecursiveLock
{
public:
    constexpr explicit RecursiveLock(u16 spins, u16 rank) : m_spins(spins), m_rank(rank) {}
    RecursiveLock(RecursiveLock const&) = delete;
    RecursiveLock& operator=(RecursiveLock const&) = delete;

    void Acquire();
    bool TryAcquire();
    /// Only by the thread that holds it, as often as it acquired it.
    void Release();
    bool IsHeldByCurrentThread() const;

private:
    void AcquireSlow();

    std::atomic<u32> m_word{0};                // 0 free, 1 held, 2 held and somebody may sleep.
    u32 m_depth = 0;                           // Guarded by the lock itself.
    std::atomic<void const*> m_owner{nullptr}; // A thread's own mark while held.
    u16 const m_spins;
    u16 const m_rank;
};

} // namespace Kernel::Platform

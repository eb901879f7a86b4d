#include "libkernel/platform/Debug.h"
#include "libkernel/platform/Lock.h"
#include "libkernel/platform/Thread.h"

#include <cerrno>
#include <climits>
#include <linux/futex.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

namespace Kernel::Platform {
namespace {

// The address of a variable that each thread has once is a thread id that costs one instruction.
__attribute__((tls_model("initial-exec"))) thread_local char t_mark = 0;

#ifndef NDEBUG
// Ranked locks that this thread holds, in the order of taking. A lock that was let go out of order leaves its place.
struct HeldLocks
{
    static constexpr int c_most = 64;
    RecursiveLock const* locks[c_most];
    u16 ranks[c_most];
    int count;
};
thread_local HeldLocks t_held = {};

void CheckRank(u16 rank)
{
    for (int i = 0; rank != 0 && i < t_held.count; ++i) {
        if (t_held.ranks[i] > rank)
            FailAssertion("a lock is taken below the rank of one that is held", __FILE__, __LINE__);
    }
}

void NoteTaken(RecursiveLock const* lock, u16 rank)
{
    if (rank == 0 || t_held.count == HeldLocks::c_most) return;
    t_held.locks[t_held.count] = lock;
    t_held.ranks[t_held.count++] = rank;
}

void NoteReleased(RecursiveLock const* lock, u16 rank)
{
    if (rank == 0) return;
    int i = t_held.count - 1;
    while (i >= 0 && t_held.locks[i] != lock) --i;
    if (i < 0) return;
    for (--t_held.count; i < t_held.count; ++i) {
        t_held.locks[i] = t_held.locks[i + 1];
        t_held.ranks[i] = t_held.ranks[i + 1];
    }
}
#else
void CheckRank(u16) {}
void NoteTaken(RecursiveLock const*, u16) {}
void NoteReleased(RecursiveLock const*, u16) {}
#endif

bool SpinningHelps()
{
    static bool const helps = CountUsableCpus() > 1;
    return helps;
}

} // namespace

bool WaitOnWord(std::atomic<u32> const& word, u32 expected, i64 timeoutNs)
{
    timespec time = {};
    if (timeoutNs >= 0) {
        time.tv_sec = static_cast<time_t>(timeoutNs / 1'000'000'000);
        time.tv_nsec = static_cast<long>(timeoutNs % 1'000'000'000);
    }
    int const saved = errno; // Taking a lock must not hide why an earlier call failed.
    long const answer = ::syscall(SYS_futex, reinterpret_cast<u32 const*>(&word), FUTEX_WAIT_PRIVATE, expected,
                                  timeoutNs >= 0 ? &time : nullptr, nullptr, 0);
    bool const timedOut = answer < 0 && errno == ETIMEDOUT;
    errno = saved;
    return !timedOut;
}

void WakeWord(std::atomic<u32> const& word, i32 count)
{
    ::syscall(SYS_futex, reinterpret_cast<u32 const*>(&word), FUTEX_WAKE_PRIVATE, count, nullptr, nullptr, 0);
}

void RecursiveLock::Acquire()
{
    void const* const me = &t_mark;
    // Only this thread can have put its own mark there, so a relaxed look is enough.
    if (m_owner.load(std::memory_order_relaxed) == me) {
        ++m_depth;
        return;
    }
    CheckRank(m_rank);
    u32 expected = 0;
    if (!m_word.compare_exchange_strong(expected, 1, std::memory_order_acquire, std::memory_order_relaxed))
        AcquireSlow();
    m_owner.store(me, std::memory_order_relaxed);
    m_depth = 1;
    NoteTaken(this, m_rank);
}

void RecursiveLock::AcquireSlow()
{
    if (m_spins > 0 && SpinningHelps()) {
        for (u32 i = 0; i < m_spins; ++i) {
            u32 expected = 0;
            if (m_word.load(std::memory_order_relaxed) == 0 &&
                m_word.compare_exchange_weak(expected, 1, std::memory_order_acquire, std::memory_order_relaxed))
                return;
            PauseProcessor();
        }
    }
    // Whoever comes out of the kernel takes the lock as 2, since it can't know whether others still sleep.
    while (m_word.exchange(2, std::memory_order_acquire) != 0) WaitOnWord(m_word, 2, -1);
}

bool RecursiveLock::TryAcquire()
{
    void const* const me = &t_mark;
    if (m_owner.load(std::memory_order_relaxed) == me) {
        ++m_depth;
        return true;
    }
    u32 expected = 0;
    if (!m_word.compare_exchange_strong(expected, 1, std::memory_order_acquire, std::memory_order_relaxed))
        return false;
    m_owner.store(me, std::memory_order_relaxed);
    m_depth = 1;
    NoteTaken(this, m_rank);
    return true;
}

void RecursiveLock::Release()
{
#ifndef NDEBUG
    if (!IsHeldByCurrentThread())
        FailAssertion("a lock is released by a thread that doesn't hold it", __FILE__, __LINE__);
#endif
    if (--m_depth > 0) return;
    NoteReleased(this, m_rank);
    m_owner.store(nullptr, std::memory_order_relaxed);
    if (m_word.exchange(0, std::memory_order_release) == 2) WakeWord(m_word, 1);
}

bool RecursiveLock::IsHeldByCurrentThread() const
{
    return m_owner.load(std::memory_order_relaxed) == &t_mark;
}

} // namespace Kernel::Platform

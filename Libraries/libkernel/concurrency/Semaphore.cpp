#include "libkernel/concurrency/Semaphore.h"

#include "libkernel/platform/Time.h"

#include <algorithm>

namespace Kernel {
namespace {

constexpr i64 c_nsPerMs = 1'000'000;

i64 Now()
{
    return Platform::GetSystemClockCalls().counter();
}

} // namespace

Semaphore::Semaphore(int initial) : m_count(static_cast<u32>(std::max(initial, 0))) {}

Semaphore::~Semaphore() = default;

// The count is raised before the waiters are looked at, and a waiter announces itself before it looks at the count,
// both in one total order: either the waiter sees the count or the signal sees the waiter.
void Semaphore::Signal()
{
    u32 count = m_count.load(std::memory_order_relaxed);
    do {
        if (count >= c_maxCount) return;
    } while (!m_count.compare_exchange_weak(count, count + 1));
    if (m_waiters.load() > 0) Platform::WakeWord(m_count, 1);
}

bool Semaphore::TryTakeI()
{
    u32 count = m_count.load();
    while (count > 0) {
        if (m_count.compare_exchange_weak(count, count - 1)) return true;
    }
    return false;
}

void Semaphore::Wait(int milliseconds)
{
    if (TryTakeI()) return;
    bool const forEver = milliseconds <= 0;
    i64 const end = forEver ? 0 : Now() + milliseconds * c_nsPerMs;
    m_waiters.fetch_add(1);
    while (!TryTakeI()) {
        i64 const left = forEver ? -1 : end - Now();
        if (!forEver && left <= 0) break;
        Platform::WaitOnWord(m_count, 0, left);
    }
    m_waiters.fetch_sub(1);
}

} // namespace Kernel

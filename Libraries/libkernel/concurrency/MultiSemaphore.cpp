#include "libkernel/concurrency/MultiSemaphore.h"

#include <utility>

namespace Kernel {

MultiSemaphore::MultiSemaphore() = default;
MultiSemaphore::~MultiSemaphore() = default;

void MultiSemaphore::Signal()
{
    Counted<Semaphore> semaphore;
    u64 waiters = 0;
    {
        CriticalSectionSpinScope const lock(m_lock);
        semaphore = std::move(m_semaphore);
        waiters = std::exchange(m_waiters, 0);
        m_signalled = true;
    }
    for (; waiters > 0; --waiters) semaphore->Signal();
}

void MultiSemaphore::Wait(int milliseconds)
{
    Counted<Semaphore> semaphore; // Held by each waiter, since the signaller may drop the object's reference meanwhile.
    {
        CriticalSectionSpinScope const lock(m_lock);
        if (m_signalled) return;
        if (!m_semaphore) m_semaphore = MakeCounted<Semaphore>(0);
        semaphore = m_semaphore;
        ++m_waiters;
    }
    semaphore->Wait(milliseconds);
}

} // namespace Kernel

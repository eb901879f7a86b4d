#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/concurrency/Semaphore.h"

namespace Kernel {

/// A gate for any number of waiters that opens once and stays open.
class KERNEL_API MultiSemaphore : public Countable
{
public:
    MultiSemaphore();

    /// Opens the gate and wakes all who wait. Wakes nobody while it holds its lock.
    void Signal();

    /// Returns at once when the gate is open, else waits up to @p milliseconds for it; 0 means for ever.
    void Wait(int milliseconds);

protected:
    ~MultiSemaphore() override;

private:
    CriticalSectionSpin m_lock; // Guards all below.
    Counted<Semaphore> m_semaphore;
    u64 m_waiters = 0;
    bool m_signalled = false;
};

} // namespace Kernel

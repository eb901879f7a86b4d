#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Countable.h"

#include <atomic>

namespace Kernel {

/// Counting semaphore with a lock beside it for the data that goes with it.
class KERNEL_API Semaphore : public Countable
{
public:
    static constexpr u32 c_maxCount = 0x7FFFFFFF;

    explicit Semaphore(int initial = 0);

    /// Raises the count by 1; nothing happens at c_maxCount.
    void Signal();

    /// Lowers the count, waiting up to @p milliseconds for it to rise above 0. 0 and below mean for ever, not a poll. A
    /// time-out and a signal look alike to the caller.
    void Wait(int milliseconds);

    void AcquireLock() const { m_lock.AcquireLock(); }
    void ReleaseLock() const { m_lock.ReleaseLock(); }

protected:
    ~Semaphore() override;

private:
    bool TryTakeI();

    std::atomic<u32> m_count;
    std::atomic<u32> m_waiters{0}; // Threads that sleep or are about to; lets Signal skip the kernel.
    CriticalSection m_lock;
};

} // namespace Kernel

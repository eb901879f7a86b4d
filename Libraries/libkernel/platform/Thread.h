#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

namespace Kernel::Platform {

/// The operating system's id of the calling thread. Never 0.
KERNEL_API u64 GetCurrentThreadId();

/// Gives the rest of the time slice away.
KERNEL_API void YieldThread();

/// Starts a thread that nobody joins, with every signal blocked. False if the system has no more.
KERNEL_API bool StartDetachedThread(void (*run)(void*), void* context);

/// Calls @p run in every child process that this one forks from here on, before the fork returns there.
KERNEL_API void RunInChildProcesses(void (*run)());

/// Something to be done as threads end. One for each purpose, made with static storage; each holds on to one of the few
/// thread keys of the process.
///
/// A thread_local object with a destructor would do, were it not that the C library ends the process where there is no
/// memory to note the destructor down.
class KERNEL_API ThreadEnd
{
public:
    /// @p run gets what the thread has given to Arm.
    explicit ThreadEnd(void (*run)(void*));
    ThreadEnd(ThreadEnd const&) = delete;
    ThreadEnd& operator=(ThreadEnd const&) = delete;

    /// Has it done, once, when the calling thread ends; @p context is not to be null. False if that can't be.
    bool Arm(void* context);

private:
    unsigned m_key = 0;
    bool m_hasKey = false;
};

/// True if that thread of this process runs or waits only for a processor.
KERNEL_API bool IsThreadRunnable(u64 id);

struct CpuCounts
{
    int logical = 1;
    int cores = 1;
};

/// Processors of the machine, counted anew at each call. Never below 1.
KERNEL_API CpuCounts CountCpus();

/// Processors that this process may run on. Never below 1.
KERNEL_API int CountUsableCpus();

/// Names of the machine and of the user, cut at @p size with the terminator; empty on failure.
KERNEL_API bool GetHostName(char* name, u64 size);
KERNEL_API bool GetUserName(char* name, u64 size);
/// Bytes of memory installed; 0 if unknown.
KERNEL_API u64 GetMemorySize();

KERNEL_API u64 GetCurrentProcessId();

} // namespace Kernel::Platform

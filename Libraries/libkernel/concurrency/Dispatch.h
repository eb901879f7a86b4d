#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Types.h"

#include <functional>
#include <vector>

namespace Kernel {

/// Jobs on other threads: fire and forget, parallel loops, and the way to the application's main thread.
///
/// Jobs run on a process-wide pool whose threads come and go; the order in which jobs of one priority start is the
/// order in which they were given. What a job throws is not caught: it ends the process. All operations may be called
/// from any thread, from jobs too, except the ones that set things up at start.
class KERNEL_API Dispatch
{
public:
    enum class DispatchPriority : i32
    {
        Background = 0, ///< The same queue as Low.
        Low = 1,
        Default = 2, ///< Any other value means this one.
        High = 3
    };

    /// What a thread is there for. The host gives the values a meaning; 0 at the start of every thread.
    enum class ThreadPurpose : u32
    {
        None = 0,
        Worker = 1
    };

    enum class YieldPolicy : i32
    {
        Default = 0
    };

    /// Carries what belongs to a thread from the one that dispatches to the one that runs the job. In a parallel loop
    /// Begin and End run around every single index, on several threads at once on the same clone, so what they change
    /// must lie in the thread's own state.
    class KERNEL_API Scope : public Countable
    {
    public:
        /// A copy for one job, made on the dispatching thread.
        virtual Counted<Scope> Clone() = 0;
        /// Records what the dispatching thread has; called on the clone.
        virtual void Capture();
        virtual void Begin();
        virtual void End();

    protected:
        ~Scope() override;
    };

    Dispatch() = delete;

    /// Takes part in every dispatch from here on. Takes no lock: before the first dispatch only.
    static void AddScope(Counted<Scope> scope);

    /// Queues a job and returns at once. @p context is borrowed until the job has run.
    static void DispatchAndForget(void (*function)(void*), void* context,
                                  DispatchPriority priority = DispatchPriority::Default,
                                  ThreadPurpose purpose = ThreadPurpose::Worker);
    static void DispatchAndForget(std::function<void()> function, DispatchPriority priority = DispatchPriority::Default,
                                  ThreadPurpose purpose = ThreadPurpose::Worker);

    /// Runs the function once for each index from 0 to @p count - 1, on the calling thread and on others, in no
    /// particular order, and returns when all are done. Nested loops are allowed. The last number is not used.
    static void DispatchParallelFor(void (*function)(void*, u64), u64 count, void* context,
                                    DispatchPriority priority = DispatchPriority::Default,
                                    ThreadPurpose purpose = ThreadPurpose::Worker, int unused = 0);
    static void DispatchParallelFor(std::function<void(u64)> function, u64 count,
                                    DispatchPriority priority = DispatchPriority::Default,
                                    ThreadPurpose purpose = ThreadPurpose::Worker, int unused = 0);
    /// The same over a list, index i running element i.
    static void DispatchParallel(std::vector<std::function<void()>> functions,
                                 DispatchPriority priority = DispatchPriority::Default,
                                 ThreadPurpose purpose = ThreadPurpose::Worker);

    /// Hands the job to the sink; without a sink the job is dropped unrun.
    static void DispatchOnMainThread(void (*function)(void*), void* context);
    /// The sink must call what it is given exactly once, or the function is never freed.
    static void DispatchOnMainThread(std::function<void()> function);

    /// False on every thread until the id has been set.
    static bool IsMainThread();
    /// Set by the host at start-up, without a lock. The id is ThreadId's number.
    static void SetMainThreadId(unsigned long id);
    static void SetMainThreadSink(void (*sink)(void (*)(void*), void*));

    static ThreadPurpose GetCurrentThreadPurpose();
    static void SetCurrentThreadPurpose(ThreadPurpose purpose);

    /// What the host stored, 0 until then; System::GetCpuCount counts.
    static int GetNumberOfRealCPUs();
    static void SetNumberOfRealCPUs(int count);

    /// Rests for @p milliseconds; 0 and below only give way to other threads.
    static void Sleep(int milliseconds);
    static void Yield(YieldPolicy policy);
};

} // namespace Kernel

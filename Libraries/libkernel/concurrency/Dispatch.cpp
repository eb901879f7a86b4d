#include "libkernel/concurrency/Dispatch.h"

#include "libkernel/concurrency/internal/GlobalQueue.h"
#include "libkernel/platform/Thread.h"
#include "libkernel/platform/Time.h"

#include <atomic>
#include <memory>
#include <utility>

namespace Kernel {
namespace {

using ScopeList = std::vector<Counted<Dispatch::Scope>>;

unsigned long s_mainThreadId = 0;
void (*s_mainThreadSink)(void (*)(void*), void*) = nullptr;
std::atomic<int> s_realCpus{0};
thread_local Dispatch::ThreadPurpose t_purpose = Dispatch::ThreadPurpose::None;

// Never destroyed: jobs may still be dispatched while the process ends.
ScopeList& GetScopes()
{
    static ScopeList& scopes = *new ScopeList;
    return scopes;
}

ScopeList CaptureScopes()
{
    ScopeList clones;
    ScopeList const& scopes = GetScopes();
    clones.reserve(scopes.size());
    for (auto const& scope : scopes) {
        Counted<Dispatch::Scope> clone = scope->Clone();
        clone->Capture();
        clones.push_back(std::move(clone));
    }
    return clones;
}

template <class F>
void RunInScopes(ScopeList const& scopes, F&& run)
{
    for (auto const& scope : scopes) scope->Begin();
    run();
    for (auto const& scope : scopes) scope->End();
}

GlobalQueue::Queue QueueOf(Dispatch::DispatchPriority priority)
{
    static constexpr int c_priorities[] = {GlobalQueue::c_low, GlobalQueue::c_low, GlobalQueue::c_default,
                                           GlobalQueue::c_high};
    u32 const index = static_cast<u32>(priority);
    return GlobalQueue::GetQueue(index < std::size(c_priorities) ? c_priorities[index] : GlobalQueue::c_default);
}

struct Job
{
    std::function<void()> function;
    ScopeList scopes;
    Job* next = nullptr; // While it is free.
};

// Jobs are made on one thread and freed on another, which a general allocator likes least. Each thread keeps some free
// ones of its own; those of a thread that frees more than it makes go onto a shared stack in batches, and a thread that
// has none takes the whole stack. Nobody ever pops a single element from the shared stack, so it can't be fooled by an
// element that went and came back.
std::atomic<Job*> s_free{nullptr};
std::atomic<int> s_freeCount{0}; // On the stack, roughly: a batch may be on its way.
constexpr int c_mostFree = 4096;
constexpr int c_batch = 32;

void ShareOwnJobs(void* own);
Platform::ThreadEnd s_threadEnd(ShareOwnJobs);

struct OwnFreeJobs
{
    Job* first = nullptr;
    Job* last = nullptr; // Of those freed here; what came from the stack isn't counted.
    int count = 0;
    bool isArmed = false; // They are shared when the thread ends. A thread that has not been promised that keeps none.

    bool Arm() { return isArmed || (isArmed = s_threadEnd.Arm(this)); }
    void Share()
    {
        if (!first) return;
        while (last->next) last = last->next;
        last->next = s_free.load(std::memory_order_relaxed);
        s_freeCount.fetch_add(count, std::memory_order_relaxed);
        while (!s_free.compare_exchange_weak(last->next, first, std::memory_order_release, std::memory_order_relaxed)) {
        }
        first = last = nullptr;
        count = 0;
    }
};
thread_local OwnFreeJobs t_free;

void ShareOwnJobs(void* own)
{
    static_cast<OwnFreeJobs*>(own)->Share();
    static_cast<OwnFreeJobs*>(own)->isArmed = false;
}

Job* NewJob()
{
    OwnFreeJobs& own = t_free;
    if (!own.first && s_free.load(std::memory_order_relaxed) && own.Arm()) {
        own.first = own.last = s_free.exchange(nullptr, std::memory_order_acquire);
        own.count = 0;
        s_freeCount.store(0, std::memory_order_relaxed);
    }
    Job* const job = own.first;
    if (!job) return new Job;
    own.first = job->next;
    if (own.last == job) own.last = own.first;
    return job;
}

void FreeJob(Job* job)
{
    job->function = nullptr;
    job->scopes.clear();
    OwnFreeJobs& own = t_free;
    if (s_freeCount.load(std::memory_order_relaxed) >= c_mostFree || !own.Arm()) {
        delete job;
        return;
    }
    job->next = own.first;
    own.first = job;
    if (!own.last) own.last = job;
    if (++own.count >= c_batch) own.Share();
}

struct JobFreer
{
    void operator()(Job* job) const { FreeJob(job); }
};

void RunJob(void* context)
{
    Job* const job = static_cast<Job*>(context);
    RunInScopes(job->scopes, job->function);
    FreeJob(job);
}

struct LoopRecord
{
    void (*function)(void*, u64);
    void* context;
    ScopeList scopes;
};

void RunIndices(void* context, u64 begin, u64 end)
{
    LoopRecord const& record = *static_cast<LoopRecord const*>(context);
    if (record.scopes.empty()) {
        for (u64 i = begin; i < end; ++i) record.function(record.context, i);
        return;
    }
    for (u64 i = begin; i < end; ++i) RunInScopes(record.scopes, [&] { record.function(record.context, i); });
}

void RunIndexFunction(void* context, u64 index)
{
    (*static_cast<std::function<void(u64)>*>(context))(index);
}

void RunElement(void* context, u64 index)
{
    (*static_cast<std::vector<std::function<void()>>*>(context))[index]();
}

void RunAndFree(void* context)
{
    std::function<void()>* const function = static_cast<std::function<void()>*>(context);
    (*function)();
    delete function;
}

} // namespace

void Dispatch::Scope::Capture() {}
void Dispatch::Scope::Begin() {}
void Dispatch::Scope::End() {}
Dispatch::Scope::~Scope() = default;

void Dispatch::AddScope(Counted<Scope> scope)
{
    GetScopes().push_back(std::move(scope));
}

void Dispatch::DispatchAndForget(void (*function)(void*), void* context, DispatchPriority priority,
                                 ThreadPurpose purpose)
{
    DispatchAndForget([function, context] { function(context); }, priority, purpose);
}

void Dispatch::DispatchAndForget(std::function<void()> function, DispatchPriority priority, ThreadPurpose)
{
    std::unique_ptr<Job, JobFreer> job(NewJob());
    job->function = std::move(function);
    if (!GetScopes().empty()) job->scopes = CaptureScopes();
    GlobalQueue::Async(QueueOf(priority), job.get(), RunJob);
    (void)job.release();
}

void Dispatch::DispatchParallelFor(void (*function)(void*, u64), u64 count, void* context, DispatchPriority priority,
                                   ThreadPurpose, int)
{
    LoopRecord record = {function, context, CaptureScopes()};
    GlobalQueue::Apply(count, QueueOf(priority), &record, RunIndices);
}

void Dispatch::DispatchParallelFor(std::function<void(u64)> function, u64 count, DispatchPriority priority,
                                   ThreadPurpose purpose, int unused)
{
    DispatchParallelFor(RunIndexFunction, count, &function, priority, purpose, unused);
}

void Dispatch::DispatchParallel(std::vector<std::function<void()>> functions, DispatchPriority priority,
                                ThreadPurpose purpose)
{
    DispatchParallelFor(RunElement, functions.size(), &functions, priority, purpose, 0);
}

void Dispatch::DispatchOnMainThread(void (*function)(void*), void* context)
{
    if (s_mainThreadSink) s_mainThreadSink(function, context);
}

void Dispatch::DispatchOnMainThread(std::function<void()> function)
{
    if (s_mainThreadSink) s_mainThreadSink(RunAndFree, new std::function<void()>(std::move(function)));
}

bool Dispatch::IsMainThread()
{
    return Platform::GetCurrentThreadId() == s_mainThreadId;
}
void Dispatch::SetMainThreadId(unsigned long id)
{
    s_mainThreadId = id;
}
void Dispatch::SetMainThreadSink(void (*sink)(void (*)(void*), void*))
{
    s_mainThreadSink = sink;
}

Dispatch::ThreadPurpose Dispatch::GetCurrentThreadPurpose()
{
    return t_purpose;
}
void Dispatch::SetCurrentThreadPurpose(ThreadPurpose purpose)
{
    t_purpose = purpose;
}

int Dispatch::GetNumberOfRealCPUs()
{
    return s_realCpus;
}
void Dispatch::SetNumberOfRealCPUs(int count)
{
    s_realCpus = count;
}

void Dispatch::Sleep(int milliseconds)
{
    Platform::Sleep(milliseconds > 0 ? milliseconds * i64{1'000'000} : 0);
}
void Dispatch::Yield(YieldPolicy)
{
    Sleep(0);
}

} // namespace Kernel

#include "libkernel/concurrency/internal/GlobalQueue.h"

#include "libkernel/platform/Lock.h"
#include "libkernel/platform/Thread.h"
#include "libkernel/platform/Time.h"

#include <algorithm>
#include <atomic>
#include <memory>
#include <mutex>
#include <new>
#include <vector>

// One lock guards three rings of pending jobs and the census of the workers. It is held for some tens of nanoseconds at
// a time, so one lock costs less than anything cleverer, and the census is always exact.
//
// Waking. A worker that runs out of work looks on for a few microseconds, then sleeps in the kernel. Whoever adds a job
// wakes a sleeper only if nobody is on his way already (looking on, or woken and not yet back); whoever takes a job and
// leaves more behind does the same. So a burst of jobs costs one wake for each worker, not one for each job.
//
// Blocking. The number of workers is the number of processors, until a job has to wait although all of them are at
// work. Then the manager, a thread that otherwise sleeps, looks every few milliseconds how many workers really run, and
// adds as many as are blocked. When the blocked ones come back, the surplus is sent home.
namespace Kernel::GlobalQueue {
namespace {

constexpr int c_queueCount = 3; // Highest first.
constexpr int c_mostThreads = 256;
constexpr i64 c_idleNs = 5'000'000'000;
constexpr i64 c_firstLookNs = 2'000'000;
constexpr i64 c_longestLookNs = 20'000'000;
constexpr int c_idleSpins = 120; // Some microseconds.

struct Pending
{
    JobFunction work;
    void* context;
};

// Held so briefly that whoever finds it taken spins, and gives way only if the holder lost its processor. Letting go is
// a plain store, which a lock that can sleep could not afford.
class BriefLock
{
public:
    void lock()
    {
        for (u32 tries = 0; m_taken.exchange(true, std::memory_order_acquire); ++tries) {
            for (u32 i = 0; i < 64 && m_taken.load(std::memory_order_relaxed); ++i) Platform::PauseProcessor();
            if (tries > 8) Platform::YieldThread();
        }
    }
    void unlock() { m_taken.store(false, std::memory_order_release); }

private:
    std::atomic<bool> m_taken{false};
};

// First in, first out; grows by doubling and gives a large block back when it runs empty.
class Ring
{
public:
    bool IsEmpty() const { return m_count == 0; }

    // Makes room for so many more, or throws and leaves all as it was.
    void Reserve(u64 more)
    {
        while (m_capacity - m_count < more) Grow();
    }

    // There must be room.
    void Push(Pending const& job) { m_jobs[(m_head + m_count++) & (m_capacity - 1)] = job; }

    Pending Pop()
    {
        Pending const job = m_jobs[m_head];
        m_head = (m_head + 1) & (m_capacity - 1);
        if (--m_count == 0 && m_capacity > c_kept) {
            m_jobs.reset();
            m_capacity = m_head = 0;
        }
        return job;
    }

    // Takes out the newest job of that context; false if it has been taken already.
    bool Withdraw(void const* context)
    {
        u64 i = m_count;
        while (i > 0 && At(i - 1).context != context) --i;
        if (i == 0) return false;
        for (; i < m_count; ++i) At(i - 1) = At(i);
        --m_count;
        return true;
    }

private:
    static constexpr u64 c_kept = 65536;

    Pending& At(u64 i) { return m_jobs[(m_head + i) & (m_capacity - 1)]; }

    void Grow()
    {
        u64 const capacity = std::max<u64>(256, m_capacity * 2);
        std::unique_ptr<Pending[]> jobs(new Pending[capacity]);
        for (u64 i = 0; i < m_count; ++i) jobs[i] = m_jobs[(m_head + i) & (m_capacity - 1)];
        m_jobs = std::move(jobs);
        m_capacity = capacity;
        m_head = 0;
    }

    std::unique_ptr<Pending[]> m_jobs;
    u64 m_capacity = 0; // 0 or a power of 2.
    u64 m_head = 0;
    u64 m_count = 0;
};

class Pool
{
public:
    explicit Pool(Pool* before) : m_processors(Platform::CountUsableCpus()), m_before(before)
    {
        // The threads that use these have nobody to tell that there is no memory.
        m_threadIds.reserve(static_cast<u64>(std::max(c_mostThreads, m_processors)));
        m_measuredIds.reserve(m_threadIds.capacity());
    }

    int GetProcessors() const { return m_processors; }
    // Adds all copies, or throws std::bad_alloc and adds none. False if a worker was to be started for them and could
    // not be.
    bool Add(Queue queue, Pending const& job, int copies);
    // Takes a job back if nobody is there who could do it.
    bool Withdraw(Queue queue, void const* context);

private:
    // What has to be done outside the lock after a change under it.
    struct Calls
    {
        bool wake = false;
        bool startWorker = false;
        bool startManager = false;
        bool wakeManager = false;
    };

    static void RunWorkerThread(void* pool) { static_cast<Pool*>(pool)->RunWorker(); }
    static void RunManagerThread(void* pool) { static_cast<Pool*>(pool)->RunManager(); }

    void RunWorker() noexcept;
    void RunManager() noexcept;
    bool WaitForWork();
    bool SleepUntilWoken();
    bool Look();
    Pending TakeCS();
    void CallForHelpCS(Calls& calls);
    bool Do(Calls const& calls);
    bool StartWorker();
    i64 MeasureCS();
    void Lock() { m_lock.lock(); }
    void Unlock() { m_lock.unlock(); }

    int const m_processors;
    [[maybe_unused]] Pool* const m_before; // The parent process's, kept reachable in a child.
    alignas(64) BriefLock m_lock;          // Guards everything but the atomics.
    Ring m_rings[c_queueCount];
    u64 m_pending = 0;
    std::vector<u64> m_threadIds;   // Of all workers.
    std::vector<u64> m_measuredIds; // The manager's own copy.
    int m_threads = 0;              // Workers there are or that are being started.
    int m_looking = 0;              // Workers that look for work without sleeping, those being started among them.
    int m_sleeping = 0;             // Workers that sleep and that nobody has woken.
    int m_woken = 0;                // Wakes that no worker has answered yet.
    int m_surplus = 0;              // Workers to be sent home after their present job.
    bool m_managed = false;         // The manager has work to do.
    bool m_managerThere = false;
    alignas(64) std::atomic<u64> m_hint{0}; // m_pending, for a look without the lock.
    std::atomic<u32> m_bell{0};             // Rung for a sleeping worker.
    std::atomic<u32> m_managerBell{0};
};

bool Pool::Add(Queue queue, Pending const& job, int copies)
{
    Calls calls;
    {
        std::lock_guard const lock(m_lock);
        m_rings[queue].Reserve(static_cast<u64>(copies));
        for (int i = 0; i < copies; ++i) m_rings[queue].Push(job);
        m_pending += static_cast<u64>(copies);
        m_hint.store(m_pending, std::memory_order_relaxed);
        CallForHelpCS(calls);
    }
    return Do(calls);
}

bool Pool::Withdraw(Queue queue, void const* context)
{
    std::lock_guard const lock(m_lock);
    if (m_threads > 0 || !m_rings[queue].Withdraw(context)) return false;
    m_hint.store(--m_pending, std::memory_order_relaxed);
    return true;
}

Pending Pool::TakeCS()
{
    Ring* ring = m_rings;
    while (ring->IsEmpty()) ++ring;
    m_hint.store(--m_pending, std::memory_order_relaxed);
    return ring->Pop();
}

// Called whenever jobs are pending: sees to it that somebody comes for them.
void Pool::CallForHelpCS(Calls& calls)
{
    if (m_looking + m_woken > 0) return;
    if (m_sleeping > 0) {
        --m_sleeping;
        ++m_woken;
        m_bell.fetch_add(1, std::memory_order_relaxed);
        calls.wake = true;
    } else if (m_threads < m_processors) {
        ++m_threads;
        ++m_looking;
        calls.startWorker = true;
    } else if (!m_managed) {
        m_managed = true;
        calls.startManager = !m_managerThere;
        m_managerThere = true;
        m_managerBell.fetch_add(1, std::memory_order_relaxed);
        calls.wakeManager = !calls.startManager;
    }
}

// False if a worker was to be started and could not be.
bool Pool::Do(Calls const& calls)
{
    if (calls.wake) Platform::WakeWord(m_bell, 1);
    bool const isStarted = !calls.startWorker || StartWorker();
    if (calls.wakeManager) Platform::WakeWord(m_managerBell, 1);
    if (calls.startManager && !Platform::StartDetachedThread(RunManagerThread, this)) {
        Lock(); // The next job tries again.
        m_managerThere = m_managed = false;
        Unlock();
    }
    return isStarted;
}

bool Pool::StartWorker()
{
    if (Platform::StartDetachedThread(RunWorkerThread, this)) return true;
    Lock();
    --m_threads;
    --m_looking;
    Unlock();
    return false;
}

void Pool::RunWorker() noexcept
{
    u64 const id = Platform::GetCurrentThreadId();
    Lock();
    m_threadIds.push_back(id);
    for (;;) {
        // Here the lock is held and this worker counts as looking.
        if (m_surplus > 0 || (m_pending == 0 && !WaitForWork())) break;
        --m_looking;
        Pending const job = TakeCS();
        Calls calls;
        if (m_pending > 0) CallForHelpCS(calls);
        Unlock();
        Do(calls);
        job.work(job.context);
        Lock();
        ++m_looking;
    }
    if (m_surplus > 0) --m_surplus;
    --m_looking;
    --m_threads;
    m_threadIds.erase(std::find(m_threadIds.begin(), m_threadIds.end(), id));
    Calls calls;
    if (m_pending > 0) CallForHelpCS(calls);
    Unlock();
    Do(calls);
}

// Comes and goes with the lock held and this worker looking. True if there is work, false if the worker may end.
bool Pool::WaitForWork()
{
    while (m_pending == 0) {
        Unlock();
        Look();
        Lock();
        if (m_pending > 0) return true;
        --m_looking;
        ++m_sleeping;
        bool const woken = SleepUntilWoken();
        ++m_looking;
        if (!woken) return m_pending > 0;
    }
    return true;
}

bool Pool::Look()
{
    for (int i = 0; i < c_idleSpins; ++i) {
        if (m_hint.load(std::memory_order_relaxed) > 0) return true;
        Platform::PauseProcessor();
    }
    return false;
}

// Sleeps until a wake is there for this worker or until it has been idle long enough; the lock is held on both sides.
bool Pool::SleepUntilWoken()
{
    i64 const end = Platform::GetSystemClockCalls().counter() + c_idleNs;
    for (;;) {
        u32 const bell = m_bell.load(std::memory_order_relaxed);
        if (m_woken > 0) {
            --m_woken;
            return true;
        }
        i64 const left = end - Platform::GetSystemClockCalls().counter();
        if (left <= 0) {
            --m_sleeping;
            return false;
        }
        Unlock();
        Platform::WaitOnWord(m_bell, bell, left);
        Lock();
    }
}

void Pool::RunManager() noexcept
{
    i64 pause = c_firstLookNs;
    Lock();
    for (;;) {
        u32 const bell = m_managerBell.load(std::memory_order_relaxed);
        if (m_pending == 0) {
            m_managed = false;
            m_surplus = 0;
        }
        bool const managed = m_managed;
        Unlock();
        bool const inTime = Platform::WaitOnWord(m_managerBell, bell, managed ? pause : c_idleNs);
        Lock();
        if (!managed) {
            pause = c_firstLookNs;
            if (!inTime && !m_managed) break;
            continue; // Give the workers their first moments before looking.
        }
        if (m_pending == 0 || m_looking + m_woken > 0) continue;
        i64 const missing = MeasureCS();
        m_surplus = missing < 0 ? static_cast<int>(-missing) : 0;
        i64 const wanted = std::min<i64>({missing, static_cast<i64>(m_pending), c_mostThreads - m_threads});
        pause = wanted > 0 ? c_firstLookNs : std::min(pause * 2, c_longestLookNs);
        if (wanted <= 0) continue;
        m_threads += static_cast<int>(wanted);
        m_looking += static_cast<int>(wanted);
        Unlock();
        for (i64 i = 0; i < wanted; ++i) StartWorker();
        Lock();
    }
    m_managerThere = false;
    Unlock();
}

// How many workers fewer run than there are processors; below 0 if more do. Lets go of the lock meanwhile.
i64 Pool::MeasureCS()
{
    m_measuredIds = m_threadIds;
    Unlock();
    i64 const running = std::count_if(m_measuredIds.begin(), m_measuredIds.end(), Platform::IsThreadRunnable);
    Lock();
    return m_processors - running;
}

Pool* s_pool = nullptr;

// A child process has none of the threads, so it begins anew. What the parent had pending stays the parent's.
void BeginAnew()
{
    s_pool = new Pool(s_pool);
}

Pool& GetPool()
{
    static bool const made = [] {
        BeginAnew();
        Platform::RunInChildProcesses(BeginAnew);
        return true;
    }();
    (void)made;
    return *s_pool;
}

// A parallel loop. Its helpers are jobs that may start after the loop has ended; they then find nothing left to claim,
// and touch neither context nor function. The last of caller and helpers frees it.
class Loop
{
public:
    Loop(u64 count, void* context, RangeFunction work, u64 threads)
        : m_count(count), m_threads(threads), m_context(context), m_work(work), m_references(threads)
    {
    }

    static void Help(void* loop)
    {
        static_cast<Loop*>(loop)->Work();
        static_cast<Loop*>(loop)->Release();
    }

    void Work() noexcept;
    void WaitForLast();
    void Release()
    {
        if (m_references.fetch_sub(1, std::memory_order_acq_rel) == 1) delete this;
    }

private:
    // A run is to take about this long: an index that takes longer is claimed alone, so that a slow one never holds up
    // others behind it, and runs of short ones grow until a claim is worth its cost.
    static constexpr i64 c_runNs = 16'000;
    static constexpr u64 c_fastestGrowth = 8;

    u64 Claim(u64 wanted, u64& begin);

    u64 const m_count;
    u64 const m_threads;
    void* const m_context;
    RangeFunction const m_work;
    alignas(64) std::atomic<u64> m_next{0};
    alignas(64) std::atomic<u64> m_done{0};
    std::atomic<u32> m_finished{0}; // 0 under way, 1 the caller sleeps, 2 all done.
    std::atomic<u64> m_references;
};

// Takes up to @p wanted indices, but no more than a fair part of what is left, so that runs shrink towards the end.
u64 Loop::Claim(u64 wanted, u64& begin)
{
    begin = m_next.load(std::memory_order_relaxed);
    u64 run = 0;
    do {
        if (begin >= m_count) return 0;
        run = std::clamp<u64>((m_count - begin) / (2 * m_threads), 1, wanted);
    } while (!m_next.compare_exchange_weak(begin, begin + run, std::memory_order_relaxed));
    return run;
}

void Loop::Work() noexcept
{
    auto const counter = Platform::GetSystemClockCalls().counter;
    u64 wanted = 1;
    u64 begin = 0;
    i64 start = counter();
    while (u64 const run = Claim(wanted, begin)) {
        m_work(m_context, begin, begin + run);
        if (m_done.fetch_add(run, std::memory_order_acq_rel) + run == m_count) {
            if (m_finished.exchange(2, std::memory_order_acq_rel) == 1) Platform::WakeWord(m_finished, 1);
            return;
        }
        i64 const end = counter();
        i64 const took = end - start;
        start = end;
        u64 const growth = c_fastestGrowth * static_cast<u64>(took);
        wanted = growth <= c_runNs ? run * c_fastestGrowth : std::max<u64>(1, run * c_runNs / static_cast<u64>(took));
    }
}

void Loop::WaitForLast()
{
    for (int i = 0; i < c_idleSpins * 4; ++i) {
        if (m_finished.load(std::memory_order_acquire) == 2) return;
        Platform::PauseProcessor();
    }
    u32 expected = 0;
    m_finished.compare_exchange_strong(expected, 1, std::memory_order_acq_rel);
    while (m_finished.load(std::memory_order_acquire) != 2) Platform::WaitOnWord(m_finished, 1, -1);
}

} // namespace

Queue GetQueue(int priority)
{
    if (priority == c_high) return 0;
    return priority == c_low ? 2 : 1;
}

void Async(Queue queue, void* context, JobFunction work)
{
    Pool& pool = GetPool();
    if (pool.Add(queue, {work, context}, 1)) return;
    // It would lie there until some later job brings a worker.
    if (pool.Withdraw(queue, context)) throw std::bad_alloc();
}

void Apply(u64 count, Queue queue, void* context, RangeFunction work)
{
    if (count == 0) return;
    Pool& pool = GetPool();
    u64 const threads = std::min<u64>(count, static_cast<u64>(pool.GetProcessors()));
    auto loop = std::make_unique<Loop>(count, context, work, threads);
    if (threads > 1) pool.Add(queue, {Loop::Help, loop.get()}, static_cast<int>(threads - 1));
    Loop* const shared = loop.release(); // The helpers have their references now.
    shared->Work();
    shared->WaitForLast();
    shared->Release();
}

} // namespace Kernel::GlobalQueue

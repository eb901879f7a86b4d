#include "libkernel/concurrency/Dispatch.h"

#include "libkernel/concurrency/MultiSemaphore.h"
#include "libkernel/concurrency/Semaphore.h"
#include "libkernel/concurrency/ThreadId.h"
#include "libkernel/platform/Thread.h"
#include "support/FakeClock.h"

#include <atomic>
#include <cstdlib>
#include <gtest/gtest.h>
#include <mutex>
#include <set>
#include <string>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

using namespace Kernel;
using Priority = Dispatch::DispatchPriority;
using Purpose = Dispatch::ThreadPurpose;

thread_local int t_inScope = 0;
thread_local int t_carried = 0; // What the scope below carries over.

struct ScopeCounts
{
    std::atomic<int> clones{0};
    std::atomic<int> captures{0};
    std::atomic<int> begins{0};
    std::atomic<int> ends{0};
    std::atomic<int> alive{0};

    void Reset() { clones = captures = begins = ends = 0; }
};
ScopeCounts s_counts;

class CarryingScope : public Dispatch::Scope
{
public:
    CarryingScope() { ++s_counts.alive; }
    Counted<Scope> Clone() override
    {
        ++s_counts.clones;
        return MakeCounted<CarryingScope>();
    }
    void Capture() override
    {
        ++s_counts.captures;
        m_value = t_carried;
    }
    void Begin() override
    {
        ++s_counts.begins;
        ++t_inScope;
        t_carried = m_value;
    }
    void End() override
    {
        ++s_counts.ends;
        --t_inScope;
    }

protected:
    ~CarryingScope() override { --s_counts.alive; }

private:
    int m_value = 0;
};

thread_local std::string t_marks;

// Leaves marks on the thread that it begins and ends on.
class MarkingScope : public Dispatch::Scope
{
public:
    explicit MarkingScope(char mark) : m_mark(mark) {}
    Counted<Scope> Clone() override { return MakeCounted<MarkingScope>(m_mark); }
    void Begin() override { t_marks += m_mark; }
    void End() override { t_marks += static_cast<char>(m_mark - 'a' + 'A'); }

private:
    char const m_mark;
};

// Scopes stay for the rest of the process, so the tests that want some share them.
void RegisterScopes()
{
    static bool const once = [] {
        Dispatch::AddScope(MakeCounted<CarryingScope>());
        Dispatch::AddScope(MakeCounted<MarkingScope>('a'));
        Dispatch::AddScope(MakeCounted<MarkingScope>('b'));
        return true;
    }();
    (void)once;
    s_counts.Reset();
}

// Jobs counted down to nothing.
class Countdown
{
public:
    explicit Countdown(int n) : m_left(n) {}
    void Done()
    {
        if (--m_left == 0) m_gate->Signal();
    }
    void Wait() { m_gate->Wait(0); }

private:
    std::atomic<int> m_left;
    Counted<MultiSemaphore> m_gate = MakeCounted<MultiSemaphore>();
};

TEST(Dispatch, EveryForgottenJobRunsOnceOnAnotherThread)
{
    constexpr int c_jobs = 20'000;
    Countdown countdown(c_jobs);
    std::atomic<int> elsewhere{0};
    ThreadId const mine = ThreadId::GetCurrent();
    for (int i = 0; i < c_jobs; ++i) {
        Dispatch::DispatchAndForget([&] {
            if (ThreadId::GetCurrent() != mine) ++elsewhere;
            countdown.Done();
        });
    }
    countdown.Wait();
    EXPECT_EQ(c_jobs, elsewhere);
}

TEST(Dispatch, AnyPriorityNumberRuns)
{
    int const priorities[] = {0, 1, 2, 3, 7, -1};
    Countdown countdown(static_cast<int>(std::size(priorities)));
    for (int const priority : priorities) {
        Dispatch::DispatchAndForget([](void* c) { static_cast<Countdown*>(c)->Done(); }, &countdown,
                                    static_cast<Priority>(priority), Purpose::Worker);
    }
    countdown.Wait();
}

// All workers are held while the queue fills, and then one is let go, so that the order of running is the queue's.
TEST(Dispatch, HigherPrioritiesStartFirstAndEqualOnesInOrder)
{
    int const processors = Platform::CountUsableCpus();
    std::pair<int, int> const jobs[] = {{0, 30}, {2, 20}, {7, 21}, {3, 10}, {1, 31}, {2, 22}, {3, 11}, {0, 32}};
    Countdown held(processors);
    Countdown done(static_cast<int>(std::size(jobs)));
    Countdown gone(processors);
    std::atomic<int> released{0};
    std::mutex mutex;
    std::vector<int> order;
    std::set<u64> runners;
    for (int i = 0; i < processors; ++i) {
        Dispatch::DispatchAndForget([&, i] {
            held.Done();
            while (released <= i) {
            } // Busy, so no thread is added for a blocked one.
            gone.Done();
        });
    }
    held.Wait();
    for (auto const& [priority, number] : jobs) {
        Dispatch::DispatchAndForget(
            [&, number = number] {
                {
                    std::lock_guard const lock(mutex);
                    order.push_back(number);
                    runners.insert(Platform::GetCurrentThreadId());
                }
                done.Done();
            },
            static_cast<Priority>(priority), Purpose::Worker);
    }
    released = 1;
    done.Wait();
    released = processors;
    gone.Wait();
    if (runners.size() > 1) GTEST_SKIP() << "an earlier test's worker took part";
    EXPECT_EQ((std::vector<int>{10, 11, 20, 21, 22, 30, 31, 32}), order);
}

// A job that waits for a later one blocks its worker; the queue must not stand still for it.
TEST(Dispatch, JobsThatWaitForLaterJobsDoNotStopTheQueue)
{
    constexpr int c_chain = 24; // More than there are processors on a small machine.
    std::vector<Counted<MultiSemaphore>> gates;
    for (int i = 0; i <= c_chain; ++i) gates.push_back(MakeCounted<MultiSemaphore>());
    for (int i = 0; i < c_chain; ++i) {
        Dispatch::DispatchAndForget([&, i] {
            gates[static_cast<u64>(i) + 1]->Wait(0);
            gates[static_cast<u64>(i)]->Signal();
        });
    }
    Dispatch::DispatchAndForget([&] { gates[c_chain]->Signal(); });
    gates[0]->Wait(0);
    Countdown after(1);
    Dispatch::DispatchAndForget([&] { after.Done(); });
    after.Wait();
}

TEST(Dispatch, LoopRunsEachIndexOnceWhateverItsLength)
{
    for (u64 const count : {u64{0}, u64{1}, u64{2}, u64{3}, u64{7}, u64{1000}, u64{200'001}}) {
        std::vector<std::atomic<u8>> runs(count);
        Dispatch::DispatchParallelFor([&](u64 i) { ++runs[i]; }, count);
        u64 wrong = 0;
        for (auto const& n : runs) wrong += n != 1;
        EXPECT_EQ(0u, wrong) << count;
    }
}

TEST(Dispatch, LongIndicesAreSharedOutSingly)
{
    if (Platform::CountUsableCpus() < 2) GTEST_SKIP() << "one processor";
    // Two indices that wait for each other: both must be under way at once.
    std::atomic<int> met{0};
    Dispatch::DispatchParallelFor(
        [&](u64) {
            ++met;
            while (met < 2) std::this_thread::yield();
        },
        2);
    EXPECT_EQ(2, met);
}

TEST(Dispatch, LoopsNestAndRunInsideJobs)
{
    std::atomic<int> runs{0};
    Countdown countdown(4);
    for (int job = 0; job < 4; ++job) {
        Dispatch::DispatchAndForget([&] {
            Dispatch::DispatchParallelFor([&](u64) { Dispatch::DispatchParallelFor([&](u64) { ++runs; }, 10); }, 10);
            countdown.Done();
        });
    }
    countdown.Wait();
    EXPECT_EQ(400, runs);
}

TEST(Dispatch, ListRunsEachElement)
{
    std::atomic<int> sum{0};
    Dispatch::DispatchParallel({[&] { sum += 1; }, [&] { sum += 10; }, [&] { sum += 100; }});
    EXPECT_EQ(111, sum);
    Dispatch::DispatchParallel({});
}

TEST(DispatchScope, JobSeesWhatWasCapturedWhenItWasGiven)
{
    RegisterScopes();
    Countdown countdown(1);
    int seen = 0;
    int inScope = 0;
    t_carried = 5;
    Dispatch::DispatchAndForget([&] {
        seen = t_carried;
        inScope = t_inScope;
        countdown.Done();
    });
    t_carried = 6;
    EXPECT_EQ(1, s_counts.clones);
    EXPECT_EQ(1, s_counts.captures);
    countdown.Wait();
    EXPECT_EQ(5, seen);
    EXPECT_EQ(1, inScope);
    while (s_counts.alive > 1) std::this_thread::yield(); // The record goes behind the job.
    EXPECT_EQ(1, s_counts.begins);
    EXPECT_EQ(1, s_counts.ends);
}

TEST(DispatchScope, LoopBeginsAndEndsAroundEveryIndex)
{
    RegisterScopes();
    for (u64 const count : {u64{0}, u64{1}, u64{500}}) {
        s_counts.Reset();
        std::atomic<int> outside{0};
        Dispatch::DispatchParallelFor([&](u64) { outside += t_inScope != 1; }, count);
        EXPECT_EQ(1, s_counts.clones);
        EXPECT_EQ(1, s_counts.captures);
        EXPECT_EQ(count, static_cast<u64>(s_counts.begins));
        EXPECT_EQ(count, static_cast<u64>(s_counts.ends));
        EXPECT_EQ(0, outside);
        EXPECT_EQ(1, s_counts.alive) << "the clone is released with the loop";
    }
    EXPECT_EQ(0, t_inScope);
}

TEST(DispatchScope, ScopesBeginAndEndInTheOrderOfRegistration)
{
    RegisterScopes();
    t_marks.clear();
    Dispatch::DispatchParallelFor([&](u64) { t_marks += '-'; }, 1); // A single index runs on this thread here.
    EXPECT_EQ("ab-AB", t_marks);
}

void (*s_sunkFunction)(void*) = nullptr;
void* s_sunkContext = nullptr;

TEST(Dispatch, MainThreadIsReachedThroughTheSink)
{
    int runs = 0;
    Dispatch::DispatchOnMainThread([&] { ++runs; }); // No sink: dropped.
    EXPECT_FALSE(Dispatch::IsMainThread());
    Dispatch::SetMainThreadId(static_cast<unsigned long>(Platform::GetCurrentThreadId()));
    Dispatch::SetMainThreadSink([](void (*function)(void*), void* context) {
        s_sunkFunction = function;
        s_sunkContext = context;
    });
    EXPECT_TRUE(Dispatch::IsMainThread());
    std::thread([] { EXPECT_FALSE(Dispatch::IsMainThread()); }).join();
    Dispatch::DispatchOnMainThread([&] { ++runs; });
    EXPECT_EQ(0, runs);
    s_sunkFunction(s_sunkContext);
    EXPECT_EQ(1, runs);
    Dispatch::DispatchOnMainThread([](void* n) { *static_cast<int*>(n) += 10; }, &runs);
    s_sunkFunction(s_sunkContext);
    EXPECT_EQ(11, runs);
    Dispatch::SetMainThreadSink(nullptr);
    Dispatch::SetMainThreadId(0);
}

TEST(Dispatch, PurposeBelongsToTheThread)
{
    EXPECT_EQ(Purpose::None, Dispatch::GetCurrentThreadPurpose());
    Dispatch::SetCurrentThreadPurpose(static_cast<Purpose>(9));
    std::thread([] { EXPECT_EQ(Purpose::None, Dispatch::GetCurrentThreadPurpose()); }).join();
    EXPECT_EQ(static_cast<Purpose>(9), Dispatch::GetCurrentThreadPurpose());
    Dispatch::SetCurrentThreadPurpose(Purpose::None);
}

TEST(Dispatch, SleepGoesThroughTheClock)
{
    TestSupport::FakeClock clock;
    Dispatch::Sleep(1000);
    Dispatch::Yield(Dispatch::YieldPolicy::Default);
    EXPECT_EQ((std::vector<i64>{1000, 0}), clock.GetSleeps());
}

TEST(Dispatch, ChildProcessHasWorkersOfItsOwn)
{
#if defined(__SANITIZE_THREAD__)
    GTEST_SKIP() << "the thread sanitiser allows no threads behind a fork";
#endif
    Countdown countdown(1);
    Dispatch::DispatchAndForget([&] { countdown.Done(); });
    countdown.Wait();
    pid_t const child = ::fork();
    if (child == 0) {
        ::alarm(30);
        Countdown again(1);
        Dispatch::DispatchAndForget([&] { again.Done(); });
        again.Wait();
        ::_exit(0);
    }
    int status = 1;
    ASSERT_EQ(child, ::waitpid(child, &status, 0));
    EXPECT_EQ(0, status);
}

TEST(DispatchDeathTest, ProcessEndsWhileJobsRunAndWait)
{
    EXPECT_EXIT(
        {
            ::alarm(30);
            auto const gate = MakeCounted<MultiSemaphore>();
            Counted<MultiSemaphore>& never = *new Counted<MultiSemaphore>(gate);
            for (int i = 0; i < 1000; ++i) Dispatch::DispatchAndForget([&] { never->Wait(0); });
            std::exit(0);
        },
        testing::ExitedWithCode(0), "");
}

TEST(DispatchDeathTest, ThrowingJobEndsTheProcess)
{
    EXPECT_DEATH(Dispatch::DispatchParallelFor([](u64) { throw 1; }, 2), "");
}

} // namespace

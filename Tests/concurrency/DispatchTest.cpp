#include "libkernel/concurrency/Dispatch.h"

#include "libkernel/concurrency/MultiSemaphore.h"
#include "libkernel/concurrency/Semaphore.h"
#include "libkernel/concurrency/ThreadId.h"
#include "libkernel/platform/Thread.h"
#include "support/FakeClock.h"

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <gtest/gtest.h>
#include <sched.h>
#include <string>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

#if defined(__SANITIZE_THREAD__)
// By its own choice the sanitizer ends a child process that starts threads.
extern "C" __attribute__((visibility("default"))) char const* __tsan_default_options();
char const* __tsan_default_options()
{
    return "die_after_fork=0";
}
#endif

namespace {

using namespace Kernel;
using Priority = Dispatch::DispatchPriority;
using Purpose = Dispatch::ThreadPurpose;

thread_local int t_carried = 0; // What the scopes below carry over.
thread_local std::string t_marks;

struct
{
    std::atomic<int> captures{0}, begins{0}, ends{0}, alive{0};
} s_counts; // Of both scopes.

// Leaves marks on the thread that it begins and ends on.
class CarryingScope : public Dispatch::Scope
{
public:
    explicit CarryingScope(char mark) : m_mark(mark) { ++s_counts.alive; }
    Counted<Scope> Clone() override { return MakeCounted<CarryingScope>(m_mark); }
    void Capture() override { ++s_counts.captures, m_value = t_carried; }
    void Begin() override { ++s_counts.begins, t_marks += m_mark, t_carried = m_value; }
    void End() override { ++s_counts.ends, t_marks += static_cast<char>(m_mark - 'a' + 'A'); }

protected:
    ~CarryingScope() override { --s_counts.alive; }

private:
    char const m_mark;
    int m_value = 0;
};

// Scopes stay for the rest of the process, so the tests that want some share them.
void RegisterScopes()
{
    static bool const once = [] {
        for (char const mark : {'a', 'b'}) Dispatch::AddScope(MakeCounted<CarryingScope>(mark));
        return true;
    }();
    (void)once;
    while (s_counts.alive > 2) std::this_thread::yield(); // The records of an earlier test's jobs.
    s_counts.captures = s_counts.begins = s_counts.ends = 0;
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

TEST(Dispatch, EveryForgottenJobRunsOnceOnAnotherThreadWhateverItsPriority)
{
    constexpr int c_jobs = 20'000;
    int const priorities[] = {0, 1, 2, 3, 7, -1};
    Countdown countdown(c_jobs);
    std::atomic<int> elsewhere{0};
    ThreadId const mine = ThreadId::GetCurrent();
    auto const job = [&] {
        if (ThreadId::GetCurrent() != mine) ++elsewhere;
        countdown.Done();
    };
    for (int i = 0; i < c_jobs; ++i)
        Dispatch::DispatchAndForget(job, static_cast<Priority>(priorities[i % 6]), Purpose::Worker);
    countdown.Wait();
    EXPECT_EQ(c_jobs, elsewhere);
}

// Narrows this process, which must have no workers yet, to one processor, and so to one worker while none blocks. The
// first job keeps it busy until all others are queued, so that they start in the order of the queue.
[[noreturn]] void ShowOrderOnOneProcessor()
{
    ::alarm(30);
    cpu_set_t all, one;
    ::sched_getaffinity(0, sizeof all, &all);
    CPU_ZERO(&one);
    for (size_t cpu = 0; CPU_COUNT(&one) == 0; ++cpu)
        if (CPU_ISSET(cpu, &all)) CPU_SET(cpu, &one);
    ::sched_setaffinity(0, sizeof one, &one);

    std::pair<int, int> const jobs[] = {{0, 30}, {2, 20}, {7, 21}, {3, 10}, {1, 31}, {2, 22}, {3, 11}, {0, 32}};
    std::atomic<bool> busy{false}, queued{false};
    std::atomic<size_t> ran{0};
    int order[std::size(jobs)] = {};
    Dispatch::DispatchAndForget([&] {
        busy = true;
        while (!queued) std::this_thread::yield();
    });
    while (!busy) std::this_thread::yield();
    for (auto const& [priority, number] : jobs)
        Dispatch::DispatchAndForget([&, number = number] { order[ran] = number, ++ran; },
                                    static_cast<Priority>(priority), Purpose::Worker);
    queued = true;
    while (ran < std::size(jobs)) std::this_thread::yield();
    for (int const number : order) std::fprintf(stderr, "%d ", number);
    Dispatch::DispatchParallelFor(
        [mine = ThreadId::GetCurrent()](u64 i) {
            std::fprintf(stderr, mine == ThreadId::GetCurrent() ? "%d" : "x", static_cast<int>(i));
        },
        9);
    std::_Exit(0);
}

TEST(DispatchDeathTest, HigherPrioritiesStartFirstAndEqualOnesAndIndicesInOrder)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // A new process of this program.
    EXPECT_EXIT(ShowOrderOnOneProcessor(), testing::ExitedWithCode(0), "^10 11 20 21 22 30 31 32 012345678$");
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
}

TEST(Dispatch, LoopRunsEachIndexOnceWhateverItsLengthAndWhereverItRuns)
{
    for (u64 const count : {u64{0}, u64{1}, u64{2}, u64{3}, u64{7}, u64{1000}, u64{200'001}}) {
        std::vector<std::atomic<u8>> runs(count);
        Dispatch::DispatchParallelFor([&](u64 i) { ++runs[i]; }, count);
        EXPECT_EQ(count, static_cast<u64>(std::ranges::count_if(runs, [](auto const& n) { return n == 1; }))) << count;
    }
    std::atomic<int> sum{0};
    Dispatch::DispatchParallel({[&] { sum += 1; }, [&] { sum += 10; }, [&] { sum += 100; }});
    EXPECT_EQ(111, sum);
    Dispatch::DispatchParallel({});

    Countdown countdown(4); // Loops nest, and run inside jobs.
    for (int job = 0; job < 4; ++job)
        Dispatch::DispatchAndForget([&] {
            Dispatch::DispatchParallelFor([&](u64) { Dispatch::DispatchParallelFor([&](u64) { ++sum; }, 10); }, 10);
            countdown.Done();
        });
    countdown.Wait();
    EXPECT_EQ(511, sum);
}

// Indices that wait for each other must be under way at once, as far as there are processors.
TEST(Dispatch, LongIndicesAreSharedOutSingly)
{
    int const together = std::min(2, Platform::CountUsableCpus());
    std::atomic<int> met{0};
    std::atomic<int> onCaller{0};
    Dispatch::DispatchParallelFor(
        [&, mine = ThreadId::GetCurrent()](u64) {
            onCaller += mine == ThreadId::GetCurrent();
            ++met;
            while (met < together) std::this_thread::yield();
        },
        2);
    EXPECT_EQ(2, met);
    EXPECT_EQ(together == 2 ? 1 : 2, onCaller);
}

TEST(DispatchScope, JobSeesWhatWasCapturedWhenItWasGiven)
{
    RegisterScopes();
    Countdown countdown(1);
    std::pair<int, bool> seen;
    t_carried = 5;
    Dispatch::DispatchAndForget([&] {
        seen = {t_carried, t_marks.ends_with("ab")};
        countdown.Done();
    });
    t_carried = 6;
    EXPECT_EQ(2, s_counts.captures);
    countdown.Wait();
    EXPECT_EQ(std::pair(5, true), seen);
    while (s_counts.alive > 2) std::this_thread::yield(); // The record goes behind the job.
    EXPECT_TRUE(s_counts.begins == 2 && s_counts.ends == 2);
}

TEST(DispatchScope, LoopBeginsAndEndsAroundEveryIndexInTheOrderOfRegistration)
{
    for (u64 const count : {u64{0}, u64{1}, u64{500}}) {
        RegisterScopes();
        std::atomic<int> outside{0};
        t_marks.clear();
        Dispatch::DispatchParallelFor(
            [&](u64) {
                outside += !t_marks.ends_with("ab");
                t_marks += '-';
            },
            count);
        EXPECT_EQ(0, outside);
        EXPECT_TRUE(t_marks.empty() || t_marks.ends_with("ab-AB")) << t_marks;
        EXPECT_EQ(2, s_counts.captures);
        EXPECT_TRUE(2 * count == u64(s_counts.begins) && s_counts.begins == s_counts.ends);
        EXPECT_EQ(2, s_counts.alive) << "the clones are released with the loop";
    }
}

std::pair<void (*)(void*), void*> s_sunk;

TEST(Dispatch, MainThreadIsReachedThroughTheSinkAndThreadsHaveTheirOwnPurpose)
{
    int runs = 0;
    Dispatch::DispatchOnMainThread([&] { ++runs; }); // No sink: dropped.
    EXPECT_FALSE(Dispatch::IsMainThread());
    Dispatch::SetMainThreadId(static_cast<unsigned long>(Platform::GetCurrentThreadId()));
    Dispatch::SetMainThreadSink([](void (*function)(void*), void* context) { s_sunk = {function, context}; });
    Dispatch::SetCurrentThreadPurpose(static_cast<Purpose>(9));
    std::thread([] {
        EXPECT_FALSE(Dispatch::IsMainThread());
        EXPECT_EQ(Purpose::None, Dispatch::GetCurrentThreadPurpose());
    }).join();
    EXPECT_TRUE(Dispatch::IsMainThread());
    EXPECT_EQ(static_cast<Purpose>(9), Dispatch::GetCurrentThreadPurpose());
    Dispatch::SetCurrentThreadPurpose(Purpose::None);
    Dispatch::DispatchOnMainThread([&] { ++runs; });
    EXPECT_EQ(0, runs);
    s_sunk.first(s_sunk.second);
    EXPECT_EQ(1, runs);
    Dispatch::DispatchOnMainThread([](void* n) { *static_cast<int*>(n) += 10; }, &runs);
    s_sunk.first(s_sunk.second);
    EXPECT_EQ(11, runs);
    Dispatch::SetMainThreadSink(nullptr);
    Dispatch::SetMainThreadId(0);
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

// Dispatch beside other pools: a loop over a million tiny indices, one over a thousand of some microseconds, jobs that
// are forgotten, and the time until a single job has run.
#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/concurrency/MultiSemaphore.h"
#include "support/Table.h"

#include <atomic>
#include <cmath>
#include <condition_variable>
#include <mutex>
#include <thread>
#ifdef KERNEL_HAVE_TBB
#include <tbb/parallel_for.h>
#include <tbb/task_arena.h>
#include <tbb/task_group.h>
#endif
#ifdef KERNEL_HAVE_GLIB
#include <glib.h>
#endif

namespace {

using namespace Kernel;

constexpr u64 c_tiny = 1'000'000;
constexpr u64 c_heavy = 1'000;
constexpr int c_jobs = 20'000;
constexpr int c_rounds = 15;

std::vector<float> s_values(c_tiny, 1.0f);

void Tiny(void*, u64 i)
{
    s_values[i] = s_values[i] * 1.0001f + 0.5f;
}

void Heavy(void*, u64 i)
{
    double sum = static_cast<double>(i);
    for (int k = 0; k < 700; ++k) sum += std::sqrt(sum + k);
    Bench::Keep(sum);
}

double SerialLoop(u64 count, void (*function)(void*, u64))
{
    return Bench::BestSeconds(c_rounds, [&] {
        auto* volatile f = function;
        for (u64 i = 0; i < count; ++i) f(nullptr, i);
    });
}

double OurLoop(u64 count, void (*function)(void*, u64))
{
    return Bench::BestSeconds(c_rounds, [&] { Dispatch::DispatchParallelFor(function, count, nullptr); });
}

// Median over single jobs, each given when all workers had time to fall asleep.
template <class Give>
double Latency(Give&& give)
{
    std::vector<double> all;
    for (int i = 0; i < 200; ++i) {
        std::this_thread::sleep_for(std::chrono::microseconds(500));
        std::atomic<bool> ran{false};
        auto const start = std::chrono::steady_clock::now();
        give(ran);
        while (!ran.load(std::memory_order_acquire)) {
        }
        all.push_back(std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
    }
    std::nth_element(all.begin(), all.begin() + 100, all.end());
    return all[100];
}

double SleepingThread()
{
    std::mutex mutex;
    std::condition_variable wake;
    std::atomic<bool>* job = nullptr;
    bool stop = false;
    std::thread thread([&] {
        std::unique_lock lock(mutex);
        for (;;) {
            wake.wait(lock, [&] { return job || stop; });
            if (stop) return;
            job->store(true, std::memory_order_release);
            job = nullptr;
        }
    });
    double const latency = Latency([&](std::atomic<bool>& ran) {
        std::lock_guard const lock(mutex);
        job = &ran;
        wake.notify_one();
    });
    {
        std::lock_guard const lock(mutex);
        stop = true;
        wake.notify_one();
    }
    thread.join();
    return latency;
}

double OurJobs()
{
    return Bench::BestSeconds(c_rounds, [] {
        std::atomic<int> left{c_jobs};
        auto const gate = MakeCounted<MultiSemaphore>();
        for (int i = 0; i < c_jobs; ++i) {
            Dispatch::DispatchAndForget([&] {
                if (left.fetch_sub(1) == 1) gate->Signal();
            });
        }
        gate->Wait(0);
    });
}

#ifdef KERNEL_HAVE_TBB
double TbbLoop(u64 count, void (*function)(void*, u64))
{
    return Bench::BestSeconds(c_rounds, [&] {
        auto* volatile f = function;
        tbb::parallel_for(u64{0}, count, [f = f](u64 i) { f(nullptr, i); });
    });
}

double TbbJobs()
{
    return Bench::BestSeconds(c_rounds, [] {
        tbb::task_arena arena;
        std::atomic<int> left{c_jobs};
        auto const gate = MakeCounted<MultiSemaphore>();
        for (int i = 0; i < c_jobs; ++i) {
            arena.enqueue([&] {
                if (left.fetch_sub(1) == 1) gate->Signal();
            });
        }
        gate->Wait(0);
    });
}

double TbbLatency()
{
    tbb::task_arena arena;
    return Latency([&](std::atomic<bool>& ran) { arena.enqueue([&] { ran.store(true, std::memory_order_release); }); });
}
#else
double TbbLoop(u64, void (*)(void*, u64))
{
    return 0.0;
}
double TbbJobs()
{
    return 0.0;
}
double TbbLatency()
{
    return 0.0;
}
#endif

#ifdef KERNEL_HAVE_GLIB
double GlibLatency()
{
    GThreadPool* const pool = g_thread_pool_new(
        [](gpointer job, gpointer) { static_cast<std::atomic<bool>*>(job)->store(true, std::memory_order_release); },
        nullptr, static_cast<gint>(std::thread::hardware_concurrency()), TRUE, nullptr);
    double const latency = Latency([&](std::atomic<bool>& ran) { g_thread_pool_push(pool, &ran, nullptr); });
    g_thread_pool_free(pool, FALSE, TRUE);
    return latency;
}
#else
double GlibLatency()
{
    return 0.0;
}
#endif

template <class Acquire, class Release>
double LockPair(Acquire&& acquire, Release&& release)
{
    constexpr int c_pairs = 1'000'000;
    return Bench::BestSeconds(5,
                              [&] {
                                  for (int i = 0; i < c_pairs; ++i) {
                                      acquire();
                                      release();
                                  }
                              }) /
           c_pairs;
}

} // namespace

int main()
{
    constexpr double c_ns = 1e9;
    constexpr double c_us = 1e6;
    Bench::Table table("Dispatch, per index, job or pair");

    double peer = TbbLoop(c_tiny, Tiny) / c_tiny * c_ns;
    table.Row("loop of 1,000,000 tiny", "serial", SerialLoop(c_tiny, Tiny) / c_tiny * c_ns, "ns");
    if (peer > 0) table.Row("loop of 1,000,000 tiny", "oneTBB", peer, "ns");
    table.Row("loop of 1,000,000 tiny", "libkernel", OurLoop(c_tiny, Tiny) / c_tiny * c_ns, "ns", peer,
              "<= 1.30 x TBB");

    peer = TbbLoop(c_heavy, Heavy) / c_heavy * c_us;
    table.Row("loop of 1,000 heavier", "serial", SerialLoop(c_heavy, Heavy) / c_heavy * c_us, "us");
    if (peer > 0) table.Row("loop of 1,000 heavier", "oneTBB", peer, "us");
    table.Row("loop of 1,000 heavier", "libkernel", OurLoop(c_heavy, Heavy) / c_heavy * c_us, "us", peer,
              "<= 1.03 x TBB");

    peer = TbbJobs() / c_jobs * c_ns;
    if (peer > 0) table.Row("20,000 jobs forgotten", "oneTBB", peer, "ns");
    table.Row("20,000 jobs forgotten", "libkernel", OurJobs() / c_jobs * c_ns, "ns", peer, "<= 1.10 x TBB");

    double const limit = SleepingThread() * c_us;
    table.Row("latency of one job", "one sleeping thread (limit)", limit, "us");
    if (double const tbb = TbbLatency() * c_us; tbb > 0) table.Row("latency of one job", "oneTBB", tbb, "us");
    double const glib = GlibLatency() * c_us;
    if (glib > 0) table.Row("latency of one job", "glib pool", glib, "us");
    double const ours = Latency([](std::atomic<bool>& ran) {
                            Dispatch::DispatchAndForget([&] { ran.store(true, std::memory_order_release); });
                        }) *
                        c_us;
    table.Row("latency of one job", "libkernel", ours, "us", glib > 0 ? glib : limit,
              glib > 0 ? "<= 1.00 x glib, <= 1.50 x limit" : "<= 1.50 x limit");

    CriticalSection section;
    CriticalSectionSpin spin;
    std::recursive_mutex recursive;
    double const pthread = LockPair([&] { recursive.lock(); }, [&] { recursive.unlock(); }) * c_ns;
    table.Row("lock and unlock, uncontended", "std::recursive_mutex", pthread, "ns");
    table.Row("lock and unlock, uncontended", "CriticalSection",
              LockPair([&] { section.AcquireLock(); }, [&] { section.ReleaseLock(); }) * c_ns, "ns", pthread);
    table.Row("lock and unlock, uncontended", "CriticalSectionSpin",
              LockPair([&] { spin.AcquireLock(); }, [&] { spin.ReleaseLock(); }) * c_ns, "ns", pthread);
}

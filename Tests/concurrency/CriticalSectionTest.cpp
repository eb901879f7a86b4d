#include "libkernel/concurrency/CriticalSection.h"

#include "libkernel/concurrency/MultiSemaphore.h"
#include "libkernel/concurrency/Semaphore.h"
#include "libkernel/concurrency/System.h"

#include <atomic>
#include <chrono>
#include <gtest/gtest.h>
#include <thread>
#include <vector>

namespace {

using namespace Kernel;

template <class T>
class LockTest : public testing::Test
{
};
using LockTypes = testing::Types<CriticalSection, CriticalSectionSpin>;
TYPED_TEST_SUITE(LockTest, LockTypes);

TYPED_TEST(LockTest, OneThreadTakesItTwiceAndOthersWaitForBothReleases)
{
    TypeParam lock;
    int value = 0;
    lock.AcquireLock();
    lock.AcquireLock();
    std::thread other([&] {
        LockScope<TypeParam> const scope(lock);
        value *= 10;
    });
    value = 1;
    lock.ReleaseLock();
    value = 2;
    EXPECT_TRUE(lock.IsHeldByCurrentThread());
    lock.ReleaseLock();
    other.join();
    EXPECT_EQ(20, value);
    EXPECT_FALSE(lock.IsHeldByCurrentThread());
}

TEST(CriticalSection, HeldLockSurvivesAMoveOfItsObjectAndLetsNobodyElseIn)
{
    std::vector<CriticalSection> locks(1);
    EXPECT_TRUE(locks[0].TryAcquireLock());
    locks.resize(100);
    EXPECT_TRUE(locks[0].IsHeldByCurrentThread());
    std::thread([&] { EXPECT_FALSE(locks[0].TryAcquireLock()); }).join();
    CriticalSectionScope scope(locks[0]);
    locks[0].ReleaseLock();
    scope.Release();
    std::thread([&] {
        EXPECT_TRUE(locks[0].TryAcquireLock());
        locks[0].ReleaseLock();
    }).join();
}

TEST(Semaphore, EachSignalLetsOneWaiterThrough)
{
    auto const semaphore = MakeCounted<Semaphore>();
    std::vector<std::jthread> threads; // They wait for ever, so every signal is needed.
    for (int i = 0; i < 4; ++i)
        threads.emplace_back([&] {
            for (int k = 0; k < 500; ++k) semaphore->Wait(0);
        });
    for (int i = 0; i < 4 * 500; ++i) semaphore->Signal();
    threads.clear();
    auto const start = std::chrono::steady_clock::now();
    semaphore->Wait(5); // Nothing is left.
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(5));
    semaphore->Signal(); // The wait that timed out took nothing along.
    semaphore->Wait(0);
}

TEST(Semaphore, InitialCountIsTakenFirstAndStopsAtItsMaximum)
{
    auto const semaphore = MakeCounted<Semaphore>(2);
    for (int i = 0; i < 2; ++i) semaphore->Wait(0);
    auto const full = MakeCounted<Semaphore>(0x7FFFFFFF);
    full->Signal();
    full->Wait(1);
}

TEST(MultiSemaphore, OpensOnceForAllAndStaysOpen)
{
    auto const gate = MakeCounted<MultiSemaphore>();
    std::atomic<int> through{0}, arrived{0};
    std::vector<std::jthread> threads;
    for (int i = 0; i < 8; ++i) threads.emplace_back([&] { ++arrived, gate->Wait(0), ++through; });
    while (arrived < 4) std::this_thread::yield(); // Some wait, some come late.
    gate->Wait(1);                                 // Times out, and stays counted.
    EXPECT_EQ(0, through);
    gate->Signal();
    threads.clear();
    EXPECT_EQ(8, through);
    gate->Wait(0);
    gate->Signal();
    gate->Wait(0);
}

TEST(System, FactsArePlausible)
{
    EXPECT_GE(System::GetCpuCount(true), System::GetCpuCount(false));
    EXPECT_GE(System::GetCpuCount(false), 1);
    EXPECT_EQ(0u, System::GetRamCount() % 1024);
    EXPECT_GT(System::GetRamCount(), 1u << 24);
    EXPECT_FALSE(System::GetHostName().IsEmpty());
}

} // namespace

#include "libkernel/platform/Lock.h"

#include "libkernel/platform/Random.h"
#include "libkernel/platform/Thread.h"
#include "libkernel/platform/Time.h"

#include <cstring>
#include <gtest/gtest.h>
#include <thread>
#include <vector>

namespace {

using namespace Kernel;
using namespace Kernel::Platform;

TEST(RecursiveLock, CountsAreExactUnderContention)
{
    for (u16 const spins : {u16{0}, u16{4000}}) {
        RecursiveLock lock(spins, 0);
        int count = 0;
        std::vector<std::thread> threads;
        for (int t = 0; t < 4; ++t) {
            threads.emplace_back([&] {
                for (int i = 0; i < 5000; ++i) {
                    lock.Acquire();
                    lock.Acquire();
                    ++count;
                    lock.Release();
                    ++count;
                    lock.Release();
                }
            });
        }
        for (auto& thread : threads) thread.join();
        EXPECT_EQ(4 * 5000 * 2, count);
    }
}

TEST(RecursiveLock, OthersWaitUntilTheLastRelease)
{
    RecursiveLock lock(0, 0);
    auto const othersGetIt = [&] {
        bool got = false;
        std::thread([&] {
            got = lock.TryAcquire();
            if (got) lock.Release();
        }).join();
        return got;
    };
    lock.Acquire();
    EXPECT_TRUE(lock.TryAcquire());
    EXPECT_TRUE(lock.IsHeldByCurrentThread());
    lock.Release();
    EXPECT_FALSE(othersGetIt());
    lock.Release();
    EXPECT_FALSE(lock.IsHeldByCurrentThread());
    EXPECT_TRUE(othersGetIt());
}

#ifndef NDEBUG
TEST(RecursiveLockDeathTest, WrongOrdersEndTheProcess)
{
    RecursiveLock low(0, 1);
    RecursiveLock high(0, 2);
    RecursiveLock unranked(0, 0);
    EXPECT_DEATH((high.Acquire(), low.Acquire()), "below the rank");
    EXPECT_DEATH(low.Release(), "doesn't hold it");
    // In order, a lock that is held already, and locks outside the order are all right.
    low.Acquire();
    unranked.Acquire();
    high.Acquire();
    low.Acquire();
    low.Release();
    low.Release(); // Out of order of taking.
    EXPECT_DEATH(low.Acquire(), "below the rank");
    high.Release();
    low.Acquire();
    low.Release();
    unranked.Release();
}
#endif

TEST(WaitOnWord, ComesBackForAChangeAWakeOrTheTime)
{
    std::atomic<u32> word{5};
    EXPECT_TRUE(WaitOnWord(word, 4, -1)) << "the word differs already";
    EXPECT_FALSE(WaitOnWord(word, 5, 1'000'000));
    std::thread waiter([&] {
        while (word.load() == 5) WaitOnWord(word, 5, -1);
    });
    word = 6;
    WakeWord(word, 1);
    waiter.join();
}

TEST(Thread, DetachedThreadRunsUnderItsOwnId)
{
    std::atomic<u32> id{0};
    ASSERT_TRUE(StartDetachedThread(
        [](void* context) {
            auto* const word = static_cast<std::atomic<u32>*>(context);
            *word = static_cast<u32>(GetCurrentThreadId());
            WakeWord(*word, 1);
        },
        &id));
    while (id == 0) WaitOnWord(id, 0, -1);
    EXPECT_NE(GetCurrentThreadId(), id.load());
    EXPECT_TRUE(IsThreadRunnable(GetCurrentThreadId()));
    EXPECT_FALSE(IsThreadRunnable(0));
    EXPECT_GE(CountCpus().logical, CountCpus().cores);
    EXPECT_GE(CountCpus().cores, 1);
}

TEST(Random, BytesDifferFromCallToCall)
{
    unsigned char a[32] = {};
    unsigned char b[32] = {};
    EXPECT_TRUE(RandomBytes(a, sizeof a));
    EXPECT_TRUE(RandomBytes(b, sizeof b));
    EXPECT_NE(0, std::memcmp(a, b, sizeof a));
    EXPECT_TRUE(RandomBytes(nullptr, 0));
}

TEST(Time, CivilFieldsGoThereAndBack)
{
    for (i64 const seconds : {i64{0}, i64{-1}, i64{951'782'399}, i64{4'102'444'800}, i64{-62'135'596'800}}) {
        std::tm fields = {};
        i64 back = 7;
        EXPECT_TRUE(ToCivilUtc(seconds, fields));
        EXPECT_TRUE(FromCivilUtc(fields, back));
        EXPECT_EQ(seconds, back);
        EXPECT_TRUE(ToCivilLocal(seconds, fields));
        EXPECT_TRUE(FromCivilLocal(fields, back));
        EXPECT_EQ(seconds, back);
    }
    std::tm fields = {};
    EXPECT_FALSE(ToCivilUtc(INT64_MAX, fields));
}

} // namespace

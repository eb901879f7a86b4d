#include "libkernel/platform/Lock.h"

#include "libkernel/platform/Thread.h"

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

TEST(Thread, OnlyOneThatRunsIsRunnable)
{
    EXPECT_TRUE(IsThreadRunnable(GetCurrentThreadId()));
    EXPECT_FALSE(IsThreadRunnable(0));
}

} // namespace

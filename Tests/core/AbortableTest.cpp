#include "libkernel/core/Abortable.h"

#include <gtest/gtest.h>
#include <thread>

namespace Kernel {
namespace {

class Work : public Abortable
{
};

TEST(AbortableTest, CopyStandsAloneOrSharesTheOuterFlagUntilThatIsTaken)
{
    Work alone;
    alone.SetAbort(true);
    Work copy(alone);
    EXPECT_TRUE(copy.IsAborting());
    copy.SetAbort(false);
    EXPECT_TRUE(alone.IsAborting());

    bool outer = false;
    Work sharing;
    sharing.SetAbort(true);
    sharing.SetAbortPointer(&outer);
    EXPECT_FALSE(sharing.IsAborting());
    copy = sharing;
    Work second(sharing);
    EXPECT_EQ(copy.GetAbortPointer(), &outer);
    EXPECT_EQ(second.GetAbortPointer(), &outer);
    EXPECT_FALSE(copy.IsAborting());
    second.SetAbort(true);
    EXPECT_TRUE(outer);
    copy.SetAbortPointer(nullptr);
    EXPECT_NE(copy.GetAbortPointer(), &outer);
    EXPECT_TRUE(copy.IsAborting()); // The value of the other's own flag came along.
}

TEST(AbortableTest, AnotherThreadMayAbort)
{
    Work work;
    std::thread other([&] { work.SetAbort(true); });
    while (!work.IsAborting()) std::this_thread::yield();
    other.join();
    EXPECT_TRUE(IsAbortFlagSet(work.GetAbortPointer()));
    EXPECT_FALSE(IsAbortFlagSet(nullptr));
}

} // namespace
} // namespace Kernel

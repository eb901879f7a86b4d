#include "libkernel/core/AssertTrap.h"

#include "libkernel/core/Assert.h"

#include <gtest/gtest.h>
#include <string>

namespace Kernel {
namespace {

class Trap : public AssertTrap
{
public:
    std::string heard;

private:
    void HandleAssert(char const* file, char const* message, int line) override
    {
        heard = std::string(file) + ":" + std::to_string(line) + ":" + message;
    }
};

TEST(AssertTrapTest, PathsBelowTheSourceFolderAreCut)
{
    AssertTrap::NotifyAssert("nobody", "listens", 1);
    Trap trap;
    AssertTrap::NotifyAssert(__FILE__, "m", 7);
    EXPECT_EQ(trap.heard, "Tests/core/AssertTrapTest.cpp:7:m");
    AssertTrap::NotifyAssert("/elsewhere/x.cpp", "m", 8);
    EXPECT_EQ(trap.heard, "/elsewhere/x.cpp:8:m");
}

TEST(AssertTrapDeathTest, SecondTrapAndFailedAssertionEndTheProcess)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_DEATH(
        {
            Trap one;
            Trap two;
        },
        "");
    EXPECT_DEATH(FailAssertion("f", "c", 1), "c");
#if !defined(NDEBUG)
    int const five = 5;
    KERNEL_ASSERT(five == 5);
    EXPECT_DEATH(KERNEL_ASSERT(five == 4), "five == 4");
#endif
}

} // namespace
} // namespace Kernel

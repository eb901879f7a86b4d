#include "libkernel/core/Trace.h"

#include "libkernel/core/Assert.h"
#include "libkernel/core/AssertTrap.h"
#include "libkernel/core/BuildNumber.h"
#include "libkernel/core/LogSink.h"
#include "support/TraceCapture.h"

#include <cstdlib>
#include <gtest/gtest.h>
#include <string>
#include <thread>
#include <vector>

namespace Kernel {
namespace {

TEST(TraceTest, TextIsWrittenAsItStandsWhileTracingIsOn)
{
    Kernel::Test::TraceCapture const capture;
    Trace("a");
    Trace(String8("b\n"));
    Trace(static_cast<char const*>(nullptr));
    SetIsTraceEnabled(false);
    Trace("c");
    EXPECT_EQ(capture.GetText(), "ab\n");
}

TEST(TraceTest, TextsOfThreadsDoNotMix)
{
    Kernel::Test::TraceCapture const capture;
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([] {
            for (int i = 0; i < 500; ++i) Trace("1234567\n");
        });
    for (std::thread& t : threads) t.join();
    ASSERT_EQ(capture.GetText().size(), 4u * 500 * 8);
    for (size_t i = 0; i < capture.GetText().size(); i += 8) EXPECT_EQ(capture.GetText().compare(i, 8, "1234567\n"), 0);
}

// The decision is made once in a process, so each case gets a process of its own.
TEST(TraceDeathTest, EnvironmentDecidesAtFirstUse)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    for (char const* value : {"1", "1yes", "0", "", "true"}) {
        SCOPED_TRACE(value);
        bool const on = value[0] == '1';
        EXPECT_EXIT(
            {
                setenv("CorvaneIsTraceEnabled", value, 1);
                exit(IsTraceEnabled() == on ? 0 : 1);
            },
            testing::ExitedWithCode(0), "");
    }
}

class RecordingSink : public LogSink
{
public:
    std::string m_text;

private:
    void WriteMessage(int level, String8 const& text) override
    {
        m_text += std::to_string(level) + text.GetData() + ";";
    }
};

TEST(LogSinkTest, MessagesGoToTheSinkInPlaceAndNowhereElse)
{
    WriteToLog(1, "lost");
    RecordingSink sink;
    LogSink* const before = SetLogSink(&sink);
    WriteToLog(1, "kept");
    WriteToLog(2, "too");
    EXPECT_EQ(SetLogSink(before), &sink);
    WriteToLog(1, "lost");
    EXPECT_EQ(sink.m_text, "1kept;2too;");
}

TEST(BuildNumberTest, FirstGenerationEndsBelow20)
{
    EXPECT_EQ(BuildNumber::ProductionIndex(), 24u);
    EXPECT_TRUE(BuildNumber::IsV1ProductionIndex(19));
    EXPECT_FALSE(BuildNumber::IsV1ProductionIndex(20));
}

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
    EXPECT_EQ(trap.heard, "Tests/core/TraceTest.cpp:7:m");
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

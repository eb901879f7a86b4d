#include "libkernel/concurrency/Timer.h"

#include "libkernel/platform/Debug.h"
#include "support/FakeClock.h"
#include "support/Rows.h"

#include <gtest/gtest.h>
#include <string>
#include <thread>

namespace {

using namespace Kernel;
using TestSupport::FakeClock;

std::string s_shown;

class TimersTest : public testing::Test
{
protected:
    TimersTest()
    {
        s_shown.clear();
        Platform::SetDebugSink([](char const* text) { s_shown += text; });
    }
    ~TimersTest() override { Platform::SetDebugSink(nullptr); }
    static std::string Report(Timers const& timers) { return timers.GetReportString().GetData(); }

    FakeClock m_clock;
};

TEST_F(TimersTest, TimerMeasuresFromItsStart)
{
    Timer timer;
    m_clock.AdvanceMs(1500);
    EXPECT_DOUBLE_EQ(1.5, timer.GetSeconds());
    EXPECT_DOUBLE_EQ(1500.0, timer.GetMilliseconds());
    timer.Reset();
    EXPECT_EQ(0.0, timer.GetSeconds());
    m_clock.SetFrequency(0);
    Timer const none;
    m_clock.AdvanceMs(1500);
    EXPECT_EQ(0.0, none.GetMilliseconds());
}

TEST_F(TimersTest, NamedTimersAreOneForEachName)
{
    Timer& a = Timer::GetNamed("a");
    for (int i = 0; i < 100; ++i) Timer::GetNamed(String8(std::to_string(i).c_str()));
    std::thread([&] { EXPECT_EQ(&a, &Timer::GetNamed("a")); }).join();
    EXPECT_NE(&a, &Timer::GetNamed("b"));
}

TEST_F(TimersTest, ReportHasALineForEachSlotWithACount)
{
    Timers timers("Loading");
    EXPECT_EQ("", Report(timers));
    EXPECT_FALSE(timers);
    timers.Start(0, "parse");
    m_clock.AdvanceMs(250);
    timers.Stop(0);
    timers.Start(3);
    m_clock.AdvanceMs(500);
    timers.Stop(3, "link");
    timers.Start(3);
    m_clock.AdvanceMs(1250);
    timers.Stop(3);
    timers.IncrementCount(9, "hits");
    EXPECT_EQ("Loading:\n"
              "     Id   Count  Total tm    Tm/call   Rel tm\n"
              "      0       1   250.000  250.000000  12.5 parse\n"
              "      3       2  1750.000  875.000000  87.5 link\n"
              "      9       1     0.000    0.000000   0.0 hits\n"
              "Totals:       4  2000.000  500.000000 100.0\n",
              Report(timers));
    EXPECT_EQ(4u, timers.GetTotalCount());
    timers.Clear();
    EXPECT_EQ("", Report(timers));

    Timers timeless(2, "");
    timeless.IncrementCount(1);
    EXPECT_EQ("     Id   Count  Total tm    Tm/call   Rel tm\n"
              "      1       1     0.000    0.000000   0.0 \n"
              "Totals:       1     0.000    0.000000 100.0\n",
              Report(timeless));
}

TEST_F(TimersTest, DecimalsRoundHalfUpAndCarry)
{
    m_clock.SetFrequency(1'000'000);
    for (auto const& [ms, calls, perCall] : Rows<i64, u32, char const*>{{1, 3, "   0.333333"},
                                                                        {2, 3, "   0.666667"},
                                                                        {30, 31, "   0.967742"},
                                                                        {1, 128, "   0.007813"},
                                                                        {3'000'000, 2, "1500000.000000"}})
    {
        Timers timers(1, nullptr);
        timers.Start(0);
        m_clock.AdvanceMs(ms);
        timers.Stop(0);
        for (u32 i = 1; i < calls; ++i) timers.IncrementCount(0);
        EXPECT_NE(std::string::npos, Report(timers).find(std::string(" ") + perCall + " 100.0")) << Report(timers);
        timers.Clear();
    }
}

TEST_F(TimersTest, DestructionReportsOnceAndOnlyWhatWasMeasured)
{
    {
        Timers idle("idle");
        idle.Start(0, "never stopped");
    }
    EXPECT_EQ("", s_shown);
    {
        Timers timers("once");
        timers.IncrementCount(0);
        timers.Report();
        EXPECT_NE(std::string::npos, s_shown.find("Timers::Report\nonce:\n"));
        s_shown.clear();
    }
    EXPECT_EQ("", s_shown) << "reported already";
    {
        TimersSession session("alone"); // With a set of its own, it times other slots without leaving its own.
        session.Start(1);
        m_clock.AdvanceMs(5);
        session.Stop(1);
        m_clock.AdvanceMs(5);
        session.Stop(0);
        m_clock.AdvanceMs(5);
    }
    EXPECT_NE(std::string::npos, s_shown.find("      0       1    10.000   10.000000  66.7 alone\n"
                                              "      1       1     5.000    5.000000  33.3 \n"))
        << s_shown;
}

TEST_F(TimersTest, SecondSessionOnASetDoesNothing)
{
    Timers timers("shared");
    {
        TimersSession first(timers, "first");
        m_clock.AdvanceMs(10);
        {
            TimersSession second(timers, 50, "second");
            m_clock.AdvanceMs(10);
            second.Next("x");
            second.Skip(100);
            second.Start(0);
            second.Start(0, "stolen");
            second.Stop();
            second.Stop(0);
            second.Restart();
            second.IncrementCount(0, "y");
            second.Clear();
        }
        EXPECT_EQ(10u, timers.size());
        EXPECT_EQ(0u, timers.GetTotalCount());
        EXPECT_FALSE(timers.Acquire());
    }
    EXPECT_EQ(1u, timers.GetTotalCount());
    EXPECT_DOUBLE_EQ(20.0, timers.GetTotalMilliseconds());
    EXPECT_NE(std::string::npos, Report(timers).find(" first\n"));
    EXPECT_TRUE(timers.Acquire());
    timers.Clear();
}

TEST_F(TimersTest, SessionMovesThroughSlotsAndGrowsTheSet)
{
    Timers timers(2, nullptr);
    {
        TimersSession session(timers, "zero");
        m_clock.AdvanceMs(1);
        session.Next("one");
        m_clock.AdvanceMs(2);
        session.Next("two"); // Past the end: ten more beyond the new index.
        EXPECT_EQ(12u, timers.size());
        m_clock.AdvanceMs(4);
        session.Skip(18); // Stops slot 2; slot 20 isn't started.
        EXPECT_EQ(30u, timers.size());
        m_clock.AdvanceMs(8);
        session.Restart();
        m_clock.AdvanceMs(16);
        session.Stop();
        session.Skip(-100);
        session.Start(0, nullptr); // The current slot again: running.
        m_clock.AdvanceMs(32);
    }
    EXPECT_DOUBLE_EQ(1 + 2 + 4 + 16 + 32, timers.GetTotalMilliseconds());
    EXPECT_EQ(5u, timers.GetTotalCount());
    EXPECT_NE(std::string::npos, Report(timers).find("     20       1    16.000"));
    EXPECT_NE(std::string::npos, Report(timers).find("      0       2    33.000"));
    timers.Clear();
}

} // namespace

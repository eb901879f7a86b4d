#include "libkernel/concurrency/TimeStamp.h"

#include "support/FakeClock.h"
#include "support/Rows.h"

#include <clocale>
#include <cstdlib>
#include <gtest/gtest.h>

namespace {

using namespace Kernel;

constexpr i64 c_noon = 1'582'979'445; // 2020-02-29 12:30:45 UTC.

class Zone
{
public:
    explicit Zone(char const* name)
    {
        if (char const* const old = std::getenv("TZ")) m_old = old, m_had = true;
        ::setenv("TZ", name, 1);
        ::tzset();
    }
    ~Zone()
    {
        m_had ? ::setenv("TZ", m_old.c_str(), 1) : ::unsetenv("TZ");
        ::tzset();
    }

private:
    std::string m_old;
    bool m_had = false;
};

TEST(HighResTimeStamp, TextsReadAsTheirZoneSays)
{
    constexpr i64 c_hour = 3600;
    Rows<char const*, i64> const cases = {
        // 0 for a refusal.
        {"2020-02-29T12:30:45Z", c_noon},
        {"2020-02-29T12:30:45+01:00", c_noon - c_hour},
        {"2020-02-29T12:30:45-01:00", c_noon + c_hour},
        {"2020-02-29T12:30:45.9+0100", c_noon - c_hour},
        {"2020-02-29T12:30:45-01:30", c_noon + c_hour + 1800},
        {"2020-02-29T12:30:45-1:30", c_noon + c_hour + 1800},
        {"2020-02-29T12:30:45-01", c_noon + c_hour},
        {"2020-02-29T12:30:45.9999999Z", c_noon + 1}, // The nearest float is 46.
        {"2020-02-29T12:30:4.5e1Z", c_noon},
        {"2020-2-29T12:30:45Z", c_noon},
        {"1969-12-31T23:59:58Z", -2},
        {"2020-02-29T12:30:60Z", c_noon + 15},
        {"2020-02-30T12:30:45Z", c_noon + 24 * c_hour},
        {"2020-02-29T12:30:45z", 0},
        {"2020-02-29T12:30:45Z ", 0},
        {"2020-02-29 12:30:45Z", 0},
        {"2020-02-29T12:30Z", 0},
        {"2020-02-29T12:30:nanZ", 0},
        {"2020-02-29T12:30:1e30Z", 0},
        {"2020-02-29T12:30:45+", 0},
        {"2020-02-29T12:30:45+01:", 0},
        {"2020-02-29T12:30:45+01:000", 0},
        {"2020-02-29T", 0},
        {"", 0},
        {"99999-02-29T12:30:45Z", 0},
    };
    for (auto const& [text, seconds] : cases) {
        EXPECT_EQ(seconds * 10'000'000, HighResTimeStamp(text, TimezoneBehaviour::Required).GetValue()) << text;
        EXPECT_EQ(seconds, TimeStamp(text, TimezoneBehaviour::AssumeUtc).GetValue()) << text;
    }
    EXPECT_EQ(0, HighResTimeStamp(String8("2020-02-29T12:30:45Z\0", 21), TimezoneBehaviour::Required).GetValue());
}

TEST(HighResTimeStamp, TextWithoutAZoneIsReadAsAsked)
{
    Zone const zone("CET-1CEST,M3.5.0,M10.5.0/3");
    char const winter[] = "2020-02-29T12:30:45";
    char const summer[] = "2020-07-29T12:30:45";
    EXPECT_EQ(0, TimeStamp(winter, TimezoneBehaviour::Required).GetValue());
    EXPECT_EQ(c_noon, TimeStamp(winter, TimezoneBehaviour::AssumeUtc).GetValue());
    EXPECT_EQ(c_noon - 3600, TimeStamp(winter, TimezoneBehaviour::AssumeLocal).GetValue());
    EXPECT_EQ(1'596'018'645, TimeStamp(summer, TimezoneBehaviour::AssumeLocal).GetValue());
    EXPECT_EQ(c_noon, TimeStamp("2020-02-29T12:30:45Z", TimezoneBehaviour::AssumeLocal).GetValue());
}

TEST(HighResTimeStamp, TicksTurnIntoSecondsAndMilliseconds)
{
    HighResTimeStamp const stamp(c_noon, 999);
    EXPECT_EQ(c_noon * 10'000'000 + 9'990'000, stamp.GetValue());
    EXPECT_EQ(999, stamp.GetMillis());
    EXPECT_EQ(c_noon, TimeStamp(stamp).GetValue());
    EXPECT_EQ(stamp, HighResTimeStamp(stamp.GetTimePoint()));
    HighResTimeStamp const before(-2, 250); // 1.75 s before 1970.
    EXPECT_EQ(-1, TimeStamp(before).GetValue()) << "rounds toward zero";
    EXPECT_EQ(250, before.GetMillis());
    EXPECT_EQ(58, before.GetAsStructTm(TimeStampLocale::Utc).tm_sec) << "the second that the milliseconds count from";
    EXPECT_LT(before, stamp);
}

TEST(TimeStamp, CivilFieldsGoThereAndBack)
{
    Zone const zone("EST5EDT,M3.2.0,M11.1.0");
    for (i64 const seconds : {c_noon, c_noon + 150 * 86400, i64{0}, i64{-86400}}) {
        for (TimeStampLocale const locale : {TimeStampLocale::Local, TimeStampLocale::Utc}) {
            std::tm const fields = TimeStamp(seconds).GetAsStructTm(locale);
            EXPECT_EQ(seconds, TimeStamp::MakeFromStructTm(fields, locale).GetValue());
            EXPECT_EQ(seconds * 10'000'000, HighResTimeStamp::MakeFromStructTm(fields, locale).GetValue());
        }
    }
    EXPECT_EQ(12, TimeStamp(c_noon).GetAsStructTm(static_cast<TimeStampLocale>(7)).tm_hour);
    EXPECT_EQ(7, TimeStamp(c_noon).GetAsStructTm(TimeStampLocale::Local).tm_hour);
    std::tm const none = TimeStamp(INT64_MAX).GetAsStructTm(TimeStampLocale::Local);
    EXPECT_EQ(70, none.tm_year);
    EXPECT_EQ(0, none.tm_hour) << "UTC, although local was asked for";
}

TEST(TimeStamp, SumsAndDifferencesCountSeconds)
{
    TimeStamp a(100);
    a += 50;
    a -= 20;
    EXPECT_EQ(TimeStamp(130), a);
    EXPECT_TRUE(a == i64{130} && a > i64{129} && a - 1 < a && a + 1 > a);
    EXPECT_EQ(30.0, a.ElapseSeconds(100));
    EXPECT_EQ(-30, TimeStamp(100).ElapseSecondsInt(a));
    EXPECT_EQ(1, TimeStamp((i64{1} << 32) + 1).ElapseSecondsInt(0)) << "the low 32 bits";
    EXPECT_EQ(INT64_MIN, (TimeStamp(INT64_MAX) + 1).GetValue());
}

TEST(TimeStamp, CurrentTimeComesFromTheClock)
{
    TestSupport::FakeClock clock(c_noon);
    clock.AdvanceMs(1250);
    HighResTimeStamp precise;
    precise.SetCurrent();
    EXPECT_EQ(c_noon + 1, TimeStamp::GetCurrent().GetValue());
    EXPECT_EQ(250, precise.GetMillis());
}

} // namespace

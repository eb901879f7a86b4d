#include "libkernel/text/TimeText.h"

#include <cstdlib>
#include <gtest/gtest.h>
#include <limits>
#include <tuple>

namespace Kernel {
namespace {

constexpr i64 c_noon = 1'582'979'445; // 2020-02-29 12:30:45 UTC.
constexpr auto c_utc = TimeStampLocale::Utc;
constexpr auto c_local = TimeStampLocale::Local;

// A zone that both the C library and ICU know by this name; ICU asks for it only once, so it stays.
class TimeTextTest : public testing::Test
{
protected:
    void SetUp() override
    {
        ::setenv("TZ", "EST5EDT", 1);
        ::tzset();
    }
};

TEST_F(TimeTextTest, StylesFollowTheCLibraryAndHighResolutionShowsMilliseconds)
{
    using Row = std::tuple<TimeStampStyle, char const*, char const*>;
    for (auto const& [style, utc, local] :
         {Row{TimeStampStyle::DateTime, "Sat Feb 29 12:30:45 2020", "Sat Feb 29 07:30:45 2020"},
          Row{TimeStampStyle::Date, "02/29/20", "02/29/20"}, Row{TimeStampStyle::Time, "12:30:45", "07:30:45"},
          Row{TimeStampStyle::Iso8601, "2020-02-29T12:30:45Z", "2020-02-29T07:30:45-0500"},
          Row{static_cast<TimeStampStyle>(4), "", ""}})
    {
        EXPECT_EQ(ToString(TimeStamp(c_noon), style, c_utc), utc);
        EXPECT_EQ(ToString(TimeStamp(c_noon), style, c_local), local);
        if (style != TimeStampStyle::Iso8601) {
            EXPECT_EQ(ToString(HighResTimeStamp(c_noon, 678), style, c_utc), utc);
        }
    }
    EXPECT_EQ(ToStringT<String16>(TimeStamp(0), TimeStampStyle::Iso8601, c_utc), u"1970-01-01T00:00:00Z");

    using Precise = std::tuple<HighResTimeStamp, char const*>;
    for (auto const& [stamp, expected] : {Precise{HighResTimeStamp(c_noon, 678), "2020-02-29T12:30:45.678Z"},
                                          Precise{HighResTimeStamp(c_noon, 7), "2020-02-29T12:30:45.007Z"},
                                          Precise{HighResTimeStamp(-2, 250), "1969-12-31T23:59:58.250Z"},
                                          Precise{HighResTimeStamp(-1, 0), "1969-12-31T23:59:59.000Z"}})
        EXPECT_EQ(ToString(stamp, TimeStampStyle::Iso8601, c_utc), expected);
    EXPECT_EQ(ToString(HighResTimeStamp(c_noon, 5), TimeStampStyle::Iso8601, c_local), "2020-02-29T07:30:45.005-0500");
}

TEST_F(TimeTextTest, LanguagesWriteDatesTheirWay)
{
    Counted<Locale const> const english = Locale::Create("en-GB");
    Counted<Locale const> const german = Locale::Create("de-DE");
    TimeStamp const stamp(c_noon);
    EXPECT_EQ(ToStringWithLocale(stamp, TimeStampStyle::DateTime, c_utc, english), "29 Feb 2020, 12:30:45");
    EXPECT_EQ(ToStringWithLocale(stamp, TimeStampStyle::Date, c_utc, german), "29.02.2020");
    EXPECT_EQ(ToStringWithLocale(stamp, TimeStampStyle::Time, c_utc, german), "12:30:45");
    EXPECT_EQ(ToStringWithLocale(stamp, TimeStampStyle::Iso8601, c_utc, german), "2020-02-29T12:30:45Z");
    EXPECT_EQ(ToStringWithLocale(stamp, static_cast<TimeStampStyle>(9), c_utc, german), "");
    EXPECT_EQ(ToStringWithLocale(stamp, "yMMMMd", c_utc, german), "29. Februar 2020");
    EXPECT_EQ(ToStringWithLocaleT<String16>(stamp, "yMMMMd", c_utc, english), u"29 February 2020");
    EXPECT_EQ(ToStringWithLocale(stamp, static_cast<char const*>(nullptr), c_utc, german), "");
    EXPECT_EQ(ToStringWithLocale(stamp, "Hm", c_utc, nullptr), "12:30") << "the user's own language";
    EXPECT_EQ(ToStringWithLocale(stamp, "Hm", c_local, german), "07:30");
}

} // namespace
} // namespace Kernel

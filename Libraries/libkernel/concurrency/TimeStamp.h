#pragma once

#include "libkernel/core/String.h"
#include "libkernel/core/Types.h"

#include <chrono>
#include <compare>
#include <ctime>
#include <ratio>

namespace Kernel {

/// Which civil time a conversion is about. Any value but Local means UTC.
enum class TimeStampLocale : i32
{
    Local = 0,
    Utc = 1
};

/// What a text without a time zone means.
enum class TimezoneBehaviour : i32
{
    Required = 0, ///< Refused.
    AssumeUtc = 1,
    AssumeLocal = 2
};

/// The value and the comparisons of both time stamps.
template <class Derived, class T>
class TimeStampBase
{
public:
    using ValueType = T;

    constexpr T GetValue() const { return m_value; }
    constexpr void SetValue(T value) { m_value = value; }

    friend constexpr bool operator==(Derived const& a, Derived const& b) { return a.m_value == b.m_value; }
    friend constexpr std::strong_ordering operator<=>(Derived const& a, Derived const& b)
    {
        return a.m_value <=> b.m_value;
    }
    friend constexpr bool operator==(Derived const& a, T b) { return a.m_value == b; }
    friend constexpr std::strong_ordering operator<=>(Derived const& a, T b) { return a.m_value <=> b; }

protected:
    constexpr explicit TimeStampBase(T value) : m_value(value) {}

    T m_value;
};

/// Seconds since 1970-01-01 UTC.
class KERNEL_API TimeStamp : public TimeStampBase<TimeStamp, i64>
{
public:
    constexpr TimeStamp() : TimeStampBase(0) {}
    constexpr TimeStamp(i64 seconds) : TimeStampBase(seconds) {}
    /// As HighResTimeStamp reads it.
    TimeStamp(String8 const& text, TimezoneBehaviour behaviour);

    static TimeStamp GetCurrent();
    void SetCurrent() { *this = GetCurrent(); }

    /// Sums wrap at 64 bits.
    TimeStamp operator+(i64 seconds) const;
    TimeStamp operator-(i64 seconds) const;
    TimeStamp& operator+=(i64 seconds) { return *this = *this + seconds; }
    TimeStamp& operator-=(i64 seconds) { return *this = *this - seconds; }

    /// Seconds from @p other to this; the second form gives the low 32 bits.
    double ElapseSeconds(TimeStamp const& other) const;
    i32 ElapseSecondsInt(TimeStamp const& other) const;

    /// A value that has no civil form gives that of 0 in UTC.
    std::tm GetAsStructTm(TimeStampLocale locale) const;
    /// Fields out of range are normalised; -1 if the date can't be held.
    static TimeStamp MakeFromStructTm(std::tm const& fields, TimeStampLocale locale);
};

/// Ticks of 100 nanoseconds since 1970-01-01 UTC.
class KERNEL_API HighResTimeStamp : public TimeStampBase<HighResTimeStamp, i64>
{
public:
    using Duration = std::chrono::duration<i64, std::ratio<1, 10'000'000>>;
    using TimePoint = std::chrono::time_point<std::chrono::system_clock, Duration>;

    static constexpr i64 c_ticksPerSecond = 10'000'000;
    static constexpr i64 c_ticksPerMillisecond = 10'000;

    constexpr HighResTimeStamp() : TimeStampBase(0) {}
    constexpr HighResTimeStamp(TimePoint point) : TimeStampBase(point.time_since_epoch().count()) {}
    HighResTimeStamp(i64 seconds, u16 milliseconds);
    /// Reads the forms of ISO 8601 "2020-02-29T12:30:45" with a zone "Z", "+01:00", "+0100", "+01" or none, which
    /// @p behaviour decides. Fractions of a second are dropped. 0 for any other text, and for a date out of range.
    HighResTimeStamp(String8 const& text, TimezoneBehaviour behaviour);

    static HighResTimeStamp GetCurrent();
    void SetCurrent() { *this = GetCurrent(); }

    TimePoint GetTimePoint() const { return TimePoint(Duration(m_value)); }
    /// Milliseconds within the second.
    u16 GetMillis() const;
    /// Rounds toward zero.
    operator TimeStamp() const { return TimeStamp(m_value / c_ticksPerSecond); }

    std::tm GetAsStructTm(TimeStampLocale locale) const;
    /// Whole seconds.
    static HighResTimeStamp MakeFromStructTm(std::tm const& fields, TimeStampLocale locale);
};

} // namespace Kernel

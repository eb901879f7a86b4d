#include "libkernel/concurrency/TimeStamp.h"

#include "libkernel/platform/Time.h"

#include <cstdio>
#include <cstring>
#include <limits>

namespace Kernel {
namespace {

// The forms of a zone, in the order in which they are tried, behind the civil fields. Signs are applied to the numbers
// read; with "follow" the minutes take the sign of the hours.
struct ZoneForm
{
    char const* pattern;
    int numbers; // Of the zone, 0 to 2.
    int sign;
    bool follow;
    bool hasZone;
};

#define KERNEL_CIVIL_FIELDS "%4d-%2d-%2dT%2d:%2d:%f"
constexpr int c_civilNumbers = 6;
constexpr ZoneForm c_zoneForms[] = {
    {KERNEL_CIVIL_FIELDS "%2d:%2d%n", 2, 1, true, true},    {KERNEL_CIVIL_FIELDS "+%2d%2d%n", 2, 1, false, true},
    {KERNEL_CIVIL_FIELDS "-%2d%2d%n", 2, -1, false, true},  {KERNEL_CIVIL_FIELDS "+%2d:%2d%n", 2, 1, false, true},
    {KERNEL_CIVIL_FIELDS "-%2d:%2d%n", 2, -1, false, true}, {KERNEL_CIVIL_FIELDS "+%2d%n", 1, 1, false, true},
    {KERNEL_CIVIL_FIELDS "-%2d%n", 1, -1, false, true},     {KERNEL_CIVIL_FIELDS "Z%n", 0, 1, false, true},
    {KERNEL_CIVIL_FIELDS "%n", 0, 1, false, false},
};
#undef KERNEL_CIVIL_FIELDS

struct Parsed
{
    std::tm fields = {};
    i64 offsetMinutes = 0;
    bool hasZone = false;
};

bool Matches(char const* text, int length, ZoneForm const& form, Parsed& out)
{
    int year = 0;
    int month = 0;
    int hours = 0;
    int minutes = 0;
    int end = -1;
    float seconds = 0.0f;
    std::tm f = {};
    // What a pattern doesn't use it doesn't write: the end goes where the pattern has its "%n".
    void* const zone[] = {&hours, &minutes, &end};
    void* const first = form.numbers > 0 ? zone[0] : zone[2];
    void* const second = form.numbers > 1 ? zone[1] : zone[2];
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    int const got = std::sscanf(text, form.pattern, &year, &month, &f.tm_mday, &f.tm_hour, &f.tm_min, &seconds, first,
                                second, &end);
#pragma GCC diagnostic pop
    if (got != c_civilNumbers + form.numbers || end != length) return false;
    if (!(seconds > -1e6f && seconds < 1e6f)) return false; // Not a number of seconds that an int can take.
    f.tm_year = year - 1900;
    f.tm_mon = month - 1;
    f.tm_sec = static_cast<int>(seconds);
    f.tm_isdst = -1;
    if (form.follow && hours < 0) minutes = -minutes;
    out.fields = f;
    out.offsetMinutes = form.sign * (hours * i64{60} + minutes);
    out.hasZone = form.hasZone;
    return true;
}

bool Parse(String8 const& text, Parsed& out)
{
    for (ZoneForm const& form : c_zoneForms) {
        if (Matches(text.GetData(), text.GetLength(), form, out)) return true;
    }
    return false;
}

i64 ParseTicks(String8 const& text, TimezoneBehaviour behaviour)
{
    Parsed parsed;
    if (!Parse(text, parsed) || (!parsed.hasZone && behaviour == TimezoneBehaviour::Required)) return 0;
    bool const local = !parsed.hasZone && behaviour == TimezoneBehaviour::AssumeLocal;
    i64 seconds = 0;
    bool const made =
        local ? Platform::FromCivilLocal(parsed.fields, seconds) : Platform::FromCivilUtc(parsed.fields, seconds);
    i64 ticks = 0;
    if (!made ||
        __builtin_mul_overflow(seconds - parsed.offsetMinutes * 60, HighResTimeStamp::c_ticksPerSecond, &ticks))
        return 0;
    return ticks;
}

std::tm ToCivil(i64 seconds, TimeStampLocale locale)
{
    std::tm fields = {};
    bool const made = locale == TimeStampLocale::Local ? Platform::ToCivilLocal(seconds, fields)
                                                       : Platform::ToCivilUtc(seconds, fields);
    if (!made) Platform::ToCivilUtc(0, fields);
    return fields;
}

i64 FromCivil(std::tm const& fields, TimeStampLocale locale)
{
    i64 seconds = -1;
    bool const made = locale == TimeStampLocale::Local ? Platform::FromCivilLocal(fields, seconds)
                                                       : Platform::FromCivilUtc(fields, seconds);
    return made ? seconds : -1;
}

i64 WrappingAdd(i64 a, i64 b)
{
    return static_cast<i64>(static_cast<u64>(a) + static_cast<u64>(b));
}
i64 WrappingSubtract(i64 a, i64 b)
{
    return static_cast<i64>(static_cast<u64>(a) - static_cast<u64>(b));
}
i64 WrappingMultiply(i64 a, i64 b)
{
    return static_cast<i64>(static_cast<u64>(a) * static_cast<u64>(b));
}

constexpr i64 c_nsPerSecond = 1'000'000'000;
constexpr i64 c_nsPerTick = 100;

} // namespace

TimeStamp::TimeStamp(String8 const& text, TimezoneBehaviour behaviour)
    : TimeStampBase(ParseTicks(text, behaviour) / HighResTimeStamp::c_ticksPerSecond)
{
}

TimeStamp TimeStamp::GetCurrent()
{
    return Platform::GetSystemTime() / c_nsPerSecond;
}
TimeStamp TimeStamp::operator+(i64 seconds) const
{
    return WrappingAdd(m_value, seconds);
}
TimeStamp TimeStamp::operator-(i64 seconds) const
{
    return WrappingSubtract(m_value, seconds);
}

double TimeStamp::ElapseSeconds(TimeStamp const& other) const
{
    return static_cast<double>(WrappingSubtract(m_value, other.m_value));
}

i32 TimeStamp::ElapseSecondsInt(TimeStamp const& other) const
{
    return static_cast<i32>(static_cast<u32>(WrappingSubtract(m_value, other.m_value)));
}

std::tm TimeStamp::GetAsStructTm(TimeStampLocale locale) const
{
    return ToCivil(m_value, locale);
}

TimeStamp TimeStamp::MakeFromStructTm(std::tm const& fields, TimeStampLocale locale)
{
    return FromCivil(fields, locale);
}

HighResTimeStamp::HighResTimeStamp(i64 seconds, u16 milliseconds)
    : TimeStampBase(WrappingAdd(WrappingMultiply(seconds, c_ticksPerSecond), milliseconds * c_ticksPerMillisecond))
{
}

HighResTimeStamp::HighResTimeStamp(String8 const& text, TimezoneBehaviour behaviour)
    : TimeStampBase(ParseTicks(text, behaviour))
{
}

HighResTimeStamp HighResTimeStamp::GetCurrent()
{
    return TimePoint(Duration(Platform::GetSystemTime() / c_nsPerTick));
}

// Before 1970 the second begins below the value, so that milliseconds still count upward.
u16 HighResTimeStamp::GetMillis() const
{
    i64 rest = m_value % c_ticksPerSecond;
    if (rest < 0) rest += c_ticksPerSecond;
    return static_cast<u16>(rest / c_ticksPerMillisecond);
}

std::tm HighResTimeStamp::GetAsStructTm(TimeStampLocale locale) const
{
    return ToCivil(m_value / c_ticksPerSecond, locale);
}

HighResTimeStamp HighResTimeStamp::MakeFromStructTm(std::tm const& fields, TimeStampLocale locale)
{
    return HighResTimeStamp(FromCivil(fields, locale), 0);
}

} // namespace Kernel

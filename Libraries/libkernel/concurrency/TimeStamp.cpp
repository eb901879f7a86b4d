#include "libkernel/concurrency/TimeStamp.h"

#include "libkernel/platform/Time.h"

#include <cctype>
#include <charconv>

namespace Kernel {
namespace {

// The forms of a time stamp, in the order in which they are tried: civil fields, then a zone. In a pattern "4" and "2"
// are whole numbers of that many characters at most, a sign among them, "f" is a number with a fraction, and anything
// else stands for itself. The scanner is our own, because the C library's depends on the host's locale.
struct Form
{
    char const* zone;
    int sign;    // Of both numbers of the zone.
    bool follow; // The minutes take the sign of the hours.
    bool hasZone;
};

constexpr char c_civilPattern[] = "4-2-2T2:2:f";
constexpr Form c_forms[] = {
    {"2:2", 1, true, true},   {"+22", 1, false, true},   {"-22", -1, false, true},
    {"+2:2", 1, false, true}, {"-2:2", -1, false, true}, {"+2", 1, false, true},
    {"-2", -1, false, true},  {"Z", 1, false, true},     {"", 1, false, false},
};

bool IsDigit(char c)
{
    return c >= '0' && c <= '9';
}

bool ScanInteger(char const*& at, int width, int& value)
{
    while (std::isspace(static_cast<unsigned char>(*at))) ++at;
    bool const negative = *at == '-';
    if (*at == '-' || *at == '+') {
        ++at;
        --width;
    }
    if (width <= 0 || !IsDigit(*at)) return false;
    int magnitude = 0;
    for (; width > 0 && IsDigit(*at); --width) magnitude = magnitude * 10 + (*at++ - '0');
    value = negative ? -magnitude : magnitude;
    return true;
}

// Whole seconds of a number with a fraction.
bool ScanSeconds(char const*& at, char const* end, int& value)
{
    while (std::isspace(static_cast<unsigned char>(*at))) ++at;
    bool const signedNumber = *at == '-' || *at == '+';
    bool const negative = *at == '-';
    char const* const digits = at + signedNumber;
    if (!IsDigit(*digits) && *digits != '.') return false;
    float number = 0.0f;
    std::from_chars_result const result = std::from_chars(digits, end, number);
    if (result.ec != std::errc() || !(number < 1e6f)) return false;
    at = result.ptr;
    value = static_cast<int>(negative ? -number : number);
    return true;
}

// Matches @p pattern from @p at on, and puts the numbers that it finds where @p numbers points, one behind the other.
bool Scan(char const*& at, char const* end, char const* pattern, int*& numbers)
{
    for (; *pattern; ++pattern) {
        bool matched = false;
        switch (*pattern) {
        case '4': matched = ScanInteger(at, 4, *numbers++); break;
        case '2': matched = ScanInteger(at, 2, *numbers++); break;
        case 'f': matched = ScanSeconds(at, end, *numbers++); break;
        default: matched = *at++ == *pattern;
        }
        if (!matched) return false;
    }
    return true;
}

struct Parsed
{
    std::tm fields = {};
    i64 offsetMinutes = 0;
    bool hasZone = false;
};

bool Matches(char const* at, char const* end, Form const& form, Parsed& out)
{
    int numbers[8] = {}; // Year to seconds, and the zone's.
    int* next = numbers;
    if (!Scan(at, end, c_civilPattern, next) || !Scan(at, end, form.zone, next) || at != end) return false;
    std::tm& f = out.fields;
    f.tm_year = numbers[0] - 1900;
    f.tm_mon = numbers[1] - 1;
    f.tm_mday = numbers[2];
    f.tm_hour = numbers[3];
    f.tm_min = numbers[4];
    f.tm_sec = numbers[5];
    f.tm_isdst = -1; // Summer time as the date has it.
    int const minutes = form.follow && numbers[6] < 0 ? -numbers[7] : numbers[7];
    out.offsetMinutes = form.sign * (numbers[6] * i64{60} + minutes);
    out.hasZone = form.hasZone;
    return true;
}

bool Parse(String8 const& text, Parsed& out)
{
    for (Form const& form : c_forms) {
        if (Matches(text.begin(), text.end(), form, out)) return true;
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

// Before 1970 the second begins below the value, so that milliseconds still count upward; civil fields and milliseconds
// together tell the moment.
u16 HighResTimeStamp::GetMillis() const
{
    i64 rest = m_value % c_ticksPerSecond;
    if (rest < 0) rest += c_ticksPerSecond;
    return static_cast<u16>(rest / c_ticksPerMillisecond);
}

std::tm HighResTimeStamp::GetAsStructTm(TimeStampLocale locale) const
{
    return ToCivil(m_value / c_ticksPerSecond - (m_value % c_ticksPerSecond < 0), locale);
}

HighResTimeStamp HighResTimeStamp::MakeFromStructTm(std::tm const& fields, TimeStampLocale locale)
{
    return HighResTimeStamp(FromCivil(fields, locale), 0);
}

} // namespace Kernel

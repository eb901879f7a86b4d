#include "libkernel/platform/Time.h"

#include <atomic>
#include <cerrno>
#include <sched.h>

namespace Kernel::Platform {
namespace {

constexpr i64 c_nsPerSecond = 1'000'000'000;

i64 ReadClock(clockid_t clock)
{
    timespec now = {};
    ::clock_gettime(clock, &now);
    return static_cast<i64>(now.tv_sec) * c_nsPerSecond + now.tv_nsec;
}

i64 SystemTime()
{
    return ReadClock(CLOCK_REALTIME);
}
i64 Counter()
{
    return ReadClock(CLOCK_MONOTONIC);
}
i64 CounterFrequency()
{
    return c_nsPerSecond;
}

void SleepThread(i64 nanoseconds)
{
    if (nanoseconds <= 0) {
        ::sched_yield();
        return;
    }
    timespec rest = {static_cast<time_t>(nanoseconds / c_nsPerSecond), static_cast<long>(nanoseconds % c_nsPerSecond)};
    while (::clock_nanosleep(CLOCK_MONOTONIC, 0, &rest, &rest) == EINTR) {
    }
}

constexpr ClockCalls c_systemCalls = {SystemTime, Counter, CounterFrequency, SleepThread};
constinit std::atomic<ClockCalls const*> s_calls{&c_systemCalls};

// -1 is a valid count and also the sign of failure; only the latter sets errno.
bool MakeTime(time_t (*make)(std::tm*), std::tm fields, i64& seconds)
{
    int const saved = errno;
    errno = 0;
    seconds = make(&fields);
    bool const failed = seconds == -1 && errno != 0;
    errno = saved;
    return !failed;
}

} // namespace

ClockCalls const& GetClockCalls()
{
    return *s_calls.load(std::memory_order_acquire);
}

void SetClockCalls(ClockCalls const* calls)
{
    s_calls.store(calls ? calls : &c_systemCalls, std::memory_order_release);
}

ClockCalls const& GetSystemClockCalls()
{
    return c_systemCalls;
}

bool ToCivilUtc(i64 seconds, std::tm& fields)
{
    time_t const t = seconds;
    return ::gmtime_r(&t, &fields) != nullptr;
}

bool ToCivilLocal(i64 seconds, std::tm& fields)
{
    time_t const t = seconds;
    ::tzset(); // localtime_r alone need not look at the zone.
    return ::localtime_r(&t, &fields) != nullptr;
}

bool FromCivilUtc(std::tm const& fields, i64& seconds)
{
    return MakeTime(::timegm, fields, seconds);
}

bool FromCivilLocal(std::tm const& fields, i64& seconds)
{
    return MakeTime(::mktime, fields, seconds);
}

} // namespace Kernel::Platform

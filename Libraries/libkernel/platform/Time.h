#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <ctime>

/// Clocks and pauses, through one table, so that tests set the time and need not wait. Any thread.
namespace Kernel::Platform {

struct ClockCalls
{
    /// Nanoseconds since 1970-01-01 UTC. Steps when the clock is set.
    i64 (*systemTime)();
    /// Ticks of a clock that never goes back, and how many of them make a second.
    i64 (*counter)();
    i64 (*counterFrequency)();
    /// Lets the calling thread rest for @p nanoseconds; 0 only gives way to others.
    void (*sleep)(i64 nanoseconds);
};

KERNEL_API ClockCalls const& GetClockCalls();
/// Puts another table in place; null puts back the system's. Borrowed until it is replaced. For tests.
KERNEL_API void SetClockCalls(ClockCalls const* calls);
KERNEL_API ClockCalls const& GetSystemClockCalls();

inline i64 GetSystemTime()
{
    return GetClockCalls().systemTime();
}
inline i64 GetCounter()
{
    return GetClockCalls().counter();
}
inline i64 GetCounterFrequency()
{
    return GetClockCalls().counterFrequency();
}
inline void Sleep(i64 nanoseconds)
{
    GetClockCalls().sleep(nanoseconds);
}

/// Civil fields of a count of seconds since 1970-01-01 UTC, and back. False if the value has no civil form (a year that
/// an `int` can't hold). The way back normalises fields out of range.
KERNEL_API bool ToCivilUtc(i64 seconds, std::tm& fields);
KERNEL_API bool ToCivilLocal(i64 seconds, std::tm& fields);
KERNEL_API bool FromCivilUtc(std::tm const& fields, i64& seconds);
KERNEL_API bool FromCivilLocal(std::tm const& fields, i64& seconds);

} // namespace Kernel::Platform

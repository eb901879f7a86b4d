#include "libkernel/concurrency/Timer.h"

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/platform/Time.h"

#include <map>

namespace Kernel {
namespace {

constinit CriticalSectionSpin s_namedLock; // Guards the map of named timers.

} // namespace

Timer::Timer() : m_frequency(Platform::GetCounterFrequency()), m_start(Platform::GetCounter()) {}

void Timer::Reset()
{
    m_start = Platform::GetCounter();
}

double Timer::GetMilliseconds() const
{
    return GetSeconds() * 1000.0;
}

double Timer::GetSeconds() const
{
    if (m_frequency == 0) return 0.0;
    return static_cast<double>(Platform::GetCounter() - m_start) / static_cast<double>(m_frequency);
}

Timer& Timer::GetDefault()
{
    static Timer timer;
    return timer;
}

Timer& Timer::GetNamed(String8 const& name)
{
    CriticalSectionSpinScope const lock(s_namedLock);
    static std::map<String8, Timer>& timers = *new std::map<String8, Timer>; // References stay valid to the end.
    return timers[name];
}

} // namespace Kernel

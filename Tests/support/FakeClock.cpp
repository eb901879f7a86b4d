#include "support/FakeClock.h"

#include <atomic>
#include <mutex>

namespace TestSupport {
namespace {

using Kernel::i64;

std::atomic<i64> s_now;
std::atomic<i64> s_frequency;
std::mutex s_mutex;
std::vector<i64> s_sleeps;

i64 Now()
{
    return s_now;
}
constexpr i64 c_nsPerSecond = 1'000'000'000;

i64 Counter()
{
    i64 const now = s_now;
    i64 const frequency = s_frequency;
    return now / c_nsPerSecond * frequency + now % c_nsPerSecond * frequency / c_nsPerSecond;
}

i64 Frequency()
{
    return s_frequency;
}

void Sleep(i64 ns)
{
    s_now += ns;
    std::lock_guard const lock(s_mutex);
    s_sleeps.push_back(ns / 1'000'000);
}

constexpr Kernel::Platform::ClockCalls c_calls = {Now, Counter, Frequency, Sleep};

} // namespace

FakeClock::FakeClock(i64 seconds)
{
    s_now = seconds * 1'000'000'000;
    s_frequency = 1'000'000'000;
    s_sleeps.clear();
    Kernel::Platform::SetClockCalls(&c_calls);
}

FakeClock::~FakeClock()
{
    Kernel::Platform::SetClockCalls(nullptr);
}

void FakeClock::AdvanceMs(i64 ms)
{
    s_now += ms * 1'000'000;
}
void FakeClock::SetFrequency(i64 frequency)
{
    s_frequency = frequency;
}

std::vector<i64> FakeClock::GetSleeps() const
{
    std::lock_guard const lock(s_mutex);
    return s_sleeps;
}

} // namespace TestSupport

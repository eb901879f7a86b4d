#pragma once

#include "libkernel/platform/Time.h"

#include <atomic>
#include <mutex>
#include <vector>

namespace TestSupport {

/// Puts a clock in place that stands still. A sleep moves it on at once and is written down. One at a time.
class FakeClock
{
public:
    /// @p seconds since 1970-01-01 UTC.
    explicit FakeClock(Kernel::i64 seconds = 1'600'000'000)
    {
        static constexpr Kernel::Platform::ClockCalls c_calls = {
            [] { return s_now.load(); },
            [] { return s_now / c_second * s_frequency + s_now % c_second * s_frequency / c_second; },
            [] { return s_frequency.load(); }, Sleep};
        s_now = seconds * c_second;
        s_frequency = c_second;
        s_sleeps.clear();
        Kernel::Platform::SetClockCalls(&c_calls);
    }
    ~FakeClock() { Kernel::Platform::SetClockCalls(nullptr); }
    FakeClock(FakeClock const&) = delete;

    void AdvanceMs(Kernel::i64 ms) { s_now += ms * 1'000'000; }
    /// Ticks of the counter a second; 0 stands for a machine without one.
    void SetFrequency(Kernel::i64 frequency) { s_frequency = frequency; }
    /// The sleeps so far, in milliseconds.
    std::vector<Kernel::i64> GetSleeps() const
    {
        std::lock_guard const lock(s_mutex);
        return s_sleeps;
    }

private:
    static void Sleep(Kernel::i64 ns)
    {
        s_now += ns;
        std::lock_guard const lock(s_mutex);
        s_sleeps.push_back(ns / 1'000'000);
    }
    static constexpr Kernel::i64 c_second = 1'000'000'000;
    static inline std::atomic<Kernel::i64> s_now;
    static inline std::atomic<Kernel::i64> s_frequency;
    static inline std::mutex s_mutex;
    static inline std::vector<Kernel::i64> s_sleeps;
};

} // namespace TestSupport

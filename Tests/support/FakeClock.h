#pragma once

#include "libkernel/platform/Time.h"

#include <vector>

namespace TestSupport {

/// Puts a clock in place that stands still. A sleep moves it on at once and is written down. One at a time.
class FakeClock
{
public:
    /// @p seconds since 1970-01-01 UTC.
    explicit FakeClock(Kernel::i64 seconds = 1'600'000'000);
    ~FakeClock();
    FakeClock(FakeClock const&) = delete;
    FakeClock& operator=(FakeClock const&) = delete;

    void AdvanceMs(Kernel::i64 ms);
    /// Ticks of the counter a second; 0 stands for a machine without one.
    void SetFrequency(Kernel::i64 frequency);
    /// The sleeps so far, in milliseconds.
    std::vector<Kernel::i64> GetSleeps() const;
};

} // namespace TestSupport

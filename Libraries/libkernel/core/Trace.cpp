#include "libkernel/core/Trace.h"

#include "libkernel/platform/Debug.h"
#include "libkernel/platform/Lock.h"

#include <atomic>
#include <cstdlib>

namespace Kernel {

namespace {

enum class TraceState : u8
{
    Unknown = 0,
    Off = 1,
    On = 2
};

std::atomic<TraceState> s_state{TraceState::Unknown};
constinit Platform::RecursiveLock s_lock(4000,
                                         0); // Keeps texts whole: tries as long as short locks do, outside the order.

TraceState FindState()
{
    char const* const wish = std::getenv("CorvaneIsTraceEnabled");
    bool const on = wish ? wish[0] == '1' : Platform::IsDebuggerAttached();
    return on ? TraceState::On : TraceState::Off;
}

} // namespace

void Trace(String8 const& text)
{
    Trace(text.GetData());
}

void Trace(char const* text)
{
    if (!text || !IsTraceEnabled()) return;
    s_lock.Acquire();
    Platform::WriteDebugOutput(text);
    s_lock.Release();
}

bool IsTraceEnabled()
{
    TraceState state = s_state.load(std::memory_order_relaxed);
    if (state == TraceState::Unknown) {
        // A wish that another thread sets meanwhile stands.
        TraceState const found = FindState();
        if (s_state.compare_exchange_strong(state, found, std::memory_order_relaxed)) state = found;
    }
    return state == TraceState::On;
}

void SetIsTraceEnabled(bool enabled)
{
    s_state.store(enabled ? TraceState::On : TraceState::Off, std::memory_order_relaxed);
}

} // namespace Kernel

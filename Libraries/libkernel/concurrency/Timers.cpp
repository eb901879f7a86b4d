#include "libkernel/concurrency/Timer.h"
#include "libkernel/core/DoubleText.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/Trace.h"
#include "libkernel/platform/Debug.h"

namespace Kernel {
namespace {

String8 ToDecimals(double value, u32 decimals, u32 width)
{
    return ToString(value, decimals, width, SignStyle::None, TruncateStyle::KeepAll);
}

template <TextInteger T>
String8 ToField(T value)
{
    return ToStringPadded(value, 7, PadStyle::SpacesLeft);
}

} // namespace

Timers::Timers(char const* description) : Timers(10, description) {}
Timers::Timers(u64 n, char const* description) : m_slots(n), m_description(description) {}

Timers::~Timers()
{
    if (m_hasData) Report();
}

bool Timers::Acquire()
{
    if (m_users.fetch_add(1) == 0) return true;
    m_users.fetch_sub(1);
    return false;
}

void Timers::Release()
{
    m_users.fetch_sub(1);
}

void Timers::Start(u64 slot, char const* description)
{
    SetDescription(slot, description);
    m_slots[slot].timer.Reset();
}

void Timers::Stop(u64 slot, char const* description)
{
    m_slots[slot].milliseconds += m_slots[slot].timer.GetMilliseconds();
    IncrementCount(slot, description);
}

void Timers::IncrementCount(u64 slot, char const* description)
{
    ++m_slots[slot].count;
    m_hasData = true;
    SetDescription(slot, description);
}

void Timers::SetDescription(u64 slot, char const* description)
{
    if (description) m_slots[slot].description = description;
}

void Timers::Clear()
{
    m_slots.assign(m_slots.size(), Slot());
    m_hasData = false;
}

u64 Timers::GetTotalCount() const
{
    u64 total = 0;
    for (Slot const& slot : m_slots) total += slot.count;
    return total;
}

double Timers::GetTotalMilliseconds() const
{
    double total = 0.0;
    for (Slot const& slot : m_slots) total += slot.milliseconds;
    return total;
}

String8 Timers::GetReportString() const
{
    u64 const count = GetTotalCount();
    if (count == 0) return {};
    double const total = GetTotalMilliseconds();
    String8 text;
    if (m_description && *m_description) AppendFormat(text, "%1:\n", m_description);
    text += "     Id   Count  Total tm    Tm/call   Rel tm\n";
    for (u64 i = 0; i < m_slots.size(); ++i) {
        Slot const& slot = m_slots[i];
        if (slot.count == 0) continue;
        double const share = total == 0.0 ? 0.0 : slot.milliseconds / total * 100.0;
        AppendFormat(text, "%1 %2 %3 %4 %5 %6\n", ToField(i), ToField(slot.count), ToDecimals(slot.milliseconds, 3, 9),
                     ToDecimals(slot.milliseconds / slot.count, 6, 11), ToDecimals(share, 1, 5), slot.description);
    }
    AppendFormat(text, "Totals: %1 %2 %3 100.0\n", ToField(count), ToDecimals(total, 3, 9),
                 ToDecimals(total / static_cast<double>(count), 6, 11));
    return text;
}

void Timers::Report()
{
    String8 const text = GetReportString();
    if (Platform::IsDebuggerAttached())
        Trace(text);
    else
        Platform::ShowMessage("Timers::Report", text.GetData());
    m_hasData = false;
}

TimersSession::TimersSession(Timers& timers, char const* description) : TimersSession(timers, 0, description) {}

TimersSession::TimersSession(Timers& timers, u64 slot, char const* description) : m_timers(&timers), m_current(slot)
{
    Begin(description);
}

TimersSession::TimersSession(char const* description) : m_timers(new Timers(nullptr)), m_owns(true)
{
    Begin(description);
}

TimersSession::~TimersSession()
{
    Release();
    if (m_owns) delete m_timers;
}

void TimersSession::Begin(char const* description)
{
    if (!m_timers->Acquire()) return;
    m_active = true;
    m_stopped = false;
    Need(m_current);
    m_timers->Start(m_current, description);
}

void TimersSession::Need(u64 slot)
{
    if (slot >= m_timers->size()) m_timers->resize(slot + 10);
}

void TimersSession::StopCurrent()
{
    if (!m_stopped) m_timers->Stop(m_current);
    m_stopped = true;
}

void TimersSession::Release()
{
    if (!m_active) return;
    StopCurrent();
    m_timers->Release();
    m_active = false;
}

void TimersSession::Next(char const* description)
{
    SetNext(m_current + 1, description);
}

void TimersSession::SetNext(u64 slot, char const* description)
{
    if (!m_active) return;
    StopCurrent();
    m_current = slot;
    Need(slot);
    m_timers->Start(slot, description);
    m_stopped = false;
}

void TimersSession::Skip(int n)
{
    if (!m_active) return;
    StopCurrent();
    u64 const back = n < 0 ? static_cast<u64>(-static_cast<i64>(n)) : 0;
    m_current = n < 0 ? m_current - (back < m_current ? back : m_current) : m_current + static_cast<u64>(n);
    Need(m_current);
}

void TimersSession::Start(u64 slot)
{
    if (m_active) m_timers->Start(slot);
}

void TimersSession::Start(u64 slot, char const* description)
{
    if (!m_active) return;
    m_timers->Start(slot, description);
    if (slot == m_current) m_stopped = false;
}

void TimersSession::Stop()
{
    if (!m_active) return;
    m_timers->Stop(m_current);
    m_stopped = true;
}

void TimersSession::Stop(u64 slot)
{
    if (!m_active) return;
    m_timers->Stop(slot);
    if (slot == m_current) m_stopped = true;
}

void TimersSession::Restart()
{
    if (!m_active) return;
    m_stopped = false;
    m_timers->Start(m_current);
}

void TimersSession::IncrementCount(u64 slot, char const* description)
{
    if (m_active) m_timers->IncrementCount(slot, description);
}

void TimersSession::Clear()
{
    if (!m_active) return;
    StopCurrent();
    m_current = 0;
    m_timers->Clear();
}

} // namespace Kernel

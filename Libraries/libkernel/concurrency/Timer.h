#pragma once

#include "libkernel/core/String.h"
#include "libkernel/core/Types.h"

#include <atomic>
#include <vector>

namespace Kernel {

/// A stop watch. One thread at a time.
class KERNEL_API Timer
{
public:
    /// Started.
    Timer();
    void Reset();
    /// Time since the start; 0.0 if the machine has no counter.
    double GetMilliseconds() const;
    double GetSeconds() const;

    /// The process's own timer, started on first use.
    static Timer& GetDefault();
    /// The process's timer of that name, started on first use; valid for ever. Any thread.
    static Timer& GetNamed(String8 const& name);

private:
    i64 m_frequency; // Counter ticks a second; 0 if there is no counter.
    i64 m_start;
};

/// Numbered slots for profiling, used through TimersSession. Only Acquire and Release may be called while another
/// thread uses the set. Slot numbers must be below size(). Descriptions are borrowed for the life of the set.
class KERNEL_API Timers
{
public:
    explicit Timers(char const* description);
    Timers(u64 n, char const* description);
    /// Reports if anything was measured.
    ~Timers();
    Timers(Timers const&) = delete;
    Timers& operator=(Timers const&) = delete;

    /// True if the caller is now the only user, and then wants a Release.
    bool Acquire();
    void Release();

    /// A description that is null leaves the slot's own.
    void Start(u64 slot, char const* description = nullptr);
    void Stop(u64 slot, char const* description = nullptr);
    void IncrementCount(u64 slot, char const* description = nullptr);
    void SetDescription(char const* description) { m_description = description; }
    void SetDescription(u64 slot, char const* description);
    void Clear();

    u64 size() const { return m_slots.size(); }
    void resize(u64 n) { m_slots.resize(n); }

    u64 GetTotalCount() const;
    double GetTotalMilliseconds() const;
    explicit operator bool() const { return GetTotalCount() != 0; }

    /// A table with a line for each slot that has a count; empty if none has.
    String8 GetReportString() const;
    /// Shows the table: to the debugger if one is attached, else as a message.
    void Report();

private:
    friend class TimersSession;
    struct Slot
    {
        Timer timer;
        u32 count = 0;
        double milliseconds = 0.0;
        char const* description = nullptr;
    };

    std::vector<Slot> m_slots;
    std::atomic<u32> m_users{0};
    char const* m_description;
    bool m_hasData = false;
};

/// A scope that measures into a set. On a set that is in use already it is inactive, and every operation does nothing.
/// One thread.
class KERNEL_API TimersSession
{
public:
    /// Starts with slot 0, or the slot given, which is added if the set lacks it.
    TimersSession(Timers& timers, char const* description);
    TimersSession(Timers& timers, u64 slot, char const* description);
    /// Makes a set of its own, which reports when the session ends.
    explicit TimersSession(char const* description);
    ~TimersSession();
    TimersSession(TimersSession const&) = delete;
    TimersSession& operator=(TimersSession const&) = delete;

    /// Stops the current slot and lets the set go.
    void Release();
    /// Stops the current slot and starts the next one, or the given one; slots are added as needed.
    void Next(char const* description = nullptr);
    void SetNext(u64 slot, char const* description = nullptr);
    /// Stops, and moves by @p n slots without starting. A move below slot 0 ends at slot 0.
    void Skip(int n);

    void Start(u64 slot);
    void Start(u64 slot, char const* description);
    void Stop();
    void Stop(u64 slot);
    void Restart();
    void IncrementCount(u64 slot, char const* description = nullptr);
    /// Drops all figures and ends at slot 0, stopped: Restart, Start or Next goes on.
    void Clear();

private:
    void Begin(char const* description);
    void StopCurrent();
    void Need(u64 slot);

    Timers* m_timers;
    u64 m_current = 0;
    bool m_active = false;
    bool m_stopped = true;
    bool m_owns = false;
};

} // namespace Kernel

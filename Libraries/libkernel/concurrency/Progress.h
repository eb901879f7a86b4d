#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

namespace Kernel {

class ProgressReporter;

/// The showing half of progress: the host derives from it, attaches a reporter and is called back on each change.
///
/// Any thread may read. The lock of a Progress is held around its reporter's GetProgress, so locks are taken from the
/// root of a tree of progresses towards its leaves.
class KERNEL_API Progress : public Countable
{
public:
    String8 const& GetDescription() const { return m_description; }

    /// From 0.0 to 1.0: 1.0 once complete, 0.0 without a reporter.
    double GetProgress() const;

    /// True if nobody can say how far the work is; never with a reporter attached.
    bool IsIndeterminate() const;

    /// Progress is 1.0 from here on; calls back.
    void SetAsComplete();
    /// Sets the flag without a call back.
    void SetAsIndeterminate();

    /// Detaches the old reporter and attaches the new one, which may be null. A reporter belongs to one Progress at a
    /// time. Waits for a call back of either reporter that is running on another thread; must not be called from within
    /// a call back.
    void SetReporter(Counted<ProgressReporter> const& reporter);
    bool HasReporter(NonCounted<ProgressReporter const> reporter) const;

    /// Something changed. Runs on the thread that reported, under the reporter's guard lock: it may read progress, and
    /// must not attach or detach reporters.
    virtual void OnProgressUpdate() = 0;

protected:
    explicit Progress(String8 const& description);
    Progress(String8 const& description, Counted<ProgressReporter> const& reporter);
    /// Detaches the reporter, which may live on. A class whose reporter may be set while it goes away detaches it in
    /// its own destructor, before OnProgressUpdate is gone.
    ~Progress() override;

private:
    mutable CriticalSectionSpin
        m_attachLock;                   // Held through SetReporter, never while reading; taken before a guard lock.
    mutable CriticalSectionSpin m_lock; // Guards all below but the description, which never changes.
    String8 const m_description;
    Counted<ProgressReporter> m_reporter;
    bool m_indeterminate = false;
    bool m_complete = false;
};

} // namespace Kernel

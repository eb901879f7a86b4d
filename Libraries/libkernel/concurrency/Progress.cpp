#include "libkernel/concurrency/Progress.h"

#include "libkernel/concurrency/ProgressReporter.h"

#include <algorithm>
#include <utility>

namespace Kernel {

Progress::Progress(String8 const& description) : m_description(description) {}

Progress::Progress(String8 const& description, Counted<ProgressReporter> const& reporter) : m_description(description)
{
    SetReporter(reporter);
}

Progress::~Progress()
{
    SetReporter(nullptr);
}

double Progress::GetProgress() const
{
    CriticalSectionSpinScope const lock(m_lock);
    if (m_complete) return 1.0;
    return m_reporter ? std::clamp(m_reporter->GetProgress(), 0.0, 1.0) : 0.0;
}

bool Progress::IsIndeterminate() const
{
    CriticalSectionSpinScope const lock(m_lock);
    return !m_reporter && m_indeterminate;
}

void Progress::SetAsComplete()
{
    {
        CriticalSectionSpinScope const lock(m_lock);
        m_complete = true;
    }
    OnProgressUpdate();
}

void Progress::SetAsIndeterminate()
{
    CriticalSectionSpinScope const lock(m_lock);
    m_indeterminate = true;
}

// A call back holds its reporter's guard lock and may read this object, which takes m_lock; so m_lock is given back
// before a guard lock is taken. m_attachLock keeps two calls of this operation apart meanwhile.
void Progress::SetReporter(Counted<ProgressReporter> const& reporter)
{
    CriticalSectionSpinScope const attaching(m_attachLock);
    Counted<ProgressReporter> old = reporter;
    {
        CriticalSectionSpinScope const lock(m_lock);
        std::swap(m_reporter, old);
    }
    if (old) old->Detach(this);
    if (reporter) reporter->Attach(this);
}

bool Progress::HasReporter(NonCounted<ProgressReporter const> reporter) const
{
    CriticalSectionSpinScope const lock(m_lock);
    return m_reporter.Get() == reporter.Get();
}

} // namespace Kernel

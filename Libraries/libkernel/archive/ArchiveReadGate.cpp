#include "libkernel/archive/internal/ArchiveReadGate.h"

#include "libkernel/concurrency/Dispatch.h"

namespace Kernel {

void ArchiveReadGate::Enter()
{
    if (m_inside) return;
    for (;;) {
        Counted<MultiSemaphore> wait;
        {
            CriticalSectionScope const lock(m_impl.m_stateLock);
            if (!m_impl.m_gateWait || m_impl.m_gateOwner == ThreadId::GetCurrent()) {
                ++m_impl.m_readsInside;
                m_inside = true;
                return;
            }
            wait = m_impl.m_gateWait;
        }
        wait->Wait(0);
    }
}

void ArchiveReadGate::Leave()
{
    if (!m_inside) return;
    CriticalSectionScope const lock(m_impl.m_stateLock);
    --m_impl.m_readsInside;
    m_inside = false;
}

// New readers are held back first, so that the few that are inside, each for the length of one look-up or read, are
// all there is to wait for.
ArchiveReadersOff::ArchiveReadersOff(ArchiveImpl& impl) : m_impl(impl)
{
    auto wait = MakeCounted<MultiSemaphore>();
    for (bool first = true;; first = false) {
        {
            CriticalSectionScope const lock(m_impl.m_stateLock);
            if (first) {
                m_impl.m_gateWait = wait;
                m_impl.m_gateOwner = ThreadId::GetCurrent();
            }
            if (m_impl.m_openInStreams != 0) {
                m_impl.m_gateWait = nullptr;
                m_impl.m_gateOwner = nullptr;
                break;
            }
            if (m_impl.m_readsInside == 0) {
                m_wait = wait;
                return;
            }
        }
        Dispatch::Yield(Dispatch::YieldPolicy::Default);
    }
    wait->Signal();
}

ArchiveReadersOff::~ArchiveReadersOff()
{
    if (!m_wait) return;
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        m_impl.m_gateWait = nullptr;
        m_impl.m_gateOwner = nullptr;
    }
    m_wait->Signal();
}

} // namespace Kernel

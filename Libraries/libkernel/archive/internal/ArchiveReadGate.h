#pragma once

#include "libkernel/archive/internal/ArchiveImpl.h"

namespace Kernel {

/// Keeps a streamline, which moves every stored byte and replaces every table, away from one look-up and the read that
/// follows it. Waits for a streamline that runs on another thread to end; that thread itself passes.
///
/// Held over no call into an object of the host: such a call may come back for another file, and would wait for a
/// streamline that waits for this gate. A stream is made inside the gate and counted on its own.
class ArchiveReadGate
{
public:
    explicit ArchiveReadGate(ArchiveImpl& impl) : m_impl(impl) { Enter(); }
    ~ArchiveReadGate() { Leave(); }
    ArchiveReadGate(ArchiveReadGate const&) = delete;
    ArchiveReadGate& operator=(ArchiveReadGate const&) = delete;

    void Enter();
    void Leave();

private:
    ArchiveImpl& m_impl;
    bool m_inside = false;
};

/// A streamline's side: while it lives no other thread is inside a gate.
class ArchiveReadersOff
{
public:
    explicit ArchiveReadersOff(ArchiveImpl& impl);
    ~ArchiveReadersOff();
    ArchiveReadersOff(ArchiveReadersOff const&) = delete;
    ArchiveReadersOff& operator=(ArchiveReadersOff const&) = delete;

    /// False if a stream is open: the gate was not closed.
    bool IsClosed() const { return static_cast<bool>(m_wait); }

private:
    ArchiveImpl& m_impl;
    Counted<MultiSemaphore> m_wait;
};

} // namespace Kernel

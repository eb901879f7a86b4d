#pragma once

#include "libkernel/core/Export.h"

namespace Kernel {

/// A cancellation point: work asks IsAborting from time to time and gives up when it says so.
///
/// The flag is the object's own, or an outer one that several objects share. Any thread may set it and any thread may
/// poll it; nobody waits on it. Changing which flag is in force is for the thread that owns the object.
class KERNEL_API Abortable
{
public:
    /// Its own flag in force, not set.
    Abortable() : m_abort(&m_ownAbort) {}
    /// Takes the value of the other's own flag. A copy of an object on its own flag stands on its own too; otherwise
    /// it shares the outer flag.
    Abortable(Abortable const& o);
    Abortable& operator=(Abortable const& o);

    void SetAbort(bool abort);
    bool IsAborting() const;
    /// The flag in force. Other threads may write it, so read it as IsAborting does, not as a plain bool.
    bool* GetAbortPointer() const { return m_abort; }
    /// Puts @p abort in force; it is borrowed until it is replaced or this object dies. Null goes back to the object's
    /// own flag.
    virtual void SetAbortPointer(bool* abort);

protected:
    virtual ~Abortable();

private:
    bool* m_abort; // Never null.
    bool m_ownAbort = false;
};

/// Reads a flag that another thread may set meanwhile, as IsAborting does. False for null.
KERNEL_API bool IsAbortFlagSet(bool const* flag);

} // namespace Kernel

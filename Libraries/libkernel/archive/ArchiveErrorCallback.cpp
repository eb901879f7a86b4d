#include "libkernel/archive/ArchiveErrorCallback.h"

namespace Kernel {

ArchiveErrorCallback::ArchiveErrorCallback() = default;
ArchiveErrorCallback::~ArchiveErrorCallback() = default;

void ArchiveErrorCallback::SignalError(Error error, Archive& archive)
{
    m_lock.AcquireLock();
    bool const isNew = m_signalled[&archive].insert(error).second;
    m_lock.ReleaseLock();
    OnError(error, archive, isNew);
}

} // namespace Kernel

#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Countable.h"

#include <map>
#include <set>

namespace Kernel {

class Archive;

/// Told by an archive of damage that a read has found. The host derives from it and hands it to
/// Archive::SetErrorCallback. Called on the reading thread, which holds no lock of the archive then.
class KERNEL_API ArchiveErrorCallback : public Countable
{
public:
    enum class Error
    {
        CorruptedFile = 0 ///< A CRC failed, or a stored block is not where the table says.
    };

    /// Records the pair and passes it on. @p archive is borrowed for the call; only its address is kept.
    void SignalError(Error error, Archive& archive);

protected:
    ArchiveErrorCallback();
    ~ArchiveErrorCallback() override;

    /// @p isNew is false when this archive has signalled this error through this object before.
    virtual void OnError(Error error, Archive& archive, bool isNew) = 0;

private:
    CriticalSectionSpin m_lock;
    std::map<Archive const*, std::set<Error>> m_signalled; // Guarded by m_lock.
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Exception.h"

namespace Kernel {

/// An item's bytes could not be copied to safety. Making one writes a line to the trace.
class KERNEL_API BackstoreException : public Exception
{
public:
    explicit BackstoreException(bool outOfSpace);
    BackstoreException(BackstoreException const&) = default;
    BackstoreException& operator=(BackstoreException const&) = default;
    ~BackstoreException() override;

    /// True if the place for the copies is full.
    bool GetOutOfSpace() const { return m_outOfSpace; }

private:
    bool m_outOfSpace;
};

} // namespace Kernel

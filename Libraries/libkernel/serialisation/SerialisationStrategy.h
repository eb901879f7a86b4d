#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Export.h"

namespace Kernel {

/// Advice that rides along with a save, for example how to compress what is being written. A marker base: who gives
/// the advice and who takes it agree on a class derived from this one. Never changes once it is handed over, so one
/// object may serve saves on several threads.
class KERNEL_API SerialisationStrategy : public Countable
{
protected:
    ~SerialisationStrategy() override;
};

} // namespace Kernel

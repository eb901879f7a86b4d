#pragma once

#include "libkernel/core/Export.h"

namespace Kernel {

/// What a comparison of objects carries along: handed unchanged through every Equals and CompareMembers of one
/// comparison. Classes that need to tell their parts something derive from it and ask for their own type; this base
/// says nothing. Belongs to one thread.
class KERNEL_API CompareContext
{
public:
    CompareContext();
    CompareContext(CompareContext const&) = delete;
    CompareContext& operator=(CompareContext const&) = delete;
    virtual ~CompareContext();
};

} // namespace Kernel

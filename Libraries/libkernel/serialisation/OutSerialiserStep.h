#pragma once

#include "libkernel/core/Types.h"
#include "libkernel/serialisation/PropType.h"

namespace Kernel {

struct DefaultRow;

/// One property in the order in which the last objects of a class saved theirs, for the inline operations of
/// OutSerialiser; its callers have no use for it. An object that keeps the order needs no look at the tags it used
/// before, and no search for a default.
struct OutSerialiserStep
{
    static constexpr u64 c_end = ~u64(0);

    u64 tag = c_end;                     // c_end, which no tag equals, behind the last.
    u64 value = 0;                       // The default, if it is a scalar of at most 8 bytes.
    PropType type = PropType::EndOfList; // Of that default; EndOfList if there is none.
    DefaultRow const* row = nullptr;     // The default of whatever kind, or null.
};

} // namespace Kernel

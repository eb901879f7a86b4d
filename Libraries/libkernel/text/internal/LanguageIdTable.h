#pragma once

#include "libkernel/core/Types.h"

#include <span>

namespace Kernel {

/// A Windows language identifier and its tag, terminated. The text lies in the row, so that the table needs no
/// relocations.
struct LanguageIdRow
{
    i32 lcid;
    char tag[16];
};

/// All rows, in ascending order.
std::span<LanguageIdRow const> GetLanguageIdTable();

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// Makes a password that a person typed comparable, by the SASLprep profile (RFC 4013) for stored strings. False, with
/// @p out untouched, if the profile can't be opened or the text is refused: prohibited or unassigned characters, mixed
/// directions, or bytes that aren't well-formed UTF-8. Both may be the same string.
KERNEL_API bool PreparePassword(String8& out, String8 const& password);

} // namespace Kernel

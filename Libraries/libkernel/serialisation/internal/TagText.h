#pragma once

#include "libkernel/core/IDTag.h"
#include "libkernel/core/String.h"

namespace Kernel {

/// The four characters of a code in order.
inline String8 TagText(IDTag tag)
{
    char const text[] = {static_cast<char>(tag.value >> 24), static_cast<char>(tag.value >> 16),
                         static_cast<char>(tag.value >> 8), static_cast<char>(tag.value)};
    return String8(text, 4);
}

/// The same; "<>" for 0.
inline String8 TagText(ClassUID uid)
{
    return uid.value == 0 ? String8("<>") : TagText(IDTag(uid.value));
}

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// The words for true and false.
enum class BoolStyle : u32
{
    LowerTrueFalse = 0, ///< "true", "false"
    TrueFalse = 1,
    UpperTrueFalse = 2,
    LowerYesNo = 3,
    YesNo = 4,
    UpperYesNo = 5,
    LowerOnOff = 6,
    OnOff = 7,
    OnOffAgain = 8, ///< As 7.
    OneZero = 9     ///< "1", "0"
};

/// One of two words, which all calls share; empty for any other style. Any thread.
template <class S>
S ToStringT(bool value, BoolStyle style);

extern template KERNEL_API String8 ToStringT<String8>(bool, BoolStyle);
extern template KERNEL_API String16 ToStringT<String16>(bool, BoolStyle);
extern template KERNEL_API String32 ToStringT<String32>(bool, BoolStyle);

inline String8 ToString(bool value, BoolStyle style)
{
    return ToStringT<String8>(value, style);
}

} // namespace Kernel

#include "libkernel/core/SuperscriptText.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/internal/DecimalDigits.h"

namespace Kernel::NumberTextDetail {
namespace {

constexpr u32 c_raisedDigits[10] = {0x2070, 0xB9, 0xB2, 0xB3, 0x2074, 0x2075, 0x2076, 0x2077, 0x2078, 0x2079};

u32 Raised(char unit)
{
    return unit == '+' ? 0x207A : unit == '-' ? 0x207B : unit == ' ' ? u32{' '} : c_raisedDigits[unit - '0'];
}

} // namespace

template <class S>
S Superscript(Magnitude number, SignStyle style)
{
    using Traits = CharTraits<typename S::EncodingType>;
    char plain[1 + c_digitsRoom];
    char* const end = plain + sizeof plain;
    char* begin = WriteDigits(end, number.value);
    if (char const sign = SignOf(number.negative, style)) *--begin = sign;

    int length = 0;
    for (char const* p = begin; p < end; ++p) length += Traits::GetCodePointLength(Raised(*p));
    typename S::Unit* to;
    S result(length, to);
    for (char const* p = begin; p < end; ++p) to = Traits::AppendCodePoint(to, Raised(*p));
    return result;
}

template KERNEL_API String8 Superscript<String8>(Magnitude, SignStyle);
template KERNEL_API String16 Superscript<String16>(Magnitude, SignStyle);
template KERNEL_API String32 Superscript<String32>(Magnitude, SignStyle);

} // namespace Kernel::NumberTextDetail

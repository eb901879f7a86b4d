#include "libkernel/core/NumberText.h"

#include "libkernel/core/internal/DecimalDigits.h"

#include <algorithm>

namespace Kernel {

using namespace NumberTextDetail;

namespace {

constexpr CharacterGrouping c_groupingNumber{3, ','};
constexpr CharacterGrouping c_groupingHexBytes{2, ' '};
constexpr CharacterGrouping c_groupingHexWords{4, ' '};

constexpr char c_lowerDigits[] = "0123456789abcdefghijklmnopqrstuvwxyz";
constexpr char c_upperDigits[] = "0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZ";

template <class Unit>
Unit* WriteThousands(Unit* end, u64 value, Unit separator)
{
    for (; value >= 1000; value /= 1000) {
        end = WriteTriple(end, value % 1000);
        *--end = separator;
    }
    return WriteDigits(end, value);
}

// Digits, then fill zeros, from @p end back to @p begin, with a separator on each group boundary but never first.
template <class Unit>
void WriteGrouped(Unit* const begin, Unit* end, u64 value, CharacterGrouping const& grouping)
{
    for (u32 inGroup = 0; end > begin; ++inGroup) {
        if (inGroup == grouping.size && end - 1 > begin) {
            *--end = static_cast<Unit>(grouping.separator);
            inGroup = 0;
        }
        *--end = static_cast<Unit>('0' + value % 10);
        value /= 10;
    }
}

} // namespace

CharacterGrouping const* CharacterGroupingNumber()
{
    return &c_groupingNumber;
}

CharacterGrouping const* CharacterGroupingHexBytes()
{
    return &c_groupingHexBytes;
}

CharacterGrouping const* CharacterGroupingHexWords()
{
    return &c_groupingHexWords;
}

namespace NumberTextDetail {

template <class Unit>
Unit* WriteDecimal(Unit* end, Magnitude number)
{
    end = WriteDigits(end, number.value);
    if (number.negative) *--end = '-';
    return end;
}

template <class S>
S Decimal(Magnitude number, SignStyle style, CharacterGrouping const* grouping, int width, PadStyle pad)
{
    using Unit = typename S::Unit;
    char const sign = SignOf(number.negative, style);
    int const digits = CountDigits(number.value);
    bool const grouped = grouping && grouping->size != 0;
    int const separators = grouped ? static_cast<int>(static_cast<u32>(digits - 1) / grouping->size) : 0;
    int const text = digits + separators + (sign != 0);
    int const total = std::max(text, width);

    Unit* begin;
    S result(total, begin);
    Unit* end = begin + total;
    if (pad == PadStyle::SpacesRight) {
        std::fill(begin + text, end, Unit{' '});
        end = begin + text;
    } else if (pad == PadStyle::SpacesLeft) {
        std::fill(begin, end - text, Unit{' '});
        begin = end - text;
    }
    if (sign) *begin++ = static_cast<Unit>(sign);
    if (grouped && (grouping->size != 3 || total > text))
        WriteGrouped(begin, end, number.value, *grouping);
    else {
        Unit* const first = grouped ? WriteThousands(end, number.value, static_cast<Unit>(grouping->separator))
                                    : WriteDigits(end, number.value);
        std::fill(begin, first, Unit{'0'});
    }
    return result;
}

template <class S>
S InBase(u64 value, u32 base, int width, PadStyle pad, bool upper)
{
    using Unit = typename S::Unit;
    if (base < 2 || base > 36) return S();
    char const* const table = upper ? c_upperDigits : c_lowerDigits;
    char digits[64];
    char* const last = digits + sizeof digits;
    char* first = last;
    do *--first = table[value % base];
    while (value /= base);

    int const text = static_cast<int>(last - first);
    int const total = std::max(text, width);
    Unit* to;
    S result(total, to);
    Unit* const end = to + total;
    if (pad != PadStyle::SpacesRight)
        to = std::fill_n(to, total - text, pad == PadStyle::ZerosLeft ? Unit{'0'} : Unit{' '});
    for (; first < last; ++first) *to++ = static_cast<Unit>(*first);
    std::fill(to, end, Unit{' '});
    return result;
}

template KERNEL_API String8 Decimal<String8>(Magnitude, SignStyle, CharacterGrouping const*, int, PadStyle);
template KERNEL_API String16 Decimal<String16>(Magnitude, SignStyle, CharacterGrouping const*, int, PadStyle);
template KERNEL_API String32 Decimal<String32>(Magnitude, SignStyle, CharacterGrouping const*, int, PadStyle);
template KERNEL_API String8 InBase<String8>(u64, u32, int, PadStyle, bool);
template KERNEL_API String16 InBase<String16>(u64, u32, int, PadStyle, bool);
template KERNEL_API String32 InBase<String32>(u64, u32, int, PadStyle, bool);
template KERNEL_API char* WriteDecimal<char>(char*, Magnitude);
template KERNEL_API char16_t* WriteDecimal<char16_t>(char16_t*, Magnitude);
template KERNEL_API unsigned int* WriteDecimal<unsigned int>(unsigned int*, Magnitude);

} // namespace NumberTextDetail
} // namespace Kernel

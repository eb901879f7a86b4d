#include "libkernel/core/NumberText.h"

#include "libkernel/core/internal/DecimalDigits.h"

#include <algorithm>
#include <array>

namespace Kernel {

using namespace NumberTextDetail;

namespace {

constexpr CharacterGrouping c_groupingNumber{3, ','};
constexpr CharacterGrouping c_groupingHexBytes{2, ' '};
constexpr CharacterGrouping c_groupingHexWords{4, ' '};

constexpr char c_lowerDigits[] = "0123456789abcdefghijklmnopqrstuvwxyz";
constexpr char c_upperDigits[] = "0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZ";

// Each number below 1,000 with its three digits in the upper bytes, the first lowest; room for a separator below them.
constexpr auto c_groups = [] {
    std::array<u32, 1000> table{};
    for (u32 i = 0; i < 1000; ++i) table[i] = ('0' + i / 100) << 8 | ('0' + i / 10 % 10) << 16 | ('0' + i % 10) << 24;
    return table;
}();

constexpr int c_thousandsRoom = 7 * 4;

// The digits of @p value in groups of three, ending at @p end. Writes whole groups: needs c_thousandsRoom before the
// end. Gives the first digit.
char* WriteThousands(char* end, u64 value, u32 separator)
{
    int const digits = CountDigits(value);
    char* to = end;
    for (; value >= 1000; value /= 1000) StoreLittleEndian(to -= 4, c_groups[value % 1000] | separator);
    StoreLittleEndian(to - 4, c_groups[value]);
    return end - digits - (digits - 1) / 3;
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
Unit* WriteDecimal(Unit* room, Magnitude number)
{
    if constexpr (std::is_same_v<Unit, char>) {
        char* const begin = WriteDigits(room + c_decimalRoom, number.value);
        begin[-1] = '-';
        return begin - number.negative;
    } else {
        char digits[c_decimalRoom];
        char* const begin = WriteDecimal(digits, number);
        CopyAscii(room + (begin - digits), begin, digits + c_decimalRoom);
        return room + (begin - digits);
    }
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
    bool const isFilled = total > text && pad == PadStyle::ZerosLeft;
    if (grouped && (grouping->size != 3 || grouping->separator > 0x7F || isFilled)) {
        WriteGrouped(begin, end, number.value, *grouping);
        return result;
    }
    char room[c_thousandsRoom];
    char* const last = room + sizeof room;
    char* const first =
        grouped ? WriteThousands(last, number.value, grouping->separator) : WriteDigits(last, number.value);
    if (isFilled) begin = std::fill_n(begin, total - text, Unit{'0'});
    CopyAscii(begin, first, last);
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

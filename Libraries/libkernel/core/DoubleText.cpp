#include "libkernel/core/DoubleText.h"

#include "libkernel/core/internal/DecimalDigits.h"
#include "libkernel/core/internal/HasFraction.h"

#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>
#include <new>

// The text is defined by way of the value's exact text with 14 decimals, which is then cut. That text is never written
// here. A value below 2^63 is split into its whole part and a fraction of at most 2^53 steps of a power of two; the 14
// decimals are then one product of 100 bits, shifted down, and all the rest is whole numbers: cut and round, divide by
// the multiplication with a reciprocal, spread the decimals over 8 or 16 bytes, and find the last that is not "0" by
// counting bits. A larger value has no decimals at all; its digits come from the C++ library.

namespace Kernel::DoubleTextDetail {

using namespace NumberTextDetail;

namespace {

__extension__ using u128 = unsigned __int128;

constexpr u32 c_printedDecimals = 14;
constexpr u32 c_maxDecimals = 12;
constexpr u64 c_printedUnit = 100'000'000'000'000; // 10^14, one in the last place but 14.
constexpr double c_wholeLimit = 9223372036854775808.0;

// By decimals kept, 1 to 12: what divides the 14 decimals by 10^(14 - kept), how half of the last place is written in
// them, and when a negative value is no longer shown.
struct Cut
{
    u64 reciprocal; // 2^(64 + shift) / 10^(14 - kept), rounded up: exact for dividends below 2^63.
    u32 shift;
    u64 half;
    double smallest; // 1 / 10^kept
};

constexpr auto c_cuts = [] {
    std::array<Cut, c_maxDecimals + 1> cuts{};
    for (u32 kept = 1; kept <= c_maxDecimals; ++kept) {
        u64 const divisor = c_powersOfTen[c_printedDecimals - kept];
        u32 const shift = static_cast<u32>(std::bit_width(divisor)) - 1;
        cuts[kept] = {static_cast<u64>((u128{1} << (64 + shift)) / divisor) + 1, shift, divisor / 2,
                      1.0 / static_cast<double>(c_powersOfTen[kept])};
    }
    return cuts;
}();

// A magnitude below 2^63, rounded to 14 decimals by its exact value, halves to even.
struct Printed
{
    u64 whole;
    u64 decimals; // Below 10^14.
};

Printed Print(double magnitude)
{
    u64 const bits = std::bit_cast<u64>(magnitude);
    u32 const exponent = static_cast<u32>(bits >> 52);
    u64 const mantissa = (bits & ((u64{1} << 52) - 1)) | u64{exponent != 0} << 52;
    // The value is mantissa / 2^shift.
    int const shift = 1075 - static_cast<int>(exponent + (exponent == 0));
    if (shift <= 0) return {mantissa << -shift, 0};
    if (shift > 100) return {0, 0}; // Less than half of the last place.
    u64 whole = 0;
    u64 fraction = mantissa;
    if (shift <= 52) {
        whole = mantissa >> shift;
        fraction = mantissa & ((u64{1} << shift) - 1);
    }
    u128 const product = u128{fraction} * c_printedUnit;
    u64 const odd = static_cast<u64>(product >> shift) & 1;
    u64 const decimals = static_cast<u64>((product + ((u128{1} << (shift - 1)) - 1 + odd)) >> shift);
    if (decimals == c_printedUnit) return {whole + 1, 0};
    return {whole, decimals};
}

// Bytes up to the last that is not 0, the first in the lowest.
int CountUsed(u64 bytes)
{
    return (std::bit_width(bytes) + 7) / 8;
}

// Writes @p decimals, a number of @p count digits, and gives how many of them stay when the zeros at the end go. Room
// for 16 bytes.
int WriteDecimals(char* to, u64 decimals, u32 count)
{
    if (count <= 8) {
        u64 const digits = SpreadDigits(decimals * c_powersOfTen[8 - count]);
        StoreLittleEndian(to, digits | c_zeroDigits);
        return CountUsed(digits);
    }
    u64 const all = decimals * c_powersOfTen[16 - count];
    u64 const high = SpreadDigits(all / c_eightDigits);
    u64 const low = SpreadDigits(all % c_eightDigits);
    StoreLittleEndian(to, high | c_zeroDigits);
    StoreLittleEndian(to + 8, low | c_zeroDigits);
    return low ? 8 + CountUsed(low) : CountUsed(high);
}

constexpr int c_maxWhole = 309; // Digits of the largest double.

// The text of one finite number, in its middle the point.
struct Room
{
    char text[1 + c_maxWhole + 1 + 16];

    char* Point() { return text + 1 + c_maxWhole; }
};

struct Written
{
    char* begin; // Sign or first digit.
    char* end;
    int printedWhole; // Digits before the point in the text with 14 decimals.
};

Written Write(Room& room, double value, u32 kept, SignStyle style, TruncateStyle truncate)
{
    Cut const& cut = c_cuts[kept];
    bool const negative = std::signbit(value) && -value >= cut.smallest;
    double const magnitude = std::signbit(value) && !negative ? 0.0 : std::fabs(value);

    char* const point = room.Point();
    char* begin;
    int printedWhole;
    u64 decimals = 0;
    if (magnitude < c_wholeLimit) {
        auto [whole, printed] = Print(magnitude);
        decimals = static_cast<u64>(u128{printed + cut.half} * cut.reciprocal >> 64) >> cut.shift;
        bool const carried = decimals == c_powersOfTen[kept];
        printedWhole = carried ? CountDigits(whole) : 0;
        if (carried) {
            ++whole;
            decimals = 0;
        }
        begin = WriteDigits(point, whole);
        if (!carried) printedWhole = static_cast<int>(point - begin);
    } else {
        char digits[c_maxWhole];
        auto const [last, error] =
            std::to_chars(digits, digits + sizeof digits, magnitude, std::chars_format::fixed, 0);
        printedWhole = static_cast<int>(last - digits);
        begin = point - printedWhole;
        std::memcpy(begin, digits, static_cast<size_t>(printedWhole));
    }
    if (char const sign = SignOf(negative, style)) *--begin = sign;

    *point = '.';
    int const used = WriteDecimals(point + 1, decimals, kept);
    int const shown = truncate == TruncateStyle::StripZeros ? used
                      : truncate == TruncateStyle::KeepOne  ? std::max(used, 1)
                                                            : static_cast<int>(kept);
    return {begin, point + shown + (shown != 0), printedWhole};
}

// @p text in a field of @p width units, aligned to the right.
template <class S>
S InField(char const* begin, char const* end, i64 width)
{
    using Unit = typename S::Unit;
    i64 const length = end - begin;
    i64 const total = std::max(length, width);
    if (total > std::numeric_limits<i32>::max()) throw std::bad_alloc();
    Unit* to;
    S result(static_cast<int>(total), to);
    to = std::fill_n(to, total - length, Unit{' '});
    CopyAscii(to, begin, end);
    return result;
}

// What is beyond 64 bits, or no number, has one answer, that of the usual machine instruction.
i64 RoundToInteger(double value)
{
    double const rounded = std::round(value);
    return rounded >= -c_wholeLimit && rounded < c_wholeLimit ? static_cast<i64>(rounded)
                                                              : std::numeric_limits<i64>::min();
}

} // namespace

template <class S>
S Text(double value, u32 precision, u32 width, SignStyle style, TruncateStyle truncate)
{
    int const field = width > static_cast<u32>(std::numeric_limits<i32>::max()) ? 0 : static_cast<int>(width);
    if (precision == 0) return Decimal<S>(Split(RoundToInteger(value)), style, nullptr, field, PadStyle::SpacesLeft);
    u32 const kept = std::min(precision, c_maxDecimals);
    if (!std::isfinite(value)) {
        bool const isNumber = !std::isnan(value);
        char text[4] = {SignOf(std::signbit(value), style), isNumber ? 'i' : 'n', isNumber ? 'n' : 'a',
                        isNumber ? 'f' : 'n'};
        return InField<S>(text + (text[0] == 0), text + 4, i64{field} - kept + c_printedDecimals);
    }
    Room room;
    Written const text = Write(room, value, kept, style, truncate);
    i64 const length = text.end - text.begin;
    // The field was filled around the text with 14 decimals, before anything was carried or stripped.
    i64 const sign = (*text.begin < '0');
    i64 const filled = std::max<i64>(field - sign - text.printedWhole - 1 - i64{kept}, 0);
    return InField<S>(text.begin, text.end, filled + length);
}

template <class Unit>
int WriteShort(Unit* to, double value)
{
    if (!(std::fabs(value) < c_wholeLimit)) return -1;
    Room room;
    Written const text = Write(room, value, 6, SignStyle::None, TruncateStyle::KeepOne);
    return static_cast<int>(CopyAscii(to, text.begin, text.end) - to);
}

template <class S>
S DebugText(double value, u32 precision, u32 width)
{
    // No double has more decimals than this; what is asked for beyond is zeros.
    constexpr u32 most = 1100;
    double const magnitude = std::fabs(value);
    auto const form = magnitude >= 0.001 && magnitude < 1e6 ? std::chars_format::fixed : std::chars_format::scientific;
    char text[most + 16];
    char* const end =
        std::to_chars(text, text + sizeof text, value, form, static_cast<int>(std::min(precision, most))).ptr;
    if (precision <= most || !std::isfinite(value)) return InField<S>(text, end, width);

    char* const tail = std::find(text, end, 'e');
    i64 const zeros = i64{precision} - most;
    i64 const length = end - text + zeros;
    S result = InField<S>(text, text, std::max<i64>(length, width));
    auto* to = result.GetWritable() + result.GetLength() - length;
    to = CopyAscii(to, text, tail);
    to = std::fill_n(to, zeros, typename S::Unit{'0'});
    CopyAscii(to, tail, end);
    return result;
}

template KERNEL_API String8 Text<String8>(double, u32, u32, SignStyle, TruncateStyle);
template KERNEL_API String16 Text<String16>(double, u32, u32, SignStyle, TruncateStyle);
template KERNEL_API String32 Text<String32>(double, u32, u32, SignStyle, TruncateStyle);
template KERNEL_API String8 DebugText<String8>(double, u32, u32);
template KERNEL_API String16 DebugText<String16>(double, u32, u32);
template KERNEL_API String32 DebugText<String32>(double, u32, u32);
template KERNEL_API int WriteShort<char>(char*, double);
template KERNEL_API int WriteShort<char16_t>(char16_t*, double);
template KERNEL_API int WriteShort<unsigned int>(unsigned int*, double);

} // namespace Kernel::DoubleTextDetail

namespace Kernel {

bool ToStringWillBeApproximate(double value, u32 precision, u32 extra)
{
    return DoubleTextDetail::HasFraction(value * std::pow(10.0, static_cast<double>(precision) + extra));
}

} // namespace Kernel

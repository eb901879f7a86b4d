#include "libkernel/core/FractionText.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/internal/DecimalDigits.h"
#include "libkernel/core/internal/HasFraction.h"

#include <charconv>
#include <cmath>
#include <initializer_list>

namespace Kernel {

using namespace NumberTextDetail;

namespace {

constexpr double c_wholeLimit = 9223372036854775808.0;
constexpr u32 c_eighths[8] = {0, 0x215B, 0xBC, 0x215C, 0xBD, 0x215D, 0xBE, 0x215E};

// A magnitude in parts of a denominator.
struct Parts
{
    u64 whole;
    u64 numerator;   // Below the denominator; 0 for none.
    u64 denominator; // As the text has it.
    double fraction; // The exact one, 0 to 1.
};

// @p magnitude is below 2^63.
Parts Divide(double magnitude, u32 denominator)
{
    double whole;
    double const fraction = std::modf(magnitude, &whole);
    Parts parts{static_cast<u64>(whole), static_cast<u64>(fraction * denominator + 0.5), denominator, fraction};
    if (parts.numerator != 0 && parts.numerator >= denominator) {
        ++parts.whole;
        parts.numerator = 0;
    }
    return parts;
}

// Takes the first denominator, doubling from @p smallest, that has the same value.
void Reduce(Parts& parts, u32 smallest)
{
    if (parts.numerator == 0) return;
    for (u64 d = std::max(smallest, 2u); d < parts.denominator; d *= 2) {
        if (parts.numerator * d % parts.denominator != 0) continue;
        parts.numerator = parts.numerator * d / parts.denominator;
        parts.denominator = d;
        return;
    }
}

// ASCII pieces and one code point at the end, if it is not 0.
template <class S>
S Join(std::initializer_list<std::string_view> pieces, u32 last = 0)
{
    using Traits = CharTraits<typename S::EncodingType>;
    size_t length = last ? static_cast<size_t>(Traits::GetCodePointLength(last)) : 0;
    for (std::string_view const piece : pieces) length += piece.size();
    typename S::Unit* to;
    S result(static_cast<int>(length), to);
    for (std::string_view const piece : pieces) to = CopyAscii(to, piece.data(), piece.data() + piece.size());
    if (last) Traits::AppendCodePoint(to, last);
    return result;
}

// The digits of a number, kept for the length of a call.
class Digits
{
public:
    explicit Digits(u64 value) : m_begin(WriteDigits(std::end(m_room), value)) {}
    Digits(Digits const&) = delete;
    Digits& operator=(Digits const&) = delete;
    operator std::string_view() const { return {m_begin, static_cast<size_t>(std::end(m_room) - m_begin)}; }

private:
    char m_room[c_digitsRoom];
    char const* m_begin;
};

// A sign, kept likewise; empty for none.
class Sign
{
public:
    Sign(bool negative, SignStyle style) : m_sign(SignOf(negative, style)) {}
    operator std::string_view() const { return {&m_sign, size_t{m_sign != 0}}; }

private:
    char m_sign;
};

// A value of 2^63 and more, which has no fraction, or no number at all; @p unit comes behind it.
template <class S>
S HugeText(double value, SignStyle style, std::string_view unit)
{
    char text[310];
    char const* const end = std::to_chars(text, text + sizeof text, std::fabs(value), std::chars_format::fixed, 0).ptr;
    return Join<S>({Sign(std::signbit(value), style), {text, static_cast<size_t>(end - text)}, unit});
}

bool IsHuge(double value)
{
    return !(std::fabs(value) < c_wholeLimit);
}

} // namespace

template <class S>
S ToStringImperialT(double value, u32 maxDenominator, u32 minDenominator, SignStyle style)
{
    if (IsHuge(value)) return HugeText<S>(value, style, "");
    Parts parts = Divide(std::fabs(value), maxDenominator);
    Reduce(parts, minDenominator);
    Digits const whole(parts.whole), numerator(parts.numerator), denominator(parts.denominator);
    Sign const sign(value < 0 && (parts.whole != 0 || parts.numerator != 0), style);
    if (parts.numerator == 0) return Join<S>({sign, whole});
    if (parts.whole == 0) return Join<S>({sign, numerator, "/", denominator});
    return Join<S>({sign, whole, " ", numerator, "/", denominator});
}

template <class S>
S ToStringImperialSpecialT(double value, SignStyle style)
{
    if (IsHuge(value)) return HugeText<S>(value, style, "");
    Parts const parts = Divide(std::fabs(value), 8);
    Sign const sign(value < 0 && (parts.whole != 0 || parts.numerator != 0), style);
    u32 const fraction = c_eighths[parts.numerator];
    if (parts.whole == 0 && fraction) return Join<S>({sign}, fraction);
    return Join<S>({sign, Digits(parts.whole)}, fraction);
}

bool ToStringImperialWillBeApproximate(double value, u32 maxDenominator, u32 minDenominator, u32 extra)
{
    if (IsHuge(value)) return false;
    Parts parts = Divide(std::fabs(value), maxDenominator);
    Reduce(parts, minDenominator);
    return DoubleTextDetail::HasFraction(parts.fraction * static_cast<double>(parts.denominator) *
                                         std::pow(10.0, extra));
}

bool ToStringImperialSpecialWillBeApproximate(double value, u32 extra)
{
    double whole;
    return DoubleTextDetail::HasFraction(std::pow(10.0, extra) * std::modf(std::fabs(value), &whole) * 8);
}

template <class S>
S ToPicaStringT(double value, u32 precision, u32 width, SignStyle style, TruncateStyle truncate)
{
    double const points = value * 12;
    if (IsHuge(points)) return HugeText<S>(value, SignStyle::None, "p");

    // The points are split as text, so that they show what their own text would show, rounded alike.
    String8 const text = ToString(points, precision, width, style, truncate);
    std::string_view const all = text.GetView();
    std::string_view const wholeText = all.substr(0, all.find('.'));
    std::string_view fraction = all.substr(wholeText.size());
    if (fraction.find_first_not_of(".0") == fraction.npos) fraction = {};
    size_t const first = std::min(wholeText.find_first_of("0123456789"), wholeText.size());
    u64 whole = 0;
    std::from_chars(wholeText.data() + first, wholeText.data() + wholeText.size(), whole);

    bool const negative = wholeText.find('-') != wholeText.npos && whole >= 12;
    Digits const picas(whole / 12), rest(whole % 12);
    Sign const sign(negative, SignStyle::None);
    if (whole % 12 == 0 && fraction.empty()) return Join<S>({sign, picas, "p"});
    return Join<S>({sign, picas, "p", rest, fraction});
}

template KERNEL_API String8 ToStringImperialT<String8>(double, u32, u32, SignStyle);
template KERNEL_API String16 ToStringImperialT<String16>(double, u32, u32, SignStyle);
template KERNEL_API String32 ToStringImperialT<String32>(double, u32, u32, SignStyle);
template KERNEL_API String8 ToStringImperialSpecialT<String8>(double, SignStyle);
template KERNEL_API String16 ToStringImperialSpecialT<String16>(double, SignStyle);
template KERNEL_API String32 ToStringImperialSpecialT<String32>(double, SignStyle);
template KERNEL_API String8 ToPicaStringT<String8>(double, u32, u32, SignStyle, TruncateStyle);
template KERNEL_API String16 ToPicaStringT<String16>(double, u32, u32, SignStyle, TruncateStyle);
template KERNEL_API String32 ToPicaStringT<String32>(double, u32, u32, SignStyle, TruncateStyle);

} // namespace Kernel

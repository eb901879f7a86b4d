#pragma once

#include "libkernel/core/String.h"

#include <concepts>
#include <type_traits>

namespace Kernel {

// Whole numbers as text. Each operation exists as a template over the string type, named with a T, and in a plain form
// that gives a String8, as the template does where no type is named. The text is written once, into a block of its
// final size.

/// What stands before a number that is not negative; zero counts as positive. Negative numbers always show "-".
enum class SignStyle : u32
{
    None = 0,
    Plus = 1,
    Space = 2
};

/// How a text fills a field wider than itself. A narrower field has no effect.
enum class PadStyle : u32
{
    SpacesLeft = 0, ///< Right-aligned; the sign stays against the digits.
    ZerosLeft = 1,  ///< Right-aligned; zeros between sign and digits, with the grouping going on into them.
    SpacesRight = 2 ///< Left-aligned.
};

/// Groups of digits, counted from the right: @p size digits each, with the code unit @p separator between two groups.
/// Size 0 means none.
struct CharacterGrouping
{
    u32 size;
    u32 separator;
};

/// Groups of 3 with ",".
KERNEL_API CharacterGrouping const* CharacterGroupingNumber();
/// Groups of 2 with a space.
KERNEL_API CharacterGrouping const* CharacterGroupingHexBytes();
/// Groups of 4 with a space.
KERNEL_API CharacterGrouping const* CharacterGroupingHexWords();

/// The integer types that show as numbers: all but bool and the wide character types. char shows its number too.
template <class T>
concept TextInteger = std::integral<T> && !std::same_as<T, bool> && !std::same_as<T, char8_t> &&
                      !std::same_as<T, char16_t> && !std::same_as<T, char32_t> && !std::same_as<T, wchar_t>;
template <class T>
concept SignedTextInteger = TextInteger<T> && std::is_signed_v<T>;
template <class T>
concept UnsignedTextInteger = TextInteger<T> && std::is_unsigned_v<T>;

/// What the templates below come down to; the types of integers meet here.
namespace NumberTextDetail {

/// A number split into what the formatters need.
struct Magnitude
{
    u64 value;
    bool negative;
};

template <TextInteger T>
constexpr Magnitude Split(T value)
{
    if constexpr (std::is_signed_v<T>)
        return {value < 0 ? u64{0} - static_cast<u64>(value) : static_cast<u64>(value), value < 0};
    else
        return {static_cast<u64>(value), false};
}

template <class S>
S Decimal(Magnitude number, SignStyle sign, CharacterGrouping const* grouping, int width, PadStyle pad);
template <class S>
S InBase(u64 value, u32 base, int width, PadStyle pad, bool upper);

extern template KERNEL_API String8 Decimal<String8>(Magnitude, SignStyle, CharacterGrouping const*, int, PadStyle);
extern template KERNEL_API String16 Decimal<String16>(Magnitude, SignStyle, CharacterGrouping const*, int, PadStyle);
extern template KERNEL_API String32 Decimal<String32>(Magnitude, SignStyle, CharacterGrouping const*, int, PadStyle);
extern template KERNEL_API String8 InBase<String8>(u64, u32, int, PadStyle, bool);
extern template KERNEL_API String16 InBase<String16>(u64, u32, int, PadStyle, bool);
extern template KERNEL_API String32 InBase<String32>(u64, u32, int, PadStyle, bool);

/// Units that WriteDecimal needs for an integer: more than its text has.
constexpr int c_decimalRoom = 25;

/// Writes the decimal digits of @p number, with "-" if it is negative, to the end of @p room, of c_decimalRoom units;
/// gives the first.
template <class Unit>
Unit* WriteDecimal(Unit* room, Magnitude number);
extern template KERNEL_API char* WriteDecimal<char>(char*, Magnitude);
extern template KERNEL_API char16_t* WriteDecimal<char16_t>(char16_t*, Magnitude);
extern template KERNEL_API unsigned int* WriteDecimal<unsigned int>(unsigned int*, Magnitude);

} // namespace NumberTextDetail

/// Decimal text, grouped if @p grouping is not null.
template <class S, TextInteger T>
S ToStringT(T value, SignStyle sign = SignStyle::None, CharacterGrouping const* grouping = nullptr)
{
    return NumberTextDetail::Decimal<S>(NumberTextDetail::Split(value), sign, grouping, 0, PadStyle::SpacesLeft);
}
template <TextInteger T>
String8 ToString(T value, SignStyle sign = SignStyle::None, CharacterGrouping const* grouping = nullptr)
{
    return ToStringT<String8>(value, sign, grouping);
}

/// Decimal text in a field of @p width units. Signed and unsigned numbers differ in the sign style.
template <class S = String8, SignedTextInteger T>
S ToStringTPadded(T value, int width, PadStyle pad, SignStyle sign = SignStyle::None,
                  CharacterGrouping const* grouping = nullptr)
{
    return NumberTextDetail::Decimal<S>(NumberTextDetail::Split(value), sign, grouping, width, pad);
}
template <class S = String8, UnsignedTextInteger T>
S ToStringTPadded(T value, int width, PadStyle pad, CharacterGrouping const* grouping = nullptr)
{
    return NumberTextDetail::Decimal<S>(NumberTextDetail::Split(value), SignStyle::None, grouping, width, pad);
}
template <SignedTextInteger T>
String8 ToStringPadded(T value, int width, PadStyle pad, SignStyle sign = SignStyle::None,
                       CharacterGrouping const* grouping = nullptr)
{
    return ToStringTPadded<String8>(value, width, pad, sign, grouping);
}
template <UnsignedTextInteger T>
String8 ToStringPadded(T value, int width, PadStyle pad, CharacterGrouping const* grouping = nullptr)
{
    return ToStringTPadded<String8>(value, width, pad, grouping);
}

/// Decimal text in groups of 3 with ",".
template <class S = String8, TextInteger T>
S ToStringTNumber(T value, SignStyle sign = SignStyle::None)
{
    return ToStringT<S>(value, sign, CharacterGroupingNumber());
}
template <TextInteger T>
String8 ToStringNumber(T value, SignStyle sign = SignStyle::None)
{
    return ToStringTNumber<String8>(value, sign);
}

/// Digits in a base of 2 to 36, in lower or upper case; any other base gives the empty string.
template <class S = String8, UnsignedTextInteger T>
S ToStringTBase(T value, u32 base, bool upper)
{
    return NumberTextDetail::InBase<S>(value, base, 0, PadStyle::SpacesLeft, upper);
}
template <UnsignedTextInteger T>
String8 ToStringBase(T value, u32 base, bool upper)
{
    return ToStringTBase<String8>(value, base, upper);
}
/// The same in a field of @p width units. In the plain form a signed number shows the bits of its own width.
template <class S = String8, UnsignedTextInteger T>
S ToStringTBasePadded(T value, u32 base, int width, PadStyle pad, bool upper)
{
    return NumberTextDetail::InBase<S>(value, base, width, pad, upper);
}
template <TextInteger T>
String8 ToStringBase(T value, u32 base, int width, PadStyle pad, bool upper)
{
    return ToStringTBasePadded<String8>(static_cast<std::make_unsigned_t<T>>(value), base, width, pad, upper);
}

/// An address in base 16; padded, in a field of 16 units.
template <class S = String8>
S ToStringTPointer(void const* p, bool upper)
{
    return ToStringTBase<S>(reinterpret_cast<std::uintptr_t>(p), 16, upper);
}
template <class S = String8>
S ToStringTPointerPadded(void const* p, PadStyle pad, bool upper)
{
    return ToStringTBasePadded<S>(reinterpret_cast<std::uintptr_t>(p), 16, 16, pad, upper);
}
inline String8 ToStringPointer(void const* p, bool upper)
{
    return ToStringTPointer<String8>(p, upper);
}
inline String8 ToStringPointerPadded(void const* p, PadStyle pad, bool upper)
{
    return ToStringTPointerPadded<String8>(p, pad, upper);
}

/// Lower-case hexadecimal, zero-filled to at least @p width digits.
template <class S = String8>
S ToStringTUnicode(u32 value, u32 width)
{
    return ToStringTBasePadded<S>(value, 16, static_cast<int>(width < 0x7FFFFFFF ? width : 0x7FFFFFFF),
                                  PadStyle::ZerosLeft, false);
}
inline String8 ToStringUnicode(u32 value, u32 width)
{
    return ToStringTUnicode<String8>(value, width);
}

} // namespace Kernel

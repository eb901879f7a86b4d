#pragma once

#include "libkernel/core/IDTag.h"
#include "libkernel/core/Types.h"

#include <array>
#include <bit>
#include <concepts>
#include <type_traits>

namespace Kernel {

// The wire format of the property stream. Everything is little-endian, and nothing is padded but the aligned data.
//
// File:     header (below), one property list.
// List:     items, then a byte 0. Keys are unique within one list.
// Item:     type byte T, u32 tag, then what T asks for:
//
//   T                     after the tag
//   1..40, 47, 52         the value, c_propSizes[T] bytes
//   same | 0x80           u32 count, count values
//   0x29                  1 byte, 0 or 1
//   0xA9                  u32 count, (count + 7) / 8 bytes; element i is bit i % 8 of byte i / 8
//   0x2A                  u16 code, u16 enum version
//   0xAA                  u32 count, u16 enum version, count u16 codes
//   0x2B                  u32 byte length, UTF-8 bytes
//   0xAB                  u32 total that follows the count, u32 count, then for each string u32 length and its bytes
//   0x2C                  u16 byte size, the bytes
//   0xAC                  u32 count, u16 element size, count * size bytes
//   0x2D                  u32 byte length, the bytes
//   0x30                  u16 version, data stream items, a byte 0
//   0x31                  object record
//   0xB1                  u32 count, count object records
//   0x32                  0 for null; else 1, u32 class, u16 version, list
//   0xB2                  u32 count, u32 class, u16 version, then per element 0 for null; else 1 and a list
//   0x33                  u32 class of the item type, u32 path length, path in UTF-8; both 0 for null
//   0x35..0x74            T - 0x34 bytes
//   0x75                  u16 flag set version, u8 n, the low n bytes of the encoded flags
//   0x76                  u32 total, u32 block size, the bytes
//   0x77                  u32 byte length, u16 pad, pad zero bytes, the bytes
//
// Data stream item: the same without the tag; types 0x30 to 0x33 and 0x75 to 0x77 cannot stand there.
// Object record:    0 null | 1, u32 index, class record, list | 2, u32 index of an object already written
// Class record:     2 none | 1, u32 class, already described | 0, u32 class, u16 version, default items, a byte 0,
// class
//                   record of the parent
//
// File header:
//   offset  size  field
//        0     4  c_serialisedMagic, the bytes 00 FF 4B 53
//        4     2  format version, c_serialisedFormatVersion
//        6     4  IDTag of the kind of file
//       10     2  file version, the caller's
//       12     4  build index; absent in format version 1

constexpr u32 c_serialisedMagic = 0x534BFF00;
constexpr u16 c_serialisedFormatVersion = 2;
constexpr u32 c_serialisedHeaderSize = 16;
constexpr u32 c_serialisedHeaderSizeV1 = 12;

/// Type of a property: the low seven bits of an item's first byte. Values 53 to 116 are raw structs of value - 52
/// bytes. Values above 119 belong to a later format.
enum class PropType : u8
{
    EndOfList = 0,
    UInt8 = 1,
    UInt16 = 2,
    UInt32 = 3,
    UInt64 = 4,
    Int8 = 5,
    Int16 = 6,
    Int32 = 7,
    Int64 = 8,
    Float = 9,
    Double = 10,
    Vector1 = 11,      ///< To 15: 2 to 6 elements of 1 byte.
    Vector2 = 16,      ///< To 20: 2 to 6 elements of 2 bytes.
    Vector4 = 21,      ///< To 25: 2 to 6 elements of 4 bytes.
    Vector8 = 26,      ///< To 30: 2 to 6 elements of 8 bytes.
    OtherVector4 = 31, ///< To 35: the second family, 2 to 6 elements of 4 bytes.
    OtherVector8 = 36, ///< To 40: the second family, 2 to 6 elements of 8 bytes.
    Bool = 41,
    Enum = 42,
    String = 43,
    Custom = 44,
    RawData = 45,
    StringShaped = 46, ///< Read and skipped like String; never written.
    Tag = 47,
    DataStream = 48,
    Object = 49,
    Class = 50,
    DelayLoad = 51,
    UID = 52,
    RawStruct = 52, ///< Plus the size in bytes, 1 to 64.
    FlagSet = 117,
    FragmentedRawData = 118,
    AlignedRawData = 119
};

constexpr u32 c_propTypeCount = 120;
/// Set in the type byte of an array.
constexpr u8 c_propArrayBit = 0x80;
/// Largest raw struct, in bytes.
constexpr u32 c_maxRawStructSize = 64;
/// Largest alignment of aligned raw data.
constexpr u32 c_maxDataAlignment = 8;
/// Type byte, tag and length; and the same with the pad field.
constexpr u32 c_rawDataHeaderSize = 9;
constexpr u32 c_alignedRawDataHeaderSize = 11;

/// First byte of an object record.
enum class ObjectRecord : u8
{
    Null = 0,
    First = 1,
    Back = 2
};

/// First byte of a class record.
enum class ClassRecord : u8
{
    Described = 0, ///< The description follows.
    Known = 1,     ///< Described earlier in the file.
    None = 2       ///< The end of a chain of parents.
};

namespace Internal {

constexpr std::array<u8, c_propTypeCount> MakePropSizes()
{
    std::array<u8, c_propTypeCount> sizes{};
    constexpr u8 scalars[] = {0, 1, 2, 4, 8, 1, 2, 4, 8, 4, 8};
    for (u32 i = 0; i < std::size(scalars); ++i) sizes[i] = scalars[i];
    constexpr u8 widths[] = {1, 2, 4, 8, 4, 8}; // Of the six vector families, five types each.
    for (u32 family = 0; family < std::size(widths); ++family)
        for (u32 n = 2; n <= 6; ++n) sizes[11 + family * 5 + n - 2] = static_cast<u8>(widths[family] * n);
    sizes[41] = 1;
    sizes[47] = 4;
    for (u32 i = 1; i <= c_maxRawStructSize; ++i) sizes[52 + i] = static_cast<u8>(i);
    sizes[52] = 4;
    return sizes;
}

} // namespace Internal

/// Payload size in bytes by type; 0 for the types of variable size. An array of Bool is packed to bits all the same.
inline constexpr std::array<u8, c_propTypeCount> c_propSizes = Internal::MakePropSizes();

static_assert(c_propSizes[10] == 8 && c_propSizes[11] == 2 && c_propSizes[15] == 6 && c_propSizes[20] == 12);
static_assert(c_propSizes[25] == 24 && c_propSizes[30] == 48 && c_propSizes[31] == 8 && c_propSizes[40] == 48);
static_assert(c_propSizes[41] == 1 && c_propSizes[42] == 0 && c_propSizes[46] == 0 && c_propSizes[47] == 4);
static_assert(c_propSizes[51] == 0 && c_propSizes[52] == 4 && c_propSizes[53] == 1 && c_propSizes[116] == 64);
static_assert(c_propSizes[117] == 0 && c_propSizes[119] == 0);

/// Raw struct type of @p size bytes, 1 to 64.
constexpr PropType RawStructType(u64 size)
{
    return static_cast<PropType>(static_cast<u64>(PropType::RawStruct) + size);
}

/// Numbers that a property can hold by themselves: integers of 1 to 8 bytes but for bool and the character types,
/// float and double.
template <class T>
concept PropNumber = (std::integral<T> && !std::same_as<std::remove_cv_t<T>, bool> &&
                      !std::same_as<std::remove_cv_t<T>, char> && !std::same_as<std::remove_cv_t<T>, wchar_t> &&
                      !std::same_as<std::remove_cv_t<T>, char8_t> && !std::same_as<std::remove_cv_t<T>, char16_t> &&
                      !std::same_as<std::remove_cv_t<T>, char32_t>) ||
                     std::same_as<std::remove_cv_t<T>, float> || std::same_as<std::remove_cv_t<T>, double>;

/// The JSON library's value type, with whatever string type; told by its shape, so that its header stays out of ours.
template <class T>
concept JsonValue = requires(T const& value)
{
    typename T::parse_event_t;
    value.dump();
};

/// Values that the scalar and array forms of fixed size take: numbers, tags and class codes.
template <class T>
concept PropValue =
    PropNumber<T> || std::same_as<std::remove_cv_t<T>, IDTag> || std::same_as<std::remove_cv_t<T>, ClassUID>;

template <PropValue T>
constexpr PropType PropTypeOf()
{
    using V = std::remove_cv_t<T>;
    if constexpr (std::same_as<V, IDTag>)
        return PropType::Tag;
    else if constexpr (std::same_as<V, ClassUID>)
        return PropType::UID;
    else if constexpr (std::same_as<V, float>)
        return PropType::Float;
    else if constexpr (std::same_as<V, double>)
        return PropType::Double;
    else {
        constexpr u8 step = sizeof(V) == 1 ? 0 : sizeof(V) == 2 ? 1 : sizeof(V) == 4 ? 2 : 3;
        return static_cast<PropType>((std::is_signed_v<V> ? 5 : 1) + step);
    }
}

/// The number that the bytes of a value make on the wire.
template <PropValue T>
constexpr u64 PropBits(T const& value)
{
    if constexpr (std::integral<T>)
        return static_cast<std::make_unsigned_t<T>>(value);
    else if constexpr (std::same_as<T, float>)
        return std::bit_cast<u32>(value);
    else if constexpr (std::same_as<T, double>)
        return std::bit_cast<u64>(value);
    else
        return value.value;
}

} // namespace Kernel

#pragma once

#include "libkernel/core/Endian.h"
#include "libkernel/core/Types.h"
#include "libkernel/serialisation/PropType.h"

#include <array>

namespace Kernel {

// How the payload of each type is laid out, for all who read or walk a property stream. PropType.h has the format.

enum class WireForm : u8
{
    None,  // The end of a list.
    Fixed, // c_propSizes bytes.
    Bool,
    Enum,
    String,
    Custom,
    RawData,
    FlagSet,
    Fragmented,
    Aligned,
    // From here on not just a header and bytes.
    DataStream,
    Object,
    Class,
    DelayLoad
};

struct WireType
{
    WireForm form = WireForm::Fixed;
    bool hasArray = true;     // Whether the type may have the array bit.
    bool inDataStream = true; // Whether it may stand in a data stream.
};

constexpr std::array<WireType, c_propTypeCount> MakeWireTypes()
{
    std::array<WireType, c_propTypeCount> types{};
    types[0] = {WireForm::None, false, false};
    types[41] = {WireForm::Bool, true, true};
    types[42] = {WireForm::Enum, true, true};
    types[43] = {WireForm::String, true, true};
    types[44] = {WireForm::Custom, true, true};
    types[45] = {WireForm::RawData, false, true};
    types[46] = {WireForm::String, true, false};
    types[48] = {WireForm::DataStream, false, false};
    types[49] = {WireForm::Object, true, false};
    types[50] = {WireForm::Class, true, false};
    types[51] = {WireForm::DelayLoad, false, false};
    types[117] = {WireForm::FlagSet, false, false};
    types[118] = {WireForm::Fragmented, false, false};
    types[119] = {WireForm::Aligned, false, false};
    return types;
}

inline constexpr std::array<WireType, c_propTypeCount> c_wireTypes = MakeWireTypes();

constexpr bool IsWireArray(u8 typeByte)
{
    return (typeByte & c_propArrayBit) != 0;
}
constexpr u8 GetWireType(u8 typeByte)
{
    return typeByte & static_cast<u8>(~c_propArrayBit);
}
/// True if the type exists in this format, with or without its array bit.
constexpr bool IsKnownWireType(u8 typeByte)
{
    return GetWireType(typeByte) < c_propTypeCount;
}
/// True if a property may have this type byte. The type must be known.
constexpr bool IsLegalWireType(u8 typeByte)
{
    WireType const& type = c_wireTypes[GetWireType(typeByte)];
    return type.form != WireForm::None && (type.hasArray || !IsWireArray(typeByte));
}
/// True if an item of a data stream may have this type byte.
constexpr bool IsLegalInDataStream(u8 typeByte)
{
    return IsKnownWireType(typeByte) && IsLegalWireType(typeByte) && c_wireTypes[GetWireType(typeByte)].inDataStream;
}

/// What stands between the tag and the bytes of the forms that are a header and bytes.
struct WireHeader
{
    u64 payload = 0; // Bytes that follow the header.
    u32 count = 0;   // Elements of an array or strings; bytes of a string, block, flags or data without its pad.
    u32 extra = 0;   // Element size of custom blocks, version of enums and flags, total of strings, block size, pad.
};

constexpr u32 c_maxWireHeaderSize = 8;

constexpr u32 GetWireHeaderSize(u8 typeByte)
{
    bool const isArray = IsWireArray(typeByte);
    switch (c_wireTypes[GetWireType(typeByte)].form) {
    case WireForm::Fixed:
    case WireForm::Bool: return isArray ? 4 : 0;
    case WireForm::Enum: return isArray ? 6 : 0;
    case WireForm::String: return isArray ? 8 : 4;
    case WireForm::Custom: return isArray ? 6 : 2;
    case WireForm::RawData: return 4;
    case WireForm::FlagSet: return 3;
    case WireForm::Fragmented: return 8;
    case WireForm::Aligned: return 6;
    default: return 0;
    }
}

/// Decodes the GetWireHeaderSize bytes at @p at. No product here passes 64 bits.
inline WireHeader DecodeWireHeader(u8 typeByte, u8 const* at)
{
    bool const isArray = IsWireArray(typeByte);
    u8 const type = GetWireType(typeByte);
    WireHeader header;
    switch (c_wireTypes[type].form) {
    case WireForm::Fixed:
        header.count = isArray ? LoadLittleEndian<u32>(at) : 1;
        header.payload = u64(header.count) * c_propSizes[type];
        break;
    case WireForm::Bool:
        header.count = isArray ? LoadLittleEndian<u32>(at) : 1;
        header.payload = isArray ? (u64(header.count) + 7) / 8 : 1;
        break;
    case WireForm::Enum:
        header.count = isArray ? LoadLittleEndian<u32>(at) : 1;
        header.extra = isArray ? LoadLittleEndian<u16>(at + 4) : 0;
        header.payload = isArray ? u64(header.count) * 2 : 4;
        break;
    case WireForm::String:
        header.payload = LoadLittleEndian<u32>(at);
        header.count = isArray ? LoadLittleEndian<u32>(at + 4) : static_cast<u32>(header.payload);
        header.extra = isArray ? static_cast<u32>(header.payload) : 0;
        break;
    case WireForm::Custom:
        header.count = isArray ? LoadLittleEndian<u32>(at) : LoadLittleEndian<u16>(at);
        header.extra = isArray ? LoadLittleEndian<u16>(at + 4) : 1;
        header.payload = u64(header.count) * header.extra;
        break;
    case WireForm::RawData: header.payload = header.count = LoadLittleEndian<u32>(at); break;
    case WireForm::FlagSet:
        header.extra = LoadLittleEndian<u16>(at);
        header.payload = header.count = at[2];
        break;
    case WireForm::Fragmented:
        header.payload = header.count = LoadLittleEndian<u32>(at);
        header.extra = LoadLittleEndian<u32>(at + 4);
        break;
    case WireForm::Aligned:
        header.count = LoadLittleEndian<u32>(at);
        header.extra = LoadLittleEndian<u16>(at + 4);
        header.payload = u64(header.count) + header.extra;
        break;
    default: break;
    }
    return header;
}

/// True if the @p total bytes at @p at are exactly @p count strings, each a u32 length and its bytes.
inline bool AreWireTextsSound(u8 const* at, u64 total, u64 count)
{
    u64 left = total;
    for (; count > 0; --count) {
        if (left < 4) return false;
        u32 const length = LoadLittleEndian<u32>(at + (total - left));
        left -= 4;
        if (length > left) return false;
        left -= length;
    }
    return left == 0;
}

} // namespace Kernel

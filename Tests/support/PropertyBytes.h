#pragma once

#include "libkernel/core/IDTag.h"
#include "libkernel/core/Types.h"

#include <string>
#include <string_view>
#include <vector>

namespace Kernel::Test {

/// Bytes from a text: pairs of hexadecimal digits; 'text' as it stands; [Abcd] a tag, which is stored reversed. Spaces
/// and bars separate.
inline std::string Bytes(std::string_view text)
{
    auto const digit = [](char c) { return c <= '9' ? c - '0' : (c | 0x20) - 'a' + 10; };
    std::string result;
    for (size_t i = 0; i < text.size(); ++i) {
        char const c = text[i];
        if (c == ' ' || c == '|' || c == '\n') continue;
        if (c == '[') {
            for (size_t k = 4; k > 0; --k) result += text[i + k];
            i += 5;
        } else if (c == '\'') {
            for (++i; text[i] != '\''; ++i) result += text[i];
        } else {
            result += static_cast<char>(digit(c) << 4 | digit(text[i + 1]));
            ++i;
        }
    }
    return result;
}

/// Bytes in the same notation, so that a failure can be read.
inline std::string Show(std::string_view bytes)
{
    static char const digits[] = "0123456789ABCDEF";
    std::string result;
    for (char const c : bytes) {
        u8 const byte = static_cast<u8>(c);
        result += digits[byte >> 4];
        result += digits[byte & 15];
        result += ' ';
    }
    return result;
}

/// Builds property streams byte by byte, apart from the library's own writer.
class PropertyBytes
{
public:
    PropertyBytes& U8(u8 value)
    {
        bytes.push_back(value);
        return *this;
    }
    PropertyBytes& U16(u16 value) { return U8(static_cast<u8>(value)).U8(static_cast<u8>(value >> 8)); }
    PropertyBytes& U32(u32 value) { return U16(static_cast<u16>(value)).U16(static_cast<u16>(value >> 16)); }
    PropertyBytes& Code(char const (&code)[5]) { return U32(IDTag(code).value); }
    PropertyBytes& Text(std::string_view text)
    {
        bytes.insert(bytes.end(), text.begin(), text.end());
        return *this;
    }
    /// In the notation of Bytes().
    PropertyBytes& Put(std::string_view notation) { return Text(Bytes(notation)); }
    PropertyBytes& Zeros(size_t count)
    {
        bytes.insert(bytes.end(), count, 0);
        return *this;
    }
    PropertyBytes& Append(PropertyBytes const& other)
    {
        bytes.insert(bytes.end(), other.bytes.begin(), other.bytes.end());
        return *this;
    }

    /// Header of format version 2, kind "Test", file version 3, build index 24.
    PropertyBytes& Header(u16 formatVersion = 2)
    {
        U32(0x534BFF00).U16(formatVersion).Code("Test").U16(3);
        return formatVersion >= 2 ? U32(24) : *this;
    }
    /// Type byte and tag of an item.
    PropertyBytes& Item(u8 type, char const (&tag)[5]) { return U8(type).Code(tag); }
    PropertyBytes& U32Item(char const (&tag)[5], u32 value) { return Item(3, tag).U32(value); }
    PropertyBytes& TextItem(char const (&tag)[5], std::string_view text)
    {
        return Item(0x2B, tag).U32(static_cast<u32>(text.size())).Text(text);
    }
    /// Up to the class record of an object's first appearance.
    PropertyBytes& Object(u32 index) { return U8(1).U32(index); }
    PropertyBytes& BackReference(u32 index) { return U8(2).U32(index); }
    PropertyBytes& KnownClass(char const (&uid)[5]) { return U8(1).Code(uid); }
    /// A class without defaults and without a parent.
    PropertyBytes& RootClass(char const (&uid)[5], u16 version = 1) { return U8(0).Code(uid).U16(version).End().U8(2); }
    /// The end of a list.
    PropertyBytes& End() { return U8(0); }

    std::vector<u8> bytes;
};

} // namespace Kernel::Test

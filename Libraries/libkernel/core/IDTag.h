#pragma once

#include "libkernel/core/Types.h"

#include <compare>
#include <functional>

namespace Kernel {

/// A four-character code: the first character in the high byte, so the code written Item is 0x4974656D. Written to
/// streams as a little-endian number, so that its characters lie reversed in a file.
struct IDTag
{
    unsigned int value = 0;

    constexpr IDTag() = default;
    constexpr explicit IDTag(unsigned int v) : value(v) {}
    /// From a literal of exactly four characters: IDTag("Item").
    constexpr IDTag(char const (&text)[5])
        : value(static_cast<u32>(static_cast<u8>(text[0])) << 24 | static_cast<u32>(static_cast<u8>(text[1])) << 16 |
                static_cast<u32>(static_cast<u8>(text[2])) << 8 | static_cast<u32>(static_cast<u8>(text[3])))
    {
    }
    friend constexpr auto operator<=>(IDTag const&, IDTag const&) = default;
};

/// The four-character code of a class that can be saved; the same form as IDTag, but never mixed up with one.
struct ClassUID
{
    unsigned int value = 0;

    constexpr ClassUID() = default;
    constexpr explicit ClassUID(unsigned int v) : value(v) {}
    constexpr ClassUID(char const (&text)[5]) : value(IDTag(text).value) {}
    friend constexpr auto operator<=>(ClassUID const&, ClassUID const&) = default;
};

} // namespace Kernel

template <>
struct std::hash<Kernel::IDTag>
{
    size_t operator()(Kernel::IDTag t) const { return t.value * 0x9E3779B97F4A7C15ull >> 32; }
};
template <>
struct std::hash<Kernel::ClassUID>
{
    size_t operator()(Kernel::ClassUID t) const { return t.value * 0x9E3779B97F4A7C15ull >> 32; }
};

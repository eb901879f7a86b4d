#pragma once

#include "libkernel/core/IDTag.h"
#include "libkernel/core/String.h"

#include <array>
#include <functional>

namespace Kernel {

class InSerialiser;
class OutSerialiser;

/// A 16-byte identifier with the field order of a GUID: a 32-bit number, two 16-bit numbers, 8 bytes; the numbers are
/// little-endian. A plain value.
class KERNEL_API Uuid
{
public:
    static Uuid const Null; ///< All zero.

    /// A fresh random identifier, version 4 of RFC 9562, not a null one. Null only if the system has no random bytes.
    Uuid();
    /// From the 36-character form without braces, in either case. Null on any other text.
    explicit Uuid(char const* text);
    explicit Uuid(String8 const& text);

    /// Takes the value of the 36-character form. False, with the value unchanged, on any other text.
    bool Parse(String8 const& text);
    /// The 36-character form, in upper case.
    String8 ToString() const;

    bool IsNull() const { return *this == Null; }
    std::array<u8, 16> const& GetBytes() const { return m_bytes; }

    friend bool operator==(Uuid const&, Uuid const&) = default;
    /// The order of the texts, which is not that of the bytes.
    friend KERNEL_API bool operator<(Uuid const& a, Uuid const& b);

    /// The 16 bytes as one raw struct property. Load is false, with the value unchanged, if there is no such property.
    void Save(OutSerialiser& out, IDTag const& tag) const;
    bool Load(InSerialiser const& in, IDTag const& tag);

private:
    struct NullTag
    {
    };
    constexpr explicit Uuid(NullTag) {}

    std::array<u8, 16> m_bytes{};
};

} // namespace Kernel

template <>
struct KERNEL_API std::hash<Kernel::Uuid>
{
    size_t operator()(Kernel::Uuid const& id) const;
};

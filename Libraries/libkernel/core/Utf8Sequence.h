#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// One code point with its bytes in UTF-8. A plain value.
///
/// The form is the older, wider one of RFC 2279: values above 0x1FFFFF take 5 or 6 bytes, and neither overlong forms
/// nor surrogates are refused.
class KERNEL_API Utf8Sequence
{
public:
    /// Invalid: no bytes.
    Utf8Sequence() = default;
    /// As Set() makes it.
    explicit Utf8Sequence(u32 codePoint) { Set(codePoint); }

    /// Takes a code point. False, and invalid afterwards, above 0x7FFFFFFF.
    bool Set(u32 codePoint);
    /// Takes the code point that begins at @p text, which is borrowed for the call, and gives the bytes read: 1 for
    /// ASCII, the terminator included, otherwise 2 to 4. A byte that leads no sequence and a sequence without its
    /// continuation bytes give 0, and the object is invalid afterwards; nothing behind a terminator is read.
    int Set(char const* text);

    /// 0 while invalid.
    u32 GetValue() const { return m_value; }
    /// The bytes, terminated; they live as long as this object.
    char const* GetSequence() const { return m_bytes; }
    /// 1 to 6; 0 while invalid.
    int GetSequenceSize() const { return m_size; }
    bool IsValid() const { return m_size != 0; }

    /// True if the bytes are those of @p text up to its terminator. An invalid sequence equals nothing.
    bool Equals(char const* text) const;
    /// True if the bytes are the @p size bytes at @p text. An invalid sequence equals nothing.
    bool Equals(char const* text, u64 size) const;

private:
    static constexpr int c_longest = 6;

    u32 m_value = 0;
    int m_size = 0; // Bytes; 0 means invalid.
    char m_bytes[c_longest + 1] = {};
};

} // namespace Kernel

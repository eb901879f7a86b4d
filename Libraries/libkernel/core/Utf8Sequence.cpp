#include "libkernel/core/Utf8Sequence.h"

#include <cstring>

namespace Kernel {
namespace {

struct Form
{
    u32 last; // Highest code point of this many bytes.
    u8 lead;  // The lead byte without its part of the value.
    u8 mask;  // The bits of the lead byte that tell the form.
};

constexpr Form c_forms[] = {
    {0x7F, 0x00, 0x80},     {0x7FF, 0xC0, 0xE0},     {0xFFFF, 0xE0, 0xF0},
    {0x1FFFFF, 0xF0, 0xF8}, {0x3FFFFFF, 0xF8, 0xFC}, {0x7FFFFFFF, 0xFC, 0xFE},
};
constexpr int c_readForms = 4; // Longer ones are written, but not read.

} // namespace

bool Utf8Sequence::Set(u32 codePoint)
{
    *this = {};
    int n = 0;
    while (codePoint > c_forms[n].last)
        if (++n == c_longest) return false;
    m_value = codePoint;
    m_size = n + 1;
    for (int i = n; i > 0; --i, codePoint >>= 6) m_bytes[i] = static_cast<char>(0x80 | (codePoint & 0x3F));
    m_bytes[0] = static_cast<char>(c_forms[n].lead | codePoint);
    return true;
}

int Utf8Sequence::Set(char const* text)
{
    *this = {};
    u8 const lead = static_cast<u8>(text[0]);
    int n = 0;
    while ((lead & c_forms[n].mask) != c_forms[n].lead)
        if (++n == c_readForms) return 0;
    u32 value = lead & static_cast<u8>(~c_forms[n].mask);
    for (int i = 1; i <= n; ++i) {
        u8 const tail = static_cast<u8>(text[i]); // A terminator is no continuation, so this never goes past it.
        if ((tail & 0xC0) != 0x80) return 0;
        value = value << 6 | (tail & 0x3F);
    }
    m_value = value;
    m_size = n + 1;
    std::memcpy(m_bytes, text, static_cast<size_t>(m_size));
    return m_size;
}

bool Utf8Sequence::Equals(char const* text) const
{
    return Equals(text, std::strlen(text));
}

bool Utf8Sequence::Equals(char const* text, u64 size) const
{
    return IsValid() && size == static_cast<u64>(m_size) && std::memcmp(m_bytes, text, size) == 0;
}

} // namespace Kernel

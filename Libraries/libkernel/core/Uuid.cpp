#include "libkernel/core/Uuid.h"

#include "libkernel/core/Hash.h"
#include "libkernel/platform/Random.h"

namespace Kernel {

namespace {

constexpr int c_textLength = 36;

// Which byte each pair of digits stands for; the three numbers in front are little-endian in memory and read from their
// high end in the text. -1 is a hyphen.
constexpr int c_order[] = {3, 2, 1, 0, -1, 5, 4, -1, 7, 6, -1, 8, 9, -1, 10, 11, 12, 13, 14, 15};

int DigitValue(char c)
{
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

} // namespace

constinit Uuid const Uuid::Null{Uuid::NullTag{}};

Uuid::Uuid()
{
    if (!Platform::RandomBytes(m_bytes.data(), m_bytes.size())) {
        m_bytes = {};
        return;
    }
    // Version 4 in the high byte of the third number, and the variant of the RFC.
    m_bytes[7] = static_cast<u8>((m_bytes[7] & 0x0F) | 0x40);
    m_bytes[8] = static_cast<u8>((m_bytes[8] & 0x3F) | 0x80);
}

Uuid::Uuid(char const* text) : Uuid(String8(text)) {}

Uuid::Uuid(String8 const& text) : Uuid(NullTag{})
{
    Parse(text);
}

bool Uuid::Parse(String8 const& text)
{
    if (text.GetLength() != c_textLength) return false;
    char const* at = text.GetData();
    std::array<u8, 16> bytes{};
    for (int place : c_order) {
        if (place < 0) {
            if (*at++ != '-') return false;
            continue;
        }
        int const high = DigitValue(at[0]);
        int const low = DigitValue(at[1]);
        if (high < 0 || low < 0) return false;
        bytes[static_cast<size_t>(place)] = static_cast<u8>(high * 16 + low);
        at += 2;
    }
    m_bytes = bytes;
    return true;
}

String8 Uuid::ToString() const
{
    String8 text;
    char* out = text.SetLength(c_textLength);
    for (int place : c_order) {
        if (place < 0) {
            *out++ = '-';
            continue;
        }
        u8 const byte = m_bytes[static_cast<size_t>(place)];
        *out++ = "0123456789ABCDEF"[byte >> 4];
        *out++ = "0123456789ABCDEF"[byte & 15];
    }
    return text;
}

// Upper-case digits sort as their values do, so the bytes in the order of the text decide as the texts would.
bool operator<(Uuid const& a, Uuid const& b)
{
    for (int place : c_order) {
        if (place < 0) continue;
        auto const i = static_cast<size_t>(place);
        if (a.m_bytes[i] != b.m_bytes[i]) return a.m_bytes[i] < b.m_bytes[i];
    }
    return false;
}

} // namespace Kernel

size_t std::hash<Kernel::Uuid>::operator()(Kernel::Uuid const& id) const
{
    Kernel::HashAccumulator hash;
    hash.AddToHash(id.GetBytes().data(), id.GetBytes().size());
    return hash.GetHash();
}

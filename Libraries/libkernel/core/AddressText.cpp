#include "libkernel/core/AddressText.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/UnicodeClasses.h"

#include <limits>
#include <new>

namespace Kernel {
namespace {

// ASCII letters and digits, and the characters of a list.
class ByteSet
{
public:
    consteval explicit ByteSet(std::string_view others)
    {
        for (int c = 0; c < 26; ++c) m_has['A' + c] = m_has['a' + c] = true;
        for (int c = '0'; c <= '9'; ++c) m_has[c] = true;
        for (char const c : others) m_has[static_cast<u8>(c)] = true;
    }
    constexpr bool Contains(char c) const { return m_has[static_cast<u8>(c)]; }

private:
    bool m_has[256] = {};
};

constexpr ByteSet c_url("!#$%&'()*+,-./:;=?@[]_~");
constexpr ByteSet c_mailLocal("!#$%'*+-/=?^_'{|}~");
constexpr ByteSet c_mailQuery("!#$%'*+-/=^_'{|}~&?.");
constexpr int c_mailLocalMost = 63;

bool IsHexDigit(char c)
{
    return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'F') || (c >= 'a' && c <= 'f');
}

// The "@" that ends the local part, or -1.
int FindMailDomain(String8 const& text)
{
    int const last = text.GetLength() - 1;
    for (int i = 0; i <= last; ++i) {
        char const c = text[i];
        if (c == '@') return i <= c_mailLocalMost ? i : -1;
        if (i == last) return -1;
        bool const isFine = c == '.' ? i > 0 && text[i + 1] != '.' && text[i + 1] != '@' : c_mailLocal.Contains(c);
        if (!isFine) return -1;
    }
    return -1;
}

bool IsMailQuery(String8 const& text, int i)
{
    for (; i < text.GetLength(); ++i)
        if (!c_mailQuery.Contains(text[i])) return false;
    return true;
}

bool IsMailDomain(String8 const& text, int i)
{
    // The terminator stands behind the last byte, so the byte one behind may always be looked at.
    int const length = text.GetLength();
    bool hasDot = false;
    bool hasLetter = false; // In this label; a hyphen counts.
    for (; i < length; ++i) {
        char const c = text[i];
        bool const isLast = i == length - 1;
        if (c == '.') {
            if (!hasLetter || isLast || text[i + 1] == '@' || text[i + 1] == '.') return false;
            hasDot = true;
            hasLetter = false;
        } else if (c == '-') {
            if (isLast || text[i + 2] == '.') return false;
            hasLetter = true;
        } else if (c == '?')
            return hasDot && IsMailQuery(text, i + 1);
        else if (IsAlpha(static_cast<u8>(c)))
            hasLetter = true;
    }
    return hasDot;
}

} // namespace

String8 EscapeURLForPDFLib(String8 const& url)
{
    u64 length = 0;
    for (char const c : url) length += c_url.Contains(c) ? 1 : 3;
    if (length == static_cast<u64>(url.GetLength())) return url;
    if (length > static_cast<u64>(std::numeric_limits<i32>::max())) throw std::bad_alloc();
    char* to;
    String8 escaped(static_cast<int>(length), to);
    for (char const c : url) {
        if (c_url.Contains(c)) {
            *to++ = c;
            continue;
        }
        constexpr char digits[] = "0123456789ABCDEF";
        *to++ = '%';
        *to++ = digits[static_cast<u8>(c) >> 4];
        *to++ = digits[static_cast<u8>(c) & 0xF];
    }
    return escaped;
}

bool IsValidURLForPDFLib(String8 const& url)
{
    for (char const* p = url.begin(); p < url.end(); ++p) {
        if (!c_url.Contains(*p)) return false;
        if (*p == '%' && (url.end() - p < 3 || !IsHexDigit(p[1]) || !IsHexDigit(p[2]))) return false;
    }
    return true;
}

bool HasUriProtocol(String8 const& text)
{
    int const colon = text.Find(':');
    if (colon < 0 || !CharTraits<TEncUtf8>::IsValid(text.GetData(), colon, true)) return false;
    for (char const* p = text.begin(); p < text.begin() + colon;)
        if (!IsAlnum(CharTraits<TEncUtf8>::NextCodePoint(p))) return false;
    return true;
}

bool IsValidEmail(String8 const& text)
{
    int const at = FindMailDomain(text);
    return at >= 0 && IsMailDomain(text, at + 1);
}

} // namespace Kernel

#include "libkernel/core/TextTools.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/UnicodeClasses.h"

#include <limits>
#include <new>

namespace Kernel {
namespace {

constexpr char c_ellipsis[] = "\xE2\x80\xA6"; // U+2026

char const* GetEntity(u32 unit)
{
    switch (unit) {
    case '&': return "&amp;";
    case '<': return "&lt;";
    case '>': return "&gt;";
    case '"': return "&quot;";
    case '\'': return "&apos;";
    }
    return nullptr;
}

template <class Enc>
StringT<Enc> EscapedXml(typename Enc::Unit const* begin, typename Enc::Unit const* end)
{
    using Unit = typename Enc::Unit;
    u64 length = 0;
    for (Unit const* p = begin; p < end; ++p) {
        char const* const entity = GetEntity(static_cast<std::make_unsigned_t<Unit>>(*p));
        length += entity ? std::strlen(entity) : 1;
    }
    if (length > static_cast<u64>(std::numeric_limits<i32>::max())) throw std::bad_alloc();
    Unit* to;
    StringT<Enc> text(static_cast<int>(length), to);
    for (Unit const* p = begin; p < end; ++p) {
        char const* entity = GetEntity(static_cast<std::make_unsigned_t<Unit>>(*p));
        if (!entity)
            *to++ = *p;
        else
            while (*entity) *to++ = static_cast<Unit>(*entity++);
    }
    return text;
}

// Units of the code point at @p i; those that are left where it is cut short.
int WholeLength(String8 const& text, int i)
{
    return std::min(CharTraits<TEncUtf8>::GetCodePointLength(text[i]), text.GetLength() - i);
}

bool IsSpaceAt(String8 const& text, int i, int length)
{
    char const* p = text.GetData() + i;
    return CharTraits<TEncUtf8>::GetCodePointLength(*p) == length && IsSpace(CharTraits<TEncUtf8>::NextCodePoint(p));
}

} // namespace

String8 CanonicaliseLineEnds(String8 const& text)
{
    char const* p = text.GetData();
    char const* const end = text.end();
    int const firstReturn = text.Find('\r');
    if (firstReturn < 0) return text;
    // An LF in front of the first CR goes with it.
    p += firstReturn > 0 && p[firstReturn - 1] == '\n' ? firstReturn - 1 : firstReturn;
    int const kept = static_cast<int>(p - text.GetData());
    char* units;
    String8 result(text.GetLength(), units);
    CharTraits<TEncUtf8>::Copy(units, text.GetData(), kept);
    char* to = units + kept;
    while (p < end) {
        char const c = *p++;
        bool const isLineEnd = c == '\r' || c == '\n';
        *to++ = isLineEnd ? '\n' : c;
        if (isLineEnd && p < end && *p == (c == '\r' ? '\n' : '\r')) ++p;
    }
    result.SetLength(static_cast<int>(to - units));
    return result;
}

void ApplyMaxWordCount(String8& text, int count, bool ellipsis)
{
    if (count <= 0) return;
    bool inWord = false;
    for (int i = 0, length; i < text.GetLength(); i += length) {
        length = WholeLength(text, i);
        bool const isSpace = IsSpaceAt(text, i, length);
        if (inWord && isSpace && --count == 0) {
            text.SetLength(i);
            if (ellipsis) text += c_ellipsis;
            return;
        }
        inWord = !isSpace;
    }
}

String8 EscapeXml(char const* begin, char const* end)
{
    return EscapedXml<TEncUtf8>(begin, end);
}

String16 EscapeXml(char16_t const* begin, char16_t const* end)
{
    return EscapedXml<TEncUtf16>(begin, end);
}

String32 EscapeXml(unsigned int const* begin, unsigned int const* end)
{
    return EscapedXml<TEncUtf32>(begin, end);
}

} // namespace Kernel

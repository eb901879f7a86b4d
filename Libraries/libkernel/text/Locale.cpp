#include "libkernel/text/Locale.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"

#include <unicode/uloc.h>

namespace Kernel {

namespace {

// The identifier may come from a file, and the conversion trusts its input: text that isn't UTF-8 ends where it stops
// being so.
String16 ToUtf16(String8 const& id)
{
    String16 result;
    int const valid = CharTraits<TEncUtf8>::GetValidLength(id.GetData(), id.GetLength(), true);
    ConvertEnc<TEncUtf16, TEncUtf8>(result, id.GetData(), valid);
    return result;
}

} // namespace

Locale::Locale(String8 const& id) : m_id(id), m_id16(ToUtf16(id)) {}

Locale::~Locale() = default;

Counted<Locale const> Locale::Create(String8 const& id)
{
    return Counted<Locale const>(new Locale(id));
}

Counted<Locale const> Locale::GetCurrent()
{
    char tag[ULOC_FULLNAME_CAPACITY];
    UErrorCode status = U_ZERO_ERROR;
    int const length = uloc_toLanguageTag(uloc_getDefault(), tag, sizeof tag, false, &status);
    bool const fits = U_SUCCESS(status) && length > 0 && length < static_cast<int>(sizeof tag);
    return Create(fits ? String8(tag, length) : String8());
}

String8 Locale::GetISOCode() const
{
    int const hyphen = m_id.Find('-');
    return hyphen < 0 ? m_id : m_id.GetSubstring(0, hyphen);
}

u16 Locale::GetEncodedLanguage() const
{
    return m_id.GetLength() < 2 ? u16{0} : EncodeLanguage(m_id[0], m_id[1]);
}

bool Locale::IsEqual(Locale const& other, double) const
{
    return this == &other || (GetEncodedLanguage() == other.GetEncodedLanguage() && m_id == other.m_id);
}

} // namespace Kernel

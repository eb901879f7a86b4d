#include "libkernel/text/Collator.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/MemoryHeadroom.h"
#include "libkernel/text/Locale.h"

#include <unicode/ucol.h>

namespace Kernel {

namespace {

UCollator* Open(char const* locale)
{
    RequireMemory(c_icuHeadroom);
    UErrorCode status = U_ZERO_ERROR;
    UCollator* const collator = ucol_open(locale, &status);
    if (U_SUCCESS(status)) return collator;
    ucol_close(collator);
    return nullptr;
}

void SetAttribute(UCollator* collator, UColAttribute attribute, UColAttributeValue value)
{
    UErrorCode status = U_ZERO_ERROR;
    if (collator) ucol_setAttribute(collator, attribute, value, &status);
}

} // namespace

Collator::Collator(Counted<Locale const> const& locale, bool caseSensitive, bool numeric)
    : m_collator(Open(locale ? locale->GetId().GetData() : "")), m_caseSensitive(caseSensitive)
{
    SetCaseSensitive(caseSensitive);
    SetNumericOrdering(numeric);
}

Collator::~Collator()
{
    ucol_close(m_collator);
}

void Collator::SetCaseSensitive(bool caseSensitive)
{
    m_caseSensitive = caseSensitive;
    SetAttribute(m_collator, UCOL_STRENGTH, caseSensitive ? UCOL_TERTIARY : UCOL_SECONDARY);
}

void Collator::SetNumericOrdering(bool numeric)
{
    SetAttribute(m_collator, UCOL_NUMERIC_COLLATION, numeric ? UCOL_ON : UCOL_OFF);
}

int Collator::Collate(String8 const& a, String8 const& b) const
{
    if (m_collator) {
        UErrorCode status = U_ZERO_ERROR;
        return ucol_strcollUTF8(m_collator, a.GetData(), a.GetLength(), b.GetData(), b.GetLength(), &status);
    }
    return m_caseSensitive
               ? a.Compare(b)
               : CharTraits<TEncUtf8>::CompareNoCase(a.GetData(), a.GetLength(), b.GetData(), b.GetLength());
}

} // namespace Kernel

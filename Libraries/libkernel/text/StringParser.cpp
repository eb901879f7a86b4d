#include "libkernel/text/StringParser.h"

#include "libkernel/core/MemoryHeadroom.h"
#include "libkernel/text/internal/IcuLocale.h"

#include <memory>
#include <unicode/fmtable.h>
#include <unicode/numfmt.h>

namespace Kernel {
namespace {

bool Parse(String8 const& text, Counted<Locale const> const& locale, icu::Formattable& number)
{
    RequireMemory(c_icuHeadroom);
    UErrorCode status = U_ZERO_ERROR;
    std::unique_ptr<icu::NumberFormat> const format(icu::NumberFormat::createInstance(ToIcuLocale(locale), status));
    if (U_FAILURE(status) || !format) return false;
    format->parse(icu::UnicodeString::fromUTF8({text.GetData(), text.GetLength()}), number, status);
    return U_SUCCESS(status);
}

} // namespace

bool StringParser::ParseAsDouble(String8 const& text, Counted<Locale const> const& locale, double& value)
{
    icu::Formattable number(0, icu::Formattable::kIsDate); // No number, should ICU leave it alone and report nothing.
    if (!Parse(text, locale, number)) return false;
    UErrorCode status = U_ZERO_ERROR;
    double const result = number.getDouble(status);
    if (U_SUCCESS(status)) value = result;
    return U_SUCCESS(status);
}

bool StringParser::ParseAsLong(String8 const& text, Counted<Locale const> const& locale, long& value)
{
    icu::Formattable number(0, icu::Formattable::kIsDate);
    if (!Parse(text, locale, number)) return false;
    UErrorCode status = U_ZERO_ERROR;
    long const result = number.getLong(status);
    if (U_SUCCESS(status)) value = result;
    return U_SUCCESS(status);
}

} // namespace Kernel

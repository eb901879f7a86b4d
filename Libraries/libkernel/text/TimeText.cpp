#include "libkernel/text/TimeText.h"

#include "libkernel/core/ConvertEnc.h"
#include "libkernel/text/internal/IcuLocale.h"

#include <cstdio>
#include <cstring>
#include <ctime>
#include <memory>
#include <unicode/datefmt.h>
#include <unicode/timezone.h>

namespace Kernel {
namespace {

constexpr size_t c_textSize = 256; // Units, the terminator among them.
constexpr char c_millisPlace[] = ".\?\?\?";

// What strftime takes, by style; high resolution has a place for the milliseconds.
struct StyleFormats
{
    char const* local;
    char const* utc;
    char const* localMillis;
    char const* utcMillis;
};

constexpr StyleFormats c_formats[] = {
    {"%c", "%c", "%c", "%c"},
    {"%x", "%x", "%x", "%x"},
    {"%X", "%X", "%X", "%X"},
    {"%FT%T%z", "%FT%TZ", "%FT%T.\?\?\?%z", "%FT%T.\?\?\?Z"},
};
constexpr u32 c_iso8601 = 3;

StyleFormats const* FormatsOf(TimeStampStyle style)
{
    auto const row = static_cast<u32>(style);
    return row < std::size(c_formats) ? &c_formats[row] : nullptr;
}

using FormatPtr = std::unique_ptr<icu::DateFormat>;

FormatPtr MakeFormat(TimeStampStyle style, icu::Locale const& locale)
{
    constexpr auto medium = icu::DateFormat::kMedium;
    switch (style) {
    case TimeStampStyle::DateTime: return FormatPtr(icu::DateFormat::createDateTimeInstance(medium, medium, locale));
    case TimeStampStyle::Date: return FormatPtr(icu::DateFormat::createDateInstance(medium, locale));
    case TimeStampStyle::Time: return FormatPtr(icu::DateFormat::createTimeInstance(medium, locale));
    default: return nullptr;
    }
}

template <class S>
S Apply(FormatPtr const& format, TimeStamp const& stamp, TimeStampLocale zone)
{
    if (!format) return S();
    if (zone != TimeStampLocale::Local) format->setTimeZone(*icu::TimeZone::getGMT());
    icu::UnicodeString text;
    format->format(static_cast<double>(stamp.GetValue()) * 1000.0, text);
    S result;
    ConvertEnc<typename S::EncodingType, TEncUtf16>(result, text.getBuffer(), text.length());
    return result;
}

} // namespace

template <class S>
S ToStringT(TimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone)
{
    StyleFormats const* const formats = FormatsOf(style);
    if (!formats) return S();
    std::tm const fields = stamp.GetAsStructTm(zone);
    char text[c_textSize];
    size_t const length =
        std::strftime(text, sizeof text, zone == TimeStampLocale::Local ? formats->local : formats->utc, &fields);
    return ConvertedTo<typename S::EncodingType>(String8(text, static_cast<int>(length)));
}

template <class S>
S ToStringT(HighResTimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone)
{
    StyleFormats const* const formats = FormatsOf(style);
    if (!formats) return S();
    std::tm const fields = stamp.GetAsStructTm(zone);
    char text[c_textSize];
    size_t const length = std::strftime(
        text, sizeof text, zone == TimeStampLocale::Local ? formats->localMillis : formats->utcMillis, &fields);
    text[length] = 0;
    if (char* const place = std::strstr(text, c_millisPlace)) {
        char digits[8];
        std::snprintf(digits, sizeof digits, "%03d", stamp.GetMillis());
        std::memcpy(place + 1, digits, 3);
    }
    return ConvertedTo<typename S::EncodingType>(String8(text, static_cast<int>(length)));
}

template <class S>
S ToStringWithLocaleT(TimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone,
                      Counted<Locale const> const& locale)
{
    if (static_cast<u32>(style) == c_iso8601) return ToStringT<S>(stamp, style, zone);
    return Apply<S>(MakeFormat(style, ToIcuLocale(locale)), stamp, zone);
}

template <class S>
S ToStringWithLocaleT(TimeStamp const& stamp, char const* skeleton, TimeStampLocale zone,
                      Counted<Locale const> const& locale)
{
    if (!skeleton) return S();
    UErrorCode status = U_ZERO_ERROR;
    FormatPtr const format(icu::DateFormat::createInstanceForSkeleton(icu::UnicodeString::fromUTF8(skeleton),
                                                                      ToIcuLocale(locale), status));
    return U_SUCCESS(status) ? Apply<S>(format, stamp, zone) : S();
}

template KERNEL_API String8 ToStringT<String8>(TimeStamp const&, TimeStampStyle, TimeStampLocale);
template KERNEL_API String16 ToStringT<String16>(TimeStamp const&, TimeStampStyle, TimeStampLocale);
template KERNEL_API String32 ToStringT<String32>(TimeStamp const&, TimeStampStyle, TimeStampLocale);
template KERNEL_API String8 ToStringT<String8>(HighResTimeStamp const&, TimeStampStyle, TimeStampLocale);
template KERNEL_API String16 ToStringT<String16>(HighResTimeStamp const&, TimeStampStyle, TimeStampLocale);
template KERNEL_API String32 ToStringT<String32>(HighResTimeStamp const&, TimeStampStyle, TimeStampLocale);
template KERNEL_API String8 ToStringWithLocaleT<String8>(TimeStamp const&, TimeStampStyle, TimeStampLocale,
                                                         Counted<Locale const> const&);
template KERNEL_API String16 ToStringWithLocaleT<String16>(TimeStamp const&, TimeStampStyle, TimeStampLocale,
                                                           Counted<Locale const> const&);
template KERNEL_API String32 ToStringWithLocaleT<String32>(TimeStamp const&, TimeStampStyle, TimeStampLocale,
                                                           Counted<Locale const> const&);
template KERNEL_API String8 ToStringWithLocaleT<String8>(TimeStamp const&, char const*, TimeStampLocale,
                                                         Counted<Locale const> const&);
template KERNEL_API String16 ToStringWithLocaleT<String16>(TimeStamp const&, char const*, TimeStampLocale,
                                                           Counted<Locale const> const&);
template KERNEL_API String32 ToStringWithLocaleT<String32>(TimeStamp const&, char const*, TimeStampLocale,
                                                           Counted<Locale const> const&);

} // namespace Kernel

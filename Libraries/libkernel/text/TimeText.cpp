#include "libkernel/text/TimeText.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/MemoryHeadroom.h"
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

// What strftime makes of a format; empty if it does not fit.
class Printed
{
public:
    Printed(char const* format, std::tm const& fields)
    {
        if (std::strftime(m_text, sizeof m_text, format, &fields) == 0) m_text[0] = 0;
    }

    void FillInMillis(u16 millis)
    {
        char* const place = std::strstr(m_text, c_millisPlace);
        if (!place) return;
        char digits[8];
        std::snprintf(digits, sizeof digits, "%03d", millis);
        std::memcpy(place + 1, digits, 3);
    }

    // The host's locale may have another encoding than UTF-8, which the conversion must not be given.
    template <class S>
    S As() const
    {
        int const length = static_cast<int>(std::strlen(m_text));
        int const valid = CharTraits<TEncUtf8>::GetValidLength(m_text, length, false);
        return ConvertedTo<typename S::EncodingType>(String8(m_text, valid));
    }

private:
    char m_text[c_textSize];
};

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
    Printed const text(zone == TimeStampLocale::Local ? formats->local : formats->utc, stamp.GetAsStructTm(zone));
    return text.As<S>();
}

template <class S>
S ToStringT(HighResTimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone)
{
    StyleFormats const* const formats = FormatsOf(style);
    if (!formats) return S();
    Printed text(zone == TimeStampLocale::Local ? formats->localMillis : formats->utcMillis, stamp.GetAsStructTm(zone));
    text.FillInMillis(stamp.GetMillis());
    return text.As<S>();
}

template <class S>
S ToStringWithLocaleT(TimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone,
                      Counted<Locale const> const& locale)
{
    if (static_cast<u32>(style) == c_iso8601) return ToStringT<S>(stamp, style, zone);
    RequireMemory(c_icuHeadroom);
    return Apply<S>(MakeFormat(style, ToIcuLocale(locale)), stamp, zone);
}

template <class S>
S ToStringWithLocaleT(TimeStamp const& stamp, char const* skeleton, TimeStampLocale zone,
                      Counted<Locale const> const& locale)
{
    if (!skeleton) return S();
    RequireMemory(c_icuHeadroom);
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

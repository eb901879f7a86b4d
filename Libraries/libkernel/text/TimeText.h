#pragma once

#include "libkernel/concurrency/TimeStamp.h"
#include "libkernel/text/Locale.h"

namespace Kernel {

// Moments as text. Each operation exists as a template over the string type and in a plain form that gives a String8.
// All take the civil time of @p zone; see TimeStampLocale. Any thread.

enum class TimeStampStyle : u32
{
    DateTime = 0,
    Date = 1,
    Time = 2,
    Iso8601 = 3 ///< "2020-02-29T12:30:45+0100", or with "Z" for UTC; high resolution has ".678" before the zone.
};

/// By the C library's strftime, with the formats "%c", "%x" and "%X" of the C library's locale for the first three
/// styles. Empty for any other style, and for a text of 256 units or more; cut where it stops being UTF-8.
template <class S>
S ToStringT(TimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone);
template <class S>
S ToStringT(HighResTimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone);
inline String8 ToString(TimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone)
{
    return ToStringT<String8>(stamp, style, zone);
}
inline String8 ToString(HighResTimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone)
{
    return ToStringT<String8>(stamp, style, zone);
}

/// By the user's language: ICU's medium styles; style 3 is that of ToString. Local means ICU's default zone. Null
/// @p locale means Locale::GetCurrent(). Empty if ICU fails and for any other style. Slow: about 0.1 ms.
template <class S>
S ToStringWithLocaleT(TimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone,
                      Counted<Locale const> const& locale);
/// The same by a skeleton of ICU's date patterns, such as "yMMMd", which ICU orders as the language does; null gives
/// the empty string.
template <class S>
S ToStringWithLocaleT(TimeStamp const& stamp, char const* skeleton, TimeStampLocale zone,
                      Counted<Locale const> const& locale);
inline String8 ToStringWithLocale(TimeStamp const& stamp, TimeStampStyle style, TimeStampLocale zone,
                                  Counted<Locale const> const& locale)
{
    return ToStringWithLocaleT<String8>(stamp, style, zone, locale);
}
inline String8 ToStringWithLocale(TimeStamp const& stamp, char const* skeleton, TimeStampLocale zone,
                                  Counted<Locale const> const& locale)
{
    return ToStringWithLocaleT<String8>(stamp, skeleton, zone, locale);
}

extern template KERNEL_API String8 ToStringT<String8>(TimeStamp const&, TimeStampStyle, TimeStampLocale);
extern template KERNEL_API String16 ToStringT<String16>(TimeStamp const&, TimeStampStyle, TimeStampLocale);
extern template KERNEL_API String32 ToStringT<String32>(TimeStamp const&, TimeStampStyle, TimeStampLocale);
extern template KERNEL_API String8 ToStringT<String8>(HighResTimeStamp const&, TimeStampStyle, TimeStampLocale);
extern template KERNEL_API String16 ToStringT<String16>(HighResTimeStamp const&, TimeStampStyle, TimeStampLocale);
extern template KERNEL_API String32 ToStringT<String32>(HighResTimeStamp const&, TimeStampStyle, TimeStampLocale);
extern template KERNEL_API String8 ToStringWithLocaleT<String8>(TimeStamp const&, TimeStampStyle, TimeStampLocale,
                                                                Counted<Locale const> const&);
extern template KERNEL_API String16 ToStringWithLocaleT<String16>(TimeStamp const&, TimeStampStyle, TimeStampLocale,
                                                                  Counted<Locale const> const&);
extern template KERNEL_API String32 ToStringWithLocaleT<String32>(TimeStamp const&, TimeStampStyle, TimeStampLocale,
                                                                  Counted<Locale const> const&);
extern template KERNEL_API String8 ToStringWithLocaleT<String8>(TimeStamp const&, char const*, TimeStampLocale,
                                                                Counted<Locale const> const&);
extern template KERNEL_API String16 ToStringWithLocaleT<String16>(TimeStamp const&, char const*, TimeStampLocale,
                                                                  Counted<Locale const> const&);
extern template KERNEL_API String32 ToStringWithLocaleT<String32>(TimeStamp const&, char const*, TimeStampLocale,
                                                                  Counted<Locale const> const&);

} // namespace Kernel

#include "libkernel/concurrency/Notification.h"

#include "libkernel/core/DemangleTypeName.h"

#include <cstring>
#include <cwchar>
#include <typeinfo>
#include <utility>

namespace Kernel {
namespace {

// The wide character of this system is one code point.
String16 FromWide(wchar_t const* text, int length)
{
    String16 result;
    if (!text) return result;
    result.Reserve(length);
    for (int i = 0; i < length; ++i) {
        u32 const c = static_cast<u32>(text[i]);
        if (c < 0x10000)
            result.Append(static_cast<char16_t>(c >= 0xD800 && c < 0xE000 ? 0xFFFD : c));
        else if (c > 0x10FFFF)
            result.Append(char16_t{0xFFFD});
        else {
            result.Append(static_cast<char16_t>(0xD7C0 + (c >> 10)));
            result.Append(static_cast<char16_t>(0xDC00 + (c & 0x3FF)));
        }
    }
    return result;
}

// Callers pass int lengths through the u64, so only its low half counts.
int GetIntLength(u64 length)
{
    return static_cast<i32>(static_cast<u32>(length));
}

} // namespace

Reporter::~Reporter() = default;

void Reporter::Report(Type type, wchar_t const* text, u64 length)
{
    int const given = GetIntLength(length);
    Report(type, FromWide(text, given >= 0 || !text ? given : static_cast<int>(std::wcslen(text))));
}

void Reporter::Report(Type type, char const* text, u64 length)
{
    int const given = GetIntLength(length);
    Report(type, given < 0 ? String8(text) : String8(text, given));
}

void Reporter::Report(Type type, wchar_t const* text)
{
    Report(type, text, ~u64{0});
}
void Reporter::Report(Type type, char const* text)
{
    Report(type, text, ~u64{0});
}

int Notification::GetDedupeId() const
{
    return 0;
}
Counted<Notification> Notification::Merge(Counted<Notification>)
{
    return this;
}
String8 Notification::GetDescription() const
{
    return DemangleTypeName(typeid(*this).name(), false);
}
Notification::~Notification() = default;

Broadcaster::~Broadcaster() = default;

void Broadcaster::Notify(Counted<Notification> notification)
{
    if (m_sink) m_sink(std::move(notification));
}

} // namespace Kernel

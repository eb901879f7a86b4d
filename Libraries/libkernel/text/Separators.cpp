#include "libkernel/text/Separators.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"

#include <algorithm>
#include <limits>
#include <new>
#include <string_view>

namespace Kernel {

namespace {

unsigned int s_decimal = 0;
unsigned int s_grouping = 0;
unsigned int s_list = 0;

void SetSeparator(unsigned int& separator, unsigned int codePoint)
{
    separator = codePoint;
    s_list = s_decimal == ',' || s_grouping == ',' ? ';' : ',';
}

void SetSeparator(unsigned int& separator, String8 const& text)
{
    if (!CharTraits<TEncUtf8>::IsValid(text.GetData(), text.GetLength(), true)) return;
    String32 const points = ConvertedTo<TEncUtf32>(text);
    if (points.GetLength() == 1) SetSeparator(separator, points[0]);
}

/// The UTF-8 form of a separator; empty for one that is not set.
class SeparatorText
{
public:
    explicit SeparatorText(unsigned int codePoint)
        : m_length(codePoint ? CharTraits<TEncUtf8>::AppendCodePoint(m_bytes, codePoint) - m_bytes : 0)
    {
    }
    operator std::string_view() const { return {m_bytes, static_cast<size_t>(m_length)}; }

private:
    char m_bytes[4];
    std::ptrdiff_t m_length;
};

// Left to right, going on behind what was put in.
String8 Replace(String8 const& text, std::string_view from, std::string_view to)
{
    std::string_view const whole = text.GetView();
    if (from.empty() || from == to) return text;
    i64 count = 0;
    for (size_t at = whole.find(from); at != std::string_view::npos; at = whole.find(from, at + from.size())) ++count;
    if (count == 0) return text;
    i64 const length = text.GetLength() + count * (static_cast<i64>(to.size()) - static_cast<i64>(from.size()));
    if (length > std::numeric_limits<int>::max()) throw std::bad_alloc();
    char* out = nullptr;
    String8 result(static_cast<int>(length), out);
    for (size_t at = 0; length > 0;) {
        size_t const hit = whole.find(from, at);
        std::string_view const run = whole.substr(at, hit - at);
        out = std::copy(run.begin(), run.end(), out);
        if (hit == std::string_view::npos) break;
        out = std::copy(to.begin(), to.end(), out);
        at = hit + from.size();
    }
    return result;
}

} // namespace

void SetLocalDecimalSeparator(unsigned int codePoint)
{
    SetSeparator(s_decimal, codePoint);
}

void SetLocalDecimalSeparator(String8 const& text)
{
    SetSeparator(s_decimal, text);
}

void SetLocalDigitGroupingSeparator(unsigned int codePoint)
{
    SetSeparator(s_grouping, codePoint);
}

void SetLocalDigitGroupingSeparator(String8 const& text)
{
    SetSeparator(s_grouping, text);
}

unsigned int GetLocalDecimalSeparator()
{
    return s_decimal;
}

unsigned int GetLocalGroupingSeparator()
{
    return s_grouping;
}

bool IsDefaultDecimalSeparator()
{
    return s_decimal == '.';
}

String8 ConvertFromLocalisedDecimal(String8 const& text)
{
    String8 const ungrouped = Replace(text, SeparatorText(s_grouping), "");
    return Replace(Replace(ungrouped, SeparatorText(s_decimal), "."), SeparatorText(s_list), ",");
}

String8 ConvertToLocalisedDecimal(String8 const& text)
{
    String8 const listed = s_list ? Replace(text, ",", SeparatorText(s_list)) : text;
    return s_decimal ? Replace(listed, ".", SeparatorText(s_decimal)) : listed;
}

} // namespace Kernel

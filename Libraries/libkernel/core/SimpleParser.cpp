#include "libkernel/core/SimpleParser.h"

#include <algorithm>
#include <charconv>
#include <limits>
#include <string>
#include <unicode/utf8.h>

namespace Kernel {
namespace {

bool IsDigit(char c)
{
    return c >= '0' && c <= '9';
}

bool IsKeywordStart(char c)
{
    return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || static_cast<u8>(c) > 127;
}

// Digits with at most one point, cut to @p places decimals, half up. By the digits and not by the value, since 1.005 is
// stored a little below that and would round down.
std::string Rounded(std::string_view number, int places)
{
    auto const point = number.find('.');
    if (places < 0 || point == number.npos || number.size() - point - 1 <= static_cast<size_t>(places))
        return std::string(number);
    size_t const cut = point + 1 + static_cast<size_t>(places);
    std::string kept(number.substr(0, cut));
    if (number[cut] < '5') return kept;
    for (size_t i = kept.size(); i-- > 0;) {
        if (kept[i] == '.') continue;
        if (kept[i] != '9') {
            ++kept[i];
            return kept;
        }
        kept[i] = '0';
    }
    return '1' + kept;
}

double ToValue(std::string const& number)
{
    double value = 0.0;
    auto const result = std::from_chars(number.data(), number.data() + number.size(), value);
    if (result.ec != std::errc::result_out_of_range) return value;
    // Nothing but a large whole part is too large; the rest is too small.
    auto const digit = number.find_first_of("123456789.");
    return number[digit] == '.' ? 0.0 : std::numeric_limits<double>::infinity();
}

} // namespace

SimpleParser::SimpleParser(char separator) : m_separator(separator) {}

SimpleParser::SimpleParser(std::vector<String8> const& keywords, char separator)
    : m_keywords(keywords), m_separator(separator)
{
}

void SimpleParser::SetMaxDecimalPlaces(int places)
{
    m_maxDecimalPlaces = places;
}

bool SimpleParser::Parse(String8 const& text, bool)
{
    m_results.clear();
    m_errorCode = ErrorCode::None;
    m_errorPos = m_errorLength = 0;
    if (ParseItems(text)) return true;
    m_results.clear();
    return false;
}

bool SimpleParser::Fail(ErrorCode code, int pos, int length)
{
    m_errorCode = code;
    m_errorPos = pos;
    m_errorLength = length;
    return false;
}

bool SimpleParser::ParseItems(String8 const& text)
{
    int const length = text.GetLength();
    ResultPair item;
    for (int pos = 0; pos < length;) {
        char const c = text[pos];
        if (c == m_separator) {
            m_results.push_back(item);
            item = {};
            ++pos;
        } else if (c == ' ' || c == '\t')
            ++pos;
        else if ((IsDigit(c) || c == '.') && item.isEmpty) {
            if (!ReadNumber(text, pos, item.value)) return false;
            item.isEmpty = false;
        } else if (IsKeywordStart(c) && !item.isEmpty && item.keyword < 0) {
            if (!ReadKeyword(text, pos, item.keyword)) return false;
        } else
            return Fail(ErrorCode::Unexpected, pos, 1);
    }
    if (item.isEmpty && m_results.empty()) return Fail(ErrorCode::Empty, 0, length);
    m_results.push_back(item);
    return true;
}

bool SimpleParser::ReadNumber(String8 const& text, int& pos, double& value)
{
    int const start = pos;
    bool hasPoint = false;
    bool hasDigit = false;
    for (; pos < text.GetLength() && (IsDigit(text[pos]) || text[pos] == '.'); ++pos) {
        if (IsDigit(text[pos]))
            hasDigit = true;
        else if (hasPoint)
            return Fail(ErrorCode::BadNumber, start, pos - start);
        else
            hasPoint = true;
    }
    if (!hasDigit) return Fail(ErrorCode::BadNumber, start, pos - start);
    std::string_view const number = text.GetView().substr(static_cast<size_t>(start), static_cast<size_t>(pos - start));
    value = ToValue(Rounded(number, m_maxDecimalPlaces));
    return true;
}

bool SimpleParser::ReadKeyword(String8 const& text, int& pos, int& keyword)
{
    int const start = pos;
    char const* const units = text.GetData();
    while (pos < text.GetLength()) {
        char const c = units[pos];
        if (static_cast<u8>(c) > 127) {
            int const at = pos;
            UChar32 codePoint;
            U8_NEXT(units, pos, text.GetLength(), codePoint);
            if (codePoint < 0) return Fail(ErrorCode::BadEncoding, at, 1);
        } else if (IsKeywordStart(c) || IsDigit(c) || c == '_')
            ++pos;
        else
            break;
    }
    auto const found = std::find(m_keywords.begin(), m_keywords.end(), text.GetSubstring(start, pos - start));
    if (found == m_keywords.end()) return Fail(ErrorCode::UnknownKeyword, start, pos - start);
    keyword = static_cast<int>(found - m_keywords.begin());
    return true;
}

} // namespace Kernel

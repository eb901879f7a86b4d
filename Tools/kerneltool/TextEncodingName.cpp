#include "TextEncodingName.h"

#include "Diagnostics.h"
#include "Output.h"
#include "TextInput.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/StringConverter.h"

#include <algorithm>
#include <array>

namespace KernelTool {

using namespace Kernel;

namespace {

constexpr char c_advice[] = "An encoding is a charset's name, page:NUMBER, mac:SCRIPT,LANGUAGE or pdfdoc.";

enum class EncodingProblem
{
    Unknown = 1,
    FileMissing = 2,
    HoldsZero = 3
};

Failure Describe(std::string const& name, EncodingProblem problem)
{
    static constexpr char const* c_names[] = {"", "UnknownEncoding", "MappingFileMissing", "HoldsZeroByte"};
    static constexpr char const* c_advices[] = {"", c_advice,
                                                "No mapping file is installed for it; see the README of the resources.",
                                                "Name the encoding that has zero bytes in its text, as UTF-16LE has."};
    int const number = static_cast<int>(problem);
    return {"using encoding '" + Printable(name) + "'", c_names[number], number, c_advices[number], ExitFailed};
}

struct UnicodeRow
{
    char const* name; // In capitals.
    UnicodeEncoding encoding;
    std::array<UnicodeEncoding, 2> marked; // The forms with a mark that it reads too.
    char const* charset;                   // For writing.
    size_t unitSize;
};

// Without an order in the name the mark decides when reading, and big-endian holds where there is none (RFC 2781).
using Form = UnicodeEncoding;
constexpr UnicodeRow c_unicode[] = {
    {"UTF-8", Form::Utf8, {Form::Utf8WithMark}, "UTF-8", 1},
    {"UTF-16", Form::Utf16BigEndian, {Form::Utf16BigEndianWithMark, Form::Utf16LittleEndianWithMark}, "UTF-16BE", 2},
    {"UTF-16LE", Form::Utf16LittleEndian, {Form::Utf16LittleEndianWithMark}, "UTF-16LE", 2},
    {"UTF-16BE", Form::Utf16BigEndian, {Form::Utf16BigEndianWithMark}, "UTF-16BE", 2},
    {"UTF-32", Form::Utf32BigEndian, {Form::Utf32BigEndianWithMark, Form::Utf32LittleEndianWithMark}, "UTF-32BE", 4},
    {"UTF-32LE", Form::Utf32LittleEndian, {Form::Utf32LittleEndianWithMark}, "UTF-32LE", 4},
    {"UTF-32BE", Form::Utf32BigEndian, {Form::Utf32BigEndianWithMark}, "UTF-32BE", 4},
};

UnicodeRow const* FindUnicode(std::string name)
{
    std::transform(name.begin(), name.end(), name.begin(), [](char c) { return c >= 'a' && c <= 'z' ? c - 32 : c; });
    for (UnicodeRow const& row : c_unicode)
        if (name == row.name) return &row;
    return nullptr;
}

// Decimal digits up to @p end; false for anything else.
bool ReadNumber(char const* p, char const* end, int& number)
{
    number = 0;
    if (p == end || end - p > 6) return false;
    for (; p < end; ++p) {
        if (*p < '0' || *p > '9') return false;
        number = number * 10 + (*p - '0');
    }
    return true;
}

bool FindMappingFile(std::string const& name, Counted<StringEncoding>& encoding)
{
    char const* const end = name.data() + name.size();
    int number = 0;
    int language = 0;
    if (name == "pdfdoc")
        encoding = StringEncoding::MakePdfDocEncoding();
    else if (name.rfind("page:", 0) == 0) {
        if (!ReadNumber(name.data() + 5, end, number) || !StringEncoding::IsSupported(number))
            throw Describe(name, EncodingProblem::Unknown);
        encoding = StringEncoding::Make(number);
    } else if (name.rfind("mac:", 0) == 0) {
        char const* const comma = std::find(name.data() + 4, end, ',');
        if (!ReadNumber(name.data() + 4, comma, number) || (comma < end && !ReadNumber(comma + 1, end, language)) ||
            !StringEncoding::IsSupported(number, language))
            throw Describe(name, EncodingProblem::Unknown);
        encoding = StringEncoding::Make(number, language);
    } else
        return false;
    if (!encoding || encoding->IsIdentity()) throw Describe(name, EncodingProblem::FileMissing);
    return true;
}

String8 DecodeUnicode(TextEncodingName const& encoding, std::string const& bytes)
{
    UnicodeRow const& row = *FindUnicode(encoding.name);
    u8 const* const data = reinterpret_cast<u8 const*>(bytes.data());
    i64 const size = static_cast<i64>(bytes.size());
    // In 16 bits a zero character behind the mark is no part of it.
    UnicodeEncoding const mark = GetByteOrderMark(data, row.unitSize == 2 ? std::min<i64>(size, 2) : size);
    // A mark of another form is text in this one.
    bool const isMarked = mark != UnicodeEncoding::None && (mark == row.marked[0] || mark == row.marked[1]);
    String8 const text = ConvertToUtf8(isMarked ? mark : row.encoding, data, size, true);
    size_t const markSize = !isMarked ? 0 : row.unitSize == 1 ? 3 : row.unitSize;
    size_t const units = row.unitSize == 1   ? GetWellFormedLength(text.GetView())
                         : row.unitSize == 2 ? static_cast<size_t>(ConvertedTo<TEncUtf16>(text).GetLength())
                                             : static_cast<size_t>(ConvertedTo<TEncUtf32>(text).GetLength());
    size_t const read = markSize + units * row.unitSize;
    if (read != bytes.size())
        throw Failure{"reading " + encoding.name, "IllFormed", static_cast<int>(read),
                      "The text goes wrong at byte " + std::to_string(read) + ".", ExitFailed};
    return text;
}

size_t Count(String8 const& text, u32 codePoint)
{
    size_t count = 0;
    for (char const* p = text.begin(); p < text.end();) count += CharTraits<TEncUtf8>::NextCodePoint(p) == codePoint;
    return count;
}

std::vector<char> EncodeByIcu(String8 const& text, std::string const& name, char const* charset)
{
    std::vector<char> bytes;
    std::vector<int> sources;
    if (!Utf16ToEncoded(bytes, sources, ConvertedTo<TEncUtf16>(text), charset))
        throw Describe(name, EncodingProblem::Unknown);
    return bytes;
}

// Characters that do not survive the way to a charset and back, and so have no code there.
size_t CountLost(String8 text, std::string const& charset)
{
    std::string units(text.GetView());
    std::replace(units.begin(), units.end(), '\0', ' '); // The way back ends at a zero.
    text = String8(units);
    std::vector<char> bytes = EncodeByIcu(text, charset, charset.c_str());
    if (std::find(bytes.begin(), bytes.end(), '\0') != bytes.end()) return 0; // Units of 16 or 32 bits: it has all.
    bytes.push_back('\0');
    String8 const back = EncodedToUtf8(bytes.data(), charset.c_str());
    size_t lost = 0;
    char const* q = back.begin();
    for (char const* p = text.begin(); p < text.end();) {
        u32 const wanted = CharTraits<TEncUtf8>::NextCodePoint(p);
        lost += q >= back.end() || CharTraits<TEncUtf8>::NextCodePoint(q) != wanted;
    }
    return lost;
}

} // namespace

TextEncodingName TextEncodingName::Parse(std::string const& name)
{
    TextEncodingName result;
    result.name = name;
    if (UnicodeRow const* const row = FindUnicode(name)) {
        result.kind = Kind::Unicode;
        result.unicode = row->encoding;
    } else if (FindMappingFile(name, result.mappingFile))
        result.kind = Kind::MappingFile;
    return result;
}

String8 Decode(TextEncodingName const& encoding, std::string const& bytes, size_t& undefined)
{
    undefined = 0;
    if (encoding.kind == TextEncodingName::Kind::Unicode) return DecodeUnicode(encoding, bytes);
    if (encoding.kind == TextEncodingName::Kind::MappingFile) {
        String8 const text = encoding.mappingFile->ToUnicode(bytes.data(), static_cast<int>(bytes.size()));
        undefined = Count(text, StringEncoding::c_noCode);
        return text;
    }
    if (bytes.find('\0') != std::string::npos) throw Describe(encoding.name, EncodingProblem::HoldsZero);
    if (!Utf8ToEncoded("", encoding.name.c_str())) throw Describe(encoding.name, EncodingProblem::Unknown);
    String8 const text = EncodedToUtf8(bytes.c_str(), encoding.name.c_str());
    undefined = Count(text, 0xFFFD);
    if (undefined != 0) {
        // Unless the text itself says so, in a charset that has the replacement character.
        std::vector<char> const back = EncodeByIcu(text, encoding.name, encoding.name.c_str());
        if (std::equal(back.begin(), back.end(), bytes.begin(), bytes.end())) undefined = 0;
    }
    return text;
}

std::string Encode(TextEncodingName const& encoding, String8 const& text, size_t& unmapped)
{
    unmapped = 0;
    if (encoding.kind == TextEncodingName::Kind::MappingFile) {
        using Policy = StringEncoding::ErrorPolicy;
        std::vector<char> bytes;
        encoding.mappingFile->FromUnicode(bytes, text, Policy::WriteFallback, '?');
        for (char const* p = text.begin(); p < text.end();)
            unmapped +=
                encoding.mappingFile->FromUnicode(CharTraits<TEncUtf8>::NextCodePoint(p), 0xFFFFFFFF) == 0xFFFFFFFF;
        return {bytes.begin(), bytes.end()};
    }
    UnicodeRow const* const unicode = FindUnicode(encoding.name);
    char const* const charset = unicode ? unicode->charset : encoding.name.c_str();
    std::vector<char> const bytes = EncodeByIcu(text, encoding.name, charset);
    if (!unicode) unmapped = CountLost(text, encoding.name);
    return {bytes.begin(), bytes.end()};
}

} // namespace KernelTool

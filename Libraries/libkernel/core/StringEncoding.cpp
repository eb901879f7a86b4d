#include "libkernel/core/StringEncoding.h"

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/CharTraits.h"

#include <algorithm>
#include <limits>
#include <map>
#include <new>

namespace Kernel {
namespace {

struct CodePageRow
{
    CodePage codePage;
    char const* file;
};

constexpr CodePageRow c_codePages[] = {
    {2, "WinSymbol.txt"},     {775, "CP775.txt"},      {874, "CP874.txt"},      {932, "CP932.txt"},
    {949, "CP949.txt"},       {950, "CP950.txt"},      {1250, "CP1250.txt"},    {1251, "CP1251.txt"},
    {1252, "CP1252.txt"},     {1253, "CP1253.txt"},    {1254, "CP1254.txt"},    {1255, "CP1255.txt"},
    {1256, "Arabic.txt"},     {1258, "CP1258.txt"},    {10000, "Roman.txt"},    {10001, "Japanese.txt"},
    {10002, "ChinTrad.txt"},  {10003, "Korean.txt"},   {10004, "Arabic.txt"},   {10005, "Hebrew.txt"},
    {10006, "Greek.txt"},     {10007, "Cyrillic.txt"}, {10010, "Romanian.txt"}, {10029, "Latin2.txt"},
    {10079, "Icelandic.txt"}, {10081, "Turkish.txt"},  {10082, "Croatian.txt"}, {20936, "ChinSimp.txt"},
};

constexpr int c_anyLanguage = -1;

struct ScriptRow
{
    int script;
    int language; // c_anyLanguage behind the languages that stand out.
    char const* file;
};

// Script 6, Greek, takes the rows of script 0. Two of its names have no extension, and the files are called so.
constexpr ScriptRow c_scripts[] = {
    {0, 20, "Greek"},
    {0, 21, "Iceland.txt"},
    {0, 47, "Iceland.txt"},
    {0, 24, "Turkish.txt"},
    {0, 25, "Croatian.txt"},
    {0, 66, "Croatian.txt"},
    {0, 68, "Croatian.txt"},
    {0, 39, "Romanian.txt"},
    {0, 50, "Celtic.txt"},
    {0, 75, "Celtic.txt"},
    {0, 76, "Celtic.txt"},
    {0, 77, "Celtic.txt"},
    {0, 79, "Celtic.txt"},
    {0, 81, "Gaelic"},
    {0, c_anyLanguage, "Roman.txt"},
    {1, c_anyLanguage, "Japanese.txt"},
    {2, c_anyLanguage, "ChinTrad.txt"},
    {3, c_anyLanguage, "Korean.txt"},
    {4, 48, "Farsi.txt"},
    {4, c_anyLanguage, "Arabic.txt"},
    {5, c_anyLanguage, "Hebrew.txt"},
    {7, c_anyLanguage, "Cyrillic.txt"},
    {8, c_anyLanguage, "MacSymbol.txt"},
    {9, c_anyLanguage, "Devanagari.txt"},
    {10, c_anyLanguage, "Gurmukhi.txt"},
    {11, c_anyLanguage, "Gujarati.txt"},
    {21, c_anyLanguage, "Thai.txt"},
    {25, c_anyLanguage, "ChinSimp.txt"},
    {28, c_anyLanguage, "Inuit.txt"},
    {29, c_anyLanguage, "CentEuro.txt"},
};

// Empty where there is no file.
char const* GetFile(CodePage codePage)
{
    for (CodePageRow const& row : c_codePages)
        if (row.codePage == codePage) return row.file;
    return "";
}

char const* GetFile(int script, int language)
{
    if (script == 6) script = 0;
    for (ScriptRow const& row : c_scripts)
        if (row.script == script && (row.language == language || row.language == c_anyLanguage)) return row.file;
    return "";
}

// Taken for a look at the map and to put into it, never while a file is read.
constinit CriticalSectionSpin s_lock;

struct Registry
{
    std::map<String8, Counted<StringEncoding>> encodings; // By file; they stay until the process ends.
    String8 subdirectory = "encodings";
};

// Never destroyed: encodings may be asked for until the last static destructor has run.
Registry& GetRegistry()
{
    static Registry* const registry = new Registry;
    return *registry;
}

} // namespace

StringEncoding::~StringEncoding() = default;

Counted<StringEncoding> StringEncoding::Make(char const* file)
{
    try {
        String8 const name = file;
        {
            CriticalSectionSpinScope const scope(s_lock);
            auto const found = GetRegistry().encodings.find(name);
            if (found != GetRegistry().encodings.end()) return found->second;
        }
        // Two threads may read one file; the first to come back has made the encoding that all get.
        Counted<StringEncoding> const made = Build(file);
        CriticalSectionSpinScope const scope(s_lock);
        return GetRegistry().encodings.try_emplace(name, made).first->second;
    } catch (std::bad_alloc const&) {
        return nullptr;
    }
}

Counted<StringEncoding> StringEncoding::Build(char const* file)
{
    String8 const name = file;
    int const dot = name.FindLast('.');
    Counted<StringEncoding> const encoding =
        MakeCounted<StringEncoding>(name.GetSubstring(0, dot < 0 ? name.GetLength() : dot));
    if (!encoding->ReadFile(file)) encoding->BecomeIdentity();
    return encoding;
}

Counted<StringEncoding> StringEncoding::Make(CodePage codePage)
{
    return Make(GetFile(codePage));
}

Counted<StringEncoding> StringEncoding::Make(int script, int language)
{
    return Make(GetFile(script, language));
}

Counted<StringEncoding> StringEncoding::MakeIdentity()
{
    return Make("");
}

Counted<StringEncoding> StringEncoding::MakePdfDocEncoding()
{
    return Make("PdfDocEncoding.txt");
}

Counted<StringEncoding> StringEncoding::MakeFromText(String8 const& name, char const* text, u64 size)
{
    try {
        Counted<StringEncoding> const encoding = MakeCounted<StringEncoding>(name);
        encoding->ReadLines(text, text + size);
        return encoding;
    } catch (std::bad_alloc const&) {
        return nullptr;
    }
}

bool StringEncoding::IsSupported(CodePage codePage)
{
    return *GetFile(codePage) != 0;
}

bool StringEncoding::IsSupported(int script, int language)
{
    return *GetFile(script, language) != 0;
}

CodePage StringEncoding::ToCodePage(int value)
{
    return IsSupported(value) ? value : 0;
}

void StringEncoding::SetSubdirectory(String8 const& folder)
{
    CriticalSectionSpinScope const scope(s_lock);
    GetRegistry().subdirectory = folder;
}

String8 StringEncoding::GetSubdirectory()
{
    CriticalSectionSpinScope const scope(s_lock);
    return GetRegistry().subdirectory;
}

u32 StringEncoding::ToUnicode(u32 code) const
{
    if (code < 256) return m_toUnicode[code].codePoint;
    if (code < m_identityPrefix) return code;
    auto const row = std::lower_bound(m_toUnicode.begin() + 256, m_toUnicode.end(), code,
                                      [](ToRow const& r, u32 wanted) { return r.code < wanted; });
    return row != m_toUnicode.end() && row->code == code ? row->codePoint : c_noCode;
}

u32 StringEncoding::ToUnicodeSingle(char const* text, int n) const
{
    if (n == 0) return c_noCode;
    u32 const first = static_cast<u8>(text[0]);
    if (!m_leadBytes[first]) return m_toUnicode[first].codePoint;
    return n == 2 ? ToUnicode(first << 8 | static_cast<u8>(text[1])) : c_noCode;
}

template <class Sink>
void StringEncoding::ForEachCodePoint(char const* text, int n, Sink sink) const
{
    if (!m_isMultiByte) {
        for (int i = 0; i < n; ++i) sink(m_toUnicode[static_cast<u8>(text[i])].codePoint);
        return;
    }
    for (int i = 0; i < n; ++i) {
        u32 code = static_cast<u8>(text[i]);
        if (m_leadBytes[code] && i + 1 < n) code = code << 8 | static_cast<u8>(text[++i]);
        sink(ToUnicode(code));
    }
}

String8 StringEncoding::ToUnicode(char const* text, int n) const
{
    if (n < 0) n = BaseCharTraits<char>::GetLength(text);
    try {
        i64 length = 0;
        ForEachCodePoint(text, n, [&](u32 c) { length += CharTraits<TEncUtf8>::GetCodePointLength(c); });
        if (length == 0 || length > std::numeric_limits<i32>::max()) return {};
        String8 result;
        char* to = result.SetLength(static_cast<int>(length));
        ForEachCodePoint(text, n, [&](u32 c) { to = CharTraits<TEncUtf8>::AppendCodePoint(to, c); });
        return result;
    } catch (std::bad_alloc const&) {
        return {};
    }
}

u32 StringEncoding::FromUnicode(u32 codePoint, u32 fallback) const
{
    if (codePoint < m_identityPrefix) return codePoint;
    auto const row = std::lower_bound(m_fromUnicode.begin(), m_fromUnicode.end(), codePoint,
                                      [](FromRow const& r, u32 wanted) { return r.codePoint < wanted; });
    return row != m_fromUnicode.end() && row->codePoint == codePoint ? row->code : fallback;
}

bool StringEncoding::FromUnicode(std::vector<char>& out, String8 const& text, ErrorPolicy policy,
                                 u32 fallbackCode) const
{
    char const* p = text.begin();
    char const* const end = text.end();
    try {
        if (IsIdentity()) {
            out.insert(out.end(), p, end);
            return true;
        }
        out.reserve(out.size() + static_cast<size_t>(end - p));
        constexpr u32 c_none = 0xFFFFFFFF;
        auto const write = [&](u32 code) {
            if (code > 0xFF) out.push_back(static_cast<char>(code >> 8));
            out.push_back(static_cast<char>(code));
        };
        bool isWhole = true;
        char const* valid = p; // Up to here code points are whole.
        while (p < end) {
            if (p == valid) valid += CharTraits<TEncUtf8>::GetValidLength(p, static_cast<int>(end - p), true);
            u32 code = c_none;
            if (p < valid)
                code = FromUnicode(CharTraits<TEncUtf8>::NextCodePoint(p), c_none);
            else
                valid = ++p;
            if (code != c_none)
                write(code);
            else {
                isWhole = false;
                if (policy == ErrorPolicy::Stop) break;
                if (policy == ErrorPolicy::WriteFallback) write(fallbackCode);
            }
        }
        return isWhole;
    } catch (std::bad_alloc const&) {
        return false;
    }
}

int StringEncoding::FromUnicodeSingle(char* out, int size, u32 codePoint) const
{
    constexpr u32 c_none = 0xFFFFFFFF;
    u32 const code = FromUnicode(codePoint, c_none);
    if (code > 0xFFFF) return 0;
    int const bytes = code > 0xFF || (m_isMultiByte && !m_isVariableLength) ? 2 : 1;
    if (size < bytes) return 0;
    if (bytes == 2) *out++ = static_cast<char>(code >> 8);
    *out = static_cast<char>(code);
    return bytes;
}

} // namespace Kernel

#include "libkernel/core/StringEncoding.h"
#include "libkernel/core/internal/FileBytes.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/Path.h"
#include "libkernel/platform/LibraryFolder.h"

#include <algorithm>
#include <cstring>

// Mapping files. One line gives one code and its code point, "0x80 0x20AC # EURO SIGN"; of anything else in a line
// nothing is read. The tables that the encoding works with rest on ascending codes and on code points that UTF-8 can
// write, so a line that would break that counts as one that says nothing.

namespace Kernel {
namespace {

constexpr u64 c_longestFile = 64u << 20; // Bytes; 65,536 codes in lines of the longest kind take a quarter.
constexpr int c_longestLine = 255;       // Characters that are read of a line.
constexpr u32 c_lastCode = 0xFFFF;
constexpr u32 c_lastCodePoint = 0x10FFFF;
constexpr u32 c_bytes = 256;

// Where the files lie when the host has not said: in the installed data beside the library, or in the build tree.
char const* const c_dataFolders[] = {KERNEL_RELATIVE_DATA_DIR, "Resources"};

String8 GetDataDirectory()
{
    String8 const byHost = FileSystem::GetResourcesDirectory();
    if (!byHost.IsEmpty()) return byHost;
    String8 const library{std::string_view(Platform::GetLibraryFolder())};
    for (char const* const folder : c_dataFolders) {
        String8 const candidate = Path(library).Append(folder).GetString();
        if (FileSystem::IsDirectory(candidate)) return candidate;
    }
    return {};
}

// The next number of a line, which begins at the next zero; false if there is none. A comment hides the rest.
bool ReadNumber(char const*& p, char const* end, u32& number)
{
    while (p < end && *p != '0' && *p != '#') ++p;
    if (end - p < 3 || p[0] != '0' || p[1] != 'x') return false;
    p += 2;
    char const* const digits = p;
    u64 value = 0;
    for (; p < end; ++p) {
        u32 const c = static_cast<u8>(*p);
        u32 const letter = (c | 0x20) - 'a';
        if (c - '0' > 9 && letter > 5) break;
        value = std::min<u64>(value * 16 + (c - '0' <= 9 ? c - '0' : letter + 10), 0xFFFFFFFF);
    }
    number = static_cast<u32>(value);
    return p > digits;
}

bool IsCodePoint(u32 value)
{
    return value <= c_lastCodePoint && (value & 0xFFFFF800) != 0xD800;
}

} // namespace

bool StringEncoding::ReadFile(char const* file)
{
    if (!*file) return false;
    Path path(GetDataDirectory());
    path.Append(GetSubdirectory()).Append(file);
    u64 size = 0;
    auto const text = ReadFileBytes(path.GetData(), c_longestFile, size);
    if (!text) return false;
    ReadLines(text.get(), text.get() + size);
    return true;
}

void StringEncoding::ReadLines(char const* text, char const* end)
{
    while (text < end) {
        auto const* const found = static_cast<char const*>(std::memchr(text, '\n', static_cast<size_t>(end - text)));
        char const* const next = found ? found + 1 : end;
        char const* const lineEnd = std::min(next, text + c_longestLine);
        ToRow row{};
        if (ReadNumber(text, lineEnd, row.code) && ReadNumber(text, lineEnd, row.codePoint) && row.code <= c_lastCode &&
            IsCodePoint(row.codePoint) && (m_toUnicode.empty() || m_toUnicode.back().code < row.code))
            m_toUnicode.push_back(row);
        text = next;
    }
    Complete();
}

void StringEncoding::Complete()
{
    std::vector<ToRow> rows;
    rows.reserve(m_toUnicode.size() + c_bytes);
    auto given = m_toUnicode.begin();
    for (u32 code = 0; code < c_bytes; ++code) {
        if (given != m_toUnicode.end() && given->code == code)
            rows.push_back(*given++);
        else
            rows.push_back({code < 32 || code == 127 ? code : c_noCode, code});
    }
    rows.insert(rows.end(), given, m_toUnicode.end());
    m_toUnicode = std::move(rows);

    m_fromUnicode.reserve(m_toUnicode.size());
    for (ToRow const& row : m_toUnicode)
        if (row.codePoint != c_noCode) m_fromUnicode.push_back({row.codePoint, row.code});
    std::stable_sort(m_fromUnicode.begin(), m_fromUnicode.end(),
                     [](FromRow const& a, FromRow const& b) { return a.codePoint < b.codePoint; });

    while (m_identityPrefix < m_toUnicode.size() &&
           m_toUnicode[m_identityPrefix].code == m_toUnicode[m_identityPrefix].codePoint)
        ++m_identityPrefix;

    m_isMultiByte = m_isVariableLength = m_toUnicode.back().code >= c_bytes;
    for (auto row = m_toUnicode.begin() + c_bytes; row != m_toUnicode.end(); ++row) m_leadBytes[row->code >> 8] = true;
    m_leadBytes[0] = false;
}

void StringEncoding::BecomeIdentity()
{
    m_name = "Identity";
    m_identityPrefix = c_identity;
    m_leadBytes.fill(true);
    m_isMultiByte = true;
    m_toUnicode.resize(c_bytes);
    for (u32 code = 0; code < c_bytes; ++code) m_toUnicode[code] = {code, code};
}

} // namespace Kernel

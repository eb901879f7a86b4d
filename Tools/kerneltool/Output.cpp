#include "Output.h"

#include "Diagnostics.h"
#include "Terminal.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <ctime>

namespace KernelTool {

using namespace Kernel;

namespace {

int s_outputError = 0;

} // namespace

std::string ToStd(String8 const& text)
{
    return std::string(text.GetView());
}

std::string Printable(std::string const& text)
{
    std::string result;
    for (char const c : text) {
        auto const byte = static_cast<unsigned char>(c);
        if (byte < 0x20 || byte == 0x7F) {
            char escape[8];
            std::snprintf(escape, sizeof(escape), "\\x%02x", byte);
            result += escape;
        } else {
            result += c;
        }
    }
    return result;
}

void Print(std::string const& text)
{
    if (std::fwrite(text.data(), 1, text.size(), stdout) != text.size() && s_outputError == 0)
        s_outputError = errno ? errno : EIO;
}

void PrintJson(Json const& value)
{
    Print(value.dump(2, ' ', false, Json::error_handler_t::replace) + "\n");
}

void FinishOutput()
{
    if (std::fflush(stdout) != 0 && s_outputError == 0) s_outputError = errno ? errno : EIO;
    if (s_outputError == 0) return;
    int const error = s_outputError;
    s_outputError = 0;
    throw MakeFailure("writing standard output", FileIOException::FromError(error));
}

std::string FormatSize(u64 size)
{
    static constexpr char const* c_units[] = {"B", "KiB", "MiB", "GiB", "TiB", "PiB", "EiB"};
    if (size < 1024) return std::to_string(size) + " B";
    double value = static_cast<double>(size);
    size_t unit = 0;
    while (value >= 1024 && unit + 1 < std::size(c_units)) {
        value /= 1024;
        ++unit;
    }
    char text[32];
    std::snprintf(text, sizeof(text), "%.1f %s", value, c_units[unit]);
    return text;
}

std::string FormatTime(TimeStamp time)
{
    std::tm const fields = time.GetAsStructTm(TimeStampLocale::Local);
    char text[64];
    return std::strftime(text, sizeof(text), "%Y-%m-%d %H:%M:%S", &fields) ? text : "?";
}

std::string FormatCRC(u32 crc)
{
    char text[16];
    std::snprintf(text, sizeof(text), "%08x", crc);
    return text;
}

std::string FormatTag(IDTag tag)
{
    std::string text;
    for (int shift = 24; shift >= 0; shift -= 8) {
        auto const byte = static_cast<unsigned char>(tag.value >> shift);
        if (byte < 0x80) {
            text += static_cast<char>(byte);
        } else {
            text += static_cast<char>(0xC0 | byte >> 6);
            text += static_cast<char>(0x80 | (byte & 0x3F));
        }
    }
    return text;
}

void Table::Add(std::vector<std::string> row)
{
    for (std::string& cell : row) cell = Printable(cell);
    m_rows.push_back(std::move(row));
}

void Table::Show() const
{
    std::vector<size_t> widths(m_alignment.size());
    for (auto const& row : m_rows)
        for (size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], row[i].size());
    bool const bold = IsTerminal(stdout);
    std::string text;
    for (size_t r = 0; r < m_rows.size(); ++r) {
        std::string line;
        for (size_t i = 0; i < m_rows[r].size(); ++i) {
            std::string const& cell = m_rows[r][i];
            std::string const space(widths[i] - cell.size(), ' ');
            line += (i ? "  " : "") + (m_alignment[i] == 'r' ? space + cell : cell + space);
        }
        line.erase(line.find_last_not_of(' ') + 1);
        text += (bold && r == 0 ? "\x1b[1m" + line + "\x1b[0m" : line) + "\n";
    }
    Print(text);
}

} // namespace KernelTool

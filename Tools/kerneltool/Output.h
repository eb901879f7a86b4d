#pragma once

#include "libkernel/concurrency/TimeStamp.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/String.h"

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

namespace KernelTool {

using Json = nlohmann::ordered_json;

std::string ToStd(Kernel::String8 const& text);

/// The text with control characters written as escapes: names come from files and must not drive the terminal.
std::string Printable(std::string const& text);

/// Writes to standard output. A failure shows in FinishOutput.
void Print(std::string const& text);
/// One JSON value and a line end. Bytes that are not UTF-8 become U+FFFD.
void PrintJson(Json const& value);
/// Everything has reached standard output; throws Failure otherwise.
void FinishOutput();

/// "900 B", "12.3 KiB".
std::string FormatSize(Kernel::u64 size);
/// In local time.
std::string FormatTime(Kernel::TimeStamp time);
/// Eight lower-case hexadecimal digits.
std::string FormatCRC(Kernel::u32 crc);
/// The four characters; bytes from 0x80 on as U+0080 to U+00FF.
std::string FormatTag(Kernel::IDTag tag);

/// Columns that line up. The first row is the heading, shown bold on a terminal.
class Table
{
public:
    /// One letter for each column: 'l' for text, 'r' for numbers.
    explicit Table(char const* alignment) : m_alignment(alignment) {}
    void Add(std::vector<std::string> row);
    void Show() const;

private:
    std::string m_alignment;
    std::vector<std::vector<std::string>> m_rows;
};

} // namespace KernelTool

#include "TextInput.h"

#include "Diagnostics.h"
#include "Output.h"
#include "libkernel/streams/File.h"

#include <cstdio>
#include <limits>

namespace KernelTool {

using namespace Kernel;

namespace {

bool IsStandardInput(String8 const& path)
{
    return path.IsEmpty() || path == "-";
}

} // namespace

std::string DescribeInput(String8 const& path)
{
    return IsStandardInput(path) ? "standard input" : "'" + Printable(ToStd(path)) + "'";
}

std::string ReadInput(String8 const& path)
{
    constexpr size_t c_mostBytes = std::numeric_limits<i32>::max(); // What a string can hold.
    std::string const what = "reading " + DescribeInput(path);
    File file;
    if (!IsStandardInput(path)) {
        auto const result = file.OpenEx(path.GetData(), File::AccessMode::Read);
        if (!File::IsOpened(result)) throw MakeFailure(what, result);
    }
    std::FILE* const from = file.IsOpen() ? file.GetHandle() : stdin;
    std::string bytes;
    char block[1 << 16];
    for (size_t count; (count = std::fread(block, 1, sizeof block, from)) > 0;) {
        bytes.append(block, count);
        if (bytes.size() > c_mostBytes) throw MakeFailure(what, File::OpenUnmanagedResult::TooLarge);
    }
    if (std::ferror(from)) throw MakeFailure(what, File::OpenUnmanagedResult::Other);
    return bytes;
}

std::string FormatHex(std::string const& bytes)
{
    static constexpr char c_digits[] = "0123456789abcdef";
    std::string text;
    for (char const c : bytes) {
        text += c_digits[static_cast<u8>(c) >> 4];
        text += c_digits[static_cast<u8>(c) & 15];
    }
    return text;
}

} // namespace KernelTool

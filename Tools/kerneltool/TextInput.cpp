#include "TextInput.h"

#include "Diagnostics.h"
#include "Output.h"
#include "libkernel/core/CharTraits.h"
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

size_t GetWellFormedLength(std::string_view text)
{
    using Traits = CharTraits<TEncUtf8>;
    char const* p = text.data();
    char const* const end = p + Traits::GetValidLength(p, static_cast<int>(text.size()), true);
    while (p < end) {
        char const* next = p;
        u32 const codePoint = Traits::NextCodePoint(next);
        bool const isSurrogate = (codePoint & 0xFFFFF800) == 0xD800;
        if (isSurrogate || codePoint > 0x10FFFF || Traits::GetCodePointLength(codePoint) != next - p) break;
        p = next;
    }
    return static_cast<size_t>(p - text.data());
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

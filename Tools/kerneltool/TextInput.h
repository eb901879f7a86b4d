#pragma once

#include "libkernel/core/String.h"

#include <string>
#include <string_view>

namespace KernelTool {

/// The bytes of a regular file, or with an empty name or "-" those of standard input. Throws Failure.
std::string ReadInput(Kernel::String8 const& path);

/// The name that the person is told of that input.
std::string DescribeInput(Kernel::String8 const& path);

/// Bytes of @p text from its start that are well-formed UTF-8 (The Unicode Standard, table 3-7): neither surrogates nor
/// overlong forms, and nothing above U+10FFFF.
size_t GetWellFormedLength(std::string_view text);

/// Bytes as pairs of lower-case hexadecimal digits.
std::string FormatHex(std::string const& bytes);

} // namespace KernelTool

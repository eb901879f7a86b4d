#pragma once

#include "libkernel/core/String.h"

#include <string>

namespace KernelTool {

/// The bytes of a regular file, or with an empty name or "-" those of standard input. Throws Failure.
std::string ReadInput(Kernel::String8 const& path);

/// The name that the person is told of that input.
std::string DescribeInput(Kernel::String8 const& path);

/// Bytes as pairs of lower-case hexadecimal digits.
std::string FormatHex(std::string const& bytes);

} // namespace KernelTool

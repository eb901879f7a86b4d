#pragma once

#include <cstdio>

namespace KernelTool {

/// True if the stream goes to a terminal. What is system's own about it lies in posix/.
bool IsTerminal(std::FILE* stream);

} // namespace KernelTool

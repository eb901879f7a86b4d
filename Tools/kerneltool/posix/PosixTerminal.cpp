#include "Terminal.h"

#include <unistd.h>

namespace KernelTool {

bool IsTerminal(std::FILE* stream)
{
    return ::isatty(::fileno(stream)) == 1;
}

} // namespace KernelTool

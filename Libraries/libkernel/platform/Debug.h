#pragma once

#include "libkernel/core/Export.h"

namespace Kernel::Platform {

/// True while a debugger traces this process.
KERNEL_API bool IsDebuggerAttached();

/// Text for whoever debugs: standard error, in one write, no line end added.
KERNEL_API void WriteDebugOutput(char const* text);

/// A message for the user with a title. There are no windows here: both go to standard error.
KERNEL_API void ShowMessage(char const* title, char const* text);

/// Replaces where WriteDebugOutput and ShowMessage write, null for standard error again. For tests.
KERNEL_API void SetDebugSink(void (*sink)(char const* text));

/// Says which promise was broken and where, then ends the process.
[[noreturn]] KERNEL_API void FailAssertion(char const* what, char const* file, int line);

} // namespace Kernel::Platform

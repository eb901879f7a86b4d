#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

// The channel for whoever debugs: standard error, while tracing is on. Any thread; texts never mix. Tests catch the
// text with SetIsTraceEnabled(true) and Platform::SetDebugSink.

/// Writes the text as it stands, with no line end added, if tracing is on.
KERNEL_API void Trace(String8 const& text);
/// The same; null writes nothing.
KERNEL_API void Trace(char const* text);

/// Whether tracing is on. Decided at first use: by the environment variable CorvaneIsTraceEnabled if it is set, on if
/// its first character is "1"; otherwise on if a debugger is attached.
KERNEL_API bool IsTraceEnabled();
/// Overrides that decision for the process.
KERNEL_API void SetIsTraceEnabled(bool enabled);

} // namespace Kernel

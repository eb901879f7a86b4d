#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// Where the library's log messages go. The log of the application services is one; a host or a test may put its own.
class KERNEL_API LogSink
{
public:
    /// One message, without a line end. Called from any thread, also from several at once, and must not throw.
    virtual void WriteMessage(int level, String8 const& text) = 0;

protected:
    virtual ~LogSink();
};

/// Puts @p sink in place and gives the one before. The sink is borrowed: it is replaced, and threads that may be
/// writing have ended, before it dies. Null, as at the start, drops messages.
KERNEL_API LogSink* SetLogSink(LogSink* sink);
KERNEL_API LogSink* GetLogSink();

/// Hands a message to the sink, if there is one. Any thread.
KERNEL_API void WriteToLog(int level, String8 const& text);

} // namespace Kernel

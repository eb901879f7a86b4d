#include "libkernel/core/LogSink.h"

#include <atomic>

namespace Kernel {
namespace {

std::atomic<LogSink*> s_logSink{nullptr};

} // namespace

LogSink::~LogSink() = default;

LogSink* SetLogSink(LogSink* sink)
{
    return s_logSink.exchange(sink);
}

LogSink* GetLogSink()
{
    return s_logSink;
}

void WriteToLog(int level, String8 const& text)
{
    if (LogSink* const sink = s_logSink) sink->WriteMessage(level, text);
}

} // namespace Kernel

#pragma once

#include "libkernel/core/Trace.h"
#include "libkernel/platform/Debug.h"

#include <string>

namespace Kernel::Test {

/// Turns tracing on and collects what is traced, for a scope. One at a time.
class TraceCapture
{
public:
    TraceCapture() : m_wasEnabled(IsTraceEnabled())
    {
        GetText().clear();
        Platform::SetDebugSink([](char const* text) { GetText() += text; });
        SetIsTraceEnabled(true);
    }
    ~TraceCapture()
    {
        SetIsTraceEnabled(m_wasEnabled);
        Platform::SetDebugSink(nullptr);
    }
    TraceCapture(TraceCapture const&) = delete;

    static std::string& GetText()
    {
        static std::string text;
        return text;
    }

private:
    bool const m_wasEnabled;
};

} // namespace Kernel::Test

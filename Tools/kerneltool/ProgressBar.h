#pragma once

#include "CommandLine.h"
#include "libkernel/concurrency/ProgressReporter.h"

#include <chrono>
#include <string>

namespace KernelTool {

/// One long piece of work: counts what is done and shows a bar on standard error once it lasts longer than half a
/// second. Belongs to the thread that made it.
class LongWork
{
public:
    /// @p total is in whatever Advance counts; 0 if nobody knows.
    LongWork(std::string const& description, Kernel::u64 total, Arguments const& arguments);
    LongWork(LongWork const&) = delete;
    LongWork& operator=(LongWork const&) = delete;
    /// Takes the bar away.
    ~LongWork();

    /// @p count more is done. Throws AbortException after Ctrl-C.
    void Advance(Kernel::u64 count);

private:
    class Bar : public Kernel::Progress
    {
    public:
        Bar(Kernel::String8 const& description, Kernel::Counted<Kernel::ProgressReporter> const& reporter, bool atOnce);
        void OnProgressUpdate() override;
        void Clear();

    private:
        ~Bar() override;

        std::chrono::steady_clock::time_point m_next; // No drawing before this moment.
        bool m_drawn = false;
    };

    Kernel::u64 const m_total;
    Kernel::u64 m_done = 0;
    Kernel::Counted<Kernel::BasicProgressReporter> m_reporter;
    Kernel::Counted<Bar> m_bar; // Null: never shown.
};

} // namespace KernelTool

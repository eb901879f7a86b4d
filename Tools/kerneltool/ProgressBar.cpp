#include "ProgressBar.h"

#include "Interrupt.h"
#include "Terminal.h"

#include <cstdio>

namespace KernelTool {

using namespace Kernel;

namespace {

constexpr auto c_patience = std::chrono::milliseconds(500);
constexpr auto c_interval = std::chrono::milliseconds(100);
constexpr int c_width = 30;

} // namespace

LongWork::Bar::Bar(String8 const& description, Counted<ProgressReporter> const& reporter, bool atOnce)
    : Progress(description, reporter), m_next(std::chrono::steady_clock::now())
{
    if (!atOnce) m_next += c_patience;
}

LongWork::Bar::~Bar() = default;

void LongWork::Bar::OnProgressUpdate()
{
    auto const now = std::chrono::steady_clock::now();
    double const progress = GetProgress();
    if (now < m_next && !(m_drawn && progress >= 1.0)) return;
    m_next = now + c_interval;
    m_drawn = true;
    int const filled = static_cast<int>(progress * c_width);
    std::string bar(static_cast<size_t>(filled), '#');
    bar.append(static_cast<size_t>(c_width - filled), '.');
    std::fprintf(stderr, "\r%s [%s] %3d %%", GetDescription().GetData(), bar.c_str(), static_cast<int>(progress * 100));
    std::fflush(stderr);
}

void LongWork::Bar::Clear()
{
    if (!m_drawn) return;
    bool const terminal = IsTerminal(stderr);
    std::fputs(terminal ? "\r\x1b[K" : "\n", stderr);
    std::fflush(stderr);
}

LongWork::LongWork(std::string const& description, u64 total, Arguments const& arguments)
    : m_total(total), m_reporter(MakeCounted<BasicProgressReporter>())
{
    std::string const when = arguments.Get(Option::Progress, "auto");
    bool const always = when == "always";
    if (always || (when == "auto" && IsTerminal(stderr)))
        m_bar = MakeCounted<Bar>(String8(description.c_str()), m_reporter, always);
}

LongWork::~LongWork()
{
    if (m_bar) m_bar->Clear();
}

void LongWork::Advance(u64 count)
{
    m_done += count;
    m_reporter->SetProgress(m_total ? static_cast<double>(m_done) / static_cast<double>(m_total) : 0.0);
    StopIfInterrupted();
}

} // namespace KernelTool

#pragma once

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <string>
#include <vector>

/// What every benchmark prints: one row for a figure, beside its peer's and its goal. Measures, never passes or fails.
namespace Bench {

/// Seconds that one call of @p work takes: the best of @p rounds, after one call to warm up.
template <class F>
double BestSeconds(int rounds, F&& work)
{
    work();
    double best = 1e300;
    for (int i = 0; i < rounds; ++i) {
        auto const start = std::chrono::steady_clock::now();
        work();
        best = std::min(best, std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
    }
    return best;
}

/// Seconds of one call, the median of @p rounds, for work whose best case isn't typical (a device flush).
template <class F>
double MedianSeconds(int rounds, F&& work)
{
    std::vector<double> all;
    for (int i = 0; i < rounds; ++i) {
        auto const start = std::chrono::steady_clock::now();
        work();
        all.push_back(std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
    }
    std::nth_element(all.begin(), all.begin() + rounds / 2, all.end());
    return all[static_cast<size_t>(rounds / 2)];
}

/// Keeps a value alive, so that the compiler can't drop what made it.
template <class T>
void Keep(T const& value)
{
    asm volatile("" : : "r,m"(value) : "memory");
}

/// Aligned rows on standard output.
class Table
{
public:
    explicit Table(char const* title)
    {
        std::printf("\n%s\n%-34s %-30s %12s %-6s %10s  %s\n", title, "workload", "subject", "figure", "unit", "to peer",
                    "goal");
    }

    /// @p peerFigure of 0 leaves the ratio out; @p goal is text, such as "<= 1.10 x lmdb", empty if there is none.
    void Row(char const* workload, char const* subject, double figure, char const* unit, double peerFigure = 0.0,
             char const* goal = "")
    {
        char ratio[32] = "";
        if (peerFigure > 0.0) std::snprintf(ratio, sizeof ratio, "%.2f", figure / peerFigure);
        std::printf("%-34s %-30s %12.3f %-6s %10s  %s\n", workload, subject, figure, unit, ratio, goal);
        std::fflush(stdout);
    }
};

} // namespace Bench

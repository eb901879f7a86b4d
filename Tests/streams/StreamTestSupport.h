#pragma once

#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/StreamCopyProgress.h"
#include "support/PlainStreams.h"

#include <string>
#include <utility>
#include <vector>

namespace Kernel::Test {

using Reports = std::vector<std::pair<u64, u64>>;

/// Keeps every report of a copy.
class ProgressLog : public StreamCopyProgress
{
public:
    ~ProgressLog() override = default;
    void ReportProgress(u64 done, u64 total) override { reports.emplace_back(done, total); }

    Reports reports;
};

inline std::string Pattern(size_t size, unsigned seed = 1)
{
    std::string text(size, '\0');
    for (char& c : text) c = static_cast<char>((seed = seed * 1664525u + 1013904223u) >> 24);
    return text;
}

inline std::string ReadAll(InStream& in, u64 step = 1000)
{
    std::string text;
    std::vector<char> piece(step);
    while (u64 const n = in.ReadBlock(piece.data(), step)) text.append(piece.data(), n);
    return text;
}

inline u64 Write(OutStream& out, std::string const& text)
{
    return out.WriteBlock(text.data(), text.size());
}

inline std::string Content(MemoryInOutStreamBase const& stream)
{
    return std::string(static_cast<char const*>(stream.GetBuffer()), stream.GetSizeInStream());
}

} // namespace Kernel::Test

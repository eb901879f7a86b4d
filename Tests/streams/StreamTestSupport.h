#pragma once

#include "libkernel/streams/InStream.h"
#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/StreamCopyProgress.h"

#include <algorithm>
#include <cstring>
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

/// A plain source over a text that notes the sizes of the reads. It can be told to fall silent before its end.
class PlainSource : public InStream
{
public:
    explicit PlainSource(std::string text) : m_text(std::move(text)) {}
    ~PlainSource() override = default;

    u64 ReadBlock(void* to, u64 count) override
    {
        reads.push_back(count);
        u64 const end = std::min<u64>(m_text.size(), silentFrom);
        u64 const n = m_position < end ? std::min(count, end - m_position) : 0;
        std::memcpy(to, m_text.data() + m_position, n);
        m_position += n;
        return n;
    }
    bool SkipBlock(u64 count) override
    {
        if (count > m_text.size() - m_position) return false;
        m_position += count;
        return true;
    }
    bool SlowProgressInStream() const override { return slow; }
    bool CanRewindInStream() const override { return rewindable; }
    bool RewindInStream() override
    {
        if (rewindable) m_position = 0;
        return rewindable;
    }
    bool EOS() const override { return m_position == m_text.size(); }
    u64 GetSizeInStream() const override { return sized ? m_text.size() : 0; }
    u64 TellInStream() const override { return m_position; }

    std::vector<u64> reads;
    u64 silentFrom = ~u64{0};
    bool slow = false;
    bool rewindable = false;
    bool sized = true;

private:
    std::string const m_text;
    u64 m_position = 0;
};

/// A plain target that notes the sizes of the writes, takes only so many bytes and, if told to, throws instead.
class PlainTarget : public OutStream
{
public:
    ~PlainTarget() override = default;

    u64 WriteBlock(void const* from, u64 count) override
    {
        writes.push_back(count);
        u64 const n = std::min<u64>(count, room - text.size());
        if (throws && n != count) throw 42;
        text.append(static_cast<char const*>(from), n);
        return n;
    }
    void Reserve(u64 count) override { reserved += count; }
    bool SlowProgressOutStream() const override { return slow; }
    u64 GetSizeOutStream() const override { return text.size(); }
    u64 TellOutStream() const override { return text.size(); }

    std::string text;
    std::vector<u64> writes;
    u64 room = ~u64{0};
    u64 reserved = 0;
    bool slow = false;
    bool throws = false;
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

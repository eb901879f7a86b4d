#pragma once

#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

namespace Kernel::Test {

/// A source over bytes that notes the sizes of the reads. It can be told to give small pieces, to fall silent before
/// its end, and to hide its size.
template <class Base>
class SourceT : public Base
{
public:
    explicit SourceT(std::string bytes) : m_bytes(std::move(bytes)) {}
    explicit SourceT(std::vector<u8> const& bytes) : m_bytes(bytes.begin(), bytes.end()) {}
    ~SourceT() override = default;

    u64 ReadBlock(void* to, u64 count) override
    {
        if (++readCount <= 1000) reads.push_back(count);
        u64 const end = std::min<u64>(m_bytes.size(), silentFrom);
        u64 const n = m_position < end ? std::min({count, piece, end - m_position}) : 0;
        std::copy_n(m_bytes.data() + m_position, n, static_cast<char*>(to));
        m_position += n;
        return n;
    }
    bool SkipBlock(u64 count) override
    {
        if (count > m_bytes.size() - m_position) return false;
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
    bool EOS() const override { return m_position == m_bytes.size(); }
    u64 GetSizeInStream() const override { return sized ? m_bytes.size() : 0; }
    u64 TellInStream() const override { return m_position; }

    u64 readCount = 0;
    std::vector<u64> reads; // The first thousand.
    u64 piece = ~u64{0};
    u64 silentFrom = ~u64{0};
    bool slow = false;
    bool rewindable = false;
    bool sized = true;

protected:
    std::string const m_bytes;
    u64 m_position = 0;
};
using PlainSource = SourceT<InStream>;

/// The same that can seek, and is no memory stream.
class SeekableSource : public SourceT<InStreamSeekable>
{
public:
    explicit SeekableSource(std::vector<u8> const& bytes) : SourceT(bytes) { rewindable = true; }
    bool SeekInStream(Kernel::SeekMethod method, i64 offset) override
    {
        i64 const base = method == Kernel::SeekMethod::Current ? static_cast<i64>(m_position)
                         : method == Kernel::SeekMethod::End   ? static_cast<i64>(m_bytes.size())
                                                               : 0;
        if (base + offset < 0 || base + offset > static_cast<i64>(m_bytes.size())) return false;
        m_position = static_cast<u64>(base + offset);
        return true;
    }
};

/// A target that notes the sizes of the writes, takes only so many bytes and, if told to, throws instead.
template <class Bytes>
class TargetT : public OutStream
{
public:
    explicit TargetT(u64 limit = ~u64{0}) : room(limit) {}
    ~TargetT() override = default;

    u64 WriteBlock(void const* from, u64 count) override
    {
        writes.push_back(count);
        u64 const n = std::min<u64>(count, room - bytes.size());
        if (throws && n != count) throw 42;
        auto const* const p = static_cast<typename Bytes::value_type const*>(from);
        bytes.insert(bytes.end(), p, p + n);
        return n;
    }
    void Reserve(u64 count) override { reserved += count; }
    bool SlowProgressOutStream() const override { return slow; }
    u64 GetSizeOutStream() const override { return bytes.size(); }
    u64 TellOutStream() const override { return bytes.size(); }

    Bytes bytes;
    std::vector<u64> writes;
    u64 room;
    u64 reserved = 0;
    bool slow = false;
    bool throws = false;
};
using PlainTarget = TargetT<std::string>;
using ByteSink = TargetT<std::vector<u8>>;

} // namespace Kernel::Test

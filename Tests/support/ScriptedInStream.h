#pragma once

#include "libkernel/streams/InStream.h"

#include <algorithm>
#include <cstring>
#include <vector>

namespace Kernel::Test {

/// The reading that the two below share.
template <class Base>
class ScriptedStreamT : public Base
{
public:
    explicit ScriptedStreamT(std::vector<u8> bytes) : m_bytes(std::move(bytes)) {}

    u64 ReadBlock(void* to, u64 count) override
    {
        count = std::min<u64>(count, m_bytes.size() - m_position);
        if (count) std::memcpy(to, m_bytes.data() + m_position, count);
        m_position += count;
        ++reads;
        return count;
    }
    bool EOS() const override { return m_position == m_bytes.size(); }
    u64 GetSizeInStream() const override { return m_bytes.size(); }
    u64 TellInStream() const override { return m_position; }

    u64 reads = 0; // Calls of ReadBlock.

protected:
    std::vector<u8> const m_bytes;
    u64 m_position = 0;
};

/// A stream over bytes that can neither seek nor rewind, with or without a size.
class ScriptedInStream : public ScriptedStreamT<InStream>
{
public:
    ScriptedInStream(std::vector<u8> bytes, bool knowsSize) : ScriptedStreamT(std::move(bytes)), m_knowsSize(knowsSize)
    {
    }

    bool SkipBlock(u64 count) override
    {
        if (count > m_bytes.size() - m_position) return false;
        m_position += count;
        return true;
    }
    u64 GetSizeInStream() const override { return m_knowsSize ? m_bytes.size() : 0; }
    u64 TellInStream() const override { return m_knowsSize ? m_position : 0; }

    u64 GetPosition() const { return m_position; }

private:
    bool const m_knowsSize;
};

/// The same that can seek, and is no memory stream.
class SeekableScriptedStream : public ScriptedStreamT<InStreamSeekable>
{
public:
    using ScriptedStreamT::ScriptedStreamT;

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

} // namespace Kernel::Test

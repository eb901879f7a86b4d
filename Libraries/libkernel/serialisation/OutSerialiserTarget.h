#pragma once

#include "libkernel/core/Endian.h"
#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <cstring>

namespace Kernel {

class OutStream;

/// The bytes on their way from the serialisers of one save to its stream: a buffer, so that a property costs a few
/// stores and no call through a table. Large blocks go past it. Belongs to the thread of the save.
///
/// Nothing is written after the stream took less than it was given: from then on everything fails.
class KERNEL_API OutSerialiserTarget
{
public:
    static constexpr u64 c_bufferSize = 16384;
    /// The most that Claim gives.
    static constexpr u64 c_maxClaim = 256;

    /// @p stream is borrowed and must live as long.
    explicit OutSerialiserTarget(OutStream& stream);
    OutSerialiserTarget(OutSerialiserTarget const&) = delete;
    OutSerialiserTarget& operator=(OutSerialiserTarget const&) = delete;

    /// Room for @p count bytes, at most c_maxClaim; Advance then takes as many of them as were filled. Null when the
    /// stream failed.
    u8* Reserve(u64 count) { return count <= static_cast<u64>(m_end - m_next) || Flush() ? m_next : nullptr; }
    /// True if Reserve gives that much without handing anything on.
    bool HasRoom(u64 count) const { return count <= static_cast<u64>(m_end - m_next); }
    void Advance(u64 count) { m_next += count; }
    /// Both at once: the caller fills the whole room.
    u8* Claim(u64 count)
    {
        u8* const room = Reserve(count);
        if (room) m_next += count;
        return room;
    }
    /// False when the stream failed.
    bool Put(void const* bytes, u64 count)
    {
        if (count > static_cast<u64>(m_end - m_next)) return PutLarge(bytes, count);
        Copy(m_next, static_cast<u8 const*>(bytes), count);
        m_next += count;
        return true;
    }
    /// Hands what is held back to the stream. False when it failed, now or before.
    bool Flush();
    /// Size of the stream with what is held back.
    u64 GetSize() const;
    /// The stream, with nothing held back; null when it failed.
    OutStream* GetFlushedStream();
    /// Makes everything from now on fail.
    void MarkAsFailed();

private:
    // Most texts are short, and a call costs more than their bytes.
    static void Copy(u8* to, u8 const* from, u64 count)
    {
        if (count >= 8 && count <= 16) {
            u64 const last = LoadLittleEndian<u64>(from + count - 8);
            StoreLittleEndian(to, LoadLittleEndian<u64>(from));
            StoreLittleEndian(to + count - 8, last);
        } else if (count)
            std::memcpy(to, from, count);
    }
    bool PutLarge(void const* bytes, u64 count);

    OutStream& m_stream;
    u8* m_next;
    u8* m_end; // The start of the buffer once the stream has failed, so that there is never room.
    bool m_failed = false;
    u8 m_buffer[c_bufferSize];
};

} // namespace Kernel

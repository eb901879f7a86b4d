#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Types.h"
#include "libkernel/streams/InStream.h"

#include <cstring>
#include <memory>

namespace Kernel {

/// The stream under a parse, read in blocks, with the count of what is left of it.
///
/// Three ways of reading. A MemoryInStream is read where it lies. A stream that can seek is read ahead in blocks of
/// c_blockSize, and Release sets it back. Any other is asked only for what is sure to belong to the parse: the bytes
/// wanted, and one for each list that is open, since its closing byte must follow.
class InSerialiserSource
{
public:
    static constexpr u64 c_blockSize = 64 * 1024;

    /// Borrows @p in until Release.
    explicit InSerialiserSource(InStream& in);
    InSerialiserSource(InSerialiserSource const&) = delete;
    InSerialiserSource& operator=(InSerialiserSource const&) = delete;

    /// False, with what came already taken, if the stream ends before.
    bool Read(void* to, u64 count)
    {
        if (count > static_cast<u64>(m_end - m_at)) return ReadSlow(static_cast<u8*>(to), count);
        std::memcpy(to, m_at, count);
        m_at += count;
        return true;
    }
    template <class T>
    bool ReadNumber(T& value)
    {
        if (sizeof(T) > static_cast<u64>(m_end - m_at) && !Fill(sizeof(T))) return false;
        value = LoadLittleEndian<T>(m_at);
        m_at += sizeof(T);
        return true;
    }
    /// The first byte of the next item of the innermost open list, or the 0 that closes it.
    bool ReadItemByte(u8& value)
    {
        if (m_at == m_end && !FillSlow(1, m_openLists - 1)) return false;
        value = *m_at++;
        return true;
    }
    bool Skip(u64 count);

    /// Makes @p count bytes, at most c_blockSize, readable at GetAt.
    bool Fill(u64 count) { return count <= static_cast<u64>(m_end - m_at) || FillSlow(count, m_openLists); }
    u8 const* GetAt() const { return m_at; }
    u64 GetBuffered() const { return static_cast<u64>(m_end - m_at); }
    /// Takes @p count bytes that Fill has made readable.
    void Take(u64 count) { m_at += count; }

    /// False if the stream knows its size and has fewer than @p count bytes left: no length beyond that is believed.
    bool Fits(u64 count) const
    {
        u64 const buffered = static_cast<u64>(m_end - m_at);
        return count <= buffered || !m_sized || count - buffered <= m_unread;
    }
    /// False if the stream does not know its size.
    bool IsSized() const { return m_sized; }

    /// Bytes taken since the start.
    u64 GetTaken() const { return m_fetched - static_cast<u64>(m_end - m_at); }
    /// Bytes that have come out of the stream since the start: after a failure for want of bytes, all that it had.
    u64 GetFetched() const { return m_fetched; }
    /// The part of the whole stream that is done, 0 to 1; 0 if the size is not known.
    float GetProgress() const;

    void OpenList() { ++m_openLists; }
    void CloseList() { --m_openLists; }

    /// Sets the stream to just behind what was taken. False if it refuses.
    bool Release();

private:
    bool ReadSlow(u8* to, u64 count);
    bool FillSlow(u64 count, u64 sure);
    u64 Fetch(u8* to, u64 count);

    InStream& m_in;
    InStreamSeekable* m_seekable = nullptr; // The same stream, if it can be set back.
    u8 const* m_at = nullptr;
    u8 const* m_end = nullptr;
    u64 m_start = 0;   // Position of the stream at the start.
    u64 m_size = 0;    // Of the whole stream; 0 if it does not know.
    u64 m_fetched = 0; // Bytes that went into the buffer or straight to their place since the start.
    u64 m_unread = 0;  // Bytes that the stream still has; only where m_sized.
    bool m_sized = false;
    bool m_inPlace = false;
    u32 m_openLists = 0;
    std::unique_ptr<u8[]> m_buffer;
};

/// The rest of a parse as a stream of its own, for those who read from one. Knows neither size nor position.
class InSerialiserSourceStream final : public InStream
{
public:
    explicit InSerialiserSourceStream(InSerialiserSource& source) : m_source(source) {}
    u64 ReadBlock(void* to, u64 count) override { return m_source.Read(to, count) ? count : 0; }
    bool SkipBlock(u64 count) override { return m_source.Skip(count); }
    u64 GetSizeInStream() const override { return 0; }
    u64 TellInStream() const override { return m_source.GetTaken(); }
    bool EOS() const override { return false; }

private:
    InSerialiserSource& m_source;
};

} // namespace Kernel

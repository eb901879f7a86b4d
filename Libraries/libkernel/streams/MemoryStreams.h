#pragma once

#include "libkernel/streams/InOutStream.h"

namespace Kernel {

/// Hands a malloc'ed buffer from a writer to a reader without a copy. Owns the buffer until somebody detaches it.
class KERNEL_API MemCourier
{
public:
    MemCourier() = default;
    /// Takes over @p data, which must come from malloc or be null.
    MemCourier(void* data, u64 size) : m_data(data), m_size(size) {}
    MemCourier(MemCourier&& o) noexcept;
    MemCourier& operator=(MemCourier&& o) noexcept;
    ~MemCourier();

    void* GetData() const { return m_data; }
    u64 GetSize() const { return m_size; }
    /// Gives the buffer to the caller, who frees it; the courier is then empty.
    [[nodiscard]] void* Detach() noexcept;

private:
    void* m_data = nullptr;
    u64 m_size = 0;
};

/// Reads a block of memory. Seeks go to the nearest end rather than fail; only an unknown method is refused.
class KERNEL_API MemoryInStream : public InStreamSeekable
{
public:
    /// Reads @p size bytes at @p data: the caller's own, which must outlive the stream, or with @p copy a copy of them.
    /// Throws MemoryException if there is no memory for the copy.
    MemoryInStream(void const* data, u64 size, bool copy);
    explicit MemoryInStream(MemCourier courier);
    ~MemoryInStream() override;
    MemoryInStream(MemoryInStream const&) = delete;
    MemoryInStream& operator=(MemoryInStream const&) = delete;

    /// The first byte of the whole block.
    void const* GetBuffer() const { return m_data; }
    /// Bytes from the position to the end.
    u64 GetRem() const { return m_size - m_position; }

    u64 ReadBlock(void* to, u64 count) override;
    bool EOS() const override { return m_position == m_size; }
    bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr) override;
    u64 GetSizeInStream() const override { return m_size; }
    u64 TellInStream() const override { return m_position; }
    bool SeekInStream(SeekMethod method, i64 offset) override;

private:
    u8 const* m_data;
    u64 m_size;
    u64 m_position = 0; // Never above m_size.
    bool m_owning;
};

/// A growing block of memory with one position and one size for both sides. How it grows is the concrete class's.
///
/// A growth that fails leaves everything as it was and is told by the operation's result; nothing throws.
class KERNEL_API MemoryInOutStreamBase : public InOutStreamSeekable
{
public:
    /// Beyond a terabyte a length is an attack or a slip, and no memory is asked for.
    static constexpr u64 c_maxCapacity = u64{1} << 40;

    MemoryInOutStreamBase(MemoryInOutStreamBase const&) = delete;
    MemoryInOutStreamBase& operator=(MemoryInOutStreamBase const&) = delete;

    u64 ReadBlock(void* to, u64 count) override;
    /// False if @p count passes the end; nothing moves then.
    bool SkipBlock(u64 count) override;
    bool EOS() const override { return m_position == m_size; }
    /// Gives the buffer itself to the target, without a copy between.
    bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr) override;
    u64 GetSizeInStream() const override { return m_size; }
    u64 TellInStream() const override { return m_position; }
    /// A target before the start is the start; one beyond the end lengthens the stream with zeros.
    bool SeekInStream(SeekMethod method, i64 offset) override;

    /// Writes all or nothing.
    u64 WriteBlock(void const* from, u64 count) override;
    void Reserve(u64 count) override;
    /// Makes room for everything that @p in says is left, then reads straight into it. False without the room or if
    /// less comes.
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    u64 GetSizeOutStream() const override { return m_size; }
    u64 TellOutStream() const override { return m_position; }
    /// Zero-fills between the end and @p position if it lies beyond.
    bool WriteBlockAtPos(u64 position, void const* from, u64 count) override;
    bool Truncate(u64 size) override;
    bool SeekOutStream(SeekMethod method, i64 offset) override;

    /// Bytes that fit before the buffer must grow.
    u64 GetReserveSize() const { return m_capacity; }
    /// The first byte of the whole buffer, for as long as the stream is not written to.
    void const* GetBuffer() const { return m_buffer; }
    /// Bytes from the position to the end.
    u64 GetRem() const { return m_size - m_position; }
    /// Gives up the buffer and leaves the stream empty.
    MemCourier ReleaseBuffer();

protected:
    MemoryInOutStreamBase() = default;
    /// With a first capacity in bytes, which is 0 if there is no memory for it.
    explicit MemoryInOutStreamBase(u64 capacity);
    ~MemoryInOutStreamBase() override;

    /// Makes the capacity at least @p required.
    bool ResizeBuffer(u64 required);

    /// The capacity to go to from @p capacity when @p required bytes must fit; at least @p required.
    virtual u64 GetNewCapacity(u64 capacity, u64 required) const = 0;

private:
    bool SeekI(SeekMethod method, i64 offset);
    bool ZeroFillTo(u64 end);

    u8* m_buffer = nullptr; // From malloc; null exactly when m_capacity is 0.
    u64 m_capacity = 0;
    u64 m_position = 0; // m_position <= m_size <= m_capacity.
    u64 m_size = 0;
};

/// The memory stream to use: it doubles, so that the cost of growing spreads evenly over the bytes written.
class KERNEL_API MemoryInOutStream final : public MemoryInOutStreamBase
{
public:
    MemoryInOutStream() = default;
    explicit MemoryInOutStream(u64 capacity) : MemoryInOutStreamBase(capacity) {}
    ~MemoryInOutStream() override;

protected:
    u64 GetNewCapacity(u64 capacity, u64 required) const override;
};

} // namespace Kernel

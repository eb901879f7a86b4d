#pragma once

#include "libkernel/core/Countable.h"

#include <vector>

namespace Kernel {

class InStream;
class OutStream;

/// A large byte range in equal heap blocks: it never needs one big allocation, and growing never moves old bytes.
/// Streams read and write it through FragmentedRawDataStream. One thread at a time.
class KERNEL_API FragmentedRawData : public Countable
{
public:
    static constexpr u64 c_minBlockSize = 16384;

    /// Empty; a block size below c_minBlockSize is raised to it.
    explicit FragmentedRawData(u64 blockSize);
    FragmentedRawData(FragmentedRawData const&) = delete;
    FragmentedRawData& operator=(FragmentedRawData const&) = delete;

    /// Size in bytes.
    u64 GetSize() const { return m_size; }
    u64 GetBlockSize() const { return m_blockSize; }

    /// Grows or shrinks to @p size bytes; shrinking frees the blocks no longer needed. New bytes are zero with
    /// @p zeroFill, otherwise undefined. False, with the object unchanged, if there is no memory.
    bool SetSize(u64 size, bool zeroFill);

    /// Copies @p count bytes in at @p offset, growing as needed. With @p zeroFill the gap between the old end and an
    /// offset beyond it is zero, otherwise undefined. False, with the object unchanged, if there is no memory or
    /// offset + count passes 2^64.
    bool SetData(u64 offset, void const* bytes, u64 count, bool zeroFill);

    /// As SetData, with the bytes read straight from @p in into the blocks; gives the bytes read and stops at the first
    /// short read, with the size as grown and the bytes not read undefined. 0 if the size cannot be had: nothing was
    /// read then. Exceptions of the stream pass through.
    u64 SetDataFromStream(u64 offset, InStream& in, u64 count, bool zeroFill);

    /// Copies up to @p count bytes from @p offset; gives how many there were, 0 at or beyond the end.
    u64 GetData(u64 offset, void* to, u64 count) const;

    /// Zeroes the part of the range that lies inside the data.
    void ZeroRange(u64 offset, u64 count);

    /// Writes all bytes, block by block; false at the first short write.
    bool CopyToStream(OutStream& out) const;

protected:
    ~FragmentedRawData() override;

private:
    bool Expand(u64 size);
    u64 BlocksFor(u64 size) const { return size == 0 ? 0 : (size - 1) / m_blockSize + 1; }
    template <class Step>
    u64 ForEachPiece(u64 offset, u64 count, Step step) const;

    std::vector<u8*> m_blocks; // At least BlocksFor(m_size), each m_blockSize bytes.
    u64 const m_blockSize;
    u64 m_size = 0;
};

} // namespace Kernel

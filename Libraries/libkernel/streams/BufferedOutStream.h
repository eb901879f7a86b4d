#pragma once

#include "libkernel/streams/OutStream.h"

#include <memory>
#include <vector>

namespace Kernel {

/// Collects everything in memory, so that it can seek and patch, and writes the result to its target once, at the end.
///
/// Bytes lie in blocks of one size that never move: growing only lengthens the list of blocks. Memory that runs out
/// is a short count or false, with the contents as before.
class KERNEL_API BufferedOutStream final : public OutStreamSeekable
{
public:
    static constexpr u64 c_defaultBlockSize = 65536;
    static constexpr u64 c_smallestBlockSize = 1024;

    /// What becomes of an exception that the target throws while it takes the bytes.
    enum class CommitErrors
    {
        Swallow = 0, ///< The commit is false.
        Rethrow = 1
    };

    /// Borrows @p target, which must outlive the stream. @p blockSize is raised to c_smallestBlockSize.
    explicit BufferedOutStream(OutStream& target, u64 blockSize = c_defaultBlockSize);
    /// Commits what has not been committed; failures are swallowed.
    ~BufferedOutStream() override;

    /// Changes the block size while nothing has been stored yet; false afterwards.
    bool SetBlockSize(u64 blockSize);
    u64 GetBlockSize() const { return m_blockSize; }

    /// Writes everything to the target. After success the stream is closed: writes give 0 and seeks false. False after
    /// a short write, which keeps the bytes; what the target took stays there.
    bool Commit(CommitErrors errors);

    u64 WriteBlock(void const* from, u64 count) override;
    void Reserve(u64 count) override;
    /// Reads straight into the blocks, with a report after each read. False if less comes than @p in said is left.
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    u64 GetSizeOutStream() const override { return m_size; }
    u64 TellOutStream() const override { return m_position; }
    bool WriteBlockAtPos(u64 position, void const* from, u64 count) override;
    bool Truncate(u64 size) override;
    /// A target before the start is the start; one beyond the end lengthens the stream with zeros.
    bool SeekOutStream(SeekMethod method, i64 offset) override;

private:
    using Block = std::unique_ptr<u8[]>;

    bool AllocateTo(u64 end);
    bool ZeroFillTo(u64 end);
    void SetPosition(u64 position);
    void Put(u64 position, u8 const* from, u64 count);
    bool CommitI();

    OutStream& m_target;
    std::vector<Block> m_blocks;
    u64 m_blockSize;    // 0 once committed.
    u64 m_position = 0; // Never above m_size.
    u64 m_size = 0;
    // Derived from m_position, for small writes: where it lies, and the room behind it in its block. 0 at a block
    // border.
    u8* m_write = nullptr;
    u64 m_room = 0;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/streams/OutStream.h"

#include <memory>

namespace Kernel {

/// What the text encoders share: bytes are gathered in blocks of a size that encodes without a tail, and each full
/// block is encoded onto the target. The tail goes out when the stream is destroyed, and nowhere else.
///
/// Once the target has come up short, or thrown, the stream has failed and every later write gives 0.
class KERNEL_API GatheringOutStream : public OutStream
{
public:
    u64 WriteBlock(void const* from, u64 count) override;
    /// True, and encodes nothing.
    bool Flush() override;
    /// The raw bytes taken; the position is the same.
    u64 GetSizeOutStream() const override;
    u64 TellOutStream() const override;

protected:
    /// Keeps a reference to @p target. Throws std::bad_alloc without memory for its block of @p blockSize bytes.
    GatheringOutStream(Counted<OutStream> target, u32 blockSize);
    ~GatheringOutStream() override;

    /// Encodes the tail. For the destructor of the class that encodes, the last place where it can.
    void FlushTail() noexcept;

    /// Encodes @p count bytes, at least 1 and at most one block, onto @p target. False if it took less than the text.
    virtual bool Encode(OutStream& target, char const* from, u32 count) = 0;

private:
    bool FlushBlock();

    Counted<OutStream> m_target;
    std::unique_ptr<char[]> m_block;
    u32 const m_blockSize;
    u32 m_fill = 0;
    bool m_failed = false;
    u64 m_taken = 0;
};

} // namespace Kernel

#pragma once

#include "libkernel/streams/InStream.h"

namespace Kernel {

/// Makes a plain stream seekable as far as it can be: forward by skipping, back by a rewind and a skip where the source
/// can rewind.
class KERNEL_API ForwardBiasedSeekableInStream final : public InStreamSeekable
{
public:
    /// Borrows @p source, which must outlive the stream.
    explicit ForwardBiasedSeekableInStream(InStream& source) : m_source(source) {}
    ~ForwardBiasedSeekableInStream() override;

    u64 ReadBlock(void* to, u64 count) override;
    bool SkipBlock(u64 count) override;
    bool EOS() const override;
    bool SlowProgressInStream() const override;
    bool CanRewindInStream() const override;
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override;
    /// False where the source can't go; a target before the start is refused, and nothing moves. A skip that fails
    /// leaves the source where the skip left it.
    bool SeekInStream(SeekMethod method, i64 offset) override;

private:
    InStream& m_source;
};

} // namespace Kernel

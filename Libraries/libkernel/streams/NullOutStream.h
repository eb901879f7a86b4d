#pragma once

#include "libkernel/streams/OutStream.h"

namespace Kernel {

/// Throws the bytes away and keeps a position and a size, for measuring.
class KERNEL_API NullOutStream final : public OutStreamSeekable
{
public:
    NullOutStream() = default;
    ~NullOutStream() override;

    u64 WriteBlock(void const* from, u64 count) override;
    /// Moves nothing: counts what @p in says is left and skips it there. One report, at the end.
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    u64 GetSizeOutStream() const override { return m_size; }
    u64 TellOutStream() const override { return m_position; }
    bool Truncate(u64 size) override;
    /// A target before the start is the start; one beyond the end raises the size.
    bool SeekOutStream(SeekMethod method, i64 offset) override;

private:
    bool MoveTo(u64 position);

    u64 m_position = 0;
    u64 m_size = 0;
};

} // namespace Kernel

#pragma once

#include "libkernel/streams/InStream.h"

#include <memory>

namespace Kernel {

/// Reads another stream in large pieces for a reader that takes small ones. Position 0 is where the source stood.
class KERNEL_API BufferedInStream final : public InStream
{
public:
    static constexpr u64 c_smallestBuffer = 65536;

    /// Keeps @p source. @p bufferSize is raised to c_smallestBuffer. Null without a source; std::bad_alloc without
    /// memory for the buffer.
    static Counted<BufferedInStream> Create(Counted<InStream> const& source, u64 bufferSize);

    /// Nothing behind @p position of this stream will be given or taken from the source; 0 means no limit. Bytes that
    /// are in the buffer already stay there.
    void SetLimit(u64 position) { m_limit = position; }

    /// Requests of the buffer size and more go past the buffer.
    u64 ReadBlock(void* to, u64 count) override;
    /// If it fails the buffer is dropped all the same.
    bool SkipBlock(u64 count) override;
    bool EOS() const override;
    bool SlowProgressInStream() const override;
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return m_position; }

private:
    BufferedInStream(Counted<InStream> const& source, u64 bufferSize);
    ~BufferedInStream() override;
    u64 CutToLimit(u64 count) const;
    u64 TakeAvailable(void* to, u64 count);

    Counted<InStream> const m_source;
    u64 const m_start; // The source's position at creation.
    u64 const m_bufferSize;
    std::unique_ptr<u8[]> const m_buffer;
    u8 const* m_read = nullptr;
    u64 m_available = 0; // Bytes at m_read that are not delivered yet.
    u64 m_position = 0;
    u64 m_limit = 0;
};

} // namespace Kernel

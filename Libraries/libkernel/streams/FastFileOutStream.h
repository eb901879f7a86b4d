#pragma once

#include "libkernel/streams/FileWriterBase.h"
#include "libkernel/streams/OutStream.h"

namespace Kernel {

/// Writes a file from start to end through a buffer of the caller's size. Failures as FileStreamBase tells them; one of
/// bytes held back may come with a later call.
class KERNEL_API FastFileOutStream final : public OutStream, public FileWriterBase
{
public:
    static constexpr u64 c_minBufferSize = 1024;

    /// @p bufferSize is raised to c_minBufferSize. Null on failure, without memory for the buffer, and for a null
    /// path.
    static Counted<FastFileOutStream> Create(char const* path, u64 bufferSize);
    /// Keeps what is there, and writes behind it.
    static Counted<FastFileOutStream> Append(char const* path, u64 bufferSize);

    u64 GetBufferSize() const { return GetBufferSizeI(); }

    u64 WriteBlock(void const* from, u64 count) override;
    bool Flush() override { return FlushI(); }
    /// A flush that the device failed is never tried again: the stream is broken.
    bool ForceFlush() override { return ForceFlushI(); }
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyFromStream() const override { return true; }
    bool SlowProgressOutStream() const override { return true; }
    u64 GetSizeOutStream() const override { return GetSizeI(); }
    u64 TellOutStream() const override { return GetPosition(); }

private:
    FastFileOutStream(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize, Placement placement,
                      u64 size);
    ~FastFileOutStream() override;
    static Counted<FastFileOutStream> OpenI(char const* path, char const* mode, u64 bufferSize, Placement placement);
};

} // namespace Kernel

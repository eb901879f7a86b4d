#pragma once

#include "libkernel/streams/FileReaderBase.h"
#include "libkernel/streams/InStream.h"

namespace Kernel {

/// Reads a file through a buffer of the caller's size, for readers that take many small pieces. Failures as
/// FileStreamBase tells them.
class KERNEL_API FastFileInStream final : public InStreamSeekable, public FileReaderBase
{
public:
    static constexpr u64 c_minBufferSize = 1024;

    /// @p bufferSize is raised to c_minBufferSize. Null on failure, without memory for the buffer, and for a null
    /// path.
    static Counted<FastFileInStream> Open(char const* path, u64 bufferSize);

    u64 GetBufferSize() const { return GetBufferSizeI(); }
    bool Close() { return CloseI(); }

    u64 ReadBlock(void* to, u64 count) override;
    bool SkipBlock(u64 count) override;
    /// True when the file has been read to its end and the buffer is used up.
    bool EOS() const override { return IsClosed() || (FileHitEnd() && GetAvailable() == 0); }
    bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyToStream() const override { return true; }
    bool SlowProgressInStream() const override { return true; }
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return GetPosition(); }
    /// May pass the end; a target before the start is the start. Inside the buffer it touches no file.
    bool SeekInStream(SeekMethod method, i64 offset) override;

private:
    FastFileInStream(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize);
    ~FastFileInStream() override;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"
#include "libkernel/streams/File.h"
#include "libkernel/streams/FileReaderBase.h"
#include "libkernel/streams/InStream.h"

namespace Kernel {

/// Reads a file. Failures as FileStreamBase tells them.
class KERNEL_API FileInStream final : public InStreamSeekable, public FileReaderBase
{
public:
    static constexpr u64 c_bufferSize = 4096;

    /// Null on failure, and for a null path. With @p unbuffered each read reaches the system.
    static Counted<FileInStream> Open(char const* path, bool unbuffered = false);
    static Counted<FileInStream> OpenEx(char const* path, File::OpenUnmanagedResult& result, bool unbuffered = false);

    /// As it was given when the file was opened.
    String8 const& GetPath() const { return m_path; }

    /// False after reporting a failure; true for a stream that is closed already.
    bool Close() { return CloseI(); }

    u64 ReadBlock(void* to, u64 count) override;
    /// True once a read has tried to pass the end; a seek makes it false again. A broken stream isn't at its end.
    bool EOS() const override { return IsClosed() || m_passedEnd; }
    bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyToStream() const override { return true; }
    bool SlowProgressInStream() const override { return true; }
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return GetPosition(); }
    /// May pass the end, but not the start.
    bool SeekInStream(SeekMethod method, i64 offset) override;

private:
    FileInStream(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize, String8 path);
    ~FileInStream() override;

    String8 const m_path;
    bool m_passedEnd = false;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"
#include "libkernel/streams/File.h"
#include "libkernel/streams/FileStreamErrorHandler.h"
#include "libkernel/streams/OutStream.h"

#include <memory>

namespace Kernel {

class FileStreamCore;

/// A file for writing, with a small buffer. Failures are reported once, as FileInStream has it; what a buffer still
/// held may surface as late as Flush or Close. One thread at a time.
class KERNEL_API FileOutStream : public OutStreamSeekable
{
public:
    using Result = File::OpenUnmanagedResult;

    /// A new file, or an existing one emptied. Null on failure; the long form says why.
    static Counted<FileOutStream> Create(char const* path);
    static Counted<FileOutStream> Create(char const* path, File::ShareMode share, Result& result, String8* text);
    /// Every write goes to the end.
    static Counted<FileOutStream> Append(char const* path);
    static Counted<FileOutStream> Append(char const* path, File::ShareMode share, Result& result, String8* text);

    u64 WriteBlock(void const* from, u64 count) override;
    bool Flush() override;
    bool ForceFlush() override;
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyFromStream() const override { return true; }
    bool SlowProgressOutStream() const override { return true; }
    u64 GetSizeOutStream() const override;
    u64 TellOutStream() const override;
    bool Truncate(u64 size) override;
    bool SeekOutStream(SeekMethod method, i64 offset) override;

    void SetErrorHandler(Counted<FileStreamErrorHandler> const& handler);
    bool Close();
    bool IsClosed() const;
    bool IsBroken() const;
    FileIOException::Reason GetReason() const;

private:
    static constexpr u64 c_bufferSize = 4096;

    FileOutStream(int handle, bool append);
    ~FileOutStream() override;
    bool WriteOut();

    std::unique_ptr<FileStreamCore> m_core;
    std::unique_ptr<u8[]> m_buffer;
    u64 m_held = 0;
    u64 m_position = 0; // Of the buffer's first byte.
    bool const m_append;
};

} // namespace Kernel

#pragma once

#include "libkernel/streams/File.h"
#include "libkernel/streams/FileStreamErrorHandler.h"
#include "libkernel/streams/OutStream.h"

#include <memory>

namespace Kernel {

class FileStreamCore;

/// A file for many small writes, with one buffer of the caller's size; it can't seek. Failures are reported once, as
/// FileInStream has it, and may surface as late as Flush or Close. One thread at a time.
class KERNEL_API FastFileOutStream : public OutStream
{
public:
    static constexpr u64 c_minBufferSize = 1024;

    /// The buffer size is raised to c_minBufferSize. Null if the file can't be opened or the buffer not be had.
    static Counted<FastFileOutStream> Create(char const* path, u64 bufferSize);
    static Counted<FastFileOutStream> Append(char const* path, u64 bufferSize);

    u64 WriteBlock(void const* from, u64 count) override;
    bool Flush() override;
    bool ForceFlush() override;
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyFromStream() const override { return true; }
    bool SlowProgressOutStream() const override { return true; }
    u64 GetSizeOutStream() const override;
    u64 TellOutStream() const override { return m_position; }

    u64 GetBufferSize() const { return m_bufferSize; }
    void SetErrorHandler(Counted<FileStreamErrorHandler> const& handler);
    bool Close();
    bool IsClosed() const;
    bool IsBroken() const;
    FileIOException::Reason GetReason() const;

private:
    static Counted<FastFileOutStream> OpenI(char const* path, u64 bufferSize, bool append);
    FastFileOutStream(int handle, std::unique_ptr<u8[]> buffer, u64 bufferSize);
    ~FastFileOutStream() override;
    bool DumpStream();

    std::unique_ptr<FileStreamCore> m_core;
    std::unique_ptr<u8[]> m_buffer;
    u64 const m_bufferSize;
    u64 m_held = 0;
    u64 m_position = 0; // Of the caller: what is in the file and in the buffer.
};

} // namespace Kernel

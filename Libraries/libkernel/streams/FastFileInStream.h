#pragma once

#include "libkernel/streams/File.h"
#include "libkernel/streams/FileStreamErrorHandler.h"
#include "libkernel/streams/InStream.h"

#include <memory>

namespace Kernel {

class FileStreamCore;

/// A file for many small reads, with one buffer of the caller's size; reads of at least that size go past it. Failures
/// are reported once, as FileInStream has it. One thread at a time.
class KERNEL_API FastFileInStream : public InStreamSeekable
{
public:
    static constexpr u64 c_minBufferSize = 1024;

    /// The buffer size is raised to c_minBufferSize. Null if the file can't be opened or the buffer not be had.
    static Counted<FastFileInStream> Open(char const* path, u64 bufferSize);

    u64 ReadBlock(void* to, u64 count) override;
    bool SkipBlock(u64 count) override;
    /// True only once a read has tried to pass the end, and the buffer is empty.
    bool EOS() const override { return m_hitEnd && m_left == 0; }
    bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyToStream() const override { return true; }
    bool SlowProgressInStream() const override { return true; }
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return m_position; }
    /// A target inside the bytes of the buffer touches no file.
    bool SeekInStream(SeekMethod method, i64 offset) override;

    u64 GetBufferSize() const { return m_bufferSize; }
    void SetErrorHandler(Counted<FileStreamErrorHandler> const& handler);
    bool Close();
    bool IsClosed() const;
    bool IsBroken() const;
    FileIOException::Reason GetReason() const;

private:
    FastFileInStream(int handle, std::unique_ptr<u8[]> buffer, u64 bufferSize);
    ~FastFileInStream() override;

    std::unique_ptr<FileStreamCore> m_core;
    std::unique_ptr<u8[]> m_buffer;
    u64 const m_bufferSize;
    u64 m_held = 0; // Bytes in the buffer, read or not; those not read are the last m_left.
    u64 m_left = 0;
    u64 m_position = 0; // Of the caller.
    bool m_hitEnd = false;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"
#include "libkernel/streams/File.h"
#include "libkernel/streams/FileStreamErrorHandler.h"
#include "libkernel/streams/InStream.h"

#include <memory>

namespace Kernel {

class FileStreamCore;

/// A file for reading, with a small buffer unless that is switched off.
///
/// The first failure breaks the stream: it is handed to the error handler if one is set, else thrown as
/// FileIOException; from then on reads give 0. The end of the file is no failure. One thread at a time.
class KERNEL_API FileInStream : public InStreamSeekable
{
public:
    /// Null if the file cannot be opened; OpenEx says why. Paths are UTF-8.
    static Counted<FileInStream> Open(char const* path, bool unbuffered = false);
    static Counted<FileInStream> OpenEx(char const* path, File::OpenUnmanagedResult& result, bool unbuffered = false);

    u64 ReadBlock(void* to, u64 count) override;
    bool SkipBlock(u64 count) override;
    /// True only once a read has tried to pass the end.
    bool EOS() const override;
    bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyToStream() const override { return true; }
    bool SlowProgressInStream() const override { return true; }
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return m_position; }
    bool SeekInStream(SeekMethod method, i64 offset) override;

    void SetErrorHandler(Counted<FileStreamErrorHandler> const& handler);
    bool Close();
    bool IsClosed() const;
    bool IsBroken() const;
    FileIOException::Reason GetReason() const;
    /// The path it was opened with.
    String8 const& GetPath() const { return m_path; }

private:
    static constexpr u64 c_bufferSize = 4096;

    FileInStream(int handle, String8 const& path, bool unbuffered);
    ~FileInStream() override;
    void DropBuffer() { m_left = 0; }

    std::unique_ptr<FileStreamCore> m_core;
    String8 m_path;
    std::unique_ptr<u8[]> m_buffer; // Null when unbuffered.
    u8* m_read = nullptr;
    u64 m_left = 0;
    u64 m_position = 0; // Of the caller.
    bool m_hitEnd = false;
};

} // namespace Kernel

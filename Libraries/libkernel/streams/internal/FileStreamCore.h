#pragma once

#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/FileStreamErrorHandler.h"

namespace Kernel {

/// What all file streams have in common: the handle, and the rule for failures. The first one breaks the stream for
/// good and is reported, to the handler if there is one, else as FileIOException; after that every call answers at once
/// without touching the file.
class FileStreamCore
{
public:
    explicit FileStreamCore(Platform::FileHandle handle) : m_handle(handle) {}
    ~FileStreamCore();
    FileStreamCore(FileStreamCore const&) = delete;
    FileStreamCore& operator=(FileStreamCore const&) = delete;

    bool IsClosed() const { return m_handle == Platform::c_noHandle; }
    bool IsBroken() const { return m_broken; }
    bool IsUsable() const { return !m_broken && !IsClosed(); }
    FileIOException::Reason GetReason() const { return m_reason; }
    void SetErrorHandler(Counted<FileStreamErrorHandler> const& handler) { m_handler = handler; }
    Platform::FileHandle GetHandle() const { return m_handle; }

    /// Breaks the stream and reports, once. With no error number nothing is reported unless @p force is set.
    void OnError(int error, bool force = false, bool fatal = true);
    /// OnError if @p error is not 0; true if it is.
    bool Check(int error);
    /// Each returns the bytes moved and runs the error step for a failure.
    u64 Read(void* to, u64 count);
    u64 Write(void const* from, u64 count);
    u64 ReadAt(u64 position, void* to, u64 count);
    u64 WriteAt(u64 position, void const* from, u64 count);

    /// A broken stream has nothing left to flush. A flush that fails is never tried again: what it left on the device
    /// is not known.
    bool FlushToDevice();
    bool Close();
    bool Seek(i64 offset, Platform::SeekFrom from, u64& position);
    /// 0 on failure.
    u64 GetSize() const;
    bool SetSize(u64 size);

private:
    Platform::FileHandle m_handle;
    Counted<FileStreamErrorHandler> m_handler;
    bool m_broken = false;
    FileIOException::Reason m_reason = FileIOException::Reason::NoError;
};

/// The C library's three places to seek from, by a stream's method; false for an unknown method.
bool ToSeekFrom(int method, Platform::SeekFrom& from);

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"
#include "libkernel/streams/File.h"
#include "libkernel/streams/FileStreamErrorHandler.h"
#include "libkernel/streams/InOutStream.h"

#include <memory>

namespace Kernel {

class FileStreamCore;

/// A file for reading and writing, with one position. Not buffered: each call reaches the system, in one piece.
///
/// Failures are reported once, as FileInStream has it. One thread at a time, but for ReadAt: any number of threads may
/// read by position, beside each other and beside the thread that works with the stream.
class KERNEL_API FileInOutStream : public InOutStreamSeekable
{
public:
    using Result = File::OpenUnmanagedResult;

    /// An existing file. The forms with a result say why they give null, and @p text, if not null, gets the platform's
    /// words for it.
    static Counted<FileInOutStream> Open(char const* path);
    static Counted<FileInOutStream> Open(char const* path, File::ShareMode share, Result& result, String8* text);
    static Counted<FileInOutStream> OpenReadOnly(char const* path);
    static Counted<FileInOutStream> OpenReadOnly(char const* path, File::ShareMode share, Result& result,
                                                 String8* text);
    static Counted<FileInOutStream> OpenOrCreate(char const* path);
    static Counted<FileInOutStream> OpenOrCreate(char const* path, File::ShareMode share, Result& result,
                                                 String8* text);
    /// A new, empty file. With @p exclusive it fails where anything stands at the path, else it empties what stands
    /// there.
    static Counted<FileInOutStream> Create(char const* path, bool exclusive = false);
    static Counted<FileInOutStream> Create(char const* path, File::ShareMode share, Result& result, String8* text,
                                           bool exclusive = false);

    u64 ReadBlock(void* to, u64 count) override;
    bool EOS() const override { return m_hitEnd; }
    bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyToStream() const override { return true; }
    bool SlowProgressInStream() const override { return true; }
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return m_position; }
    bool SeekInStream(SeekMethod method, i64 offset) override;

    u64 WriteBlock(void const* from, u64 count) override;
    bool Flush() override { return true; }
    bool ForceFlush() override;
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyFromStream() const override { return true; }
    bool SlowProgressOutStream() const override { return true; }
    u64 GetSizeOutStream() const override { return GetSizeInStream(); }
    u64 TellOutStream() const override { return m_position; }
    bool Truncate(u64 size) override;
    bool SeekOutStream(SeekMethod method, i64 offset) override { return SeekInStream(method, offset); }

    /// Reads at @p position without moving the stream's own. Fewer bytes only at the end of the file; a failure throws
    /// FileIOException and leaves the stream as it is.
    u64 ReadAt(u64 position, void* to, u64 count) const;
    /// Writes at @p position without moving the stream's own; a failure breaks the stream.
    u64 WriteAt(u64 position, void const* from, u64 count);
    /// Hints: the range may go to the device now; its pages in memory may go.
    void StartWriteBack(u64 position, u64 count);
    void DropCache(u64 position, u64 count);

    /// Empties the file and seeks to its start; false on a read-only or broken stream.
    bool Recreate();
    /// Gives this file the rights and attributes of @p from.
    bool CopyFileAttributes(FileInOutStream const& from);
    /// Sets the file's times to now. False only for a closed or read-only stream.
    bool UpdateTimestamps();
    bool IsReadOnly() const { return m_readOnly; }

    void SetErrorHandler(Counted<FileStreamErrorHandler> const& handler);
    bool Close();
    bool IsClosed() const;
    bool IsBroken() const;
    FileIOException::Reason GetReason() const;

private:
    FileInOutStream(int handle, bool readOnly);
    ~FileInOutStream() override;

    std::unique_ptr<FileStreamCore> m_core;
    bool const m_readOnly;
    u64 m_position = 0;
    bool m_hitEnd = false;
};

} // namespace Kernel

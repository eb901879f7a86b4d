#pragma once

#include "libkernel/core/String.h"
#include "libkernel/streams/File.h"
#include "libkernel/streams/FileStreamBase.h"
#include "libkernel/streams/InOutStream.h"

#include <atomic>

namespace Kernel {

/// Reads and writes a file, with one position for both. Failures as FileStreamBase tells them.
///
/// Nothing is held back: each read or write reaches the system in one piece, in the order of the calls. Who moves small
/// pieces buffers above it.
class KERNEL_API FileInOutStream final : public InOutStreamSeekable, public FileStreamBase
{
public:
    using Result = File::OpenUnmanagedResult;

    // The long forms tell in @p result why there is no stream, and in @p errorText, if given, the error's name. All
    // give null on failure, and for a null path.

    /// Opens a file that exists.
    static Counted<FileInOutStream> Open(char const* path);
    static Counted<FileInOutStream> Open(char const* path, File::ShareMode share, File::OpenUnmanagedResult& result,
                                         String8* errorText = nullptr);
    /// Opens a file that exists: writes give 0, and truncations false.
    static Counted<FileInOutStream> OpenReadOnly(char const* path);
    static Counted<FileInOutStream> OpenReadOnly(char const* path, File::ShareMode share,
                                                 File::OpenUnmanagedResult& result, String8* errorText = nullptr);
    /// Opens a file, or makes it if it can't be opened. What is there is never emptied.
    static Counted<FileInOutStream> OpenOrCreate(char const* path);
    static Counted<FileInOutStream> OpenOrCreate(char const* path, File::ShareMode share,
                                                 File::OpenUnmanagedResult& result, String8* errorText = nullptr);
    /// Makes the file, or empties it; with @p mustBeNew an existing file makes it fail with Exists.
    static Counted<FileInOutStream> Create(char const* path, bool mustBeNew = false);
    static Counted<FileInOutStream> Create(char const* path, File::ShareMode share, File::OpenUnmanagedResult& result,
                                           String8* errorText = nullptr, bool mustBeNew = false);

    bool IsReadOnly() const { return m_readOnly; }
    /// False after reporting a failure; true for a stream that is closed already.
    bool Close() { return CloseI(); }
    /// Empties the file in place and stands at its start. False for a read-only or broken stream.
    bool Recreate();
    /// Gives this file the permissions and the hidden attribute of the other.
    bool CopyFileAttributes(FileInOutStream const& from);
    /// Sets the modification time to now. False for a stream that can't write.
    bool UpdateTimestamps();

    // By position: the stream's own stays where it is. Any number of threads may do this at once, beside the one that
    // works with the stream, though not beside Close.

    /// Fewer bytes only at the end of the file. A failure throws FileIOException, handler or not, and leaves the stream
    /// whole: each of several readers learns of its own.
    u64 ReadAt(u64 position, void* to, u64 count) const;
    /// A failure breaks the stream, as for WriteBlock.
    u64 WriteAt(u64 position, void const* from, u64 count);
    /// Lets the system begin to write a range to the device, without waiting and without a promise. A size of 0 means
    /// to the end, here and below.
    void StartWriteBack(u64 offset, u64 size) const;
    /// Tells the system that a range will not be read again soon.
    void DropCache(u64 offset, u64 size) const;

    u64 ReadBlock(void* to, u64 count) override;
    /// True once a read has tried to pass the end; a seek makes it false again. A broken stream isn't at its end.
    bool EOS() const override { return IsClosed() || m_passedEnd; }
    bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyToStream() const override { return true; }
    bool SlowProgressInStream() const override { return true; }
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return IsUsable() ? m_position : 0; }
    /// May pass the end, but not the start. Costs no call but from the end.
    bool SeekInStream(SeekMethod method, i64 offset) override;

    u64 WriteBlock(void const* from, u64 count) override;
    bool Flush() override { return true; }
    /// Brings contents and length to the device: POSIX.1-2017, "synchronized I/O data integrity completion", by which
    /// what a reader needs to find the data again goes with it, so that growing by writes asks for no more. The first
    /// flush after the file was made or its length was set brings the times and attributes as well. A flush that the
    /// device failed is never tried again: the stream is broken.
    bool ForceFlush() override;
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyFromStream() const override { return true; }
    bool SlowProgressOutStream() const override { return true; }
    u64 GetSizeOutStream() const override { return GetSizeInStream(); }
    u64 TellOutStream() const override { return TellInStream(); }
    bool WriteBlockAtPos(u64 position, void const* from, u64 count) override;
    /// Stands at the smaller of @p size and the end afterwards.
    bool Truncate(u64 size) override;
    bool SeekOutStream(SeekMethod method, i64 offset) override;

private:
    FileInOutStream(Platform::FileHandle handle, bool readOnly, bool isNew);
    ~FileInOutStream() override;
    static Counted<FileInOutStream> OpenI(char const* path, char const* mode, File::ShareMode share,
                                          File::OpenUnmanagedResult& result, String8* errorText);
    static Counted<FileInOutStream> AdoptI(Platform::FileHandle handle, bool readOnly, bool isNew);
    bool SetSizeI(u64 size);
    Platform::IoResult ReadAtI(u64 position, void* to, u64 count) const;
    bool CanWrite() const { return IsUsable() && !m_readOnly; }

    bool const m_readOnly;
    bool m_passedEnd = false;
    u64 m_position = 0;                 // At most the highest i64.
    std::atomic<bool> m_needsFullFlush; // Several threads may write at once.
};

} // namespace Kernel

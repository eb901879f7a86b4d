#pragma once

#include "libkernel/core/String.h"
#include "libkernel/streams/File.h"
#include "libkernel/streams/FileWriterBase.h"
#include "libkernel/streams/OutStream.h"

namespace Kernel {

/// Writes a file. Failures as FileStreamBase tells them; one of bytes held back may come with a later call.
class KERNEL_API FileOutStream final : public OutStreamSeekable, public FileWriterBase
{
public:
    using Result = File::OpenUnmanagedResult;

    static constexpr u64 c_bufferSize = 4096;

    /// Makes the file or empties it. Null on failure, and for a null path; @p result then tells why, and @p errorText,
    /// if given, gets the error's name.
    static Counted<FileOutStream> Create(char const* path);
    static Counted<FileOutStream> Create(char const* path, File::ShareMode share, File::OpenUnmanagedResult& result,
                                         String8* errorText = nullptr);
    /// Makes the file or keeps what is there: the stream begins at its end, and every write goes to the end.
    static Counted<FileOutStream> Append(char const* path);
    static Counted<FileOutStream> Append(char const* path, File::ShareMode share, File::OpenUnmanagedResult& result,
                                         String8* errorText = nullptr);

    u64 WriteBlock(void const* from, u64 count) override;
    bool Flush() override { return FlushI(); }
    /// A flush that the device failed is never tried again: the stream is broken.
    bool ForceFlush() override { return ForceFlushI(); }
    bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr) override;
    bool WillDelegateCopyFromStream() const override { return true; }
    bool SlowProgressOutStream() const override { return true; }
    u64 GetSizeOutStream() const override { return GetSizeI(); }
    u64 TellOutStream() const override { return GetPosition(); }
    bool WriteBlockAtPos(u64 position, void const* from, u64 count) override;
    /// Stands at the smaller of @p size and the end afterwards.
    bool Truncate(u64 size) override { return TruncateI(size); }
    /// May pass the end, but not the start.
    bool SeekOutStream(SeekMethod method, i64 offset) override { return SeekI(method, offset); }

private:
    FileOutStream(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, Placement placement, u64 size);
    ~FileOutStream() override;
    static Counted<FileOutStream> OpenI(char const* path, char const* mode, File::ShareMode share, Placement placement,
                                        File::OpenUnmanagedResult& result, String8* errorText);
};

} // namespace Kernel

#pragma once

#include "libkernel/archive/internal/ArchiveImpl.h"

#include <functional>
#include <memory>

namespace Kernel {

/// A block of c_copyBufferSize bytes out of a pool that the whole process shares: fresh memory of that size costs more
/// than the copy it serves.
class ArchiveCopyBuffer
{
public:
    ArchiveCopyBuffer(); ///< Throws std::bad_alloc.
    ~ArchiveCopyBuffer();
    ArchiveCopyBuffer(ArchiveCopyBuffer const&) = delete;
    ArchiveCopyBuffer& operator=(ArchiveCopyBuffer const&) = delete;

    u8* GetData() const { return m_data; }

private:
    u8* m_data;
};

/// Writes at the growing end of one archive file. Small pieces, of however many items, gather in the copy buffer and go
/// out together; a piece as large as the buffer goes out by itself. Nothing written here is reachable before a commit.
///
/// All writes take the file's lock, and on the master pass the write guard first, so a foreign writer is seen within
/// one buffer. Failures are exceptions: ArchiveFileException, or OutStream::WriteException for a short write.
class ArchiveAppender
{
public:
    ArchiveAppender(ArchiveImpl& impl, Counted<Archive::ArchiveFile> file, u64 end);

    /// Where the next byte will lie.
    u64 GetEnd() const { return m_written + m_held; }
    void Append(void const* data, u64 size);
    /// Room for @p size bytes, at most c_copyBufferSize, that the caller fills before it calls CommitSpace.
    u8* GetSpace(u64 size);
    void CommitSpace(u64 size) { m_held += size; }
    void Flush();

private:
    void Write(void const* data, u64 size);
    void DropOldThumbnails();

    ArchiveImpl& m_impl;
    Counted<Archive::ArchiveFile> const m_file;
    ArchiveCopyBuffer m_buffer;
    u64 m_held = 0;
    u64 m_written; // Position in the file of the buffer's first byte.
};

} // namespace Kernel

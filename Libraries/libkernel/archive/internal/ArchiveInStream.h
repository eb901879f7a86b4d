#pragma once

#include "libkernel/archive/internal/ArchiveImpl.h"
#include "libkernel/streams/InStream.h"

#include <cstdlib>
#include <memory>

namespace Kernel {

/// Part of an archive's file as a stream. Reads go through the file's present handle by position, so that any number of
/// readers and a save work side by side.
class ArchiveFileStreamReader : public InStream
{
public:
    ArchiveFileStreamReader(Counted<Archive::ArchiveFile> file, u64 start, u64 length);

    u64 ReadBlock(void* to, u64 count) override;
    bool SkipBlock(u64 count) override;
    u64 GetSizeInStream() const override { return m_length; }
    u64 TellInStream() const override { return m_position; }

    /// A read gave less than lies within the part: the file is shorter than it was, or cannot be read.
    bool HasFailed() const { return m_failed; }

private:
    ~ArchiveFileStreamReader() override;

    Counted<Archive::ArchiveFile> const m_file;
    u64 const m_start;
    u64 const m_length;
    u64 m_position = 0;
    bool m_failed = false;
};

/// Unpacks a stored block from a stream of its stored bytes: the bytes themselves for the direct method, else what the
/// decompressor makes of them. Null when there is no memory.
Counted<InStream> MakeArchiveUnpacker(Counted<InStream> const& stored, u8 compressionCode);

/// To be asked after a short read, before the block is taken for damaged: throws MemoryException if an unpacker from
/// above had no memory to go on.
void ThrowIfOutOfMemory(Counted<InStream> const& unpacker);

/// One file of an archive, unpacked. Checks the CRC when the last byte has been delivered; a difference throws
/// ArchiveCorruptionException, a file that cannot be read ArchiveFileException, and an unpacker without memory
/// MemoryException. Keeps the archive and its handle.
class ArchiveInStream : public InStream
{
public:
    ArchiveInStream(Counted<Archive> archive, ArchiveImpl& impl, Counted<Archive::AccessBlock> access,
                    Counted<Archive::ArchiveFile> file, Counted<Archive::Revision const> revision,
                    Archive::FileRevision const& entry);

    /// Makes the unpacker and the buffer; false when there is no memory.
    bool Init();

    u64 ReadBlock(void* to, u64 count) override;
    bool SkipBlock(u64 count) override;
    u64 GetSizeInStream() const override { return m_size; }
    u64 TellInStream() const override { return m_position; }

protected:
    ~ArchiveInStream() override;

private:
    u64 ReadUnpacked(void* to, u64 count);
    bool Refill();
    void CheckEnd();

    Counted<Archive> const m_archive;
    ArchiveImpl& m_impl;
    Counted<Archive::AccessBlock> const m_access;
    Counted<Archive::ArchiveFile> const m_file;
    Counted<Archive::Revision const> const m_revision; // Keeps a scratch file's bytes from being written over.
    Counted<ArchiveFileStreamReader> m_reader;
    Counted<InStream> m_unpacker;
    u64 const m_size;
    u32 const m_expectedCRC;
    u8 const m_code;
    u64 m_position = 0;
    u64 m_unpacked = 0; // Bytes taken out of the unpacker.
    u32 m_crc;
    std::unique_ptr<u8, void (*)(void*)> m_buffer;
    u64 m_bufferSize;
    u8* m_bufferRead = nullptr;
    u64 m_bufferLeft = 0;
};

/// The kinds for which offlining stays off the disk as long as the stream lives.
class ArchiveInStreamScoped : public ArchiveInStream, public ArchiveReadCounterScope
{
public:
    ArchiveInStreamScoped(Counted<Archive> archive, ArchiveImpl& impl, Counted<Archive::AccessBlock> access,
                          Counted<Archive::ArchiveFile> file, Counted<Archive::Revision const> revision,
                          Archive::FileRevision const& entry)
        : ArchiveInStream(archive, impl, std::move(access), std::move(file), std::move(revision), entry),
          ArchiveReadCounterScope(archive, impl)
    {
    }

private:
    ~ArchiveInStreamScoped() override;
};

} // namespace Kernel

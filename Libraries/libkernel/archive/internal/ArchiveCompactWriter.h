#pragma once

#include "libkernel/archive/internal/ArchiveAppender.h"

namespace Kernel {

class ArchiveStreamlineProgress;
class InOutStreamSeekable;

/// What a streamline has written, as the archive itself keeps it: the surviving paths, and one revision.
struct Archive::StreamlineData
{
    ArchivePathMap paths;
    std::vector<Counted<Revision>> revisions;
};

/// Writes what an archive shows at its working revision as one compact file. Everything is laid out first and then
/// written front to back without a seek, so that the target may be a plain stream. The caller holds the session lock
/// and keeps the archive's files open.
class ArchiveCompactWriter
{
public:
    struct Options
    {
        bool copyThumbnails = false;
        bool midStreamline = false; ///< Mark the file as a streamline's temporary.
        bool const* abort = nullptr;
        ArchiveStreamlineProgress* progress = nullptr;
        std::vector<Archive::LostFile>* lost = nullptr; ///< Takes what is damaged, which otherwise ends the writing.
    };

    /// @p file describes the new file: its save time, save count and write counter are given, all else is set. The
    /// result is Done, Aborted, NoAccess for a write that failed, or Failed.
    static Archive::StreamlineResult StreamlineToArchiveFileI(ArchiveImpl& impl, Archive::ArchiveFile& file,
                                                              InOutStreamSeekable& target, Options const& options,
                                                              Archive::StreamlineData& data);

private:
    struct Item
    {
        Archive::FileRevision entry; // As it stands in the source; then as written.
        Counted<Archive::ArchiveFile> source;
    };
    struct Source
    {
        Counted<Archive::ArchiveFile> file;
        Counted<FileInOutStream> stream;
        u64 size = 0;
    };

    ArchiveCompactWriter(ArchiveImpl& impl, Archive::ArchiveFile& file, InOutStreamSeekable& target,
                         Options const& options);

    Archive::StreamlineResult Run(Archive::StreamlineData& data);
    void Collect();
    void LeaveOutDamaged();
    bool LayOut();
    void WriteFront();
    Archive::StreamlineResult WriteBlocks();
    bool CopyBlock(Item& item);
    bool FindSource(Counted<Archive::ArchiveFile> const& file, Source const*& source);
    void WriteTable();
    void CopyThumbnailBlock();
    void Describe(Archive::StreamlineData& data);

    void Put(void const* bytes, u64 size);
    u8* GetSpace(u64 wanted, u64& room);
    void FlushBuffer();

    ArchiveImpl& m_impl;
    Archive::ArchiveFile& m_file;
    InOutStreamSeekable& m_target;
    Options const m_options;
    FileInOutStream* const m_targetFile; // The target, if it is a file; else null.

    std::vector<Item> m_items; // By rising UID.
    std::vector<std::pair<std::pair<String8, String8>, u64>> m_pathCounts;
    std::vector<Source> m_sources;
    ArchiveFormat::FATHeader m_table;
    Archive::ArchiveInfo m_info;

    ArchiveCopyBuffer m_buffer;
    u64 m_held = 0;
    u64 m_written = 0;
};

} // namespace Kernel

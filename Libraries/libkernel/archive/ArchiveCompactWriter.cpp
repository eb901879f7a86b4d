#include "libkernel/archive/internal/ArchiveCompactWriter.h"

#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/archive/internal/ArchiveThumbnailBlock.h"
#include "libkernel/core/Abortable.h"
#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Limits.h"
#include "libkernel/streams/CRC32.h"
#include "libkernel/streams/FileIOException.h"

#include <algorithm>
#include <limits>

// A compact file: front, the live blocks in the order of their UIDs, one table. A block goes from its file straight
// into the output buffer, tag and bytes in one read, so that each byte is moved in memory no more than once and small
// items share large writes.

namespace Kernel {

using namespace ArchiveFormat;
using Result = Archive::StreamlineResult;

ArchiveCompactWriter::ArchiveCompactWriter(ArchiveImpl& impl, Archive::ArchiveFile& file, InOutStreamSeekable& target,
                                           Options const& options)
    : m_impl(impl), m_file(file), m_target(target), m_options(options),
      m_targetFile(dynamic_cast<FileInOutStream*>(&target))
{
}

Result ArchiveCompactWriter::StreamlineToArchiveFileI(ArchiveImpl& impl, Archive::ArchiveFile& file,
                                                      InOutStreamSeekable& target, Options const& options,
                                                      Archive::StreamlineData& data)
{
    try {
        return ArchiveCompactWriter(impl, file, target, options).Run(data);
    } catch (OutStream::WriteException const&) {
        return Archive::StreamlineNoAccess;
    } catch (FileIOException const&) {
        // A source that cannot be read is turned into a result where it is read: this is the target.
        return Archive::StreamlineNoAccess;
    } catch (std::bad_alloc const&) {
        return Archive::StreamlineFailed;
    } catch (MemoryException const&) {
        return Archive::StreamlineFailed;
    }
}

Result ArchiveCompactWriter::Run(Archive::StreamlineData& data)
{
    Collect();
    if (m_options.lost) LeaveOutDamaged();
    if (!LayOut()) return Archive::StreamlineFailed;
    WriteFront();
    if (Result const result = WriteBlocks()) return result;
    WriteTable();
    FlushBuffer();
    Describe(data);
    if (m_options.copyThumbnails) {
        // Without its thumbnails the file is not what was asked for.
        if (IsAbortFlagSet(m_options.abort)) return Archive::StreamlineAborted;
        CopyThumbnailBlock();
    }
    return m_targetFile && m_targetFile->IsBroken() ? Archive::StreamlineNoAccess : Archive::StreamlineDone;
}

void ArchiveCompactWriter::Collect()
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    Archive::Revision* const working = m_impl.GetWorkingRevisionCS();
    m_items.reserve(m_impl.m_paths.size());
    for (auto const& [path, info] : m_impl.m_paths) {
        Archive::Revision* where = nullptr;
        Archive::FileRevision const* const entry = working ? m_impl.FindEntryCS(*info, *working, &where) : nullptr;
        if (entry && !entry->IsDeletion()) m_items.push_back({*entry, where->m_file});
    }
    std::sort(m_items.begin(), m_items.end(),
              [](Item const& a, Item const& b) { return a.entry.info->GetUID() < b.entry.info->GetUID(); });
    for (auto const& [parts, count] : m_impl.m_pathCounts)
        if (count.counter != 0) m_pathCounts.emplace_back(parts, count.counter);
    m_info.nextFreeUID = m_impl.m_nextFreeUID;
}

// What counts is that the data come out as they went in. A wrong CRC of the stored bytes, or a block without its end,
// loses nothing: both are written anew.
void ArchiveCompactWriter::LeaveOutDamaged()
{
    std::erase_if(m_items, [this](Item& item) {
        Archive::BlockCheck check = Archive::BlockCheck::Unreadable;
        try {
            check = m_impl.CheckBlockTag(*item.source, item.entry);
            if (check == Archive::BlockCheck::Ok) check = m_impl.CheckUnpacked(*item.source, item.entry);
        } catch (FileIOException const&) {
        }
        item.entry.crcCompressed = 0;
        if (check != Archive::BlockCheck::Ok) m_options.lost->push_back({item.entry.info->GetPath(), check});
        return check != Archive::BlockCheck::Ok;
    });
    std::sort(m_options.lost->begin(), m_options.lost->end(),
              [](Archive::LostFile const& a, Archive::LostFile const& b) { return a.path < b.path; });
}

// All sums are checked: sizes come from a file. What does not fit its field is not cut short.
bool ArchiveCompactWriter::LayOut()
{
    u64 end = c_firstContentPos;
    u64 total = 0;
    u64 body = 0;
    for (Item& item : m_items) {
        if (static_cast<u64>(item.entry.info->GetPath().GetLength()) > c_maxPathSize) return false;
        item.entry.added = true;
        body += RecordSize(item.entry);
        u64 const stored = item.entry.fileCompressedSize;
        if (!CheckedAdd(total, stored, total)) return false;
        if (!CheckedAdd(end, stored, end) || !CheckedAdd(end, c_blockTagSize + c_blockEndSize, end)) return false;
    }
    for (auto const& [parts, counter] : m_pathCounts) {
        auto const prefix = static_cast<u64>(parts.first.GetLength());
        auto const suffix = static_cast<u64>(parts.second.GetLength());
        if (prefix > c_maxPathSize || suffix > c_maxPathSize) return false;
        body += c_pathCountFixedSize + prefix + suffix;
    }
    if (body > std::numeric_limits<u32>::max() || m_pathCounts.size() > std::numeric_limits<u16>::max()) return false;
    m_info.firstFAT = end;
    if (!CheckedAdd(end, c_fatHeaderSize + body, m_info.fileEnd)) return false;
    m_info.totalBytes = total;
    m_info.saveTimeStamp = m_file.m_saveTimeStamp;
    m_info.saveCount = m_file.m_saveCount;

    m_table.timeStamp = m_info.saveTimeStamp;
    m_table.fileEnd = m_info.fileEnd;
    m_table.totalBytes = total;
    m_table.recordCount = static_cast<u32>(m_items.size());
    m_table.bodySize = static_cast<u32>(body);
    m_table.pathCountCount = static_cast<u16>(m_pathCounts.size());
    m_table.revisionTag = Archive::RevisionTagStreamlined;
    return true;
}

void ArchiveCompactWriter::WriteFront()
{
    u16 const flags = m_options.midStreamline ? c_flagMidStreamline : 0;
    u8 header[c_headerSize];
    EncodeHeader(header, {c_version, flags, m_impl.m_archiveUID});
    Put(header, sizeof(header));
    u8 info[c_infoSize];
    EncodeInfo(info, m_info);
    Put(info, sizeof(info));
    u8 guard[c_guardSize];
    StoreLittleEndian(guard, c_tagGuard);
    StoreLittleEndian(guard + 4, m_file.m_writeCounter);
    Put(guard, sizeof(guard));
    m_file.m_flags = flags;
}

Result ArchiveCompactWriter::WriteBlocks()
{
    u64 done = 0;
    for (Item& item : m_items) {
        if (IsAbortFlagSet(m_options.abort)) return Archive::StreamlineAborted;
        if (!CopyBlock(item)) return Archive::StreamlineFailed;
        if (m_options.progress) m_options.progress->OnProgress(++done, m_items.size() + 1);
    }
    return IsAbortFlagSet(m_options.abort) ? Archive::StreamlineAborted : Archive::StreamlineDone;
}

bool ArchiveCompactWriter::FindSource(Counted<Archive::ArchiveFile> const& file, Source const*& source)
{
    auto found = std::find_if(m_sources.begin(), m_sources.end(), [&](Source const& s) { return s.file == file; });
    if (found == m_sources.end()) {
        Source fresh{file, file->GetStream(), 0};
        if (!fresh.stream) return false;
        try {
            fresh.size = fresh.stream->GetSizeInStream();
        } catch (FileIOException const&) {
            return false;
        }
        found = m_sources.insert(m_sources.end(), fresh);
    }
    source = &*found;
    return true;
}

bool ArchiveCompactWriter::CopyBlock(Item& item)
{
    Archive::FileRevision& entry = item.entry;
    Source const* source = nullptr;
    if (!FindSource(item.source, source)) return false;
    u64 const size = c_blockTagSize + entry.fileCompressedSize;
    if (!RangeFits(entry.filePos, size, source->size)) return false;

    u64 const position = m_written + m_held;
    bool const needsCRC = entry.crcCompressed == 0;
    u32 crc = 0;
    CRC32::BeginCRC32(crc);
    for (u64 at = 0; at < size;) {
        u64 piece = 0;
        u8* const space = GetSpace(size - at, piece);
        try {
            if (source->stream->ReadAt(entry.filePos + at, space, piece) != piece) return false;
        } catch (FileIOException const&) {
            return false;
        }
        if (at == 0 && LoadLittleEndian<u32>(space) != c_tagBlock) return false;
        u64 const skip = at == 0 ? c_blockTagSize : 0;
        if (needsCRC) CRC32::CalcCRC32(space + skip, piece - skip, crc);
        m_held += piece;
        at += piece;
    }
    CRC32::EndCRC32(crc);
    if (needsCRC) entry.crcCompressed = crc == 0 ? 1 : crc;
    u8 end[c_blockEndSize];
    StoreLittleEndian(end, c_blockEnd);
    Put(end, sizeof(end));
    entry.filePos = position;
    return true;
}

void ArchiveCompactWriter::WriteTable()
{
    u8 header[c_fatHeaderSize];
    EncodeFATHeader(header, m_table);
    Put(header, sizeof(header));
    std::vector<u8> body;
    body.reserve(m_table.bodySize);
    for (Item const& item : m_items) AppendRecord(body, item.entry);
    for (auto const& [parts, counter] : m_pathCounts) AppendPathCount(body, parts.first, parts.second, counter);
    Put(body.data(), body.size());
}

void ArchiveCompactWriter::Describe(Archive::StreamlineData& data)
{
    m_file.m_fileVersion = c_version;
    m_file.m_archiveUID = m_impl.m_archiveUID;
    m_file.m_firstFAT = m_info.firstFAT;
    m_file.m_fileEnd = m_info.fileEnd;
    m_file.m_totalBytes = m_info.totalBytes;
    m_file.m_deadBytes = 0;
    m_file.m_nextFreeUID = m_info.nextFreeUID;
    m_file.m_thumbnailsPos = 0;
    m_file.m_rawInfo = m_info;

    auto revision = MakeCounted<Archive::Revision>();
    revision->m_file = Counted<Archive::ArchiveFile>(&m_file);
    revision->m_timeStamp = m_table.timeStamp;
    revision->m_tag = Archive::RevisionTagStreamlined;
    revision->m_fatPos = m_info.firstFAT;
    revision->m_fatEnd = m_info.fileEnd;
    revision->m_fileEnd = m_info.fileEnd;
    revision->m_totalBytes = m_info.totalBytes;
    revision->m_entries.reserve(m_items.size());
    data.paths.reserve(m_items.size());
    for (Item& item : m_items) {
        auto* const info = const_cast<Archive::FileInfo*>(item.entry.info.Get());
        data.paths.emplace(info->GetPath(), Counted<Archive::FileInfo>(info));
        revision->m_entries.push_back(std::move(item.entry));
    }
    revision->Freeze();
    data.revisions.push_back(std::move(revision));
}

void ArchiveCompactWriter::CopyThumbnailBlock()
{
    Counted<Archive::ArchiveFile> source;
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        bool const inScratch = m_impl.m_scratch && m_impl.m_scratch->m_thumbnailsPos.load() != 0;
        source = inScratch ? m_impl.m_scratch : m_impl.m_master;
    }
    if (!source || source->m_thumbnailsPos.load() == 0) return;
    if (CopyThumbnails(m_target, *source, m_buffer.GetData(), c_copyBufferSize))
        m_file.m_thumbnailsPos = m_info.fileEnd;
    else
        m_target.Truncate(m_info.fileEnd); // Half a block is worth less than none.
}

void ArchiveCompactWriter::Put(void const* bytes, u64 size)
{
    u8 const* from = static_cast<u8 const*>(bytes);
    while (size != 0) {
        u64 piece = 0;
        u8* const space = GetSpace(size, piece);
        std::copy_n(from, piece, space);
        m_held += piece;
        from += piece;
        size -= piece;
    }
}

/// Room for @p wanted bytes, or for as many as the buffer takes: all of it, if need be after it was written out.
u8* ArchiveCompactWriter::GetSpace(u64 wanted, u64& room)
{
    room = std::min(wanted, c_copyBufferSize);
    if (room > c_copyBufferSize - m_held) FlushBuffer();
    return m_buffer.GetData() + m_held;
}

void ArchiveCompactWriter::FlushBuffer()
{
    if (m_held == 0) return;
    if (m_target.WriteBlock(m_buffer.GetData(), m_held) != m_held) throw OutStream::WriteException();
    // The device starts now, so that the flush at the end finds little left to do.
    if (m_targetFile) m_targetFile->StartWriteBack(m_written, m_held);
    m_written += m_held;
    m_held = 0;
}

} // namespace Kernel

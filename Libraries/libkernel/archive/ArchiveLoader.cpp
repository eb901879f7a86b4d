#include "libkernel/archive/internal/ArchiveImpl.h"
#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Endian.h"

#include <algorithm>
#include <cstring>

namespace Kernel {

using namespace ArchiveFormat;

ArchiveSource::~ArchiveSource() = default;

u64 ArchiveFileSource::ReadAt(u64 position, void* to, u64 count)
{
    return m_stream.ReadAt(position, to, count);
}

u64 ArchiveFileSource::GetSize()
{
    return m_stream.GetSizeInStream();
}

/// Moves forward through a source with a window of its bytes in memory, so that a table is usually one read. Memory
/// follows the bytes that are there: the window is never larger than what the source has left.
class ArchiveTableCursor
{
public:
    ArchiveTableCursor(ArchiveSource& source, u64 limit, u64 position, u64 expected)
        : m_source(source), m_size(limit), m_position(position), m_expected(expected)
    {
    }

    u64 GetPosition() const { return m_position + m_at; }
    u64 GetRemaining() const { return m_size > GetPosition() ? m_size - GetPosition() : 0; }

    /// @p count bytes, valid until the next call; null if they are not there.
    u8 const* Take(u64 count)
    {
        if (m_held - m_at < count && !Refill(count)) return nullptr;
        u8 const* const result = m_window.data() + m_at;
        m_at += count;
        return result;
    }

private:
    static constexpr u64 c_window = 64 * 1024;

    bool Refill(u64 count)
    {
        u64 const position = GetPosition();
        if (!RangeFits(position, count, m_size)) return false;
        u64 want = std::max(count, c_window);
        // The first fill takes the whole table, as far as its header told the truth.
        if (m_window.empty()) want = std::max(want, std::min<u64>(m_expected, 16 * 1024 * 1024));
        want = std::min(want, m_size - position);
        if (m_window.size() < want) m_window.resize(want);
        m_position = position;
        m_at = 0;
        m_held = m_source.ReadAt(position, m_window.data(), want);
        return m_held >= count;
    }

    ArchiveSource& m_source;
    u64 const m_size;
    u64 m_position; // Of the window's first byte.
    u64 const m_expected;
    std::vector<u8> m_window;
    u64 m_at = 0;
    u64 m_held = 0;
};

namespace {

using Result = Archive::OpenResult;

/// What a read that came up short means: the file ends there, or it could not be read.
Result ShortRead(ArchiveSource& source, u64 position, u64 count)
{
    return RangeFits(position, count, source.GetSize()) ? Archive::OpenCorrupt : Archive::OpenTruncated;
}

/// A path behind its length of 2 bytes at @p position; moves the position behind it.
Result ReadPath(ArchiveSource& source, u64& position, String8& path)
{
    u8 size[2];
    if (source.ReadAt(position, size, 2) != 2) return ShortRead(source, position, 2);
    u16 const length = LoadLittleEndian<u16>(size);
    position += 2;
    if (length != 0 && source.ReadAt(position, path.SetLength(length), length) != length)
        return ShortRead(source, position, length);
    position += length;
    return Archive::OpenOk;
}

Result CheckVersionAndTag(Archive::ArchiveHdr const& header, IDTag tag)
{
    if (header.fileVersion < c_oldestVersion) return Archive::OpenTooOld;
    if (header.fileVersion > c_version) return Archive::OpenTooNew;
    if (tag != IDTag() && tag != header.archiveUID) return Archive::OpenWrongType;
    return Archive::OpenOk;
}

} // namespace

// A table can only point at one that lies before it: a chain that comes back on itself is damage.
Result ArchiveLoader::ReadFATHeader(ArchiveSource& source, u64 position, bool newest, FATHeader& header,
                                    FATKind const*& kind)
{
    u8 bytes[c_fatHeaderSize];
    if (source.ReadAt(position, bytes, sizeof(bytes)) != sizeof(bytes))
        return newest ? ShortRead(source, position, sizeof(bytes)) : Archive::OpenCorrupt;
    bool newer = false;
    kind = DecodeFATHeader(bytes, header, newer);
    if (!kind) return newer ? Archive::OpenTooNew : Archive::OpenCorrupt;
    if (header.nextFAT >= position) return Archive::OpenCorrupt;
    // Tables of the present kind end exactly at their FileEnd; older writers are not known to have kept to that.
    bool const endsRight = header.fileEnd == position + c_fatHeaderSize + header.bodySize;
    if (kind->tag == c_tagFAT && !endsRight) return Archive::OpenCorrupt;
    return Archive::OpenOk;
}

// A power cut can leave an info block that is a mixture of two commits; a link must then neither match a newer table
// nor miss its own. The newest table is whole, and if it alone has the time stamp that the link names, it is the linked
// one whatever the block says.
bool ArchiveLoader::IsLinkedState(ArchiveSource& source, Archive::ArchiveInfo const& info, ArchiveLoadData const& link)
{
    bool const isSame = info.saveTimeStamp == link.linkSaveTimeStamp && info.saveCount == link.linkSaveCount;
    FATHeader newest;
    FATKind const* kind = nullptr;
    if (info.firstFAT == 0 || ReadFATHeader(source, info.firstFAT, true, newest, kind) != Archive::OpenOk)
        return isSame;
    // A compact file is written whole: its save time need not be that of the revision it keeps.
    bool const isCompact = newest.revisionTag == Archive::RevisionTagStreamlined;
    bool const sameTime = isCompact || newest.timeStamp == info.saveTimeStamp;
    if (isSame && newest.fileEnd == info.fileEnd && sameTime) return true;
    if (isCompact || newest.timeStamp != link.linkSaveTimeStamp || newest.nextFAT == 0) return false;
    FATHeader previous;
    return ReadFATHeader(source, newest.nextFAT, false, previous, kind) == Archive::OpenOk &&
           previous.timeStamp != newest.timeStamp;
}

Result ArchiveLoader::ReadFront(ArchiveSource& source, IDTag tag, ArchiveLoadData const* expectedLink, Front& front,
                                bool tolerant)
{
    u8 header[c_headerSize];
    if (source.ReadAt(c_headerPos, header, sizeof(header)) != sizeof(header)) return Archive::OpenNotArchive;
    if (!DecodeHeader(header, front.header)) return Archive::OpenNotArchive;
    if (Result const result = CheckVersionAndTag(front.header, tag)) return result;

    u8 info[c_infoSize];
    if (source.ReadAt(c_infoPos, info, sizeof(info)) != sizeof(info)) return Archive::OpenBadInfo;
    if (!DecodeInfo(info, front.info)) {
        if (!tolerant) return Archive::OpenBadInfo;
        front.info = {};
        front.infoDamaged = true;
    }
    if (!tolerant && expectedLink && !IsLinkedState(source, front.info, *expectedLink))
        return Archive::OpenLinkMismatch;

    u64 position = c_firstContentPosV7;
    if (front.header.fileVersion >= c_guardVersion) {
        u8 guard[c_guardSize];
        if (source.ReadAt(c_guardPos, guard, sizeof(guard)) != sizeof(guard)) return Archive::OpenBadInfo;
        u32 const guardTag = LoadLittleEndian<u32>(guard);
        bool const isGuard = guardTag == c_tagGuard || guardTag == c_tagBlock;
        if (!isGuard && !tolerant) return Archive::OpenBadInfo;
        front.writeCounter = isGuard ? LoadLittleEndian<u32>(guard + 4) : 0;
        position = c_firstContentPos;
        front.guardIsBlock = guardTag == c_tagBlock;
    }
    if (front.HasLink()) {
        u8 link[c_linkFixedSize - 2];
        if (source.ReadAt(position, link, sizeof(link)) != sizeof(link))
            return ShortRead(source, position, sizeof(link));
        front.linkSaveTimeStamp = TimeStamp(LoadLittleEndian<i64>(link));
        front.linkSaveCount = LoadLittleEndian<u32>(link + 8);
        position += sizeof(link);
        if (Result const result = ReadPath(source, position, front.linkPath)) return result;
    }
    if (front.HasReference())
        if (Result const result = ReadPath(source, position, front.referencePath)) return result;
    front.contentPos = position;
    return Archive::OpenOk;
}

Result ArchiveLoader::LoadArchiveFile(Archive::ArchiveFile& file, IDTag tag, ArchiveLoadData& data)
{
    ArchiveFileSource source(*file.m_stream);
    Front front;
    if (Result const result = ReadFront(source, tag, data.testLink ? &data : nullptr, front)) return result;

    TakeFront(front, file, data);
    u32 highestUID = 0;
    size_t const before = data.revisions.size();
    Result const result =
        LoadFATChain(source, front, Counted<Archive::ArchiveFile>(&file), data, front.info.firstFAT, highestUID);
    if (result != Archive::OpenOk) {
        data.files.clear(); // The revisions that held them have gone.
        return result;
    }

    bool const hasTable = data.revisions.size() > before;
    // A table in the fixed part would not outlive the next save.
    if (hasTable && data.revisions.front()->m_fatPos < front.contentPos) return Archive::OpenCorrupt;
    TakeEnd(source, front, hasTable ? data.revisions[data.revisions.size() - before - 1].Get() : nullptr, highestUID,
            file, data);
    return Archive::OpenOk;
}

void ArchiveLoader::TakeFront(Front const& front, Archive::ArchiveFile& file, ArchiveLoadData& data)
{
    file.m_fileVersion = front.header.fileVersion;
    file.m_flags = front.header.flags;
    file.m_archiveUID = front.header.archiveUID;
    file.m_rawInfo = front.info;
    file.m_infoDamaged = front.infoDamaged;
    file.m_firstFAT = front.info.firstFAT;
    file.m_fileEnd = front.info.fileEnd;
    file.m_totalBytes = front.info.totalBytes;
    file.m_deadBytes = front.info.deadBytes;
    file.m_saveTimeStamp = front.info.saveTimeStamp;
    file.m_saveCount = front.info.saveCount;
    file.m_writeCounter = front.writeCounter;
    file.m_hasLink = front.HasLink();
    file.m_linkPath = front.linkPath;
    file.m_linkSaveTimeStamp = front.linkSaveTimeStamp;
    file.m_linkSaveCount = front.linkSaveCount;
    if (front.HasReference()) file.m_referenceInfo = MakeCounted<ArchiveReferenceInfo>(front.referencePath);

    data.hasLink = front.HasLink();
    data.linkPath = front.linkPath;
    data.linkSaveTimeStamp = front.linkSaveTimeStamp;
    data.linkSaveCount = front.linkSaveCount;
}

void ArchiveLoader::TakeEnd(ArchiveSource& source, Front const& front, Archive::Revision const* newest, u32 highestUID,
                            Archive::ArchiveFile& file, ArchiveLoadData& data)
{
    // An info block that a crash left half written can lag behind the table it names, or be rubbish; a save that
    // trusted it would write over live bytes or reuse an identifier.
    u64 contentEnd = front.contentPos;
    if (newest) contentEnd = std::max(contentEnd, newest->m_fatEnd);
    if (file.m_fileEnd < contentEnd || file.m_fileEnd > source.GetSize()) file.m_fileEnd = contentEnd;
    file.m_nextFreeUID = front.info.nextFreeUID;
    if (file.m_nextFreeUID <= highestUID) file.m_nextFreeUID = highestUID == 0xFFFFFFFF ? highestUID : highestUID + 1;
    data.nextFreeUID = std::max(data.nextFreeUID, file.m_nextFreeUID);

    u8 thumbnails[c_thumbnailHeaderSize];
    bool const has = source.ReadAt(file.m_fileEnd, thumbnails, sizeof(thumbnails)) == sizeof(thumbnails) &&
                     LoadLittleEndian<u32>(thumbnails) == c_blockEnd &&
                     LoadLittleEndian<u32>(thumbnails + 4) == c_tagThumbnails;
    file.m_thumbnailsPos = has ? file.m_fileEnd : 0;
}

Result ArchiveLoader::LoadFATChain(ArchiveSource& source, Front const& front, Counted<Archive::ArchiveFile> const& file,
                                   ArchiveLoadData& data, u64 position, u32& highestUID, u64* failedAt)
{
    // Each table lies whole before the next newer one, as in any append-only log. Without this rule a small file could
    // claim tables that overlap, and take memory by the square of its size.
    u64 limit = source.GetSize();
    std::vector<Counted<Archive::Revision>> newestFirst;
    while (position != 0) {
        FATHeader header;
        FATKind const* kind = nullptr;
        if (failedAt) *failedAt = position;
        if (Result const result = ReadFATHeader(source, position, newestFirst.empty(), header, kind)) return result;

        auto revision = MakeCounted<Archive::Revision>();
        revision->m_file = file;
        revision->m_timeStamp = header.timeStamp;
        revision->m_tag = static_cast<Archive::RevisionTag>(header.revisionTag);
        revision->m_nextFAT = header.nextFAT;
        revision->m_fileEnd = header.fileEnd;
        revision->m_totalBytes = header.totalBytes;
        revision->m_deadBytes = header.deadBytes;
        revision->m_fatPos = position;

        ArchiveTableCursor cursor(source, limit, position + c_fatHeaderSize, header.bodySize);
        if (Result const result =
                LoadBody(cursor, header, *kind, front.GetFirstBlockPos(), *revision, data, highestUID)) {
            if (failedAt && data.contradicts) *failedAt = 0;
            return result;
        }
        revision->m_fatEnd = cursor.GetPosition();
        if (kind->tag == c_tagFAT && revision->m_fatEnd != header.fileEnd) return Archive::OpenCorrupt;
        revision->Freeze();
        newestFirst.push_back(std::move(revision));
        limit = position;
        position = header.nextFAT;
    }
    // The scratch file is read before its master, whose revisions are the older ones.
    data.revisions.insert(data.revisions.begin(), newestFirst.rbegin(), newestFirst.rend());
    return Archive::OpenOk;
}

Result ArchiveLoader::LoadBody(ArchiveTableCursor& cursor, FATHeader const& header, FATKind const& kind,
                               u64 firstBlockPos, Archive::Revision& revision, ArchiveLoadData& data, u32& highestUID)
{
    // Room for what a usual table has. A count is only a claim, so beyond that memory follows the records.
    constexpr u64 c_mostAhead = 65536;
    u64 const ahead = std::min({u64{header.recordCount}, cursor.GetRemaining() / c_recordFixedSize, c_mostAhead});
    revision.m_entries.reserve(ahead);
    if (data.files.empty()) {
        data.files.reserve(ahead);
        data.paths.reserve(ahead);
    }
    for (u32 i = 0; i < header.recordCount; ++i) {
        u8 const* const fixed = cursor.Take(c_recordFixedSize);
        if (!fixed) return Archive::OpenCorrupt;
        u32 const uid = LoadLittleEndian<u32>(fixed);
        u8 const recordKind = fixed[4];
        if (recordKind > RecordDeleted) return Archive::OpenCorrupt;

        highestUID = std::max(highestUID, uid);
        Archive::FileRevision& entry = revision.m_entries.emplace_back();
        NonCounted<Archive::FileInfo>& known = data.files[uid];
        if (!known) known = new Archive::FileInfo(uid, String8());
        Archive::FileInfo* const info = known.Get();
        entry.info = Counted<Archive::FileInfo const>(info);
        if (recordKind == RecordDeleted) continue;

        u8 const* const details = cursor.Take(kind.detailsSize);
        if (!details) return Archive::OpenCorrupt;
        DecodeDetails(details, kind, entry);
        // The next save would write over it.
        if (entry.filePos < firstBlockPos && !entry.IsDeletion()) entry.filePos = c_noBlockPos;
        if (recordKind != RecordAdded) continue;

        entry.added = true;
        u8 const* const lengthBytes = cursor.Take(2);
        if (!lengthBytes) return Archive::OpenCorrupt;
        u16 const length = LoadLittleEndian<u16>(lengthBytes);
        u8 const* const text = cursor.Take(length);
        if (!text) return Archive::OpenCorrupt;
        if (info->m_path.IsEmpty())
            info->m_path = String8(reinterpret_cast<char const*>(text), length);
        else if (info->m_path.GetLength() != length || std::memcmp(info->m_path.GetData(), text, length) != 0) {
            data.contradicts = true;
            return Archive::OpenCorrupt;
        }
        // Newest first: where two files claim one path the newer one has it.
        data.paths.try_emplace(info->m_path, Counted<Archive::FileInfo>(info));
    }
    for (u16 i = 0; i < header.pathCountCount; ++i) {
        u8 const* const fixed = cursor.Take(c_pathCountFixedSize);
        if (!fixed) return Archive::OpenCorrupt;
        u16 const prefixLength = LoadLittleEndian<u16>(fixed);
        u16 const suffixLength = LoadLittleEndian<u16>(fixed + 2);
        u64 const counter = LoadLittleEndian<u64>(fixed + 4);
        u8 const* const text = cursor.Take(u64{prefixLength} + suffixLength);
        if (!text) return Archive::OpenCorrupt;
        if (counter == 0) continue; // Counts nothing, and is not written again.
        char const* const chars = reinterpret_cast<char const*>(text);
        ArchivePathCount& count =
            data.pathCounts[{String8(chars, prefixLength), String8(chars + prefixLength, suffixLength)}];
        if (counter <= count.counter) continue;
        count.counter = counter;
        count.dirty = revision.m_tag == Archive::RevisionTagIncremental ? 2 : 0;
    }
    if (header.userDataSize != 0) {
        if (header.userDataSize > cursor.GetRemaining()) return Archive::OpenCorrupt;
        u8 const* const bytes = cursor.Take(header.userDataSize);
        if (!bytes) return Archive::OpenCorrupt;
        revision.m_userData = MakeCounted<RawDataMalloc>(header.userDataSize);
        if (!revision.m_userData->GetData()) return Archive::OpenNoMemory;
        std::memcpy(revision.m_userData->GetData(), bytes, header.userDataSize);
    }
    return Archive::OpenOk;
}

void ArchiveLoader::LinkHistories(ArchiveLoadData& data)
{
    u64 order = 0;
    for (Counted<Archive::Revision> const& revision : data.revisions) {
        revision->m_order = ++order;
        for (Archive::FileRevision const& entry : revision->m_entries)
            const_cast<Archive::FileInfo&>(*entry.info).m_history.push_back(revision.Get());
    }
}

Result ArchiveLoader::TestArchive(ArchiveSource& source, IDTag tag, Archive::ArchiveHdr* header,
                                  Archive::ArchiveInfo* info)
{
    Front front;
    Result const result = ReadFront(source, tag, nullptr, front);
    if (header) *header = front.header;
    if (info) *info = front.info;
    if (result != Archive::OpenOk) return result;
    for (u64 position = front.info.firstFAT; position != 0;) {
        FATHeader fat;
        FATKind const* kind = nullptr;
        bool const newest = position == front.info.firstFAT;
        if (position < front.contentPos) return Archive::OpenCorrupt;
        if (Result const walked = ReadFATHeader(source, position, newest, fat, kind)) return walked;
        position = fat.nextFAT;
    }
    return Archive::OpenOk;
}

} // namespace Kernel

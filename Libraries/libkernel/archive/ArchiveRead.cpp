#include "libkernel/archive/internal/ArchiveAppender.h"
#include "libkernel/archive/internal/ArchiveInStream.h"
#include "libkernel/archive/internal/ArchiveReadGate.h"
#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Limits.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/streams/CRC32.h"
#include "libkernel/streams/FileIOException.h"
#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/ZStandardInStream.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <memory>

// How a path at a revision becomes bytes. Each file knows the revisions that touched it, so a look-up costs the same
// however long the history is.

namespace Kernel {

using namespace ArchiveFormat;

Archive::Revision* ArchiveImpl::GetWorkingRevisionCS() const
{
    return m_rewindCount < m_revisions.size() ? m_revisions[m_revisions.size() - 1 - m_rewindCount].Get() : nullptr;
}

Archive::FileInfo* ArchiveImpl::FindFileInfoCS(String8 const& path) const
{
    auto const it = m_paths.find(path);
    return it == m_paths.end() ? nullptr : it->second.Get();
}

Archive::FileRevision* ArchiveImpl::FindEntryCS(Archive::FileInfo const& info, Archive::Revision const& revision,
                                                Archive::Revision** where) const
{
    auto const& history = info.m_history;
    auto const later = std::upper_bound(history.begin(), history.end(), revision.m_order,
                                        [](u64 order, Archive::Revision const* r) { return order < r->m_order; });
    if (later == history.begin()) return nullptr;
    Archive::Revision* const found = *std::prev(later);
    if (where) *where = found;
    return found->FindI(info);
}

Archive::FileRevision* ArchiveImpl::FindHeadEntryCS(Archive::FileInfo const& info, Archive::Revision** where) const
{
    if (info.m_history.empty()) return nullptr;
    Archive::Revision* const found = info.m_history.back();
    if (where) *where = found;
    return found->FindI(info);
}

Archive::Revision* ArchiveImpl::AsRevisionCS(NonCounted<FileStoreRevision const> revision) const
{
    // By address only: what the caller holds may be gone.
    auto const it = m_revisionsByAddress.find(revision.Get());
    return it == m_revisionsByAddress.end() ? nullptr : it->second;
}

Counted<Archive::Revision const> ArchiveImpl::FindRevision(NonCounted<FileStoreRevision const> revision) const
{
    CriticalSectionScope const lock(m_stateLock);
    return Counted<Archive::Revision const>(AsRevisionCS(revision));
}

bool Archive::GetFileRevision(String8 const& path, FileRevision& entry, Counted<Revision const>& revision) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    Revision* const working = m->GetWorkingRevisionCS();
    FileInfo* const info = m->FindFileInfoCS(path);
    Revision* where = nullptr;
    FileRevision* const found = working && info ? m->FindEntryCS(*info, *working, &where) : nullptr;
    if (!found || found->IsDeletion()) return false;
    entry = *found;
    revision = Counted<Revision const>(where);
    return true;
}

bool Archive::HasFile(String8 const& path) const
{
    FileRevision entry;
    Counted<Revision const> revision;
    return GetFileRevision(path, entry, revision);
}

bool Archive::HasFileRevision(FileInfo const& info, NonCounted<FileStoreRevision const> revision) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    Revision* const at = m->AsRevisionCS(revision);
    FileRevision* const found = at ? m->FindEntryCS(info, *at) : nullptr;
    return found && !found->IsDeletion();
}

bool Archive::HasFileRevision(String8 const& path, NonCounted<FileStoreRevision const> revision) const
{
    Counted<FileInfo const> const info = GetFileInfo(path);
    return info && HasFileRevision(*info, revision);
}

namespace {

/// A path with its first bytes as a number that sorts like them.
struct ListedPath
{
    u64 key;
    String8* path;
};

/// Paths of one archive mostly begin alike, so the key is taken from behind what all have in common.
void SortPaths(std::vector<String8>& paths)
{
    if (paths.empty()) return;
    String8 const& first = paths.front();
    auto common = static_cast<size_t>(first.GetLength());
    for (String8 const& path : paths) {
        common = std::min(common, static_cast<size_t>(path.GetLength()));
        char const* const end = first.GetData() + common;
        common = static_cast<size_t>(std::mismatch(first.GetData(), end, path.GetData()).first - first.GetData());
    }
    std::vector<ListedPath> listed;
    listed.reserve(paths.size());
    for (String8& path : paths) {
        u8 bytes[sizeof(u64)] = {};
        std::memcpy(bytes, path.GetData() + common,
                    std::min(static_cast<size_t>(path.GetLength()) - common, sizeof(bytes)));
        u64 key = 0;
        for (u8 const byte : bytes) key = key << 8 | byte;
        listed.push_back({key, &path});
    }
    std::sort(listed.begin(), listed.end(), [](ListedPath const& a, ListedPath const& b) {
        return a.key != b.key ? a.key < b.key : *a.path < *b.path;
    });
    std::vector<String8> sorted;
    sorted.reserve(paths.size());
    for (ListedPath const& one : listed) sorted.push_back(std::move(*one.path));
    paths.swap(sorted);
}

} // namespace

void Archive::GetFileList(std::vector<String8>& paths) const
{
    paths.clear();
    {
        CriticalSectionScope const lock(m->m_stateLock);
        Revision* const working = m->GetWorkingRevisionCS();
        if (!working) return;
        paths.reserve(m->m_paths.size());
        for (auto const& [path, info] : m->m_paths) {
            FileRevision* const found = m->FindEntryCS(*info, *working);
            if (found && !found->IsDeletion()) paths.push_back(path);
        }
    }
    SortPaths(paths);
}

Counted<Archive::FileInfo const> Archive::GetFileInfo(String8 const& path) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return Counted<FileInfo const>(m->FindFileInfoCS(path));
}

Counted<Archive::Revision const> Archive::GetHeadRevisionForFile(FileInfo const& info) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    Revision* where = nullptr;
    FileRevision* const found = m->FindHeadEntryCS(info, &where);
    return found && !found->IsDeletion() ? Counted<Revision const>(where) : nullptr;
}

Counted<Archive::Revision const> Archive::GetHeadRevisionForFile(String8 const& path) const
{
    Counted<FileInfo const> const info = GetFileInfo(path);
    return info ? GetHeadRevisionForFile(*info) : nullptr;
}

NonCounted<FileStoreRevision const> Archive::GetHeadRevisionI() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_revisions.empty() ? nullptr : m->m_revisions.back().Get();
}

NonCounted<FileStoreRevision const> Archive::GetHeadRevisionForFileI(String8 const& path) const
{
    // The archive keeps the revision alive as long as it is part of the history.
    return GetHeadRevisionForFile(path).Get();
}

bool Archive::FileWasDeleted(String8 const& path) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    FileInfo* const info = m->FindFileInfoCS(path);
    FileRevision* const found = info ? m->FindHeadEntryCS(*info) : nullptr;
    return found && found->IsDeletion();
}

u32 Archive::GetFileCodeBaseBuildIndex(FileInfo const& info) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    FileRevision* const found = m->FindHeadEntryCS(info);
    return found ? found->codeBaseIndex : 0;
}

u32 Archive::GetFileCodeBaseBuildIndex(String8 const& path) const
{
    Counted<FileInfo const> const info = GetFileInfo(path);
    return info ? GetFileCodeBaseBuildIndex(*info) : 0;
}

void Archive::GetRevisions(std::vector<Counted<Revision const>>& revisions) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    revisions.assign(m->m_revisions.begin(), m->m_revisions.end());
}

u64 Archive::GetTotalBytes() const
{
    FileState state;
    return GetFileState(HasScratchFile() ? ChoiceScratch : ChoiceMaster, state) ? state.totalBytes : 0;
}

u64 Archive::GetDeadByteCount() const
{
    FileState state;
    return GetFileState(HasScratchFile() ? ChoiceScratch : ChoiceMaster, state) ? state.deadBytes : 0;
}

TimeStamp Archive::GetSaveTimestamp() const
{
    FileState state;
    return GetFileState(HasScratchFile() ? ChoiceScratch : ChoiceMaster, state) ? state.saveTimeStamp : TimeStamp();
}

u32 Archive::GetSaveCount() const
{
    FileState state;
    return GetFileState(HasScratchFile() ? ChoiceScratch : ChoiceMaster, state) ? state.saveCount : 0;
}

Archive::RevisionTag Archive::GetLastSaveType() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    Revision* const working = m->GetWorkingRevisionCS();
    return working ? working->m_tag : RevisionTagFull;
}

bool Archive::RewindWorkingRevision()
{
    CriticalSectionScope const lock(m->m_stateLock);
    if (m->m_rewindCount < m->m_revisions.size()) ++m->m_rewindCount;
    return m->m_rewindCount < m->m_revisions.size();
}

void Archive::ResetWorkingRevisionToHead()
{
    CriticalSectionScope const lock(m->m_stateLock);
    m->m_rewindCount = 0;
}

bool Archive::IsWorkingRevisionAtHead() const
{
    return GetRewindCount() == 0;
}

u64 Archive::GetRewindCount() const
{
    CriticalSectionScope const lock(m->m_stateLock);
    return m->m_rewindCount;
}

// Loading.

void ArchiveImpl::ReportCorruption(bool reportToCallback)
{
    Counted<ArchiveErrorCallback> callback;
    {
        CriticalSectionSpinScope const lock(m_flagsLock);
        m_broken = true;
        if (reportToCallback) callback = m_errorCallback;
    }
    if (!callback) throw ArchiveCorruptionException(&m_self);
    callback->SignalError(ArchiveErrorCallback::Error::CorruptedFile, m_self);
}

bool ArchiveImpl::LoadFileI(Archive::FileRevision const& entry, Archive::Revision const& revision, FileStoreItem& item,
                            bool reportToCallback, ArchiveReadGate& gate)
{
    bool loaded = false;
    if (entry.backData) {
        gate.Leave();
        loaded = entry.backData->LoadItem(item);
        if (!loaded) gate.Enter();
    }
    if (!loaded) {
        InStreamResult result = InStreamResult::Failure;
        bool corrupt = false;
        try {
            Counted<InStream> const stream = CreateInStream(Counted<Archive::Revision const>(&revision), entry, result);
            corrupt = !stream && result == InStreamResult::Corrupt;
            gate.Leave();
            if (stream) loaded = item.Load(*stream, m_self);
        } catch (ArchiveCorruptionException const& e) {
            if (e.GetArchive() != &m_self) throw;
            corrupt = true;
        }
        if (corrupt) {
            ReportCorruption(reportToCallback);
            return false;
        }
    }
    if (!loaded) return false;
    bool const incremental = revision.m_tag == Archive::RevisionTagIncremental;
    m_self.SetObjectDirtyStatePostLoad(item, incremental ? FileStoreStateObject::DirtyStateIncremental
                                                         : FileStoreStateObject::DirtyStateClean);
    return true;
}

bool Archive::LoadFile(String8 const& path, NonCounted<FileStoreRevision const> revision, FileStoreItem& item,
                       bool reportToCallback)
{
    ArchiveReadGate gate(*m);
    FileRevision entry;
    Counted<Revision> where;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        Revision* const at = m->AsRevisionCS(revision);
        FileInfo* const info = m->FindFileInfoCS(path);
        Revision* found = nullptr;
        FileRevision* const at2 = at && info ? m->FindEntryCS(*info, *at, &found) : nullptr;
        if (!at2 || at2->IsDeletion()) return false;
        entry = *at2;
        where = Counted<Revision>(found);
    }
    return m->LoadFileI(entry, *where, item, reportToCallback, gate);
}

bool Archive::LoadFile(String8 const& path, FileStoreItem& item)
{
    ArchiveReadGate gate(*m);
    FileRevision entry;
    Counted<Revision const> revision;
    return GetFileRevision(path, entry, revision) && m->LoadFileI(entry, *revision, item, true, gate);
}

Counted<InStream> Archive::OpenFileInStream(String8 const& path)
{
    ArchiveReadGate const gate(*m);
    FileRevision entry;
    Counted<Revision const> revision;
    if (!GetFileRevision(path, entry, revision)) return nullptr;
    ArchiveImpl::InStreamResult result{};
    Counted<InStream> const stream = m->CreateInStream(revision, entry, result);
    if (!stream && result == ArchiveImpl::InStreamResult::Corrupt) m->ReportCorruption(false);
    return stream;
}

Counted<InStream> Archive::OpenFileInStream(String8 const& path, NonCounted<FileStoreRevision const> revision)
{
    ArchiveReadGate const gate(*m);
    FileRevision entry;
    Counted<Revision const> holds;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        Revision* const at = m->AsRevisionCS(revision);
        FileInfo* const info = m->FindFileInfoCS(path);
        Revision* where = nullptr;
        FileRevision* const found = at && info ? m->FindEntryCS(*info, *at, &where) : nullptr;
        if (!found || found->IsDeletion()) return nullptr;
        entry = *found;
        holds = Counted<Revision const>(where);
    }
    ArchiveImpl::InStreamResult result{};
    Counted<InStream> const stream = m->CreateInStream(holds, entry, result);
    if (!stream && result == ArchiveImpl::InStreamResult::Corrupt) m->ReportCorruption(false);
    return stream;
}

// Whole files to memory.

namespace {

/// The stored bytes of one block with their tag, in the pooled buffer where they fit.
class StoredBlock
{
public:
    /// False if the bytes cannot be had; @p size counts the tag and, if asked for, the terminator.
    bool Read(FileInOutStream& stream, u64 position, u64 size)
    {
        u64 const held = stream.GetSizeInStream();
        if (!RangeFits(position, size, held)) return false;
        if (size <= c_copyBufferSize) {
            m_pooled = std::make_unique<ArchiveCopyBuffer>();
            m_bytes = m_pooled->GetData();
        } else {
            m_own.reset(static_cast<u8*>(std::malloc(size)));
            m_bytes = m_own.get();
        }
        return m_bytes && stream.ReadAt(position, m_bytes, size) == size;
    }
    u8 const* GetBytes() const { return m_bytes; }

private:
    std::unique_ptr<ArchiveCopyBuffer> m_pooled;
    std::unique_ptr<u8, void (*)(void*)> m_own{nullptr, std::free};
    u8* m_bytes = nullptr;
};

bool Unpack(u8 code, u8 const* stored, u64 storedSize, void* to, u64 size)
{
    auto const type = static_cast<CompressionPredictorType>(PredictorOf(code));
    auto const striping = static_cast<CompressionPredictorStripingType>(StripingOf(code));
    if (MethodOf(code) == MethodZStandard)
        return ZStandardDecompressExact(stored, storedSize, to, size, type, striping);
    auto const in = MakeCounted<MemoryInStream>(stored, storedSize, false);
    Counted<InStream> const unpacker = MakeArchiveUnpacker(in, code);
    return unpacker && unpacker->ReadBlock(to, size) == size;
}

} // namespace

bool ArchiveImpl::ReadEntry(Archive::ArchiveFile& file, Archive::FileRevision const& entry, RawDataBlock& data)
{
    u8 const code = entry.compressionCode;
    if (!SizesArePlausible(code, entry.fileSize, entry.fileCompressedSize)) return false;
    ArchiveAccessScope const access(*this);
    if (!access.IsOpen()) return false;
    try {
        Counted<FileInOutStream> const stream = file.GetStream();
        return stream && ReadEntryI(*stream, entry, data);
    } catch (FileIOException const&) {
        return false;
    }
}

bool ArchiveImpl::ReadEntryI(FileInOutStream& stream, Archive::FileRevision const& entry, RawDataBlock& data)
{
    u64 blockSize = 0;
    if (!CheckedAdd(entry.fileCompressedSize, c_blockTagSize, blockSize)) return false;
    u32 crc = 0;
    if (MethodOf(entry.compressionCode) == MethodDirect) {
        // Straight to where it belongs: the tag by itself, then the bytes.
        u8 tag[c_blockTagSize];
        if (!RangeFits(entry.filePos, blockSize, stream.GetSizeInStream())) return false;
        if (stream.ReadAt(entry.filePos, tag, sizeof(tag)) != sizeof(tag)) return false;
        if (LoadLittleEndian<u32>(tag) != c_tagBlock) return false;
        RawDataBlock bytes(entry.fileSize);
        if (entry.fileSize != 0 && !bytes.GetData()) return false;
        if (stream.ReadAt(entry.filePos + c_blockTagSize, bytes.GetData(), entry.fileSize) != entry.fileSize)
            return false;
        CRC32::DataCRC32(bytes.GetData(), entry.fileSize, crc);
        if (crc != entry.crcUncompressed) return false;
        data.Swap(bytes);
        return true;
    }
    StoredBlock stored;
    if (!stored.Read(stream, entry.filePos, blockSize)) return false;
    if (LoadLittleEndian<u32>(stored.GetBytes()) != c_tagBlock) return false;
    RawDataBlock bytes(entry.fileSize);
    if (entry.fileSize != 0 && !bytes.GetData()) return false;
    if (!Unpack(entry.compressionCode, stored.GetBytes() + c_blockTagSize, entry.fileCompressedSize, bytes.GetData(),
                entry.fileSize))
        return false;
    CRC32::DataCRC32(bytes.GetData(), entry.fileSize, crc);
    if (crc != entry.crcUncompressed) return false;
    data.Swap(bytes);
    return true;
}

bool Archive::ReadFile(String8 const& path, RawDataBlock& data)
{
    ArchiveReadGate const gate(*m);
    FileRevision entry;
    Counted<Revision const> revision;
    return GetFileRevision(path, entry, revision) && m->ReadEntry(*revision->m_file, entry, data);
}

Counted<RawDataMalloc> Archive::ReadFile(String8 const& path)
{
    RawDataBlock data;
    if (!ReadFile(path, data)) return nullptr;
    auto result = MakeCounted<RawDataMalloc>();
    result->Swap(data);
    return result;
}

// Checking. In bounded memory, whatever the block claims to unpack to.

Archive::BlockCheck ArchiveImpl::CheckStoredBytes(Archive::ArchiveFile& file, Archive::FileRevision const& entry)
{
    if (BlockCheck const tag = CheckBlockTag(file, entry); tag != BlockCheck::Ok) return tag;
    Counted<FileInOutStream> const stream = file.GetStream();
    u64 const start = entry.filePos + c_blockTagSize;
    ArchiveCopyBuffer const buffer;
    u32 crc = 0;
    CRC32::BeginCRC32(crc);
    for (u64 at = 0; at < entry.fileCompressedSize;) {
        u64 const piece = std::min(entry.fileCompressedSize - at, c_copyBufferSize);
        if (stream->ReadAt(start + at, buffer.GetData(), piece) != piece) return BlockCheck::Unreadable;
        CRC32::CalcCRC32(buffer.GetData(), piece, crc);
        at += piece;
    }
    CRC32::EndCRC32(crc);
    u8 end[c_blockEndSize];
    if (stream->ReadAt(start + entry.fileCompressedSize, end, sizeof(end)) != sizeof(end))
        return BlockCheck::Unreadable;
    if (LoadLittleEndian<u32>(end) != c_blockEnd) return BlockCheck::BadTag;
    bool const known = entry.crcCompressed != 0;
    return known && entry.crcCompressed != (crc == 0 ? 1 : crc) ? BlockCheck::BadStoredCRC : BlockCheck::Ok;
}

Archive::BlockCheck ArchiveImpl::CheckUnpacked(Archive::ArchiveFile& file, Archive::FileRevision const& entry)
{
    if (!SizesArePlausible(entry.compressionCode, entry.fileSize, entry.fileCompressedSize)) return BlockCheck::BadData;
    auto const reader = MakeCounted<ArchiveFileStreamReader>(Counted<Archive::ArchiveFile>(&file),
                                                             entry.filePos + c_blockTagSize, entry.fileCompressedSize);
    Counted<InStream> const unpacker = MakeArchiveUnpacker(reader, entry.compressionCode);
    if (!unpacker) throw MemoryException();
    ArchiveCopyBuffer const buffer;
    u32 crc = 0;
    CRC32::BeginCRC32(crc);
    for (u64 at = 0; at < entry.fileSize;) {
        u64 const piece = std::min(entry.fileSize - at, c_copyBufferSize);
        if (unpacker->ReadBlock(buffer.GetData(), piece) != piece) {
            ThrowIfOutOfMemory(unpacker);
            return reader->HasFailed() ? BlockCheck::Unreadable : BlockCheck::BadData;
        }
        CRC32::CalcCRC32(buffer.GetData(), piece, crc);
        at += piece;
    }
    CRC32::EndCRC32(crc);
    return crc == entry.crcUncompressed ? BlockCheck::Ok : BlockCheck::BadCRC;
}

Archive::BlockCheck Archive::CheckStoredBlock(Revision const& revision, FileRevision const& entry)
{
    ArchiveReadGate const gate(*m);
    ArchiveAccessScope const access(*m);
    if (!access.IsOpen()) return BlockCheck::Unreadable;
    try {
        BlockCheck const stored = m->CheckStoredBytes(*revision.m_file, entry);
        return stored == BlockCheck::Ok ? m->CheckUnpacked(*revision.m_file, entry) : stored;
    } catch (FileIOException const&) {
        return BlockCheck::Unreadable;
    }
}

} // namespace Kernel

#include "libkernel/archive/internal/ArchiveSessionState.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Limits.h"
#include "libkernel/streams/FileIOException.h"

#include <algorithm>
#include <cassert>
#include <cstring>
#include <exception>
#include <iterator>
#include <limits>

// The commit of a save session.
//
// By now the new blocks lie behind the file's end and nothing points at them. The commit appends the table, flushes,
// and then makes all of it live by rewriting the info block in one write; a second flush, and the save is made. Only
// after that do revisions and objects in memory move. What a commit costs depends on what the session changed, never on
// how many files or revisions the archive has: revisions and paths are added in place under the state lock, so a reader
// sees the archive before the save or after it.

namespace Kernel {

using namespace ArchiveFormat;

class ArchiveCommit
{
public:
    ArchiveCommit(ArchiveImpl& impl, ArchiveSession::State& state)
        : m_impl(impl), m(state), m_file(*state.file), m_revision(*state.revision)
    {
    }

    void Run(bool updateTimestamps);

private:
    bool IsMasterWithScratch() const { return !m_file.m_isScratch && m_impl.m_scratch; }
    bool IsExport() const { return m.type == Archive::SessionTypeExport; }

    void RollDownScratch();
    void CopyBlock(FileInOutStream& from, Archive::FileRevision const& source, Archive::FileRevision& entry);
    void SettleEntries();
    Archive::FileRevision const* FindEarlier(Archive::FileInfo const& info) const;
    void WriteTable();
    void CutLeftovers();
    void ReserveMemory();
    bool WillDrop(Archive::Revision const& revision) const { return !m_file.m_isScratch && revision.IsScratch(); }
    void Publish();
    void RaiseVersion();
    void WriteThumbnails();
    bool TryWriteThumbnails();
    void CopyFields();
    void AddRevision();
    void TellObjects();
    void MoveHolders();
    void DropScratchRevisions();
    void QueueForOfflining();

    template <class TStep>
    void Attempt(TStep const& step);
    void WriteAt(u64 position, void const* data, u64 size);
    void FlushToDevice();
    void PassGuard();

    ArchiveImpl& m_impl;
    ArchiveSession::State& m;
    Archive::ArchiveFile& m_file;
    Archive::Revision& m_revision;

    u64 m_fatPos = 0;
    Archive::ArchiveInfo m_info;
    // New paths and the new revision, to be merged in without a failure being possible.
    ArchivePathMap m_nodes;
    ArchiveRevisionMap m_revisionNode;
    std::set<String8> m_deletedPaths;
    std::set<Archive::FileInfo const*> m_rolledDown;
    std::vector<Counted<Archive::Revision>> m_droppedRevisions;
    std::exception_ptr m_failure; // The first of what went wrong after the save stood.
};

void ArchiveCommit::Run(bool updateTimestamps)
{
    bool const clearsScratch = IsMasterWithScratch();
    {
        CriticalSectionScope const fileLock(m_file.m_lock);
        if (clearsScratch) RollDownScratch();
        SettleEntries();
        // A master session without entries still has the scratch file's revisions to make final.
        bool const scratchHasRevisions =
            clearsScratch && !m_impl.m_revisions.empty() && m_impl.m_revisions.back()->IsScratch();
        if (m_revision.GetEntries().empty() && !scratchHasRevisions) return;

        ReserveMemory();
        WriteTable();
        CutLeftovers();
        FlushToDevice();
        Publish();
        Attempt([this] { RaiseVersion(); });
        WriteThumbnails();
        bool const touches = m.type == Archive::SessionTypeFull || m.type == Archive::SessionTypeRewrite;
        if (updateTimestamps && touches && m_file.m_stream) m_file.m_stream->UpdateTimestamps();
        CopyFields();
    }
    AddRevision();
    TellObjects();
    // Behind the holders, which take what they need from the scratch file's old blocks: a front that has grown, by the
    // master's path or by a reference path, writes over the first of them.
    if (clearsScratch) {
        m_impl.ResetScratch(m_file, m.nextFreeUID);
        DropScratchRevisions();
    }
    Attempt([this] { QueueForOfflining(); });
    if (!m_file.m_finalPath.IsEmpty()) Attempt([this] { m_impl.MoveTemporary(m_file); });
    if (m_failure) std::rethrow_exception(m_failure);
}

// The save stands: whatever one step of its aftermath throws, the others are still due, or the archive would go on with
// revisions that its files no longer hold. The first failure reaches the caller when all is done.
template <class TStep>
void ArchiveCommit::Attempt(TStep const& step)
{
    try {
        step();
    } catch (...) {
        if (!m_failure) m_failure = std::current_exception();
    }
}

void ArchiveCommit::WriteAt(u64 position, void const* data, u64 size)
{
    if (!m_file.m_stream) m_impl.ThrowFileException(m_file, ArchiveFileException::Reason::FileError);
    if (m_file.m_stream->WriteAt(position, data, size) != size) throw OutStream::WriteException();
}

void ArchiveCommit::FlushToDevice()
{
    // A flush that failed says nothing about what reached the device, and a later one that succeeds says no more: the
    // stream is broken from here on, and the next access compares what the file really holds.
    if (!m_file.m_stream || m_file.m_stream->IsBroken() || !m_file.m_stream->ForceFlush())
        throw OutStream::WriteException();
}

void ArchiveCommit::PassGuard()
{
    if (m_file.m_isScratch || m_file.m_fileVersion < c_guardVersion) return;
    switch (m_impl.PassWriteGuard(m_file, true)) {
    case ArchiveImpl::GuardResult::Ok: return;
    case ArchiveImpl::GuardResult::WrongCounter:
        m_impl.ThrowFileException(m_file, ArchiveFileException::Reason::OtherWriter);
    default: m_impl.ThrowFileException(m_file, ArchiveFileException::Reason::GuardUnreadable);
    }
}

// Copies the newest scratch version of each file that this session has not written itself, so that the master is
// complete by itself.
void ArchiveCommit::RollDownScratch()
{
    struct Source
    {
        Archive::FileRevision entry;
    };
    std::vector<Source> sources;
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        std::set<Archive::FileInfo const*> seen;
        // A file that no path leads to can't be found in the master either, and might hide the one that it does lead
        // to.
        auto const isNamed = [this](Archive::FileInfo const& info) {
            return m_impl.FindFileInfoCS(info.GetPath()) == &info;
        };
        for (size_t i = m_impl.m_revisions.size(); i-- > 0 && m_impl.m_revisions[i]->IsScratch();)
            for (Archive::FileRevision const& entry : m_impl.m_revisions[i]->GetEntries())
                if (isNamed(*entry.info) && !m_revision.Find(*entry.info) && seen.insert(entry.info.Get()).second)
                    sources.push_back({entry});
    }
    Counted<FileInOutStream> const from = m_impl.m_scratch->GetStream();
    try {
        for (Source const& source : sources) {
            bool made = false;
            Archive::FileRevision& entry = m_revision.FindOrAdd(source.entry.info, made);
            entry = source.entry;
            if (entry.IsDeletion()) continue;
            if (!from) m_impl.ThrowFileException(*m_impl.m_scratch, ArchiveFileException::Reason::FileError);
            CopyBlock(*from, source.entry, entry);
            m_rolledDown.insert(entry.info.Get());
        }
    } catch (FileIOException const& e) {
        m_impl.ThrowFileException(*m_impl.m_scratch,
                                  ArchiveFileException::FromFileIOReason(static_cast<int>(e.GetReason())));
    }
    CriticalSectionSpinScope const lock(m.lock);
    for (auto& [parts, count] : m.pathCounts) count.dirty = 1;
}

void ArchiveCommit::CopyBlock(FileInOutStream& from, Archive::FileRevision const& source, Archive::FileRevision& entry)
{
    ArchiveAppender& appender = *m.appender;
    u8 tag[c_blockTagSize];
    if (from.ReadAt(source.filePos, tag, sizeof(tag)) != sizeof(tag) || LoadLittleEndian<u32>(tag) != c_tagBlock)
        throw OutStream::WriteException();
    entry.filePos = appender.GetEnd();
    appender.Append(tag, sizeof(tag));
    u64 const size = source.fileCompressedSize + c_blockEndSize;
    for (u64 at = 0; at < size;) {
        u64 const piece = std::min(size - at, c_copyBufferSize);
        u8* const space = appender.GetSpace(piece);
        if (from.ReadAt(source.filePos + c_blockTagSize + at, space, piece) != piece) throw OutStream::WriteException();
        appender.CommitSpace(piece);
        at += piece;
    }
    m_revision.m_fileEnd = appender.GetEnd();
    m_revision.m_totalBytes += source.fileCompressedSize;
}

// The newest entry for the file before this revision, in the history that this revision continues: for the master that
// is the master's own, since the scratch revisions end with this commit.
Archive::FileRevision const* ArchiveCommit::FindEarlier(Archive::FileInfo const& info) const
{
    auto const& history = info.m_history;
    for (size_t i = history.size(); i-- > 0;)
        if (m_file.m_isScratch || !history[i]->IsScratch()) return history[i]->Find(info);
    return nullptr;
}

void ArchiveCommit::SettleEntries()
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    std::vector<Counted<Archive::FileInfo const>> dropped;
    for (Archive::FileRevision& entry : m_revision.m_entries) {
        Archive::FileRevision const* const earlier = FindEarlier(*entry.info);
        bool const hadData = earlier && !earlier->IsDeletion();
        if (hadData) m_revision.m_deadBytes += earlier->fileCompressedSize;
        entry.added = !entry.IsDeletion() && !hadData;
        if (!entry.IsDeletion()) continue;
        m_deletedPaths.insert(entry.info->GetPath());
        if (!hadData) dropped.push_back(entry.info);
    }
    for (Counted<Archive::FileInfo const> const& info : dropped) m_revision.Remove(*info);
    m_revision.Freeze();
}

void ArchiveCommit::WriteTable()
{
    std::vector<u8> body;
    u64 bodySize = 0;
    for (Archive::FileRevision const& entry : m_revision.GetEntries()) bodySize += RecordSize(entry);
    u64 const userDataSize = m_revision.m_userData ? m_revision.m_userData->GetSize() : 0;
    body.reserve(bodySize);
    for (Archive::FileRevision const& entry : m_revision.GetEntries()) AppendRecord(body, entry);

    u64 pathCounts = 0;
    bool const incremental = m_revision.m_tag == Archive::RevisionTagIncremental;
    for (auto const& [parts, count] : m.pathCounts) {
        if (count.dirty != 1 && (incremental || count.dirty != 2)) continue;
        ++pathCounts;
        AppendPathCount(body, parts.first, parts.second, count.counter);
    }
    bodySize = body.size() + userDataSize;
    // Neither is cut short in silence: what does not fit its field cannot be saved.
    if (pathCounts > std::numeric_limits<u16>::max() || bodySize > std::numeric_limits<u32>::max())
        throw OutStream::WriteException();

    ArchiveAppender& appender = *m.appender;
    m_fatPos = appender.GetEnd();
    m_revision.m_fatPos = m_fatPos;
    m_revision.m_fatEnd = m_fatPos + c_fatHeaderSize + bodySize;
    m_revision.m_fileEnd = m_revision.m_fatEnd;

    FATHeader header;
    header.nextFAT = m_revision.m_nextFAT;
    header.timeStamp = m_revision.m_timeStamp;
    header.fileEnd = m_revision.m_fileEnd;
    header.totalBytes = m_revision.m_totalBytes;
    header.deadBytes = m_revision.m_deadBytes;
    header.recordCount = static_cast<u32>(m_revision.GetEntries().size());
    header.userDataSize = static_cast<u32>(userDataSize);
    header.bodySize = static_cast<u32>(bodySize);
    header.pathCountCount = static_cast<u16>(pathCounts);
    header.revisionTag = m_revision.m_tag;
    u8 bytes[c_fatHeaderSize];
    EncodeFATHeader(bytes, header);
    appender.Append(bytes, sizeof(bytes));
    appender.Append(body.data(), body.size());
    if (userDataSize != 0) appender.Append(m_revision.m_userData->GetData(), userDataSize);
    appender.Flush();
    PassGuard();
}

// An abandoned save may have left a whole table behind the end, of which the new one does not reach far enough to write
// over. Should the info block be torn, a search would take it for the newest.
void ArchiveCommit::CutLeftovers()
{
    if (m_file.m_stream->GetSizeInStream() <= m_revision.m_fileEnd) return;
    if (!m_file.m_stream->Truncate(m_revision.m_fileEnd)) throw OutStream::WriteException();
}

// What the steps behind the commit need is taken before it: a save that stands must not fail for want of memory.
void ArchiveCommit::ReserveMemory()
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    size_t fresh = 0;
    for (Archive::FileRevision const& entry : m_revision.GetEntries()) {
        auto& history = const_cast<Archive::FileInfo&>(*entry.info).m_history;
        if (history.size() == history.capacity()) history.reserve(std::max<size_t>(2 * history.size(), 1));
        auto const it = m.newPaths.find(entry.info->GetPath());
        if (it == m.newPaths.end()) continue;
        m_nodes.emplace(it->first, it->second);
        ++fresh;
    }
    ArchivePathMap& paths = m_impl.m_paths;
    paths.reserve(paths.size() + fresh);
    std::vector<Counted<Archive::Revision>>& revisions = m_impl.m_revisions;
    if (revisions.size() == revisions.capacity()) revisions.reserve(std::max<size_t>(2 * revisions.size(), 8));
    m_impl.m_revisionsByAddress.reserve(revisions.size() + 1);
    m_revisionNode.emplace(&m_revision, &m_revision);
    // Those of the scratch file stand last.
    size_t dropped = 0;
    while (dropped < revisions.size() && WillDrop(*revisions[revisions.size() - 1 - dropped])) ++dropped;
    m_droppedRevisions.reserve(dropped);
    m_impl.m_staleScratch.reserve(m_impl.m_staleScratch.size() + dropped);
}

void ArchiveCommit::Publish()
{
    m_info.firstFAT = m_fatPos;
    m_info.fileEnd = m_revision.m_fileEnd;
    m_info.totalBytes = m_revision.m_totalBytes;
    m_info.deadBytes = m_revision.m_deadBytes;
    m_info.saveTimeStamp = m_revision.m_timeStamp;
    m_info.saveCount = m_file.m_saveCount + 1;
    m_info.nextFreeUID = m.nextFreeUID;
    u8 bytes[c_infoSize];
    EncodeInfo(bytes, m_info);
    // One write, and nothing between the fixed part and the file's end: this is the moment of the save.
    WriteAt(c_infoPos, bytes, sizeof(bytes));
    FlushToDevice();
}

// A link or a reference path is found only with its flag. In a version 7 file that has one, it lies where a later
// version has its guard: such a file keeps its version.
void ArchiveCommit::RaiseVersion()
{
    if (m_file.m_fileVersion >= c_version) return;
    u16 const flags = m_file.m_flags & (c_flagLink | c_flagReference);
    if (m_file.m_fileVersion < c_guardVersion && flags != 0) return;
    u8 bytes[c_headerSize];
    EncodeHeader(bytes, {c_version, flags, m_file.m_archiveUID});
    WriteAt(c_headerPos, bytes, sizeof(bytes));
    FlushToDevice();
    m_file.m_fileVersion = c_version;
    m_file.m_flags = flags;
}

void ArchiveCommit::WriteThumbnails()
{
    m_file.m_thumbnailsPos = 0;
    m_file.m_thumbnails = nullptr;
    if (!m.thumbnails) return;
    // The save stands already; thumbnails are not worth failing it.
    bool written = false;
    try {
        written = TryWriteThumbnails();
    } catch (Exception const&) {
    } catch (std::bad_alloc const&) {
    }
    if (!written) return;
    m_file.m_thumbnailsPos = m_revision.m_fileEnd;
    m_file.m_thumbnails = m.thumbnails;
}

bool ArchiveCommit::TryWriteThumbnails()
{
    std::vector<ArchiveThumbnails::Rec> const& recs = m.thumbnails->GetRecs();
    u64 const entriesSize = recs.size() * c_thumbnailEntrySize;
    u64 size = c_thumbnailHeaderSize + entriesSize;
    for (ArchiveThumbnails::Rec const& rec : recs) size += rec.data->GetSize();
    if (size - c_thumbnailHeaderSize > std::numeric_limits<u32>::max()) return false;

    std::vector<u8> block(size, 0);
    u8* entry = block.data() + c_thumbnailHeaderSize;
    u64 dataPos = c_thumbnailHeaderSize + entriesSize;
    for (ArchiveThumbnails::Rec const& rec : recs) {
        u64 const dataSize = rec.data->GetSize();
        StoreLittleEndian(entry, dataPos);
        StoreLittleEndian(entry + 8, static_cast<u32>(dataSize));
        entry[12] = c_thumbnailType;
        if (dataSize != 0) std::memcpy(block.data() + dataPos, rec.data->GetData(), dataSize);
        entry += c_thumbnailEntrySize;
        dataPos += dataSize;
    }
    // The header goes out last, when what it vouches for is on the device.
    u64 const position = m_revision.m_fileEnd;
    WriteAt(position, block.data(), size);
    FlushToDevice();
    StoreLittleEndian(block.data(), c_blockEnd);
    StoreLittleEndian(block.data() + 4, c_tagThumbnails);
    StoreLittleEndian(block.data() + 8, static_cast<u32>(recs.size()));
    StoreLittleEndian(block.data() + 12, static_cast<u32>(size - c_thumbnailHeaderSize));
    WriteAt(position, block.data(), c_thumbnailHeaderSize);
    FlushToDevice();
    return true;
}

void ArchiveCommit::CopyFields()
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    m_file.m_firstFAT = m_info.firstFAT;
    m_file.m_fileEnd = m_info.fileEnd;
    m_file.m_totalBytes = m_info.totalBytes;
    m_file.m_deadBytes = m_info.deadBytes;
    m_file.m_saveTimeStamp = m_info.saveTimeStamp;
    m_file.m_saveCount = m_info.saveCount;
    m_file.m_nextFreeUID = m_info.nextFreeUID;
    m_file.m_rawInfo = m_info;
    m_file.m_infoDamaged = false;
}

void ArchiveCommit::AddRevision()
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    m_impl.m_paths.merge(m_nodes);
    m_impl.m_pathCounts.swap(m.pathCounts);
    for (auto& [parts, count] : m_impl.m_pathCounts)
        if (count.dirty != 0) count.dirty = m_revision.m_tag == Archive::RevisionTagIncremental ? 2 : 0;
    m_impl.m_nextFreeUID = std::max(m_impl.m_nextFreeUID, m.nextFreeUID);
    m_revision.m_order = m_impl.m_nextRevisionOrder++;
    for (Archive::FileRevision const& entry : m_revision.GetEntries())
        const_cast<Archive::FileInfo&>(*entry.info).m_history.push_back(&m_revision);
    m_impl.m_revisions.emplace_back(&m_revision);
    m_impl.m_revisionsByAddress.merge(m_revisionNode);
    for (size_t i = m_impl.m_revisions.size() - 1; i-- > 0 && WillDrop(*m_impl.m_revisions[i]);)
        m_droppedRevisions.push_back(m_impl.m_revisions[i]);
}

void ArchiveCommit::TellObjects()
{
    Archive& store = m_impl.m_self;
    auto const state = m.type == Archive::SessionTypeIncremental ? FileStoreStateObject::DirtyStateIncremental
                                                                 : FileStoreStateObject::DirtyStateClean;
    if (!IsExport()) {
        for (auto const& object : m.objectsToClean) Attempt([&] { store.ClearObjectDirtyState(*object, state); });
        for (auto const& [holder, path] : m.holderPaths)
            Attempt([&, &to = holder, &at = path] { store.SetDelayLoadOwner(to, &m_revision, at); });
        for (auto const& item : m.savedItems)
            Attempt([&] { store.ClearObjectDirtyState(const_cast<FileStoreItem&>(*item), state); });
        for (auto const& object : m.postSaves) Attempt([&] { object->PostSave(); });
        Attempt([&] { store.RemoveDirtyStates(m_deletedPaths); });
    }
    // The links move even where no object is told: a holder must not rest on a revision that is about to go.
    if (!m_droppedRevisions.empty()) {
        Attempt([this] { MoveHolders(); });
        Attempt([&] {
            std::set<NonCounted<FileStoreRevision const>> dropped;
            for (Counted<Archive::Revision> const& revision : m_droppedRevisions) dropped.insert(revision);
            store.RemoveDelayLoadLinks(dropped);
        });
    }
    if (!IsExport()) store.RelinkFileStoreAssociations();
    CriticalSectionSpinScope const lock(m.lock);
    m.writeFinished = true;
}

// A holder whose bytes were rolled down finds them in the new revision from now on. Only holders of older versions are
// left to give up this store, with back data taken from the old blocks while these still stand.
void ArchiveCommit::MoveHolders()
{
    std::unordered_map<String8, NonCounted<FileStoreRevision const>> moved;
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        for (Archive::FileInfo const* info : m_rolledDown) {
            auto const& history = info->m_history;
            // The newest is this revision; the one before it is where the rolled down bytes came from.
            if (history.size() >= 2) moved.emplace(info->GetPath(), history[history.size() - 2]);
        }
    }
    m_impl.m_self.MoveDelayLoadOwners(&m_revision, moved);
}

void ArchiveCommit::DropScratchRevisions()
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    for (Counted<Archive::Revision> const& revision : m_droppedRevisions) {
        for (Archive::FileRevision const& entry : revision->GetEntries()) {
            auto& info = const_cast<Archive::FileInfo&>(*entry.info);
            info.m_history.Remove(revision.Get());
            if (!info.m_history.empty()) continue;
            // Only the scratch file knew it, and it is deleted: the path is free.
            auto const it = m_impl.m_paths.find(info.GetPath());
            if (it != m_impl.m_paths.end() && it->second.Get() == &info) m_impl.m_paths.erase(it);
        }
        m_impl.m_revisionsByAddress.erase(revision.Get());
    }
    std::erase_if(m_impl.m_revisions, [](Counted<Archive::Revision> const& r) { return r->IsScratch(); });
    std::move(m_droppedRevisions.begin(), m_droppedRevisions.end(), std::back_inserter(m_impl.m_staleScratch));
    m_droppedRevisions.clear();
    // Other bytes may soon stand where their blocks lie: nothing is to be copied from there any more.
    std::erase_if(m_impl.m_offlineQueue, [&](auto const& queued) {
        auto const& [info, revision] = queued;
        if (!revision->IsScratch()) return false;
        if (Archive::FileRevision const* const entry = revision->Find(*info))
            m_impl.m_offlineTotal -= std::min(entry->fileCompressedSize, m_impl.m_offlineTotal);
        return true;
    });
}

void ArchiveCommit::QueueForOfflining()
{
    if (!m.restartOfflining) return;
    CriticalSectionScope const lock(m_impl.m_stateLock);
    for (Archive::FileRevision const& entry : m_revision.GetEntries()) {
        // What is queued for the file is an older version, and may lie in the scratch file that has just been cleared.
        m_impl.m_offlineQueue.erase(entry.info.Get());
        if (entry.IsDeletion() || entry.backData) continue;
        m_impl.m_offlineQueue[entry.info.Get()] = Counted<Archive::Revision>(&m_revision);
        m_impl.m_offlineTotal += entry.fileCompressedSize;
    }
}

void ArchiveImpl::FinaliseActiveSessionCS(ArchiveSession& session, bool updateTimestamps)
{
    assert(m_sessionLock.IsHeldByCurrentThread());
    ArchiveSession::State& state = *session.m;
    if (state.enumerationOnly || session.WasAborted() || !state.file) return;
    if (!state.file->GetStream()) return;
    try {
        ArchiveCommit(*this, state).Run(updateTimestamps);
    } catch (FileIOException const& e) {
        ThrowFileException(*state.file, ArchiveFileException::FromFileIOReason(static_cast<int>(e.GetReason())));
    }
}

} // namespace Kernel

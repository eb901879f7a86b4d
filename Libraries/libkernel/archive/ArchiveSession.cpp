#include "libkernel/archive/ArchiveSession.h"

#include "libkernel/archive/internal/ArchiveBackData.h"
#include "libkernel/archive/internal/ArchiveSessionState.h"
#include "libkernel/core/NestingGuard.h"
#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/streams/NullOutStream.h"

#include <cstring>
#include <limits>

namespace Kernel {

using Operation = ArchiveQueueEntry::Operation;

ArchiveSessionProgress::~ArchiveSessionProgress() = default;
void ArchiveSessionProgress::OnBegin() {}
ArchiveSession::FileDeleteSelector::~FileDeleteSelector() = default;

namespace {

/// Runs a save only to learn which paths it uses.
class PathEnumerator : public FileStoreOut
{
public:
    PathEnumerator(ArchiveSession& session, std::set<String8>& paths)
        : FileStoreOut(session, PurposeEnumeratePaths), m_session(session), m_paths(paths)
    {
    }

    void Enumerate(FileStoreItem const& item)
    {
        NestingGuard const level;
        if (!level.IsAllowed()) throw OutStream::WriteException();
        auto const nowhere = MakeCounted<NullOutStream>();
        item.Save(*nowhere, *this);
    }

    void CreateFile(Counted<DelayLoadHolder> holder, Counted<FileStoreCompressionHint> const&) override
    {
        String8 path;
        if (!holder || (!holder->GetPath(m_session.GetFileStore(), path) && !FindAssigned(holder, path))) return;
        if (!m_paths.insert(path).second || !holder->GetFileStoreItemType()->IsNestable()) return;
        DelayLoadHolder::TempLoadItem const temporary(holder);
        if (temporary.GetItem()) Enumerate(*temporary.GetItem());
    }
    void CreateFile(String8 const& path, Counted<FileStoreItem const> const& item,
                    Counted<FileStoreCompressionHint> const&) override
    {
        if (path.IsEmpty() || !item || !m_paths.insert(path).second) return;
        if (item->GetObjectFileStoreItemType()->IsNestable()) Enumerate(*item);
    }
    void DeleteFile(String8 const&) override {}
    void AddObjectToClean(Counted<FileStoreStateObject>) override {}
    void AddPostSaveObject(Counted<FileStorePostSaveInterface>) override {}
    bool GenerateIndexedPath(IndexedPathParts const& parts, NonCounted<FileStoreItem const> item,
                             NonCounted<DelayLoadHolder const> holder, String8& path) override
    {
        return m_session.GenerateIndexedPath(parts, item, holder, path);
    }
    void AssignDelayLoadHolderPath(Counted<DelayLoadHolder> holder, String8 const& path) override
    {
        m_assigned[holder] = path;
        m_session.AssignDelayLoadHolderPath(holder, path);
    }
    FileStore& GetFileStore() const override { return m_session.GetFileStore(); }

private:
    bool FindAssigned(Counted<DelayLoadHolder> const& holder, String8& path) const
    {
        auto const it = m_assigned.find(holder);
        if (it == m_assigned.end()) return false;
        path = it->second;
        return true;
    }

    ArchiveSession& m_session;
    std::set<String8>& m_paths;
    std::map<Counted<DelayLoadHolder>, String8> m_assigned;
};

/// Hexadecimal, least significant digit first: the names of neighbours differ early.
void AppendReversedHex(String8& out, u64 number)
{
    do {
        out.Append("0123456789abcdef"[number & 15]);
        number >>= 4;
    } while (number != 0);
}

} // namespace

ArchiveSession::ArchiveSession(std::unique_ptr<State> state, bool const* abort)
    : FileStoreOut(PurposeSave, abort), m(std::move(state))
{
}

ArchiveSession::~ArchiveSession() = default;

FileStore& ArchiveSession::GetFileStore() const
{
    return *m->archive;
}

void ArchiveSession::Fail()
{
    {
        CriticalSectionSpinScope const lock(m->lock);
        m->failed = true;
    }
    throw OutStream::WriteException();
}

bool ArchiveSession::BeginOffer()
{
    {
        CriticalSectionSpinScope const lock(m->lock);
        // Other threads go on offering files meanwhile: only the item itself may not.
        if (m->nonNestable && m->runner == ThreadId::GetCurrent()) {
            m->failed = true;
            throw NestedException();
        }
        if (m->writeFinished) return false;
        if (m->failed) throw OutStream::WriteException();
    }
    // The session stays aborted even if the caller's flag is taken back before it closes.
    if (IsAbortRequested()) {
        SetAborted();
        throw AbortException();
    }
    return true;
}

void ArchiveSession::CreateFile(Counted<DelayLoadHolder> holder)
{
    CreateFile(std::move(holder), nullptr);
}

void ArchiveSession::CreateFile(String8 const& path, Counted<FileStoreItem const> const& item)
{
    CreateFile(path, item, nullptr);
}

void ArchiveSession::CreateFile(String8 const& path, Counted<FileStoreItem const> const& item,
                                Counted<FileStoreCompressionHint> const& hint)
{
    if (!BeginOffer() || path.IsEmpty() || !item) return;
    bool const all = m->type == Archive::SessionTypeRewrite || m->type == Archive::SessionTypeExport;
    bool const wanted =
        all || m->enumerationOnly || item->RequiresSave(*m->archive, m->type == Archive::SessionTypeIncremental);
    {
        CriticalSectionSpinScope const lock(m->lock);
        if (m->enumerateUsed) m->enumeratedPaths.insert(path);
        if (!wanted) return;
        if (m->addedPaths.insert(path).second) {
            ArchiveQueueEntry entry;
            entry.path = path;
            entry.item = item;
            entry.hint = hint;
            m->queue.push_back(std::move(entry));
            ++m->total;
        }
    }
    m->ReportProgress();
    RunQueue();
}

void ArchiveSession::CreateFile(Counted<DelayLoadHolder> holder, Counted<FileStoreCompressionHint> const& hint)
{
    if (!BeginOffer() || !holder) return;
    String8 path;
    if (!holder->GetPath(*m->archive, path)) {
        CriticalSectionSpinScope const lock(m->lock);
        auto const it = m->assignedPaths.find(holder);
        if (it != m->assignedPaths.end()) path = it->second;
    }
    if (path.IsEmpty()) Fail();
    {
        CriticalSectionSpinScope const lock(m->lock);
        if (m->addedPaths.count(path)) return;
        if (m->enumerateUsed) m->enumeratedPaths.insert(path);
    }
    bool const nestable = holder->GetFileStoreItemType()->IsNestable();
    if (!m->enumerationOnly && !nestable && FastMigrateFile(*holder, holder, path)) {
        m->ReportProgress();
        RunQueue();
        return;
    }

    bool const all = m->type == Archive::SessionTypeRewrite || m->type == Archive::SessionTypeExport;
    bool const fullOnly = m->type == Archive::SessionTypeIncremental;
    auto const mustWrite = [&](FileStoreItem const& item) {
        return all || item.RequiresSave(*m->archive, fullOnly) || m->archive->FileWasDeleted(path);
    };
    JailCounted<FileStoreItem> item;
    if (nestable && (GetEnumerateUsedFiles() || m->enumerationOnly)) {
        bool const wasLoaded = holder->IsLoaded();
        holder->GetItemBase(item);
        if (!item) return;
        if (m->enumerationOnly || !mustWrite(*item)) {
            EnumeratePaths(*item);
            item.Reset();
            if (!wasLoaded) holder->ReleaseItem();
            return;
        }
    }
    if (m->enumerationOnly) return;
    if (!all && !holder->IsLoaded()) {
        // A nestable item that is not in memory is unchanged, and its bytes are where they were.
        if (nestable && holder->IsBackedBy(*m->archive) && !m->archive->FileWasDeleted(path)) return;
        {
            CriticalSectionSpinScope const lock(m->lock);
            m->failed = true;
        }
        throw ArchiveBackingException(m->archive.Get());
    }
    holder->GetItemBase(item);
    if (!item || !mustWrite(*item)) return;
    {
        CriticalSectionSpinScope const lock(m->lock);
        if (m->addedPaths.insert(path).second) {
            ArchiveQueueEntry entry;
            entry.path = path;
            entry.item = Counted<FileStoreItem const>(item.Get());
            entry.holder = holder;
            entry.hint = hint;
            m->queue.push_back(std::move(entry));
            ++m->total;
        }
    }
    m->ReportProgress();
    RunQueue();
}

// Moves stored bytes without going through the item, where the item has not changed. True if a copy was queued or
// nothing has to be written at all.
bool ArchiveSession::FastMigrateFile(DelayLoadHolder& holder, Counted<DelayLoadHolder> const& counted,
                                     String8 const& path)
{
    bool const all = m->type == Archive::SessionTypeRewrite || m->type == Archive::SessionTypeExport;
    bool const fullOnly = m->type == Archive::SessionTypeIncremental;
    Counted<FileStoreItem> const item(holder.GetItemBaseIfLoaded().Get());
    Archive& archive = *m->archive;

    NonCounted<FileStoreRevision const> backing;
    bool const backedHere = holder.IsBackedBy(archive, backing);
    if (item && !all && item->RequiresSave(archive, fullOnly)) return false;

    if (backedHere && !(all && item && item->IsDirty(archive))) {
        // Nothing to do where the newest version of the path is that very one and the file of this session, or the
        // master below a scratch file, has it.
        Counted<Archive::Revision const> const head = archive.GetHeadRevisionForFile(path);
        bool const scratchSession = m->file->m_isScratch;
        if (head && head.Get() == backing.Get() && (scratchSession || !head->IsScratch())) return true;
    }

    ArchiveQueueEntry entry;
    entry.operation = Operation::CopyStored;
    entry.path = path;
    entry.holder = counted;
    if (item) entry.item = Counted<FileStoreItem const>(item.Get());

    Counted<FileStoreBackData const> const backData = holder.GetBackData();
    if (backData && dynamic_cast<ArchiveBackData const*>(backData.Get())) {
        entry.sourceBackData = backData;
    } else {
        std::vector<Counted<Archive>> candidates = m->sources;
        candidates.insert(candidates.begin(), m->archive);
        for (Counted<Archive> const& candidate : candidates) {
            NonCounted<FileStoreRevision const> revision;
            if (!holder.IsBackedBy(*candidate, revision)) continue;
            if (all && item && item->IsDirty(*candidate)) continue;
            Counted<Archive::Revision const> const found = candidate->m->FindRevision(revision);
            if (!found) continue;
            entry.sourceArchive = candidate;
            entry.sourceRevision = found;
            break;
        }
        if (!entry.sourceArchive) return false;
    }
    CriticalSectionSpinScope const lock(m->lock);
    if (!m->addedPaths.insert(path).second) return true;
    m->queue.push_back(std::move(entry));
    ++m->total;
    return true;
}

void ArchiveSession::DeleteFile(String8 const& path)
{
    if (!BeginOffer() || path.IsEmpty() || m->enumerationOnly) return;
    {
        CriticalSectionSpinScope const lock(m->lock);
        ArchiveQueueEntry entry;
        entry.operation = Operation::Delete;
        entry.path = path;
        m->queue.push_back(std::move(entry));
        ++m->total;
        // What is offered under the path after this is a new file.
        m->addedPaths.erase(path);
    }
    m->ReportProgress();
    RunQueue();
}

void ArchiveSession::DeleteSelectedFiles(FileDeleteSelector& selector)
{
    std::vector<String8> paths;
    m->archive->GetFileList(paths);
    for (String8 const& path : paths)
        if (selector(path)) DeleteFile(path);
}

void ArchiveSession::AddObjectToClean(Counted<FileStoreStateObject> object)
{
    if (!object) return;
    CriticalSectionSpinScope const lock(m->lock);
    m->objectsToClean.push_back(std::move(object));
}

void ArchiveSession::AddPostSaveObject(Counted<FileStorePostSaveInterface> object)
{
    if (!object) return;
    CriticalSectionSpinScope const lock(m->lock);
    for (auto const& known : m->postSaves)
        if (known == object) return;
    m->postSaves.push_back(std::move(object));
}

bool ArchiveSession::GenerateIndexedPath(IndexedPathParts const& parts, NonCounted<FileStoreItem const> item,
                                         NonCounted<DelayLoadHolder const> holder, String8& path)
{
    Countable const* const keys[] = {item.Get(), holder.Get()};
    constexpr int maxPart = 0xFFFF;
    if (parts.prefix.GetLength() > maxPart || parts.suffix.GetLength() > maxPart) return false;

    CriticalSectionSpinScope const lock(m->lock);
    for (Countable const* key : keys) {
        auto const it = key ? m->generatedPaths.find(key) : m->generatedPaths.end();
        if (it == m->generatedPaths.end()) continue;
        path = it->second;
        return true;
    }
    if (!item && !holder) return false;
    ArchivePathCount& count = m->pathCounts[{parts.prefix, parts.suffix}];
    if (count.counter == std::numeric_limits<u64>::max()) return false;
    ++count.counter;
    count.dirty = 1;
    path = parts.prefix;
    AppendReversedHex(path, count.counter);
    path += parts.suffix;
    for (Countable const* key : keys) {
        if (!key) continue;
        m->generatedPaths[key] = path;
        m->generatedKeys.emplace_back(key);
    }
    return true;
}

void ArchiveSession::AssignDelayLoadHolderPath(Counted<DelayLoadHolder> holder, String8 const& path)
{
    if (!holder) return;
    CriticalSectionSpinScope const lock(m->lock);
    m->assignedPaths[std::move(holder)] = path;
}

void ArchiveSession::EnumerateUsedPaths(String8 const& path, Counted<FileStoreItem const> const& item)
{
    if (path.IsEmpty()) return;
    {
        CriticalSectionSpinScope const lock(m->lock);
        m->enumeratedPaths.insert(path);
    }
    if (item) EnumeratePaths(*item);
}

void ArchiveSession::EnumeratePaths(FileStoreItem const& item)
{
    std::set<String8> paths;
    PathEnumerator enumerator(*this, paths);
    enumerator.Enumerate(item);
    CriticalSectionSpinScope const lock(m->lock);
    m->enumeratedPaths.merge(paths);
}

void ArchiveSession::SetEnumerateUsedFiles(bool on)
{
    CriticalSectionSpinScope const lock(m->lock);
    m->enumerateUsed = on;
}

bool ArchiveSession::GetEnumerateUsedFiles() const
{
    CriticalSectionSpinScope const lock(m->lock);
    return m->enumerateUsed;
}

std::set<String8> const& ArchiveSession::GetAddedPaths() const
{
    return m->addedPaths;
}

std::set<String8> const& ArchiveSession::GetEnumeratedPaths() const
{
    return m->enumeratedPaths;
}

bool ArchiveSession::HasChanges() const
{
    return m->revision && !m->revision->GetEntries().empty();
}

void ArchiveSession::SetThumbnails(Counted<ArchiveThumbnails const> const& thumbnails)
{
    m->thumbnails = thumbnails;
}

bool ArchiveSession::SetUserData(void const* data, u64 size)
{
    if (!m->revision || size > std::numeric_limits<u32>::max()) return false;
    if (size == 0) {
        m->revision->m_userData = nullptr;
        return true;
    }
    auto block = MakeCounted<RawDataMalloc>(size);
    if (!block->GetData()) return false;
    std::memcpy(block->GetData(), data, size);
    m->revision->m_userData = std::move(block);
    return true;
}

void ArchiveSession::SetProgressCallback(Counted<ArchiveSessionProgress> const& progress)
{
    m->progress = progress;
    if (progress) progress->OnBegin();
}

void ArchiveSession::AddSourceArchive(Counted<Archive> const& archive)
{
    if (!archive || archive == m->archive) return;
    for (Counted<Archive> const& known : m->sources)
        if (known == archive) return;
    if (archive->m->GuaranteeFileHandle()) m->sources.push_back(archive);
}

void ArchiveSessionHandle::Release()
{
    if (!m_session) return;
    // Another reference, since letting go of the session may let go of the archive.
    Counted<Archive> const archive = m_archive;
    CriticalSectionScope const lock(archive->m->m_sessionLock);
    archive->m->DropSession(m_session);
    m_session = nullptr;
    m_archive = nullptr;
}

} // namespace Kernel

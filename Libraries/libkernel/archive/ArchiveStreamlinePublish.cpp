#include "libkernel/archive/internal/ArchiveStreamliner.h"

#include <algorithm>
#include <iterator>

// The moment at which an archive goes on with a compact file, in memory: what the old tables named is let go first by
// those who would lose it, and whoever stays finds the same bytes at the one new revision.

namespace Kernel {

namespace {

/// True for a holder that rests on a version of its file which the compact file does not have.
class StreamlinePreFileDeleteFunctor : public FileStore::ProcessPreFileDeleteFunctor
{
public:
    StreamlinePreFileDeleteFunctor(ArchiveImpl& impl, Archive::StreamlineData const& data) : m_impl(impl), m_data(data)
    {
    }

    bool operator()(NonCounted<FileStoreRevision const> revision, String8 const& path) override
    {
        if (m_data.paths.find(path) == m_data.paths.end()) return true;
        if (!revision) return false; // Knows the path only: there is nothing to lose.
        CriticalSectionScope const lock(m_impl.m_stateLock);
        Archive::Revision* const working = m_impl.GetWorkingRevisionCS();
        Archive::Revision* const held = m_impl.AsRevisionCS(revision);
        Archive::FileInfo* const info = m_impl.FindFileInfoCS(path);
        if (!working || !held || !info) return true;
        Archive::Revision* survivor = nullptr;
        Archive::Revision* own = nullptr;
        Archive::FileRevision const* const entry = m_impl.FindEntryCS(*info, *working, &survivor);
        if (!entry || entry->IsDeletion()) return true;
        return !m_impl.FindEntryCS(*info, *held, &own) || own != survivor;
    }

private:
    ArchiveImpl& m_impl;
    Archive::StreamlineData const& m_data;
};

} // namespace

bool ArchiveStreamliner::ReleaseHolders(Archive::StreamlineData const& data)
{
    StreamlinePreFileDeleteFunctor functor(m_impl, data);
    try {
        m_impl.m_self.ProcessPreFileDelete(functor);
        return true;
    } catch (Exception const&) {
        // Its bytes are nowhere but in the file that was to go.
        return false;
    }
}

void ArchiveStreamliner::Publish(Counted<File> const& file, Archive::StreamlineData& data, bool asScratch)
{
    Counted<Archive::Revision> const revision = data.revisions.back();
    std::unordered_map<FileStoreRevision const*, Archive::Revision*> byAddress{{revision.Get(), revision.Get()}};
    Counted<File> oldMaster;
    Counted<File> oldScratch;
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        oldMaster = m_impl.m_master;
        oldScratch = m_impl.m_scratch;
        m_impl.m_staleScratch.reserve(m_impl.m_staleScratch.size() + m_impl.m_revisions.size());
        bool const samePlace = oldMaster && oldMaster->m_path == file->m_path;
        if (samePlace) {
            file->m_referenceInfo = oldMaster->m_referenceInfo;
            // The new file stands for the old one in everything, and the old object must not delete it.
            file->m_throwAway = oldMaster->m_throwAway;
            file->m_finalPath = oldMaster->m_finalPath;
            file->m_backupPath = oldMaster->m_backupPath;
            file->m_keepBackup = oldMaster->m_keepBackup;
            file->m_targetStream = std::move(oldMaster->m_targetStream);
            oldMaster->m_throwAway = false;
            oldMaster->m_finalPath = String8();
        }
    }
    Counted<File> droppedScratch;
    if (asScratch || file->m_throwAway) { // A throw-away archive has one file.
        CriticalSectionScope const lock(m_impl.m_stateLock);
        m_impl.m_scratch = nullptr;
        std::swap(droppedScratch, oldScratch);
    } else if (oldScratch && !m_impl.ResetScratch(*file, m_impl.m_nextFreeUID)) {
        std::swap(droppedScratch, oldScratch);
    }
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        for (Counted<Archive::Revision> const& old : m_impl.m_revisions) {
            for (Archive::FileRevision const& entry : old->GetEntries())
                const_cast<Archive::FileInfo&>(*entry.info).m_history.clear();
            // As long as a reader holds one, the scratch file's new life begins behind its bytes.
            if (old->IsScratch() && oldScratch) m_impl.m_staleScratch.push_back(old);
        }
        for (Archive::FileRevision const& entry : revision->GetEntries())
            const_cast<Archive::FileInfo&>(*entry.info).m_history.push_back(revision.Get());
        revision->m_order = m_impl.m_nextRevisionOrder++;
        m_impl.m_paths.swap(data.paths);
        m_impl.m_revisions.swap(data.revisions);
        m_impl.m_revisionsByAddress.swap(byAddress);
        m_impl.m_rewindCount = 0;
        // All that have a count are in the new table.
        for (auto& [parts, count] : m_impl.m_pathCounts) count.dirty = 0;
        m_impl.m_offlineQueue.clear();
        m_impl.m_offlineTotal = 0;
        m_impl.m_offlineDone = 0;
        m_impl.m_master = asScratch ? nullptr : file;
        if (asScratch) m_impl.m_scratch = file;
    }
    if (m_master) m_master = file;
    // Whoever holds an old revision keeps the object, but the file on disk is free.
    for (Counted<File> const& old : {oldMaster, droppedScratch}) {
        if (!old) continue;
        CriticalSectionScope const lock(old->m_lock);
        old->m_stream = nullptr;
    }
}

void ArchiveStreamliner::ClearTables()
{
    m_master->m_bad = true;
    m_master->m_lost = true;
    CriticalSectionScope const lock(m_impl.m_stateLock);
    for (Counted<Archive::Revision> const& old : m_impl.m_revisions)
        for (Archive::FileRevision const& entry : old->GetEntries())
            const_cast<Archive::FileInfo&>(*entry.info).m_history.clear();
    m_impl.m_paths.clear();
    m_impl.m_revisions.clear();
    m_impl.m_revisionsByAddress.clear();
    m_impl.m_rewindCount = 0;
}

} // namespace Kernel

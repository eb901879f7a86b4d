#include "libkernel/filestore/FileStore.h"

#include "libkernel/core/Format.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/filestore/FileStoreLoadContext.h"

#include <exception>
#include <string_view>

// The maps name holders without keeping them alive. A holder takes itself out in its destructor, which needs the store
// lock; so under that lock every holder in the maps is memory that may be read, but one at count 0 must not be handed
// out. Whatever calls a virtual operation, and whatever may destroy a holder, happens outside the store lock.

namespace Kernel {

FileStore::ProcessPreFileDeleteFunctor::~ProcessPreFileDeleteFunctor() = default;

FileStore::PathKey::PathKey(String8 const& p) : hash(std::hash<std::string_view>()(p.GetView())), path(p) {}

FileStore::FileStore() : m_link(new FileStoreLink(this)) {}

FileStore::~FileStore()
{
    m_link->StoreDestroyed();
}

bool FileStore::IsBroken() const
{
    return false;
}

Counted<DelayLoadHolder> FileStore::CreateDelayLoadHolderDirect(String8 const& path, FileStoreItemType const* type,
                                                                FileStoreLoadContext* context)
{
    if (!type) return nullptr;
    PathKey const key(path);
    Counted<DelayLoadHolder> holder;
    for (;;) {
        u64 changes;
        {
            CriticalSectionSpinScope const scope(m_storeLock);
            if (Counted<DelayLoadHolder> found = FindCS(key)) return found;
            changes = m_ownerChanges;
        }
        NonCounted<FileStoreRevision const> const revision = GetHeadRevisionForFileI(path);
        if (!revision && !type->IsRecoverable()) break;
        holder = Counted<DelayLoadHolder>(new DelayLoadHolder(type));
        holder->SetOwner(*m_link, revision, path, static_cast<bool>(revision));

        CriticalSectionSpinScope scope(m_storeLock);
        if (Counted<DelayLoadHolder> found = FindCS(key)) return found;
        // A commit in between may have moved or dropped the revision without seeing the new holder.
        if (changes != m_ownerChanges) {
            scope.Release();
            holder.Reset();
            continue;
        }
        EnterCS(*holder, key);
        if (revision) return holder;
        break;
    }
    if (context) context->ReportProblem(Format("Missing file: %1", path));
    return holder;
}

void FileStore::AddBackData(String8 const& path, Counted<FileStoreBackData const> const& backData)
{
    if (!backData) return;
    PathKey const key(path);
    Counted<DelayLoadHolder> holder;
    {
        CriticalSectionSpinScope const scope(m_storeLock);
        holder = FindCS(key);
    }
    if (holder) holder->SetBackData(backData);
}

void FileStore::AddBackData(String8 const& path, NonCounted<FileStoreRevision const> revision,
                            Counted<FileStoreBackData const> const& backData)
{
    if (!backData) return;
    PathKey const key(path);
    Counted<DelayLoadHolder> holder;
    {
        CriticalSectionSpinScope const scope(m_storeLock);
        holder = FindCS(key);
    }
    if (holder) holder->SetBackData(*this, revision, backData);
}

void FileStore::SetDelayLoadOwner(Counted<DelayLoadHolder> const& holder, NonCounted<FileStoreRevision const> revision,
                                  String8 const& path)
{
    if (!holder) return;
    PathKey const key(path);
    CriticalSectionSpinScope const scope(m_storeLock);
    ++m_ownerChanges;
    // The owner entry first: a holder that the maps know must find its way back here.
    holder->SetOwner(*m_link, revision, path, true);
    EnterCS(*holder, key);
}

void FileStore::UpdateDelayLoadOwners(NonCounted<FileStoreRevision const> revision)
{
    CriticalSectionSpinScope const scope(m_storeLock);
    ++m_ownerChanges;
    for (auto const& [holder, key] : m_pathOfHolder) holder->UpdateOwner(*m_link, revision);
}

void FileStore::MoveDelayLoadOwners(NonCounted<FileStoreRevision const> revision,
                                    std::unordered_map<String8, NonCounted<FileStoreRevision const>> const& moved)
{
    if (moved.empty()) return;
    CriticalSectionSpinScope const scope(m_storeLock);
    ++m_ownerChanges;
    for (auto const& [path, from] : moved) {
        auto const found = m_holderOfPath.find(PathKey(path));
        if (found != m_holderOfPath.end()) found->second->MoveOwner(*m_link, from, revision);
    }
}

void FileStore::DelayLoadHolderDestroyed(DelayLoadHolder& holder)
{
    CriticalSectionSpinScope const scope(m_storeLock);
    RemoveCS(holder);
}

void FileStore::RemoveDirtyStates(std::set<String8> const& paths)
{
    if (paths.empty()) return;
    CriticalSectionSpinScope const scope(m_storeLock);
    for (String8 const& path : paths) {
        auto const found = m_holderOfPath.find(PathKey(path));
        if (found != m_holderOfPath.end()) found->second->RemoveDirtyState(*m_link);
    }
}

void FileStore::RemoveDelayLoadLinks(std::set<NonCounted<FileStoreRevision const>> const& revisions)
{
    if (revisions.empty()) return;
    std::vector<Counted<DelayLoadHolder>> holders;
    {
        CriticalSectionSpinScope const scope(m_storeLock);
        ++m_ownerChanges;
        for (auto const& [holder, key] : m_pathOfHolder)
            if (holder->IsOwnedAt(*m_link, revisions))
                if (Counted<DelayLoadHolder> alive = CountedIfAlive(holder)) holders.push_back(std::move(alive));
    }
    // The revisions are gone whatever happens, so that no holder may go on naming one.
    std::exception_ptr failure;
    for (Counted<DelayLoadHolder> const& holder : holders) {
        try {
            if (!holder->BreakDeadLink(*this, revisions)) continue;
        } catch (...) {
            if (!failure) failure = std::current_exception();
        }
        DelayLoadHolderDestroyed(*holder);
    }
    if (failure) std::rethrow_exception(failure);
}

void FileStore::ProcessPreFileDelete(ProcessPreFileDeleteFunctor& functor)
{
    std::vector<std::pair<Counted<DelayLoadHolder>, String8>> holders;
    {
        CriticalSectionSpinScope const scope(m_storeLock);
        ++m_ownerChanges;
        holders.reserve(m_pathOfHolder.size());
        for (auto const& [holder, key] : m_pathOfHolder)
            if (Counted<DelayLoadHolder> alive = CountedIfAlive(holder))
                holders.emplace_back(std::move(alive), key.path);
    }
    for (auto const& [holder, path] : holders) {
        DelayLoadHolder::Owner const owner = holder->FindOrCreateOwner(*m_link, path);
        if (!functor(owner.revision, owner.path)) continue;
        holder->FileRemoveFromFileStore(*this);
        DelayLoadHolderDestroyed(*holder);
    }
}

void FileStore::BreakFileStoreAssociations()
{
    CriticalSectionSpinScope const scope(m_storeLock);
    m_link->m_store.store(nullptr, std::memory_order_release);
}

void FileStore::RelinkFileStoreAssociations()
{
    CriticalSectionSpinScope const scope(m_storeLock);
    m_link->m_store.store(this, std::memory_order_release);
}

void FileStore::PreDestruction()
{
    for (;;) {
        Counted<DelayLoadHolder> holder;
        {
            CriticalSectionSpinScope const scope(m_storeLock);
            ++m_ownerChanges;
            auto const first = m_pathOfHolder.begin();
            if (first == m_pathOfHolder.end()) return;
            holder = CountedIfAlive(first->first);
            RemoveCS(*first->first);
        }
        if (holder) holder->ClearOwner(*this);
    }
}

void FileStore::ClearObjectDirtyState(FileStoreStateObject& object, FileStoreStateObject::DirtyState state)
{
    object.ClearDirtyState(m_link, state);
}

void FileStore::SetObjectDirtyStatePostLoad(FileStoreStateObject& object, FileStoreStateObject::DirtyState state)
{
    object.SetDirtyStatePostLoad(m_link, state, true);
}

Counted<DelayLoadHolder> FileStore::FindCS(PathKey const& key) const
{
    auto const found = m_holderOfPath.find(key);
    return found == m_holderOfPath.end() ? nullptr : CountedIfAlive(found->second);
}

void FileStore::EnterCS(DelayLoadHolder& holder, PathKey const& key)
{
    auto const known = m_pathOfHolder.find(&holder);
    if (known != m_pathOfHolder.end() && !(known->second == key)) RemoveCS(holder);
    m_pathOfHolder.try_emplace(&holder, key);
    m_holderOfPath[key] = &holder;
}

void FileStore::RemoveCS(DelayLoadHolder& holder)
{
    auto const known = m_pathOfHolder.find(&holder);
    if (known == m_pathOfHolder.end()) return;
    auto const path = m_holderOfPath.find(known->second);
    if (path != m_holderOfPath.end() && path->second == &holder) m_holderOfPath.erase(path);
    m_pathOfHolder.erase(known);
}

} // namespace Kernel

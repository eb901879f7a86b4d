#include "libkernel/filestore/FileStoreStateObject.h"

#include "libkernel/filestore/FileStore.h"

#include <algorithm>

namespace Kernel {

FileStoreStateObject::~FileStoreStateObject() = default;

bool FileStoreStateObject::CanShare() const
{
    return false;
}

void FileStoreStateObject::PostMarkAsDirty() {}

void FileStoreStateObject::AboutToMakeDirty() {}

void FileStoreStateObject::MarkAsDirty()
{
    AboutToMakeDirty();
    {
        CriticalSectionSpinScope const scope(m_stateLock);
        m_states.EraseIf([](DirtyMap::Entry const& entry) { return !entry.link->IsAlive(); });
        for (DirtyMap::Entry& entry : m_states) entry.value = DirtyStateFull;
    }
    // Outside the lock: an item goes on to its holder's item lock, under which others take the state lock.
    PostMarkAsDirty();
}

void FileStoreStateObject::MarkAsClean(FileStore const& store)
{
    SetDirtyStatePostLoad(store.GetFileStoreLink(), DirtyStateClean, true);
}

bool FileStoreStateObject::IsDirty(FileStore const& store) const
{
    CriticalSectionSpinScope const scope(m_stateLock);
    DirtyState const* const state = m_states.Find(store.GetFileStoreLink().Get());
    return !state || *state != DirtyStateClean;
}

bool FileStoreStateObject::RequiresSave(FileStore const& store, bool fullOnly) const
{
    CriticalSectionSpinScope const scope(m_stateLock);
    DirtyState const* const state = m_states.Find(store.GetFileStoreLink().Get());
    if (!state || !store.GetFileStoreLink()->IsAlive()) return true;
    return fullOnly ? *state == DirtyStateFull : *state != DirtyStateClean;
}

bool FileStoreStateObject::GetDirtyStateForFileStore(FileStore const& store, DirtyState& state) const
{
    CriticalSectionSpinScope const scope(m_stateLock);
    DirtyState const* const found = m_states.Find(store.GetFileStoreLink().Get());
    if (found) state = *found;
    return found != nullptr;
}

bool FileStoreStateObject::IsFullyClean() const
{
    CriticalSectionSpinScope const scope(m_stateLock);
    return std::all_of(m_states.begin(), m_states.end(), [](DirtyMap::Entry const& entry) {
        return entry.value == DirtyStateClean || !entry.link->IsAlive();
    });
}

bool FileStoreStateObject::IsAnyFullDirty() const
{
    return IsAnyFullDirtyExcluding(nullptr);
}

bool FileStoreStateObject::IsAnyFullDirtyExcluding(NonCounted<FileStoreLink> link) const
{
    CriticalSectionSpinScope const scope(m_stateLock);
    return std::any_of(m_states.begin(), m_states.end(), [link](DirtyMap::Entry const& entry) {
        return entry.value == DirtyStateFull && entry.link.Get() != link.Get() && entry.link->IsAlive();
    });
}

bool FileStoreStateObject::IsShared() const
{
    CriticalSectionSpinScope const scope(m_stateLock);
    auto const isAlive = [](DirtyMap::Entry const& entry) { return entry.link->IsAlive(); };
    return std::count_if(m_states.begin(), m_states.end(), isAlive) > 1;
}

bool FileStoreStateObject::IsLinkedToFileStore(FileStore const& store) const
{
    return IsLinkedToFileStore(NonCounted<FileStoreLink>(store.GetFileStoreLink()));
}

bool FileStoreStateObject::IsLinkedToFileStore(NonCounted<FileStoreLink> link) const
{
    if (!link) return false;
    CriticalSectionSpinScope const scope(m_stateLock);
    return m_states.Find(link.Get()) != nullptr;
}

void FileStoreStateObject::BreakLinkToFileStore(FileStore const& store)
{
    RemoveDirtyState(store.GetFileStoreLink());
}

FileStoreStateObject::StateSnapshot FileStoreStateObject::GetStateSnapshot() const
{
    StateSnapshot snapshot;
    CriticalSectionSpinScope const scope(m_stateLock);
    snapshot.m_states = m_states;
    return snapshot;
}

bool FileStoreStateObject::EqualsSnapshot(StateSnapshot const& snapshot) const
{
    CriticalSectionSpinScope const scope(m_stateLock);
    return std::equal(
        m_states.begin(), m_states.end(), snapshot.m_states.begin(), snapshot.m_states.end(),
        [](DirtyMap::Entry const& a, DirtyMap::Entry const& b) { return a.link == b.link && a.value == b.value; });
}

void FileStoreStateObject::ClearDirtyState(NonCounted<FileStoreLink> link, DirtyState state)
{
    CriticalSectionSpinScope const scope(m_stateLock);
    DirtyState& entry = m_states.FindOrCreate(link.Get(), DirtyStateFull);
    if (entry != DirtyStateClean) entry = state;
}

void FileStoreStateObject::SetDirtyStatePostLoad(NonCounted<FileStoreLink> link, DirtyState state, bool overwrite)
{
    CriticalSectionSpinScope const scope(m_stateLock);
    DirtyState& entry = m_states.FindOrCreate(link.Get(), state);
    if (overwrite) entry = state;
}

void FileStoreStateObject::RemoveDirtyState(NonCounted<FileStoreLink> link)
{
    CriticalSectionSpinScope const scope(m_stateLock);
    m_states.Erase(link.Get());
}

} // namespace Kernel

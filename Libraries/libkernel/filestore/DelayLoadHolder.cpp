#include "libkernel/filestore/DelayLoadHolder.h"

#include "libkernel/core/Format.h"
#include "libkernel/filestore/FileStore.h"
#include "libkernel/filestore/FileStoreItemType.h"

#include <utility>

// The holder as its users see it: making one, asking it, letting go of its item, and the stores' entries in it. Loading
// and backing are in DelayLoadHolderLoad.cpp.
//
// Nothing virtual is called and nothing is released under the owners lock or the item lock, since a release may run any
// destructor: what is dropped moves to a local variable first.

namespace Kernel {

Counted<DelayLoadHolder> DelayLoadHolder::Create(FileStoreItemType const* type, Counted<FileStoreItem> const& item)
{
    if (!type || !item) return nullptr;
    Counted<DelayLoadHolder> const fresh(new DelayLoadHolder(type));
    Counted<DelayLoadHolder> known;
    {
        CriticalSectionSpinScope const scope(item->m_holderLock);
        known = CountedIfAlive(item->m_holder);
        if (!known) {
            fresh->m_loaded = true;
            fresh->m_item = JailCounted<FileStoreItem>(item);
            item->m_holder = fresh.Get();
        }
    }
    return known ? known : fresh;
}

Counted<DelayLoadHolder> DelayLoadHolder::Create(FileStoreItemType const* type, Counted<FileStoreItem> const& item,
                                                 NonCounted<DelayLoadHolder const> otherHolder, FileStore const& store)
{
    Counted<DelayLoadHolder> const holder = Create(type, item);
    String8 path;
    if (holder && otherHolder && otherHolder->GetPath(store, path))
        holder->FindOrCreateOwner(*store.GetFileStoreLink(), path);
    return holder;
}

DelayLoadHolder::~DelayLoadHolder()
{
    // Out of the stores' maps first: from then on no other thread can reach this object.
    for (;;) {
        Counted<FileStoreLink> link;
        {
            CriticalSectionSpinScope const scope(m_ownersLock);
            if (m_owners.IsEmpty()) break;
            link = m_owners.begin()->link;
            m_owners.Erase(link.Get());
        }
        link->TellHolderDestroyed(*this);
    }
    if (m_item) DetachCSItem(*m_item);
}

JailCounted<FileStoreItem> DelayLoadHolder::GetItemBaseIfLoaded() const
{
    CriticalSectionSpinScope const scope(m_itemLock);
    return m_item;
}

bool DelayLoadHolder::IsLoaded() const
{
    CriticalSectionSpinScope const scope(m_itemLock);
    return m_loaded;
}

bool DelayLoadHolder::ReleaseItem()
{
    return ReleaseItemI(nullptr);
}

bool DelayLoadHolder::ReleaseTempItem(FileStoreStateObject::StateSnapshot const& snapshot)
{
    return ReleaseItemI(&snapshot);
}

bool DelayLoadHolder::ReleaseItemI(FileStoreStateObject::StateSnapshot const* snapshot)
{
    JailCounted<FileStoreItem> dropped;
    CriticalSectionSpinScope const owners(m_ownersLock);
    CriticalSectionSpinScope const scope(m_itemLock);
    if (m_item) {
        bool const isOnlyCopy = !m_backData && m_owners.IsEmpty();
        if (isOnlyCopy || !(snapshot ? m_item->EqualsSnapshot(*snapshot) : m_item->IsFullyClean())) return false;
        DetachCSItem(*m_item);
        std::swap(dropped, m_item);
    }
    m_loaded = false;
    return true;
}

void DelayLoadHolder::DetachCSItem(FileStoreItem& item) const
{
    CriticalSectionSpinScope const scope(item.m_holderLock);
    if (item.m_holder == this) item.m_holder = nullptr;
}

Counted<FileStoreBackData const> DelayLoadHolder::GetBackData() const
{
    CriticalSectionSpinScope const scope(m_itemLock);
    return m_backData;
}

void DelayLoadHolder::SetBackData(Counted<FileStoreBackData const> const& data)
{
    CriticalSectionSpinScope const scope(m_itemLock);
    SetBackDataCSItem(data);
}

void DelayLoadHolder::SetBackData(FileStore const& store, NonCounted<FileStoreRevision const> revision,
                                  Counted<FileStoreBackData const> const& data)
{
    // A save moves the owner before it cleans the item: while the owner stands here, an item that was saved elsewhere
    // still counts as changed and is left alone.
    CriticalSectionSpinScope const owners(m_ownersLock);
    CriticalSectionSpinScope const scope(m_itemLock);
    Owner const* const owner = m_owners.Find(store.GetFileStoreLink().Get());
    if (owner && owner->valid && owner->revision.Get() == revision.Get()) SetBackDataCSItem(data);
}

void DelayLoadHolder::SetBackDataCSItem(Counted<FileStoreBackData const> const& data)
{
    if (m_backData || m_type->IsNestable()) return;
    // Bytes that were copied from a store before the item changed would bring the old item back after its release.
    if (m_item && !m_item->IsFullyClean()) return;
    m_backData = data;
}

void DelayLoadHolder::DropBackData(FileStoreItem const& item)
{
    Counted<FileStoreBackData const> dropped;
    CriticalSectionSpinScope const scope(m_itemLock);
    // The item may have been released, and read in anew as another object, before its change arrived here.
    if (m_item.Get() == &item) dropped = std::exchange(m_backData, nullptr);
}

bool DelayLoadHolder::GetPath(FileStore const& store, String8& path) const
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    Owner const* const owner = m_owners.Find(store.GetFileStoreLink().Get());
    if (owner) path = owner->path;
    return owner != nullptr;
}

bool DelayLoadHolder::IsBackedBy(FileStore const& store) const
{
    NonCounted<FileStoreRevision const> revision;
    return IsBackedBy(store, revision);
}

bool DelayLoadHolder::IsBackedBy(FileStore const& store, NonCounted<FileStoreRevision const>& revision) const
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    Owner const* const owner = m_owners.Find(store.GetFileStoreLink().Get());
    if (!owner || !owner->valid) return false;
    revision = owner->revision;
    return true;
}

bool DelayLoadHolder::HasLivingOwner() const
{
    OwnerMap owners;
    {
        CriticalSectionSpinScope const scope(m_ownersLock);
        owners = m_owners;
    }
    for (auto const& [link, owner] : owners) {
        if (!owner.valid) continue;
        Counted<FileStore> const store = link->GetFileStore();
        if (store && !store->IsBroken()) return true;
    }
    return false;
}

bool DelayLoadHolder::IsDead() const
{
    CriticalSectionSpinScope const owners(m_ownersLock);
    CriticalSectionSpinScope const scope(m_itemLock);
    return !m_item && !m_backData && !HasValidOwnerCSOwners();
}

bool DelayLoadHolder::ExistsOnlyInMemory() const
{
    CriticalSectionSpinScope const owners(m_ownersLock);
    CriticalSectionSpinScope const scope(m_itemLock);
    return !m_backData && !HasValidOwnerCSOwners();
}

bool DelayLoadHolder::HasValidOwnerCSOwners() const
{
    for (auto const& [link, owner] : m_owners)
        if (owner.valid) return true;
    return false;
}

bool DelayLoadHolder::ObjectIsLinkedToFileStore(FileStore const& store) const
{
    JailCounted<FileStoreItem> const item = GetItemBaseIfLoaded();
    return item && item->IsLinkedToFileStore(store);
}

bool DelayLoadHolder::GetDirtyStateForFileStore(FileStore const& store, FileStoreStateObject::DirtyState& state) const
{
    JailCounted<FileStoreItem> const item = GetItemBaseIfLoaded();
    return item && item->GetDirtyStateForFileStore(store, state);
}

void DelayLoadHolder::DumpPaths(String8& text) const
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    bool isFirst = true;
    for (auto const& [link, owner] : m_owners) {
        if (!isFirst) text += ", ";
        isFirst = false;
        AppendFormat(text, owner.valid ? "%1 [%2]" : "%1 [%2] (not in filestore)", owner.path,
                     ToStringBase(reinterpret_cast<u64>(link.Get()), 16, false));
    }
}

void DelayLoadHolder::SetOwner(FileStoreLink& link, NonCounted<FileStoreRevision const> revision, String8 const& path,
                               bool valid)
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    m_owners.FindOrCreate(&link, Owner()) = Owner{path, revision, valid};
}

void DelayLoadHolder::UpdateOwner(FileStoreLink& link, NonCounted<FileStoreRevision const> revision)
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    if (Owner* const owner = m_owners.Find(&link)) owner->revision = revision;
}

void DelayLoadHolder::MoveOwner(FileStoreLink& link, NonCounted<FileStoreRevision const> from,
                                NonCounted<FileStoreRevision const> to)
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    Owner* const owner = m_owners.Find(&link);
    if (owner && owner->valid && owner->revision == from) owner->revision = to;
}

DelayLoadHolder::Owner DelayLoadHolder::FindOrCreateOwner(FileStoreLink& link, String8 const& path)
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    return m_owners.FindOrCreate(&link, Owner{path, nullptr, false});
}

bool DelayLoadHolder::IsOwnedAt(FileStoreLink const& link,
                                std::set<NonCounted<FileStoreRevision const>> const& revisions) const
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    Owner const* const owner = m_owners.Find(&link);
    return owner && revisions.count(owner->revision) != 0;
}

void DelayLoadHolder::RemoveDirtyState(FileStoreLink& link)
{
    CriticalSectionSpinScope const scope(m_itemLock);
    RemoveDirtyStateCSItem(link);
}

void DelayLoadHolder::RemoveDirtyStateCSItem(FileStoreLink& link)
{
    if (m_item) m_item->RemoveDirtyState(NonCounted<FileStoreLink>(&link));
    if (m_loading) m_forgotten.emplace_back(&link);
}

} // namespace Kernel

#include "libkernel/core/NestingGuard.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStore.h"
#include "libkernel/filestore/FileStoreItemType.h"

#include <algorithm>
#include <utility>

// How an item comes into memory, and how its bytes are brought to safety when a store goes.
//
// A load can be long, takes locks of the store, and may load further items. So it runs under the load lock alone, and
// touches the holder's members in two short steps: before, to say that it runs, and after, to hand over the item
// together with what the stores have said meanwhile. A store that commits or dies never waits for it.
//
// Loads nest, and a document can name its items in a circle. A thread that comes back to a holder it is loading, or
// that would wait for a thread which, through whatever chain, waits for it, is refused instead.

namespace Kernel {

namespace {

/// The address stands for the calling thread.
void const* GetThreadMark()
{
    thread_local char const mark = 0;
    return &mark;
}

} // namespace

class DelayLoadHolder::LoadScope
{
public:
    explicit LoadScope(DelayLoadHolder const& holder) : m_holder(holder), m_thread(GetThreadMark())
    {
        if (holder.m_loader == m_thread) return;
        if (!holder.m_loadLock.TryAcquireLock()) {
            if (!BeginWaiting()) return;
            holder.m_loadLock.AcquireLock();
            EndWaiting();
        }
        m_holder.m_loader = m_thread;
        m_hasLock = true;
    }
    ~LoadScope()
    {
        if (!m_hasLock) return;
        m_holder.m_loader = nullptr;
        m_holder.m_loadLock.ReleaseLock();
    }
    LoadScope(LoadScope const&) = delete;
    LoadScope& operator=(LoadScope const&) = delete;

    /// False if waiting for the lock would never have ended.
    bool HasLock() const { return m_hasLock; }

private:
    /// False if the holder's loader waits, directly or by a chain of waiting threads, for this thread. Of the threads
    /// in a circle the last one to come here sees it: each has entered itself as loader before it waits.
    bool BeginWaiting()
    {
        CriticalSectionSpinScope const scope(s_lock);
        void const* loader = m_holder.m_loader;
        while (loader) {
            if (loader == m_thread) return false;
            LoadScope const* waiting = s_firstWaiting;
            while (waiting && waiting->m_thread != loader) waiting = waiting->m_next;
            loader = waiting ? waiting->m_holder.m_loader.load() : nullptr;
        }
        m_next = std::exchange(s_firstWaiting, this);
        return true;
    }
    void EndWaiting()
    {
        CriticalSectionSpinScope const scope(s_lock);
        LoadScope** at = &s_firstWaiting;
        while (*at != this) at = &(*at)->m_next;
        *at = m_next;
    }

    static inline CriticalSectionSpin s_lock;
    static inline LoadScope* s_firstWaiting = nullptr; // Guarded by s_lock; scopes lie on their threads' stacks.

    DelayLoadHolder const& m_holder;
    void const* const m_thread;
    LoadScope* m_next = nullptr;
    bool m_hasLock = false;
};

/// What a load has come to so far.
struct DelayLoadHolder::LoadAttempt
{
    Counted<FileStoreItem> item;
    Counted<FileStoreBackData const> triedBackData;
    struct FailedStore
    {
        Counted<FileStoreLink> link;
        NonCounted<FileStoreRevision const> revision; // Compared only: it may be gone.
    };
    std::vector<FailedStore> failedStores;
    Counted<FileStoreLink> source; // The store that the item came from, and that has set its state. Null: back data.
    bool isFinal = true;           // False if a store was just being destroyed: its last words may bring back data.

    bool HasFailedAt(Counted<FileStoreLink> const& link) const
    {
        return std::any_of(failedStores.begin(), failedStores.end(), [&](auto const& f) { return f.link == link; });
    }
    bool HasFailedAt(Counted<FileStoreLink> const& link, NonCounted<FileStoreRevision const> revision) const
    {
        return std::any_of(failedStores.begin(), failedStores.end(),
                           [&](auto const& f) { return f.link == link && f.revision == revision; });
    }
};

bool DelayLoadHolder::GetItemBase(JailCounted<FileStoreItem>& item)
{
    bool wasLoaded;
    return GetItemI(item, wasLoaded, nullptr);
}

bool DelayLoadHolder::GetItemI(JailCounted<FileStoreItem>& item, bool& wasLoaded,
                               FileStoreStateObject::StateSnapshot* snapshot)
{
    wasLoaded = true;
    if (TakeLoadedItem(item)) return true;
    NestingGuard const level;
    LoadScope const scope(*this);
    if (!level.IsAllowed() || !scope.HasLock()) return false;
    if (TakeLoadedItem(item)) return true;
    wasLoaded = false;
    item = JailCounted<FileStoreItem>(LoadItemCSLoad(snapshot));
    return static_cast<bool>(item);
}

bool DelayLoadHolder::TakeLoadedItem(JailCounted<FileStoreItem>& item) const
{
    JailCounted<FileStoreItem> found;
    bool loaded;
    {
        CriticalSectionSpinScope const scope(m_itemLock);
        loaded = m_loaded;
        found = m_item;
    }
    item = std::move(found);
    return loaded;
}

Counted<FileStoreItem> DelayLoadHolder::LoadItemCSLoad(FileStoreStateObject::StateSnapshot* snapshot)
{
    LoadAttempt attempt;
    {
        CriticalSectionSpinScope const scope(m_itemLock);
        m_loading = true;
    }
    try {
        // A store that loses the bytes while it is being read leaves back data behind, so look for that again.
        do {
            LoadFromBackData(attempt);
            if (!attempt.item) LoadFromStores(attempt);
        } while (!attempt.item && GetBackData() != attempt.triedBackData);
        FinishLoad(attempt, snapshot);
    } catch (...) {
        // No memory for the bookkeeping: as if nothing had been tried.
        attempt.item.Reset();
        std::vector<Counted<FileStoreLink>> dropped;
        CriticalSectionSpinScope const scope(m_itemLock);
        m_loading = false;
        dropped.swap(m_forgotten);
    }
    return attempt.item;
}

void DelayLoadHolder::LoadFromBackData(LoadAttempt& attempt) const
{
    Counted<FileStoreBackData const> const backData = GetBackData();
    bool const isNew = backData != attempt.triedBackData;
    attempt.triedBackData = backData;
    if (!backData || !isNew) return;
    try {
        Counted<FileStoreItem> const item = m_type->GetCreateFunc()();
        if (item && backData->LoadItem(*item)) attempt.item = item;
    } catch (...) {
        // The stores may still have it.
    }
}

void DelayLoadHolder::LoadFromStores(LoadAttempt& attempt) const
{
    Counted<FileStoreLink> link;
    Owner owner;
    while (TakeNextOwner(attempt, link, owner)) {
        Counted<FileStore> const store = link->GetFileStore();
        if (!store) attempt.isFinal = false;
        attempt.failedStores.push_back({link, owner.revision});
        try {
            Counted<FileStoreItem> const item = store ? m_type->GetCreateFunc()() : nullptr;
            if (!item || !store->LoadFile(owner.path, owner.revision, *item, true)) continue;
            attempt.item = item;
            attempt.failedStores.pop_back();
            attempt.source = link;
            return;
        } catch (...) {
            // Damage in one store: the next one may be whole.
        }
    }
}

bool DelayLoadHolder::TakeNextOwner(LoadAttempt const& attempt, Counted<FileStoreLink>& link, Owner& owner) const
{
    CriticalSectionSpinScope const scope(m_ownersLock);
    for (auto const& entry : m_owners) {
        if (!entry.value.valid || !entry.link->IsAlive()) continue;
        // A commit may have moved the bytes while they were being looked for: then the same store is asked again.
        if (attempt.HasFailedAt(entry.link, entry.value.revision)) continue;
        link = entry.link;
        owner = entry.value;
        return true;
    }
    return false;
}

void DelayLoadHolder::FinishLoad(LoadAttempt const& attempt, FileStoreStateObject::StateSnapshot* snapshot)
{
    std::vector<Counted<FileStoreLink>> forgotten;
    CriticalSectionSpinScope const owners(m_ownersLock);
    CriticalSectionSpinScope const scope(m_itemLock);
    if (attempt.item) {
        FileStoreItem& item = *attempt.item;
        for (auto const& [link, owner] : m_owners) {
            // All that have the bytes have the same ones. The source has said for itself how it stands.
            if (!owner.valid || link == attempt.source || !link->IsAlive()) continue;
            if (attempt.HasFailedAt(link)) continue;
            item.SetDirtyStatePostLoad(link, FileStoreStateObject::DirtyStateClean, false);
        }
        for (Counted<FileStoreLink> const& link : m_forgotten) item.RemoveDirtyState(NonCounted<FileStoreLink>(link));
        // Under the locks, before anyone else can see the item.
        if (snapshot) *snapshot = item.GetStateSnapshot();
        {
            CriticalSectionSpinScope const holder(item.m_holderLock);
            item.m_holder = this;
        }
        m_item = JailCounted<FileStoreItem>(attempt.item);
    }
    m_loaded = attempt.item || attempt.isFinal;
    m_loading = false;
    forgotten.swap(m_forgotten);
}

DelayLoadHolder::TempLoadItem::TempLoadItem(Counted<DelayLoadHolder> holder) : m_holder(std::move(holder))
{
    if (m_holder) m_holder->GetItemI(m_item, m_wasLoaded, &m_snapshot);
}

DelayLoadHolder::TempLoadItem::~TempLoadItem()
{
    if (m_item && !m_wasLoaded) m_holder->ReleaseTempItem(m_snapshot);
}

bool DelayLoadHolder::EnsureItemIsBacked()
{
    auto const isSafe = [this] {
        CriticalSectionSpinScope const scope(m_itemLock);
        return m_item || m_backData;
    };
    if (isSafe()) return true;
    if (m_type->IsNestable()) return false;
    // Only to keep two threads from copying the same bytes: refused inside this holder's own load, it copies all the
    // same.
    LoadScope const scope(*this);
    if (isSafe()) return true;

    // A commit may move the bytes on while they are copied; what came too late is not taken, and the second round finds
    // them where they lie then.
    bool cameTooLate = true;
    for (int round = 0; round < 2 && cameTooLate; ++round) {
        cameTooLate = false;
        OwnerMap owners;
        {
            CriticalSectionSpinScope const ownersScope(m_ownersLock);
            owners = m_owners;
        }
        for (auto const& [link, owner] : owners) {
            if (!owner.valid) continue;
            Counted<FileStore> const store = link->GetFileStore();
            Counted<FileStoreBackData const> const data =
                store ? store->CreateBackData(owner.revision, owner.path) : nullptr;
            if (!data) continue;
            SetBackData(*store, owner.revision, data);
            if (isSafe()) return true;
            cameTooLate = true;
        }
    }
    return false;
}

void DelayLoadHolder::ClearOwner(FileStore& store)
{
    try {
        Backstore(store, Entry::Erase);
    } catch (...) {
        CriticalSectionSpinScope const owners(m_ownersLock);
        CriticalSectionSpinScope const scope(m_itemLock);
        LeaveCSBoth(*store.GetFileStoreLink(), Entry::Erase);
    }
}

bool DelayLoadHolder::BreakDeadLink(FileStore& store, std::set<NonCounted<FileStoreRevision const>> const& revisions)
{
    if (!IsOwnedAt(*store.GetFileStoreLink(), revisions)) return false;
    try {
        Backstore(store, Entry::Invalidate);
    } catch (...) {
        CriticalSectionSpinScope const owners(m_ownersLock);
        CriticalSectionSpinScope const scope(m_itemLock);
        LeaveCSBoth(*store.GetFileStoreLink(), Entry::Invalidate);
        throw;
    }
    return true;
}

void DelayLoadHolder::FileRemoveFromFileStore(FileStore& store)
{
    Backstore(store, Entry::Invalidate);
}

// The bytes are copied before the entry goes, and outside the locks: so at each moment a load finds one or the other.
// What another thread makes of the holder meanwhile decides once more at the end.
void DelayLoadHolder::Backstore(FileStore& store, Entry entry)
{
    FileStoreLink& link = *store.GetFileStoreLink();
    Owner owner;
    {
        CriticalSectionSpinScope const owners(m_ownersLock);
        CriticalSectionSpinScope const scope(m_itemLock);
        Owner const* const found = m_owners.Find(&link);
        if (!found || !found->valid || !IsLastMeansCSBoth(link)) {
            LeaveCSBoth(link, entry);
            return;
        }
        owner = *found;
    }
    Counted<FileStoreBackData const> const data = store.CreateBackData(owner.revision, owner.path);

    CriticalSectionSpinScope const owners(m_ownersLock);
    CriticalSectionSpinScope const scope(m_itemLock);
    Owner const* const found = m_owners.Find(&link);
    // A save in between has put other bytes elsewhere, and those stay.
    bool const hasMoved = found && (found->revision.Get() != owner.revision.Get() || !(found->path == owner.path));
    if (hasMoved && entry == Entry::Invalidate) return;
    if (!hasMoved && !m_item) SetBackDataCSItem(data);
    LeaveCSBoth(link, entry);
}

bool DelayLoadHolder::IsLastMeansCSBoth(FileStoreLink const& leaving) const
{
    if (m_backData || m_item || m_type->IsNestable()) return false;
    return std::none_of(m_owners.begin(), m_owners.end(), [&leaving](OwnerMap::Entry const& entry) {
        return entry.value.valid && entry.link.Get() != &leaving && entry.link->IsAlive();
    });
}

void DelayLoadHolder::LeaveCSBoth(FileStoreLink& link, Entry entry)
{
    RemoveDirtyStateCSItem(link);
    if (entry == Entry::Erase)
        m_owners.Erase(&link);
    else if (Owner* const owner = m_owners.Find(&link))
        owner->valid = false;
}

} // namespace Kernel

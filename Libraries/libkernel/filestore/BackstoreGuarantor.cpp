#include "libkernel/filestore/BackstoreGuarantor.h"

#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/filestore/VoidFileStore.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/streams/NullOutStream.h"

#include <unordered_set>
#include <utility>

namespace Kernel {

namespace {

/// Learns which holders a save names. Items whose own saves have to be looked at too wait in a list, so that deep
/// nesting costs no stack, and each is looked at once, so that a circle ends.
class HolderEnumerator final : public FileStoreOut
{
public:
    HolderEnumerator() : FileStoreOut(PurposeEnumerateHolders) {}
    ~HolderEnumerator() override = default;

    /// Looks at all that waits. False if an item that contains others can't be had.
    bool Run()
    {
        Counted<NullOutStream> const stream(new NullOutStream);
        for (size_t item = 0, holder = 0; item < m_items.size() || holder < m_containers.size();) {
            if (item < m_items.size()) {
                Counted<FileStoreItem const> const next = m_items[item++];
                next->Save(*stream, *this);
                continue;
            }
            JailCounted<FileStoreItem> contained;
            m_containers[holder++]->GetItemBase(contained);
            if (!contained) return false;
            AddItem(contained.GetCounted());
        }
        return true;
    }
    void AddItem(Counted<FileStoreItem const> const& item)
    {
        if (item && m_seen.insert(item.Get()).second) m_items.push_back(item);
    }
    std::vector<Counted<DelayLoadHolder>> const& GetHolders() const { return m_holders; }

    using FileStoreOut::CreateFile;
    void CreateFile(Counted<DelayLoadHolder> holder, Counted<FileStoreCompressionHint> const&) override
    {
        if (!holder || !m_seen.insert(holder.Get()).second) return;
        bool const contains = holder->GetFileStoreItemType()->IsNestable();
        (contains ? m_containers : m_holders).push_back(std::move(holder));
    }
    void CreateFile(String8 const&, Counted<FileStoreItem const> const& item,
                    Counted<FileStoreCompressionHint> const&) override
    {
        AddItem(item);
    }
    void DeleteFile(String8 const&) override {}
    void AddObjectToClean(Counted<FileStoreStateObject>) override {}
    void AddPostSaveObject(Counted<FileStorePostSaveInterface>) override {}
    bool GenerateIndexedPath(IndexedPathParts const&, NonCounted<FileStoreItem const>,
                             NonCounted<DelayLoadHolder const>, String8&) override
    {
        return false;
    }
    void AssignDelayLoadHolderPath(Counted<DelayLoadHolder>, String8 const&) override {}
    FileStore& GetFileStore() const override { return VoidFileStore::GetInstance(); }

private:
    std::unordered_set<Countable const*> m_seen; // Of the objects in the lists, which keep them alive.
    std::vector<Counted<FileStoreItem const>> m_items;
    std::vector<Counted<DelayLoadHolder>> m_containers;
    std::vector<Counted<DelayLoadHolder>> m_holders;
};

/// True if @p store, which stays, holds just what the holder stands for.
bool IsSafeIn(FileStore const& store, DelayLoadHolder const& holder)
{
    FileStoreStateObject::DirtyState state;
    if (holder.GetDirtyStateForFileStore(store, state)) return state == FileStoreStateObject::DirtyStateClean;
    return !holder.GetItemBaseIfLoaded();
}

bool BackHolders(HolderEnumerator& enumerator, FileStore const* store)
{
    if (!enumerator.Run()) return false;
    for (Counted<DelayLoadHolder> const& holder : enumerator.GetHolders())
        if (!(store && IsSafeIn(*store, *holder)) && !holder->EnsureItemIsBacked()) return false;
    return true;
}

} // namespace

bool BackstoreGuarantor::Process(Counted<FileStoreItem const> const& item)
{
    return Process(item, nullptr);
}

bool BackstoreGuarantor::Process(Counted<FileStoreItem const> const& item, Counted<FileStore const> const& store)
{
    try {
        HolderEnumerator enumerator;
        enumerator.AddItem(item);
        return BackHolders(enumerator, store.Get());
    } catch (BackstoreException const&) {
        return false;
    }
}

bool BackstoreGuarantor::Process(Serialisable const& object)
{
    try {
        HolderEnumerator enumerator;
        Counted<NullOutStream> const stream(new NullOutStream);
        OutSerialiserFile file(*stream, enumerator, IDTag("Item"), 0);
        file.SaveObject(IDTag("Item"), NonCounted<Serialisable const>(&object));
        file.Close();
        return BackHolders(enumerator, nullptr);
    } catch (BackstoreException const&) {
        return false;
    }
}

} // namespace Kernel

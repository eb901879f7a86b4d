#include "libkernel/core/Limits.h"
#include "libkernel/core/NestingGuard.h"
#include "libkernel/core/NumberText.h"
#include "libkernel/filestore/BackstoreException.h"
#include "support/MemoryFileStore.h"
#include "support/Rows.h"

#include <gtest/gtest.h>

namespace {

using namespace KernelTest;
using State = FileStoreStateObject::DirtyState;
using Revision = MemoryFileStore::Revision;

class DelayLoadHolderTest : public testing::Test
{
protected:
    ~DelayLoadHolderTest() override
    {
        a.Reset();
        b.Reset();
    }
    /// A holder of one item of text "X" that both stores hold.
    Counted<DelayLoadHolder> HoldInBoth()
    {
        Counted<DelayLoadHolder> const holder = a->Store("x", "X");
        b->SetDelayLoadOwner(holder, b->Put("bx", "X"), "bx");
        return holder;
    }
    static State StateFor(Counted<DelayLoadHolder> const& holder, MemoryFileStore const& store)
    {
        State state;
        return holder->GetDirtyStateForFileStore(store, state) ? state : static_cast<State>(99);
    }

    static constexpr State c_clean = FileStoreStateObject::DirtyStateClean;
    static constexpr State c_unknown = static_cast<State>(99);
    Counted<MemoryFileStore> a = MemoryFileStore::Create();
    Counted<MemoryFileStore> b = MemoryFileStore::Create();
};

TEST_F(DelayLoadHolderTest, ItemIsLoadedOnceAndReleasedWhenClean)
{
    Counted<DelayLoadHolder> const holder = a->Store("x", "X");
    EXPECT_FALSE(holder->IsLoaded());
    EXPECT_FALSE(holder->GetItemBaseIfLoaded());
    EXPECT_TRUE(holder->ReleaseItem());
    EXPECT_EQ("X", TextOf(holder));
    EXPECT_EQ("X", TextOf(holder));
    EXPECT_EQ(1, a->loads);
    EXPECT_EQ(holder, holder->GetItemBaseIfLoaded()->GetDelayLoadHolder());

    holder->GetItemBaseIfLoaded()->MarkAsDirty();
    EXPECT_FALSE(holder->ReleaseItem());
    EXPECT_EQ("X", TextOf(holder));
    a->ClearObjectDirtyState(*holder->GetItemBaseIfLoaded(), c_clean);
    Counted<FileStoreItem> const kept = holder->GetItemBaseIfLoaded().GetCounted();
    EXPECT_TRUE(holder->ReleaseItem());
    EXPECT_FALSE(kept->GetDelayLoadHolder());
    EXPECT_FALSE(holder->IsLoaded());
    EXPECT_NE(kept.Get(), (TextOf(holder), holder->GetItemBaseIfLoaded().Get()));
}

TEST_F(DelayLoadHolderTest, NextStoreServesWhereOneFails)
{
    using Damage = void (*)(MemoryFileStore&, char const*);
    static constexpr Damage c_damages[] = {
        [](MemoryFileStore& store, char const* path) { store.UpdateDelayLoadOwners(store.Delete(path)); },
        [](MemoryFileStore& store, char const* path) { store.UpdateDelayLoadOwners(store.Put(path, "refuse")); },
        [](MemoryFileStore& store, char const*) { store.onLoad = [] { throw 1; }; }};
    for (Damage const damage : c_damages) {
        // Which store is asked first is a matter of addresses, so each of them is the damaged one once.
        for (bool const damageA : {true, false}) {
            a = MemoryFileStore::Create();
            b = MemoryFileStore::Create();
            Counted<DelayLoadHolder> const holder = HoldInBoth();
            MemoryFileStore& bad = damageA ? *a : *b;
            damage(bad, damageA ? "x" : "bx");
            EXPECT_EQ("X", TextOf(holder));
            EXPECT_EQ(c_clean, StateFor(holder, damageA ? *b : *a));
            // A store that has failed needs the item again; one that was not asked is taken at its word.
            EXPECT_EQ(bad.loads ? c_unknown : c_clean, StateFor(holder, bad));
        }
    }
    EXPECT_EQ(0, MemoryItem::s_living);

    Counted<DelayLoadHolder> const backed = HoldInBoth();
    backed->SetBackData(MakeCounted<MemoryBackData>("refuse"));
    a->onLoad = b->onLoad = nullptr;
    EXPECT_EQ("X", TextOf(backed));
    EXPECT_TRUE(backed->ObjectIsLinkedToFileStore(*a) && backed->ObjectIsLinkedToFileStore(*b));
}

TEST_F(DelayLoadHolderTest, FailedLoadIsNotTriedAgainUntilRelease)
{
    Counted<DelayLoadHolder> const holder = a->Store("x", "refuse");
    JailCounted<FileStoreItem> item;
    EXPECT_FALSE(holder->GetItemBase(item));
    EXPECT_TRUE(holder->IsLoaded());
    EXPECT_FALSE(holder->GetItemBaseIfLoaded());
    EXPECT_TRUE(holder->GetItemBase(item));
    EXPECT_FALSE(item);
    EXPECT_EQ(1, a->loads);
    EXPECT_FALSE(holder->ObjectIsLinkedToFileStore(*a));
    EXPECT_FALSE(holder->IsDead());

    a->UpdateDelayLoadOwners(a->Put("x", "whole"));
    EXPECT_TRUE(holder->ReleaseItem());
    EXPECT_EQ("whole", TextOf(holder));
}

TEST_F(DelayLoadHolderTest, OnlyCopyIsKeptUnlessItsStoreDiedUnseen)
{
    Counted<MemoryItem> const item(new MemoryItem("X"));
    Counted<DelayLoadHolder> const holder = DelayLoadHolder::Create(&MemoryItem::c_plain, item);
    EXPECT_TRUE(holder->IsLoaded());
    EXPECT_TRUE(holder->ExistsOnlyInMemory());
    EXPECT_FALSE(holder->IsDead());
    EXPECT_TRUE(item->IsFullyClean());
    EXPECT_FALSE(holder->ReleaseItem());
    EXPECT_TRUE(holder->EnsureItemIsBacked());
    holder->SetBackData(MakeCounted<MemoryBackData>("X"));
    EXPECT_FALSE(holder->ExistsOnlyInMemory());
    EXPECT_TRUE(holder->ReleaseItem());
    EXPECT_FALSE(item->GetDelayLoadHolder());

    Counted<DelayLoadHolder> const orphan = a->Store("x", "X");
    TextOf(orphan);
    a->diesSuddenly = true;
    a.Reset();
    EXPECT_FALSE(orphan->HasLivingOwner());
    EXPECT_TRUE(orphan->ReleaseItem());
    EXPECT_EQ("(none)", TextOf(orphan));
}

TEST_F(DelayLoadHolderTest, ItemHasOneHolderAndKeepsThePathOfTheOneItReplaces)
{
    Counted<DelayLoadHolder> const old = a->Store("x", "X");
    Counted<MemoryItem> const item(new MemoryItem("X2"));
    Counted<DelayLoadHolder> holder = DelayLoadHolder::Create(&MemoryItem::c_plain, item, old, *a);
    EXPECT_EQ(holder, DelayLoadHolder::Create(&MemoryItem::c_plain, item));
    EXPECT_EQ(holder, item->GetDelayLoadHolder());
    String8 path;
    EXPECT_TRUE(holder->GetPath(*a, path));
    EXPECT_EQ("x", path);
    EXPECT_FALSE(holder->GetPath(*b, path));
    EXPECT_FALSE(holder->IsBackedBy(*a));
    EXPECT_FALSE(holder->HasLivingOwner());

    // The save that follows puts the new holder in the old one's place.
    a->SetDelayLoadOwner(holder, a->Put("x", "X2"), "x");
    EXPECT_EQ(holder, a->Hold("x"));
    holder.Reset();
    EXPECT_FALSE(item->GetDelayLoadHolder());
    EXPECT_EQ(nullptr, DelayLoadHolder::Create(nullptr, item));
    EXPECT_EQ(nullptr, DelayLoadHolder::Create(&MemoryItem::c_plain, nullptr));
    EXPECT_TRUE(DelayLoadHolder::Create(&MemoryItem::c_plain, item, nullptr, *a));
}

TEST_F(DelayLoadHolderTest, TemporaryItemGoesUnlessItWasThereOrWasTouched)
{
    // A file that goes while the item is looked at takes the entry with it, so the item is the last copy.
    for (auto const& [what, load, dirty, remove, stays] :
         Rows<char const*, bool, bool, bool, bool>{{"incremental, but as it came", false, false, false, false},
                                                   {"there before", true, false, false, true},
                                                   {"made dirty", false, true, false, true},
                                                   {"last copy", false, false, true, true}})
    {
        SCOPED_TRACE(what);
        Counted<DelayLoadHolder> const holder = a->Store("x", "X", true);
        if (load) TextOf(holder);
        {
            DelayLoadHolder::TempLoadItem const temp(holder);
            ASSERT_TRUE(temp.GetItem());
            EXPECT_EQ(load, temp.WasLoadedBefore());
            DelayLoadHolder::TempLoadItem const inner(holder);
            EXPECT_TRUE(inner.WasLoadedBefore());
            EXPECT_EQ(temp.GetItem().Get(), inner.GetItem().Get());
            EXPECT_EQ(FileStoreStateObject::DirtyStateIncremental, StateFor(holder, *a));
            if (dirty) temp.GetItem()->MarkAsDirty();
            if (remove) a->RemoveDirtyStates({"x"});
        }
        EXPECT_EQ(stays, static_cast<bool>(holder->GetItemBaseIfLoaded()));
        a = MemoryFileStore::Create();
    }
    EXPECT_FALSE(DelayLoadHolder::TempLoadItem(nullptr).GetItem());
}

TEST_F(DelayLoadHolderTest, FirstBackDataStaysUntilTheItemChanges)
{
    Counted<DelayLoadHolder> const holder = HoldInBoth();
    Counted<FileStoreBackData const> const first = MakeCounted<MemoryBackData>("X");
    holder->SetBackData(nullptr);
    holder->SetBackData(first);
    holder->SetBackData(MakeCounted<MemoryBackData>("other"));
    EXPECT_EQ(first, holder->GetBackData());
    EXPECT_EQ("X", TextOf(holder));
    EXPECT_EQ(0, a->loads + b->loads);
    EXPECT_EQ(c_clean, StateFor(holder, *a));
    EXPECT_EQ(c_clean, StateFor(holder, *b));

    holder->GetItemBaseIfLoaded()->MarkAsDirty();
    EXPECT_FALSE(holder->GetBackData());
    holder->SetBackData(first);
    EXPECT_FALSE(holder->GetBackData()) << "its bytes are older than the item";

    Counted<DelayLoadHolder> const nestable = a->Store("nest/n", "N");
    nestable->SetBackData(first);
    EXPECT_FALSE(nestable->GetBackData());
}

TEST_F(DelayLoadHolderTest, BackingTakesTheFirstStoreThatCan)
{
    Counted<DelayLoadHolder> const holder = HoldInBoth();
    a->UpdateDelayLoadOwners(nullptr);
    EXPECT_TRUE(holder->EnsureItemIsBacked());
    EXPECT_EQ(1, b->copies);
    EXPECT_TRUE(holder->EnsureItemIsBacked());
    EXPECT_EQ(1, b->copies);

    Counted<DelayLoadHolder> const missing = a->Hold("opt/m");
    EXPECT_FALSE(missing->EnsureItemIsBacked());
    Counted<DelayLoadHolder> const nestable = a->Store("nest/n", "N");
    EXPECT_FALSE(nestable->EnsureItemIsBacked());
    TextOf(nestable);
    EXPECT_TRUE(nestable->EnsureItemIsBacked()) << "it is in memory";

    Counted<DelayLoadHolder> const y = a->Store("y", "Y");
    a->onCreateBackData = [] { throw BackstoreException(true); };
    EXPECT_THROW(y->EnsureItemIsBacked(), BackstoreException);
    a->onCreateBackData = nullptr;
    EXPECT_TRUE(y->EnsureItemIsBacked()) << "the exception has left no lock behind";
}

TEST_F(DelayLoadHolderTest, DumpNamesEachOwner)
{
    auto const address = [](MemoryFileStore const& s) { return ToStringPointer(s.GetFileStoreLink().Get(), false); };
    String8 text("Paths: ");
    Counted<DelayLoadHolder> const holder = HoldInBoth();
    String8 one = "x [" + address(*a) + "]";
    String8 two = "bx [" + address(*b) + "]";
    if (b->GetFileStoreLink() < a->GetFileStoreLink()) one.Swap(two);
    holder->DumpPaths(text);
    EXPECT_EQ("Paths: " + one + ", " + two, text);

    String8 missing;
    a->Hold("opt/m")->DumpPaths(missing);
    EXPECT_EQ("opt/m [" + address(*a) + "] (not in filestore)", missing);
}

TEST_F(DelayLoadHolderTest, ItemThatNamesItselfLoadsWithoutItsInnerSelf)
{
    a->Put("x", "X\n!x");
    a->Put("y", "Y\n!z");
    a->Put("z", "Z\n!y");
    Counted<DelayLoadHolder> x = a->Hold("x");
    EXPECT_EQ("X", TextOf(x));
    Counted<MemoryItem> item = CountedCast<MemoryItem>(x->GetItemBaseIfLoaded().GetCounted());
    EXPECT_EQ((std::vector<bool>{false}), item->eager);
    EXPECT_EQ(x, item->parts[0]);
    EXPECT_EQ("X", TextOf(item->parts[0])) << "the refusal leaves no mark";
    EXPECT_EQ(1, a->loads);
    item->parts.clear();

    Counted<DelayLoadHolder> const y = a->Hold("y");
    EXPECT_EQ("Y", TextOf(y));
    item = CountedCast<MemoryItem>(y->GetItemBaseIfLoaded().GetCounted());
    EXPECT_EQ((std::vector<bool>{true}), item->eager);
    EXPECT_EQ("Z", TextOf(item->parts[0]));
    item->parts.clear();
}

TEST_F(DelayLoadHolderTest, LoadsNestToTheLimit)
{
    for (u32 i = 0; i <= c_maxNesting; ++i) a->Put(std::to_string(i).c_str(), ("T\n!" + std::to_string(i + 1)).c_str());
    a->Put(std::to_string(c_maxNesting + 1).c_str(), "T");
    std::vector<Counted<DelayLoadHolder>> holders;
    for (u32 i = 0; i <= c_maxNesting; ++i) holders.push_back(a->Hold(std::to_string(i).c_str()));
    EXPECT_EQ("T", TextOf(holders[0]));
    EXPECT_TRUE(holders[c_maxNesting - 1]->IsLoaded());
    EXPECT_FALSE(holders[c_maxNesting]->IsLoaded());
    EXPECT_EQ(0u, NestingGuard::GetDepth());
    EXPECT_EQ("T", TextOf(holders[c_maxNesting])) << "later, with room on the stack, it loads";
    for (auto const& holder : holders)
        CountedCast<MemoryItem>(holder->GetItemBaseIfLoaded().GetCounted())->parts.clear();
}

} // namespace

#include "support/MemoryFileStore.h"

#include <gtest/gtest.h>
#include <thread>

namespace {

using namespace KernelTest;
using State = FileStoreStateObject::DirtyState;

constexpr State c_clean = FileStoreStateObject::DirtyStateClean;
constexpr State c_full = FileStoreStateObject::DirtyStateFull;
constexpr State c_incremental = FileStoreStateObject::DirtyStateIncremental;

class FileStoreStateObjectTest : public testing::Test
{
protected:
    std::optional<State> StateFor(MemoryFileStore const& store) const
    {
        State state;
        return item->GetDirtyStateForFileStore(store, state) ? std::optional<State>(state) : std::nullopt;
    }

    Counted<MemoryFileStore> a = MemoryFileStore::Create();
    Counted<MemoryFileStore> b = MemoryFileStore::Create();
    Counted<MemoryItem> item{new MemoryItem};
};

TEST_F(FileStoreStateObjectTest, EventsMoveTheStateAsTheTableSays)
{
    auto const dirty = [this] { item->MarkAsDirty(); };
    auto const fullSave = [this] { a->ClearObjectDirtyState(*item, c_clean); };
    auto const incrementalSave = [this] { a->ClearObjectDirtyState(*item, c_incremental); };
    auto const loadFull = [this] { a->SetObjectDirtyStatePostLoad(*item, c_clean); };
    auto const loadIncremental = [this] { a->SetObjectDirtyStatePostLoad(*item, c_incremental); };
    auto const markClean = [this] { item->MarkAsClean(*a); };
    auto const forget = [this] { item->BreakLinkToFileStore(*a); };
    std::optional<State> const none;
    struct
    {
        char const* what;
        std::optional<State> from;
        std::function<void()> event;
        std::optional<State> to;
    } const cases[] = {
        {"load of tag 0", none, loadFull, c_clean},
        {"load of tag 1", none, loadIncremental, c_incremental},
        {"load over a state", c_full, loadFull, c_clean},
        {"dirty when clean", c_clean, dirty, c_full},
        {"dirty when incremental", c_incremental, dirty, c_full},
        {"dirty when unknown", none, dirty, none},
        {"full save of full", c_full, fullSave, c_clean},
        {"full save of incremental", c_incremental, fullSave, c_clean},
        {"full save of clean", c_clean, fullSave, c_clean},
        {"full save of unknown", none, fullSave, c_clean},
        {"incremental save of full", c_full, incrementalSave, c_incremental},
        {"incremental save of incremental", c_incremental, incrementalSave, c_incremental},
        {"incremental save of clean", c_clean, incrementalSave, c_clean},
        {"incremental save of unknown", none, incrementalSave, c_incremental},
        {"own knowledge of unknown", none, markClean, c_clean},
        {"own knowledge of full", c_full, markClean, c_clean},
        {"forgotten", c_full, forget, none},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.what);
        item->BreakLinkToFileStore(*a);
        if (c.from) a->SetObjectDirtyStatePostLoad(*item, *c.from);
        c.event();
        EXPECT_EQ(c.to, StateFor(*a));
    }
}

TEST_F(FileStoreStateObjectTest, SaveIsRequiredByStateAndKind)
{
    struct
    {
        std::optional<State> state; // None: unknown to the store, so clean for itself.
        bool dirty, save, fullOnlySave, fullyClean, anyFull;
    } const cases[] = {
        {std::nullopt, true, true, true, true, false},
        {c_clean, false, false, false, true, false},
        {c_full, true, true, true, false, true},
        {c_incremental, true, true, false, false, false},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(testing::PrintToString(c.state));
        if (c.state) a->SetObjectDirtyStatePostLoad(*item, *c.state);
        EXPECT_EQ(c.state.has_value(), item->IsLinkedToFileStore(*a));
        EXPECT_EQ(c.dirty, item->IsDirty(*a));
        EXPECT_EQ(c.save, item->RequiresSave(*a, false));
        EXPECT_EQ(c.fullOnlySave, item->RequiresSave(*a, true));
        EXPECT_EQ(c.fullyClean, item->IsFullyClean());
        EXPECT_EQ(c.anyFull, item->IsAnyFullDirty());
    }
}

TEST_F(FileStoreStateObjectTest, SavingToOneOfTwoStoresLeavesTheOtherDirty)
{
    a->SetObjectDirtyStatePostLoad(*item, c_clean);
    b->SetObjectDirtyStatePostLoad(*item, c_clean);
    EXPECT_TRUE(item->IsShared());
    item->MarkAsDirty();
    a->ClearObjectDirtyState(*item, c_clean);
    EXPECT_FALSE(item->IsFullyClean());
    EXPECT_TRUE(item->IsAnyFullDirty());
    EXPECT_FALSE(item->IsAnyFullDirtyExcluding(b->GetFileStoreLink()));
    EXPECT_TRUE(item->IsAnyFullDirtyExcluding(a->GetFileStoreLink()));
    EXPECT_FALSE(item->IsDirty(*a));
    EXPECT_TRUE(item->IsDirty(*b));

    b.Reset();
    EXPECT_TRUE(item->IsFullyClean());
    EXPECT_FALSE(item->IsAnyFullDirty());
    EXPECT_FALSE(item->IsShared());
}

TEST_F(FileStoreStateObjectTest, StoreThatBrokeItsAssociationsIsSkippedThenForgotten)
{
    a->SetObjectDirtyStatePostLoad(*item, c_clean);
    b->SetObjectDirtyStatePostLoad(*item, c_full);
    b->BreakFileStoreAssociations();
    EXPECT_TRUE(item->IsFullyClean());
    EXPECT_TRUE(item->RequiresSave(*b, true));
    EXPECT_TRUE(item->IsLinkedToFileStore(*b));
    EXPECT_EQ(c_full, StateFor(*b));
    b->RelinkFileStoreAssociations();
    EXPECT_FALSE(item->IsFullyClean());

    b->BreakFileStoreAssociations();
    item->MarkAsDirty();
    EXPECT_FALSE(item->IsLinkedToFileStore(*b));
    EXPECT_EQ(c_full, StateFor(*a));
}

TEST_F(FileStoreStateObjectTest, ManyStoresKeepTheirStatesApart)
{
    std::vector<Counted<MemoryFileStore>> stores;
    for (int i = 0; i < 9; ++i) stores.push_back(MemoryFileStore::Create());
    for (int i = 0; i < 9; ++i) stores[i * 4 % 9]->SetObjectDirtyStatePostLoad(*item, static_cast<State>(i % 3));
    auto const snapshot = item->GetStateSnapshot();
    for (int i = 0; i < 9; ++i) EXPECT_EQ(static_cast<State>(i % 3), StateFor(*stores[i * 4 % 9])) << i;
    item->BreakLinkToFileStore(*stores[4]);
    EXPECT_FALSE(item->EqualsSnapshot(snapshot));
    EXPECT_EQ(std::nullopt, StateFor(*stores[4]));
    EXPECT_EQ(c_incremental, StateFor(*stores[8]));
    stores[4]->SetObjectDirtyStatePostLoad(*item, c_full);
    EXPECT_TRUE(item->EqualsSnapshot(snapshot));
}

TEST_F(FileStoreStateObjectTest, HooksRunBeforeAndAfterTheChangeOutsideTheLock)
{
    a->SetObjectDirtyStatePostLoad(*item, c_clean);
    std::vector<bool> cleanSeen;
    auto const look = [&] { std::thread([&] { cleanSeen.push_back(item->IsFullyClean()); }).join(); };
    item->onAboutToMakeDirty = look;
    item->onPostMarkAsDirty = look;
    item->MarkAsDirty();
    EXPECT_EQ((std::vector<bool>{true, false}), cleanSeen);
}

TEST_F(FileStoreStateObjectTest, CopyIsUnknownToTheStores)
{
    struct Plain : FileStoreStateObject
    {
    };
    Counted<Plain> const object(new Plain);
    a->SetObjectDirtyStatePostLoad(*object, c_clean);
    Counted<Plain> const copy(new Plain(*object));
    EXPECT_FALSE(copy->IsLinkedToFileStore(*a));
    *object = *copy;
    EXPECT_TRUE(object->IsLinkedToFileStore(*a));
    EXPECT_FALSE(object->CanShare());
}

} // namespace

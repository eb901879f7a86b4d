#include "support/MemoryFileStore.h"

#include <gtest/gtest.h>
#include <random>
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

// What each store must think of one item, in any order of events, and what the item says of itself.
TEST_F(FileStoreStateObjectTest, EveryHistoryLeavesTheStatesOfAPlainMap)
{
    std::mt19937 random(3);
    std::map<int, State> model; // A store that is not in it does not know the item.
    std::vector<Counted<MemoryFileStore>> stores;
    for (int i = 0; i < 7; ++i) stores.push_back(MemoryFileStore::Create());
    for (int round = 0; round < 3000; ++round) {
        int const i = static_cast<int>(random() % stores.size());
        MemoryFileStore& store = *stores[static_cast<size_t>(i)];
        State const state = static_cast<State>(random() % 3);
        auto const event = random() % 8;
        SCOPED_TRACE(testing::Message() << round << ": event " << event << " store " << i << " state " << state);
        auto const snapshot = item->GetStateSnapshot();
        auto const before = model;
        switch (event) {
        case 0:
            item->MarkAsDirty(); // This also lets go of dead stores.
            for (auto& known : model) known.second = c_full;
            break;
        case 1:
            item->MarkAsClean(store);
            model[i] = c_clean;
            break;
        case 2:
            item->BreakLinkToFileStore(store);
            model.erase(i);
            break;
        case 3:
            stores[static_cast<size_t>(i)] = MemoryFileStore::Create(); // The old one dies.
            model.erase(i);
            break;
        case 4: // A full save.
            store.ClearObjectDirtyState(*item, c_clean);
            model[i] = c_clean;
            break;
        case 5: // An incremental save leaves what was clean so.
            store.ClearObjectDirtyState(*item, c_incremental);
            if (!model.count(i) || model[i] != c_clean) model[i] = c_incremental;
            break;
        default: store.SetObjectDirtyStatePostLoad(*item, state); model[i] = state;
        }
        EXPECT_TRUE(event == 0 || event == 3 || item->EqualsSnapshot(snapshot) == (model == before));
        int clean = 0;
        int full = 0;
        for (auto const& known : model) clean += known.second == c_clean, full += known.second == c_full;
        int const known = static_cast<int>(model.size());
        for (int k = 0; k < 7; ++k) {
            MemoryFileStore const& one = *stores[static_cast<size_t>(k)];
            auto const at = model.find(k);
            bool const isKnown = at != model.end();
            ASSERT_EQ(isKnown ? std::optional(at->second) : std::nullopt, StateFor(one));
            ASSERT_EQ(isKnown, item->IsLinkedToFileStore(one));
            ASSERT_EQ(!isKnown || at->second != c_clean, item->IsDirty(one));
            ASSERT_EQ(!isKnown || at->second != c_clean, item->RequiresSave(one, false));
            ASSERT_EQ(!isKnown || at->second == c_full, item->RequiresSave(one, true));
            ASSERT_EQ(full - (isKnown && at->second == c_full) > 0,
                      item->IsAnyFullDirtyExcluding(one.GetFileStoreLink()));
        }
        ASSERT_EQ(clean == known, item->IsFullyClean());
        ASSERT_EQ(full > 0, item->IsAnyFullDirty());
        ASSERT_EQ(known > 1, item->IsShared());
    }
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

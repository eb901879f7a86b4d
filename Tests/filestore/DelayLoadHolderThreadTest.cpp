#include "libkernel/filestore/BackstoreException.h"
#include "support/MemoryFileStore.h"

#include <future>
#include <gtest/gtest.h>
#include <thread>

// Two roads through the same locks. Where a fault would be a deadlock, the other road runs on a thread of its own and
// has to come to its end while the first one is still inside.

namespace {

using namespace KernelTest;

class DelayLoadHolderThreadTest : public testing::Test
{
protected:
    /// True if @p work ends on another thread while this one waits for it.
    static bool EndsMeanwhile(std::function<void()> work)
    {
        auto done = std::make_shared<std::promise<void>>();
        auto ended = done->get_future();
        std::thread([work = std::move(work), done] {
            work();
            done->set_value();
        }).detach();
        return ended.wait_for(std::chrono::seconds(20)) == std::future_status::ready;
    }
    static void OnThreads(int count, std::function<void(int)> const& work)
    {
        std::vector<std::thread> threads;
        for (int i = 0; i < count; ++i) threads.emplace_back(work, i);
        for (std::thread& thread : threads) thread.join();
    }

    Counted<MemoryFileStore> a = MemoryFileStore::Create();
    Counted<MemoryFileStore> b = MemoryFileStore::Create();
};

TEST_F(DelayLoadHolderThreadTest, ThreadsThatWantOneItemLoadItOnce)
{
    a->Put("x", "X\n!y");
    a->Put("y", "Y");
    Counted<DelayLoadHolder> const holder = a->Hold("x");
    std::atomic<int> right{0};
    for (int round = 0; round < 20; ++round) {
        OnThreads(4, [&](int) { right += TextOf(holder) == "X"; });
        CountedCast<MemoryItem>(holder->GetItemBaseIfLoaded().GetCounted())->parts.clear();
        EXPECT_TRUE(holder->ReleaseItem());
    }
    EXPECT_EQ(20 * 4, right);
    EXPECT_EQ(20 * 2, a->loads);
}

TEST_F(DelayLoadHolderThreadTest, ReadersAndChangersAgreeOnOneItem)
{
    Counted<DelayLoadHolder> const holder = a->Store("x", "X");
    OnThreads(4, [&](int thread) {
        for (int i = 0; i < 300; ++i) {
            DelayLoadHolder::TempLoadItem const temp(holder);
            ASSERT_TRUE(temp.GetItem());
            if (thread == 0 && i % 7 == 0) {
                temp.GetItem()->MarkAsDirty();
                a->ClearObjectDirtyState(*temp.GetItem(), FileStoreStateObject::DirtyStateClean);
            }
            if (thread == 1) holder->ReleaseItem();
            if (thread == 2) holder->SetBackData(MakeCounted<MemoryBackData>("X"));
        }
    });
    EXPECT_EQ("X", TextOf(holder));
}

TEST_F(DelayLoadHolderThreadTest, StoreGoesOnCommittingWhileALoadRuns)
{
    Counted<DelayLoadHolder> const holder = a->Store("x", "X");
    a->onLoad = [&] {
        a->onLoad = nullptr;
        EXPECT_TRUE(EndsMeanwhile([&] {
            auto const second = a->Put("y", "Y");
            EXPECT_EQ(holder, a->Hold("x"));
            a->Hold("y");
            a->UpdateDelayLoadOwners(second);
            a->SetDelayLoadOwner(holder, second, "x");
            a->RemoveDirtyStates({"x"});
            a->RemoveDelayLoadLinks({second});
            EXPECT_FALSE(holder->IsBackedBy(*a));
            EXPECT_TRUE(holder->ReleaseItem());
            EXPECT_FALSE(holder->HasLivingOwner());
        }));
    };
    EXPECT_EQ("X", TextOf(holder));
    EXPECT_FALSE(holder->ObjectIsLinkedToFileStore(*a)) << "the store took its state back while the load ran";
    EXPECT_TRUE(holder->GetBackData());
}

TEST_F(DelayLoadHolderThreadTest, StoreDiesInsideALoadFromAnotherStore)
{
    Counted<DelayLoadHolder> const holder = a->Store("x", "X");
    b->SetDelayLoadOwner(holder, b->Put("x", "X"), "x");
    auto const kill = [&](Counted<MemoryFileStore>& other) {
        return [&] { EXPECT_TRUE(EndsMeanwhile([&] { other.Reset(); })); };
    };
    a->onLoad = kill(b);
    b->onLoad = kill(a);
    EXPECT_EQ("X", TextOf(holder));
    EXPECT_EQ(1, static_cast<int>(static_cast<bool>(a)) + static_cast<bool>(b));
    EXPECT_TRUE(holder->HasLivingOwner());
    EXPECT_FALSE(holder->GetItemBaseIfLoaded()->IsShared());
}

TEST_F(DelayLoadHolderThreadTest, StoreReleasedAndBytesDroppedInsideALoadLiveOnUntilItsEnd)
{
    auto const first = a->Put("x", "X");
    a->Put("y", "Y");
    Counted<DelayLoadHolder> const x = a->Hold("x"), y = a->Hold("y");
    a->onLoad = [&] {
        a->RemoveDelayLoadLinks({first});
        throw 1;
    };
    EXPECT_EQ("X", TextOf(x)) << "from back data";
    a->onLoad = [&] { a.Reset(); };
    EXPECT_EQ("Y", TextOf(y));
    EXPECT_FALSE(y->HasLivingOwner());
    EXPECT_TRUE(y->GetItemBaseIfLoaded()->IsFullyClean());
    EXPECT_TRUE(y->GetBackData()) << "the item was not in memory yet when its store went";
}

TEST_F(DelayLoadHolderThreadTest, LoadsThatNameEachOtherOnTwoThreadsBothEnd)
{
    for (int round = 0; round < 10; ++round) {
        a = MemoryFileStore::Create();
        a->Put("x", "X\n!y");
        a->Put("y", "Y\n!x");
        Counted<DelayLoadHolder> const holders[] = {a->Hold("x"), a->Hold("y")};
        std::promise<void> both;
        auto const ready = both.get_future().share();
        std::atomic<int> inside{0};
        // Each thread is inside its first load before either goes on to the other's.
        a->onLoad = [&] {
            int const entered = ++inside;
            if (entered == 2) both.set_value();
            if (entered <= 2) ready.wait();
        };
        OnThreads(2, [&](int i) { EXPECT_EQ(i ? "Y" : "X", TextOf(holders[i])); });
        for (auto const& holder : holders)
            CountedCast<MemoryItem>(holder->GetItemBaseIfLoaded().GetCounted())->parts.clear();
    }
}

TEST_F(DelayLoadHolderThreadTest, DyingHoldersAndStoresPassEachOther)
{
    for (int round = 0; round < 30; ++round) {
        a = MemoryFileStore::Create();
        for (char const* path : {"p", "q", "r"}) a->Put(path, path);
        std::promise<void> start;
        auto const go = start.get_future().share();
        std::vector<std::thread> threads;
        for (int thread = 0; thread < 3; ++thread) {
            threads.emplace_back([store = a, go, thread]() mutable {
                go.wait();
                Counted<DelayLoadHolder> last;
                for (int i = 0; i < 40; ++i) {
                    char const* const path = &"p\0q\0r"[2 * ((i + thread) % 3)];
                    last = store->Hold(path);
                    ASSERT_TRUE(last);
                    if (i % 5 == thread) TextOf(last);
                    if (i % 9 == 0) store->UpdateDelayLoadOwners(store->Put(path, path));
                    if (i % 11 == 0) {
                        store->BreakFileStoreAssociations();
                        last.Reset();
                        store->RelinkFileStoreAssociations();
                    }
                }
                store.Reset();
                if (last) TextOf(last);
            });
        }
        a.Reset();
        start.set_value();
        for (std::thread& thread : threads) thread.join();
    }
    EXPECT_EQ(0, MemoryItem::s_living);
}

TEST_F(DelayLoadHolderThreadTest, BackingAndCommittingTakeNoLockInTheOtherOrder)
{
    a->Put("x", "X");
    auto const second = a->Put("y", "Y");
    Counted<DelayLoadHolder> const x = a->Hold("x");
    Counted<DelayLoadHolder> const y = a->Hold("y");
    a->onCreateBackData = [&] {
        a->onCreateBackData = nullptr;
        EXPECT_TRUE(EndsMeanwhile([&] {
            a->SetDelayLoadOwner(y, second, "y");
            a->UpdateDelayLoadOwners(second);
            EXPECT_EQ(x, a->Hold("x"));
            EXPECT_EQ("Y", TextOf(y));
        }));
    };
    EXPECT_TRUE(x->EnsureItemIsBacked());
}

} // namespace

#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/filestore/VoidFileStore.h"
#include "support/MemoryFileStore.h"
#include "support/TraceCapture.h"

#include <gtest/gtest.h>

namespace {

using namespace KernelTest;
using Revision = MemoryFileStore::Revision;

class FileStoreTest : public testing::Test
{
protected:
    Counted<MemoryFileStore> a = MemoryFileStore::Create();
    Counted<MemoryFileStore> b = MemoryFileStore::Create();
    CollectingContext context;

    static String8 PathIn(MemoryFileStore const& store, Counted<DelayLoadHolder> const& holder)
    {
        String8 path;
        return holder->GetPath(store, path) ? path : String8("(unknown)");
    }
    static Revision RevisionIn(MemoryFileStore const& store, Counted<DelayLoadHolder> const& holder)
    {
        Revision revision;
        return holder->IsBackedBy(store, revision) ? revision : nullptr;
    }
};

TEST_F(FileStoreTest, OnePathHasOneHolderWhileItLivesWhichTakesItsBackData)
{
    Counted<DelayLoadHolder> holder = a->Store("x", "X");
    EXPECT_EQ(holder, a->Hold("x"));
    EXPECT_EQ("X", TextOf(holder));
    holder.Reset();
    EXPECT_EQ(0, MemoryItem::s_living);
    holder = a->Hold("x");
    EXPECT_FALSE(holder->IsLoaded());
    EXPECT_EQ(nullptr, a->CreateDelayLoadHolderDirect("x", nullptr, &context));
    EXPECT_TRUE(context.problems.empty());
    Counted<FileStoreBackData const> const data(new MemoryBackData("copy"));
    a->AddBackData("x", nullptr);
    a->AddBackData("x", nullptr, data); // Of a revision that the holder has left.
    EXPECT_FALSE(holder->GetBackData());
    a->AddBackData("x", RevisionIn(*a, holder), data);
    EXPECT_EQ(data, holder->GetBackData());
    EXPECT_EQ("copy", TextOf(holder));
    Counted<DelayLoadHolder> const y = a->Store("y", "Y");
    a->AddBackData("y", data);
    EXPECT_EQ(data, y->GetBackData());
}

TEST_F(FileStoreTest, MissingPathIsReportedAndHeldOnlyIfRecoverable)
{
    a->Put("gone", "G");
    a->Delete("gone");
    EXPECT_EQ(nullptr, a->Hold("nowhere", &context));
    EXPECT_EQ(nullptr, a->Hold("gone", &context));
    Counted<DelayLoadHolder> const holder = a->Hold("opt/nowhere", &context);
    EXPECT_EQ((std::vector<String8>{"Missing file: nowhere", "Missing file: gone", "Missing file: opt/nowhere"}),
              context.problems);
    EXPECT_EQ(nullptr, a->Hold("nowhere", nullptr));

    ASSERT_TRUE(holder);
    EXPECT_EQ(holder, a->Hold("opt/nowhere", &context));
    EXPECT_EQ(3u, context.problems.size());
    EXPECT_TRUE(holder->IsDead());
    EXPECT_FALSE(holder->HasLivingOwner());
    EXPECT_FALSE(holder->IsBackedBy(*a));
    EXPECT_EQ("opt/nowhere", PathIn(*a, holder));
    JailCounted<FileStoreItem> item;
    EXPECT_FALSE(holder->GetItemBase(item));
    EXPECT_EQ(0, a->loads);
}

TEST_F(FileStoreTest, HolderMadeDuringACommitStandsAtTheNewRevision)
{
    a->Put("x", "old");
    Revision newest;
    a->onFindHead = [&] {
        a->onFindHead = nullptr;
        newest = a->Put("x", "new");
        a->UpdateDelayLoadOwners(newest);
    };
    Counted<DelayLoadHolder> const holder = a->Hold("x");
    EXPECT_EQ(newest, RevisionIn(*a, holder));
    EXPECT_EQ("new", TextOf(holder));
}

TEST_F(FileStoreTest, OwnerMovesWithASaveToAnotherPath)
{
    Revision const r1 = a->Put("x", "X");
    Counted<DelayLoadHolder> const holder = a->Hold("x");
    Revision const r2 = a->Put("y", "X");
    a->SetDelayLoadOwner(holder, r2, "y");
    EXPECT_EQ("y", PathIn(*a, holder));
    EXPECT_EQ(r2, RevisionIn(*a, holder));
    EXPECT_EQ(holder, a->Hold("y"));
    Counted<DelayLoadHolder> const second = a->Hold("x");
    EXPECT_NE(holder, second);
    EXPECT_EQ(r1, RevisionIn(*a, second));

    // The path passes to the second holder; the first one's end must not take it away.
    a->SetDelayLoadOwner(second, r2, "y");
    EXPECT_EQ(second, a->Hold("y"));
    Counted<DelayLoadHolder> third = a->Hold("x");
    a->SetDelayLoadOwner(third, r2, "y");
    third.Reset();
    a->UpdateDelayLoadOwners(r1);
    EXPECT_EQ(r1, RevisionIn(*a, holder));
    EXPECT_EQ(r1, RevisionIn(*a, second));
    a->SetDelayLoadOwner(nullptr, r1, "z");
}

TEST_F(FileStoreTest, DroppedRevisionsLeaveBackDataWhereNothingElseWould)
{
    a->Put("x", "X");
    a->Put("nest/n", "N");
    a->Put("loaded", "L");
    a->Put("shared", "S");
    Revision const kept = a->Put("kept", "K");
    Revision const inB = b->Put("s", "S");
    char const* const paths[] = {"x", "nest/n", "loaded", "shared", "kept"};
    std::vector<Counted<DelayLoadHolder>> h;
    for (char const* path : paths) h.push_back(a->Hold(path));
    TextOf(h[2]);
    b->SetDelayLoadOwner(h[3], inB, "s");
    std::set<Revision> dropped;
    for (int i = 0; i < 4; ++i) dropped.insert(RevisionIn(*a, h[i]));

    a->RemoveDelayLoadLinks({});
    EXPECT_TRUE(h[0]->IsBackedBy(*a));
    a->RemoveDirtyStates({});
    EXPECT_TRUE(h[2]->ObjectIsLinkedToFileStore(*a));
    TextOf(h[4]);
    a->RemoveDirtyStates({"kept", "unknown"}); // Deleted paths lose their states alone.
    EXPECT_FALSE(h[4]->ObjectIsLinkedToFileStore(*a));
    EXPECT_TRUE(h[2]->ObjectIsLinkedToFileStore(*a));
    EXPECT_TRUE(h[4]->IsBackedBy(*a));
    a->RemoveDelayLoadLinks(dropped);
    for (int i = 0; i < 4; ++i) {
        SCOPED_TRACE(paths[i]);
        EXPECT_FALSE(h[i]->IsBackedBy(*a));
        EXPECT_EQ(i == 0, static_cast<bool>(h[i]->GetBackData()));
        EXPECT_NE(h[i], a->Hold(paths[i]));
        EXPECT_EQ(paths[i], PathIn(*a, h[i]));
    }
    EXPECT_EQ(1, a->copies);
    EXPECT_FALSE(h[2]->ObjectIsLinkedToFileStore(*a));
    EXPECT_EQ(kept, RevisionIn(*a, h[4]));
    EXPECT_EQ("X", TextOf(h[0]));
    EXPECT_EQ("S", TextOf(h[3]));
    EXPECT_TRUE(h[1]->IsDead());

    // A copy that fails keeps nothing alive.
    Revision const last = a->Put("last", "L");
    Counted<DelayLoadHolder> const holder = a->Hold("last");
    a->onCreateBackData = [] { throw BackstoreException(true); };
    Kernel::Test::TraceCapture const capture;
    EXPECT_THROW(a->RemoveDelayLoadLinks({last}), BackstoreException);
    EXPECT_EQ("== BackstoreException: out of space\n", Kernel::Test::TraceCapture::GetText());
    EXPECT_FALSE(holder->IsBackedBy(*a));
    Counted<DelayLoadHolder> const again = a->Hold("last");
    EXPECT_NE(holder, again);
    a.Reset();
    EXPECT_TRUE(again->IsDead());
}

TEST_F(FileStoreTest, PreFileDeleteAsksForEachHolderAndTakesTheChosenOnes)
{
    struct Chooser : FileStore::ProcessPreFileDeleteFunctor
    {
        bool operator()(Revision revision, String8 const& path) override
        {
            seen[path] = revision;
            return path == "x";
        }
        std::map<String8, Revision> seen;
    } chooser;
    Revision const rx = a->Put("x", "X");
    Revision const ry = a->Put("y", "Y");
    Counted<DelayLoadHolder> const x = a->Hold("x");
    Counted<DelayLoadHolder> const y = a->Hold("y");
    Counted<DelayLoadHolder> const missing = a->Hold("opt/m");
    a->ProcessPreFileDelete(chooser);
    EXPECT_EQ((std::map<String8, Revision>{{"x", rx}, {"y", ry}, {"opt/m", nullptr}}), chooser.seen);
    EXPECT_FALSE(x->IsBackedBy(*a));
    EXPECT_TRUE(x->GetBackData());
    EXPECT_NE(x, a->Hold("x"));
    EXPECT_TRUE(y->IsBackedBy(*a));
    EXPECT_EQ(y, a->Hold("y"));

    a->onCreateBackData = [] { throw BackstoreException(false); };
    Counted<DelayLoadHolder> const again = a->Hold("x");
    EXPECT_THROW(a->ProcessPreFileDelete(chooser), BackstoreException);
    EXPECT_TRUE(again->IsBackedBy(*a)) << "the file is still there, so its holder goes on";
}

TEST_F(FileStoreTest, EndOfAStoreLeavesBackDataUnlessAnotherStoreLives)
{
    Counted<DelayLoadHolder> const x = a->Store("x", "X");
    Counted<DelayLoadHolder> const y = a->Store("y", "Y");
    b->SetDelayLoadOwner(y, b->Put("y", "Y"), "y");
    Counted<FileStoreLink> const link = a->GetFileStoreLink();
    a.Reset();
    EXPECT_FALSE(link->IsAlive());
    EXPECT_EQ(nullptr, link->GetFileStore());
    EXPECT_TRUE(x->GetBackData());
    EXPECT_FALSE(y->GetBackData());
    EXPECT_EQ("X", TextOf(x));
    EXPECT_EQ("Y", TextOf(y));
    b.Reset();
    EXPECT_TRUE(x->ReleaseItem());
    EXPECT_EQ("X", TextOf(x));
    EXPECT_FALSE(y->ReleaseItem()) << "no store and no back data: the only copy";
}

TEST_F(FileStoreTest, StoreThatLetsGoOfItsHoldersLivesOnAndTheirEndLeavesNoTrace)
{
    Counted<DelayLoadHolder> const x = a->Store("x", "X");
    a->PreDestruction();
    EXPECT_EQ("(unknown)", PathIn(*a, x));
    EXPECT_EQ("X", TextOf(x));
    EXPECT_TRUE(a->GetFileStoreLink()->IsAlive());
    Counted<DelayLoadHolder> again = a->Hold("x");
    EXPECT_NE(x, again);
    EXPECT_TRUE(again->HasLivingOwner());
    a->BreakFileStoreAssociations();
    EXPECT_FALSE(again->HasLivingOwner());
    EXPECT_EQ("(none)", TextOf(again));
    again.Reset();
    a->RelinkFileStoreAssociations();
    a->UpdateDelayLoadOwners(a->Put("x", "X2"));
    again = a->Hold("x");
    EXPECT_EQ("X2", TextOf(again));
    a->broken = true;
    EXPECT_FALSE(again->HasLivingOwner());
}

TEST(FileStoreItemType, LastRegistrationOfAClassWins)
{
    using Type = FileStoreItemType;
    static Type const s_first(ClassUID("Ts01"), nullptr, Type::IsNestableType, Type::NotRecoverable);
    static Type const s_second(ClassUID("Ts01"), nullptr, Type::NotNestable, Type::IsRecoverableType);
    Type::Init const first(s_first), second(s_second);
    EXPECT_EQ(&s_second, Type::FindFileStoreItemType(ClassUID("Ts01")));
}

TEST(VoidFileStore, HasNothingAndTakesNothing)
{
    VoidFileStore& store = VoidFileStore::GetInstance();
    Counted<MemoryItem> const item(new MemoryItem);
    EXPECT_FALSE(store.LoadFile("x", *item) || store.LoadFile("x", nullptr, *item, true) ||
                 store.CreateBackData(nullptr, "x") || store.IsBroken());
    EXPECT_FALSE(store.CreateDelayLoadHolderDirect("x", &MemoryItem::c_plain, nullptr));
    EXPECT_TRUE(store.CreateDelayLoadHolderDirect("x", &MemoryItem::c_recoverable, nullptr)->IsDead());
    VoidFileStoreOut& out = VoidFileStoreOut::GetInstance();
    EXPECT_TRUE(&store == &out.GetFileStore() && out.IsFullSave());
    EXPECT_FALSE(out.AddProlongedObject(item)) << "the process-wide output must not collect objects";
    EXPECT_EQ(1, item->GetReferenceCount());
}

TEST(FileStoreOut, EnumerationInheritsStrategiesAndAbortFlagAlone)
{
    class Advice : public SerialisationStrategy
    {
    };
    bool abort = true;
    Counted<MemoryItem> const kept(new MemoryItem);
    {
        RecordingOut out(VoidFileStore::GetInstance(), FileStoreOut::PurposeSave, &abort);
        out.AddStrategy(nullptr);
        out.AddStrategy(MakeCounted<Advice>());
        EXPECT_TRUE(out.AddProlongedObject(kept));
        out.SetAborted();
        RecordingOut const inner(out, FileStoreOut::PurposeEnumeratePaths);
        EXPECT_EQ(1u, inner.GetStrategies().size());
        EXPECT_TRUE(inner.IsAbortRequested() && !inner.WasAborted() && !inner.IsFullSave());
        EXPECT_EQ(2, kept->GetReferenceCount());
    }
    EXPECT_EQ(1, kept->GetReferenceCount());
}

} // namespace

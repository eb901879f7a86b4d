#include "libkernel/filestore/BackstoreGuarantor.h"

#include "libkernel/filestore/BackstoreException.h"
#include "support/MemoryFileStore.h"
#include "support/Rows.h"

#include <gtest/gtest.h>

namespace {

using namespace KernelTest;

class BackstoreGuarantorTest : public testing::Test
{
protected:
    /// An item in memory that names the holders.
    static Counted<MemoryItem> Root(std::vector<Counted<DelayLoadHolder>> parts)
    {
        Counted<MemoryItem> const root(new MemoryItem("root"));
        root->parts = std::move(parts);
        return root;
    }

    Counted<MemoryFileStore> a = MemoryFileStore::Create();
};

TEST_F(BackstoreGuarantorTest, NamedItemsAndThePartsOfNestedOnesSurviveTheStore)
{
    EXPECT_TRUE(BackstoreGuarantor::Process(Counted<FileStoreItem const>()));
    a->Put("x", "X");
    a->Put("nest/inner", "I\nx\nnest/outer");
    Counted<DelayLoadHolder> const outer = a->Store("nest/outer", "O\nnest/inner"), y = a->Store("y", "Y");
    Counted<MemoryItem> const root = Root({y, y, nullptr, outer});
    EXPECT_TRUE(BackstoreGuarantor::Process(root)) << "items that contain each other end";
    EXPECT_EQ(2, a->copies) << "each holder once";
    EXPECT_EQ(2, a->loads) << "copied, not loaded, unless nested";
    a->diesSuddenly = true;
    a.Reset();
    auto const partOf = [](Counted<DelayLoadHolder> const& holder) {
        return CountedCast<MemoryItem>(holder->GetItemBaseIfLoaded().GetCounted())->parts[0];
    };
    EXPECT_EQ("Y", TextOf(y));
    EXPECT_EQ("O", TextOf(outer));
    EXPECT_EQ("I", TextOf(partOf(outer)));
    EXPECT_EQ("X", TextOf(partOf(partOf(outer))));
    CountedCast<MemoryItem>(outer->GetItemBaseIfLoaded().GetCounted())->parts.clear();
}

TEST_F(BackstoreGuarantorTest, WhatCannotBeHadFailsTheRun)
{
    EXPECT_FALSE(BackstoreGuarantor::Process(Root({a->Hold("opt/missing")})));
    Counted<DelayLoadHolder> const x = a->Store("x", "X");
    EXPECT_FALSE(BackstoreGuarantor::Process(Root({x, a->Store("nest/n", "refuse")})));
    EXPECT_FALSE(x->GetBackData()) << "nothing is copied when the walk has failed";
    a->onCreateBackData = [] { throw BackstoreException(true); };
    EXPECT_FALSE(BackstoreGuarantor::Process(Root({x})));
}

TEST_F(BackstoreGuarantorTest, WhatAStayingStoreHoldsIsNotCopied)
{
    for (auto const& [what, load, dirty, forget] :
         Rows<char const*, bool, bool, bool>{{"never loaded", false, false, false},
                                             {"clean", true, false, false},
                                             {"dirty, so in memory", true, true, false},
                                             {"unknown, but in memory", true, false, true}})
    {
        SCOPED_TRACE(what);
        Counted<DelayLoadHolder> const x = a->Store("x", "X");
        if (load) TextOf(x);
        if (dirty) x->GetItemBaseIfLoaded()->MarkAsDirty();
        if (forget) a->RemoveDirtyStates({"x"});
        EXPECT_TRUE(BackstoreGuarantor::Process(Root({x}), a));
        EXPECT_EQ(0, a->copies);
    }
    // Another store is no reason to leave out the copy of what it does not know.
    Counted<MemoryFileStore> const b = MemoryFileStore::Create();
    Counted<DelayLoadHolder> const y = a->Store("y", "Y");
    TextOf(y);
    EXPECT_TRUE(y->ReleaseItem());
    EXPECT_TRUE(BackstoreGuarantor::Process(Root({y})));
    EXPECT_EQ(1, a->copies);
}

} // namespace

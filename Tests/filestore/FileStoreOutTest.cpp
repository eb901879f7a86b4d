#include "libkernel/core/Exception.h"
#include "libkernel/filestore/FileStoreOutPathGenerator.h"
#include "libkernel/filestore/VoidFileStore.h"
#include "support/MemoryFileStore.h"

#include <gtest/gtest.h>

namespace {

using namespace KernelTest;

/// Writes down what it is called with.
class RecordingOut : public FileStoreOut
{
public:
    explicit RecordingOut(Purpose purpose = PurposeSave, bool const* abort = nullptr) : FileStoreOut(purpose, abort) {}
    RecordingOut(FileStoreOut const& o, Purpose purpose) : FileStoreOut(o, purpose) {}

    using FileStoreOut::CreateFile;
    void CreateFile(Counted<DelayLoadHolder>, Counted<FileStoreCompressionHint> const& hint) override
    {
        calls.push_back(hint ? "holder, hint" : "holder");
    }
    void CreateFile(String8 const& path, Counted<FileStoreItem const> const&,
                    Counted<FileStoreCompressionHint> const& hint) override
    {
        calls.push_back(path + (hint ? ", hint" : ""));
    }
    void DeleteFile(String8 const&) override {}
    void AddObjectToClean(Counted<FileStoreStateObject>) override {}
    void AddPostSaveObject(Counted<FileStorePostSaveInterface>) override {}
    bool GenerateIndexedPath(IndexedPathParts const& parts, NonCounted<FileStoreItem const> item,
                             NonCounted<DelayLoadHolder const>, String8& path) override
    {
        path = parts.prefix + "7" + parts.suffix;
        return static_cast<bool>(item);
    }
    void AssignDelayLoadHolderPath(Counted<DelayLoadHolder>, String8 const&) override {}
    FileStore& GetFileStore() const override { return VoidFileStore::GetInstance(); }

    std::vector<String8> calls;
};

class Advice : public SerialisationStrategy
{
};

TEST(FileStoreOut, FormsWithoutAHintPassANullHintOn)
{
    RecordingOut out;
    out.CreateFile(Counted<DelayLoadHolder>());
    out.CreateFile("p", Counted<FileStoreItem const>());
    out.CreateFile("p", Counted<FileStoreItem const>(), MakeCounted<FileStoreCompressionHintGeneral>());
    EXPECT_EQ((std::vector<String8>{"holder", "p", "p, hint"}), out.calls);
}

TEST(FileStoreOut, AbortFlagIsAskedAndNothingIsSetByAsking)
{
    bool abort = false;
    RecordingOut out(FileStoreOut::PurposeSave, &abort);
    EXPECT_NO_THROW(out.TestAbort());
    abort = true;
    EXPECT_THROW(out.TestAbort(), AbortException);
    EXPECT_FALSE(out.WasAborted());
    out.SetAborted();
    EXPECT_TRUE(out.WasAborted());
    EXPECT_NO_THROW(RecordingOut().TestAbort());
}

TEST(FileStoreOut, EnumerationInheritsStrategiesAndAbortFlagAlone)
{
    bool abort = true;
    Counted<MemoryItem> const kept(new MemoryItem);
    {
        RecordingOut out(FileStoreOut::PurposeSave, &abort);
        out.AddStrategy(nullptr);
        out.AddStrategy(MakeCounted<Advice>());
        EXPECT_TRUE(out.AddProlongedObject(kept));
        out.SetAborted();
        RecordingOut const inner(out, FileStoreOut::PurposeEnumeratePaths);
        EXPECT_EQ(out.GetStrategies(), inner.GetStrategies());
        EXPECT_EQ(1u, inner.GetStrategies().size());
        EXPECT_TRUE(inner.IsAbortRequested());
        EXPECT_FALSE(inner.WasAborted());
        EXPECT_EQ(FileStoreOut::PurposeEnumeratePaths, inner.GetPurpose());
        EXPECT_TRUE(out.IsFullSave());
        EXPECT_FALSE(inner.IsFullSave());
        EXPECT_EQ(2, kept->GetReferenceCount());
    }
    EXPECT_EQ(1, kept->GetReferenceCount());
}

TEST(FileStoreOut, IndexedGeneratorAsksTheOutput)
{
    RecordingOut out;
    Counted<MemoryItem> const item(new MemoryItem);
    String8 path;
    EXPECT_TRUE(FileStoreOutIndexedPathGenerator(out, "Images/", ".img").GeneratePath(item, nullptr, path));
    EXPECT_EQ("Images/7.img", path);
    FileStoreOutIndexedPathGenerator generator(out, FileStoreOut::IndexedPathParts{"a", "b"});
    EXPECT_FALSE(generator.GeneratePath(nullptr, nullptr, path));
}

TEST(FileStoreCompressionHintGeneral, StartsAtZero)
{
    auto const hint = MakeCounted<FileStoreCompressionHintGeneral>();
    EXPECT_EQ(FileStoreCompressionHintGeneral::CompressionLevelDefault, hint->GetCompressionLevel());
    EXPECT_EQ(CompressionPredictorType::None, hint->GetCompressionPredictorType());
    EXPECT_EQ(CompressionPredictorStripingType::None, hint->GetCompressionPredictorStripingType());
}

} // namespace

#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/filestore/FileStorePostSaveInterface.h"
#include "libkernel/filesystem/TempFile.h"
#include "support/ArchiveFixture.h"
#include "support/FaultyFiles.h"
#include "support/TempFolder.h"

#include <atomic>
#include <filesystem>
#include <gtest/gtest.h>
#include <set>
#include <stdexcept>
#include <thread>

namespace KernelTest {
namespace {

using namespace Kernel;

class ArchiveAftermathTest : public testing::Test
{
protected:
    TestSupport::TempFolder m_folder;
    std::string const m_path = m_folder / "doc";
};

class FailingPostSave : public FileStorePostSaveInterface
{
public:
    void PostSave() override { throw std::runtime_error("post save"); }

private:
    ~FailingPostSave() override = default;
};

TEST_F(ArchiveAftermathTest, FailureOfAPostSaveObjectLeavesTheArchiveAtTheNewState)
{
    Counted<Archive> archive = CreateDocument(m_path);
    ASSERT_TRUE(Save(*archive, {{"a", "1"}}));
    Archive::CreateResult result;
    ASSERT_TRUE(archive->AddScratchFile(Str(m_folder / "scratch"), result));
    ASSERT_TRUE(Save(*archive, {{"a", "2"}, {"b", "2"}}, true));

    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->CreateFile(Str("c"), MakeCounted<BytesItem>("3"));
    handle->AddPostSaveObject(MakeCounted<FailingPostSave>());
    EXPECT_THROW(archive->CloseSession(handle, false), std::runtime_error);

    EXPECT_FALSE(archive->HaveScratchRevisions());
    ASSERT_TRUE(Save(*archive, {{"d", std::string(1000, 'd')}}, true));
    std::map<std::string, std::string> const expected = {
        {"a", "2"}, {"b", "2"}, {"c", "3"}, {"d", std::string(1000, 'd')}};
    EXPECT_EQ(GetAll(*archive), expected);
    archive = nullptr;
    archive = OpenDocument(m_folder / "scratch");
    ASSERT_TRUE(archive);
    EXPECT_EQ(GetAll(*archive), expected);
}

TEST_F(ArchiveAftermathTest, TemporaryThatHoldsASaveOutlivesAFailedMove)
{
    std::string const temporary = m_folder / "temporary";
    std::filesystem::create_directory(m_folder / "gone");
    Archive::MarshalledFileAccess marshalled;
    marshalled.path = Str(temporary);
    Archive::CreateResult result;
    Counted<Archive> archive =
        Archive::CreateWithAdjacentTemporary(Str(m_folder / "gone/doc"), c_documentTag, result, marshalled);
    ASSERT_TRUE(archive);
    std::filesystem::remove_all(m_folder / "gone");
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->CreateFile(Str("a"), MakeCounted<BytesItem>("1"));
    EXPECT_THROW(archive->CloseSession(handle, false), ArchiveFileException);
    archive = nullptr;
    archive = OpenDocument(temporary);
    ASSERT_TRUE(archive);
    EXPECT_EQ(Get(*archive, "a"), "1");
}

TEST_F(ArchiveAftermathTest, AbortFlagTakenBackStillCommitsNothing)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    bool abort = false;
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, &abort));
    handle->CreateFile(Str("half"), MakeCounted<BytesItem>("1"));
    abort = true;
    EXPECT_THROW(handle->CreateFile(Str("other half"), MakeCounted<BytesItem>("2")), AbortException);
    abort = false;
    archive->CloseSession(handle, false);
    EXPECT_TRUE(archive->IsEmpty());
}

TEST_F(ArchiveAftermathTest, SessionWaitsForASuspensionToEnd)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    ASSERT_TRUE(archive->Suspend());
    std::atomic<bool> ended{false};
    bool early = false;
    std::thread saver([&] {
        ArchiveSessionHandle handle;
        ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
        early = !ended;
        handle->CreateFile(Str("a"), MakeCounted<BytesItem>("1"));
        archive->CloseSession(handle, false);
    });
    for (int i = 0; i < 1000; ++i) std::this_thread::yield();
    ended = true;
    archive->Unsuspend();
    saver.join();
    EXPECT_FALSE(early);
    EXPECT_EQ(Get(*archive, "a"), "1");
}

TEST_F(ArchiveAftermathTest, EnumerationSessionNamesWhatItemsNameAndWritesNothing)
{
    class Folder : public BytesItem
    {
    public:
        FileStoreItemType const* GetObjectFileStoreItemType() const override
        {
            static FileStoreItemType const s_type(ClassUID("Fold"), BytesItem::c_type.GetCreateFunc(),
                                                  FileStoreItemType::IsNestableType, FileStoreItemType::NotRecoverable);
            return &s_type;
        }
    };
    Counted<Archive> const archive = CreateDocument(m_path);
    std::string const before = ReadWhole(m_path);
    auto const root = MakeCounted<Folder>();
    root->onSave = [](FileStoreOut& out) { out.CreateFile(Str("root/part"), MakeCounted<BytesItem>("1")); };
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateFileEnumerationSession(handle, nullptr));
    handle->SetEnumerateUsedFiles(true);
    handle->CreateFile(Str("root"), root);
    EXPECT_EQ(handle->GetEnumeratedPaths(), (std::set<String8>{Str("root"), Str("root/part")}));
    archive->CloseSession(handle, false);
    EXPECT_EQ(ReadWhole(m_path), before);
}

TEST_F(ArchiveAftermathTest, GuardWhoseStepOnlySeemedToFailIsStillOurs)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    ArchiveSessionHandle handle;
    {
        // All bytes that matter arrive, each time.
        TestSupport::FaultyFiles files;
        files.Plan({.call = TestSupport::FileCall::Write,
                    .forEver = true,
                    .error = EIO,
                    .part = TestSupport::Fault::Part::AllButOne});
        EXPECT_EQ(archive->CreateSessionAdv(handle, Archive::SessionTypeFull, nullptr, false),
                  Archive::SessionFileUnusable);
    }
    EXPECT_EQ(archive->GetLastRestoreResult(), Archive::RestoreGuardUnwritable);
    ASSERT_TRUE(Save(*archive, {{"a", "1"}}));
    // A step that is not ours is still seen.
    WriteWhole(m_path, ReadWhole(m_path).replace(68, 1, "\x7F"));
    EXPECT_EQ(archive->CreateSessionAdv(handle, Archive::SessionTypeFull, nullptr, false),
              Archive::SessionFileUnusable);
    EXPECT_EQ(archive->GetLastRestoreResult(), Archive::RestoreNotTheFile);
}

TEST(ArchiveMoveTest, FileThatHasMovedIsUsedWhereItIsThoughItsFolderCannotBeFlushed)
{
    TestSupport::TempFolder const folder;
    std::filesystem::create_directory(folder / "temp");
    TempFile::SetTempPath(Str(folder / "temp"));
    ASSERT_TRUE(Save(*CreateDocument(folder / "from"), {{"a", "1"}}));
    TestSupport::FaultyFiles files;
    files.Plan({.call = TestSupport::FileCall::FlushFolder, .forEver = true, .error = EIO});
    Archive::OpenResult opened{};
    Counted<Archive> archive = Archive::OpenMigrate(Str(folder / "from"), Str(folder / "to"), c_documentTag, opened);
    ASSERT_TRUE(archive);
    Archive::CreateResult created;
    ASSERT_TRUE(archive->AddScratchFile(Str(folder / "scratch"), created));
    EXPECT_EQ(archive->MigratePrepare(Str(folder / "moved")), Archive::MigrateDone);
    EXPECT_EQ(archive->MigrateRestore(Str(folder / "moved")), Archive::OpenOk);
    EXPECT_EQ(Get(*archive, "a"), "1");
    archive = nullptr;
    archive = OpenDocument(folder / "to");
    EXPECT_EQ(archive->CaptureToThrowaway(), Archive::CaptureDone);
    EXPECT_EQ(Get(*archive, "a"), "1");
    archive = nullptr;
    TempFile::SetTempPath(String8());
}

TEST(ArchiveMoveTest, SaveThatIsInPlaceStaysThereWhenItsFolderCannotBeFlushed)
{
    TestSupport::TempFolder const folder;
    std::string const path = folder / "target";
    ASSERT_TRUE(Save(*CreateDocument(path), {{"a", "old"}}));
    Archive::CreateResult result;
    Counted<Archive> archive = Archive::CreateWithAdjacentTemporary(Str(path), c_documentTag, result, {});
    ASSERT_TRUE(archive);
    {
        TestSupport::FaultyFiles files;
        files.Plan({.call = TestSupport::FileCall::FlushFolder, .forEver = true, .error = EIO});
        EXPECT_THROW(Save(*archive, {{"a", "new"}}), ArchiveFileException);
    }
    EXPECT_EQ(Get(*archive, "a"), "new");
    archive = nullptr;
    Counted<Archive> const again = OpenDocument(path);
    ASSERT_TRUE(again);
    EXPECT_EQ(Get(*again, "a"), "new");
}

} // namespace
} // namespace KernelTest

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

TEST_F(ArchiveAftermathTest, FileThatHasMovedIsUsedWhereItIsThoughItsFolderCannotBeFlushed)
{
    TempFile::SetTempPath(Str(m_folder.GetPath()));
    std::string const path = m_folder / "to";
    ASSERT_TRUE(Save(*CreateDocument(m_path), {{"a", "1"}}));
    TestSupport::FaultyFiles files;
    TestSupport::Fault const fault{.call = TestSupport::FileCall::FlushFolder, .forEver = true, .error = EIO};
    files.Plan(fault);
    Archive::OpenResult opened{};
    Counted<Archive> archive = Archive::OpenMigrate(Str(m_path), Str(path), c_documentTag, opened);
    ASSERT_TRUE(archive);
    Archive::CreateResult result;
    ASSERT_TRUE(archive->AddScratchFile(Str(m_folder / "scratch"), result));
    EXPECT_EQ(archive->MigratePrepare(Str(m_folder / "moved")), Archive::MigrateDone);
    EXPECT_EQ(archive->MigrateRestore(Str(m_folder / "moved")), Archive::OpenOk);
    EXPECT_EQ(Get(*archive, "a"), "1");
    archive = nullptr;
    // A save that may not last is no success, but stays where it is.
    archive = Archive::CreateWithAdjacentTemporary(Str(path), c_documentTag, result, {});
    ASSERT_TRUE(archive);
    EXPECT_THROW(Save(*archive, {{"a", "new"}}), ArchiveFileException);
    EXPECT_EQ(Get(*archive, "a"), "new");
    archive = nullptr;
    archive = OpenDocument(path);
    EXPECT_EQ(archive->CaptureToThrowaway(), Archive::CaptureDone);
    EXPECT_EQ(Get(*archive, "a"), "new");
    archive = nullptr;
    TempFile::SetTempPath(String8());
}

} // namespace
} // namespace KernelTest

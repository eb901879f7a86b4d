#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/filestore/FileStorePostSaveInterface.h"
#include "support/ArchiveFixture.h"
#include "support/FaultyFiles.h"

#include <gtest/gtest.h>
#include <set>
#include <stdexcept>

namespace KernelTest {
namespace {

using namespace Kernel;

using ArchiveAftermathTest = DocumentTest;

class FailingPostSave : public FileStorePostSaveInterface
{
public:
    void PostSave() override { throw std::runtime_error("post save"); }

private:
    ~FailingPostSave() override = default;
};

TEST_F(ArchiveAftermathTest, FailureOfAPostSaveObjectLeavesTheArchiveAtTheNewState)
{
    m_archive = CreateDocument(m_path);
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    AddScratch();
    ASSERT_TRUE(Save(*m_archive, {{"a", "2"}, {"b", "2"}}, true));

    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->CreateFile(Str("c"), MakeCounted<BytesItem>("3"));
    handle->AddPostSaveObject(MakeCounted<FailingPostSave>());
    EXPECT_THROW(m_archive->CloseSession(handle, false), std::runtime_error);

    EXPECT_FALSE(m_archive->HaveScratchRevisions());
    ASSERT_TRUE(Save(*m_archive, {{"d", std::string(1000, 'd')}}, true));
    std::map<std::string, std::string> const expected = {
        {"a", "2"}, {"b", "2"}, {"c", "3"}, {"d", std::string(1000, 'd')}};
    EXPECT_EQ(GetAll(*m_archive), expected);
    Reopen(m_scratchPath);
    EXPECT_EQ(GetAll(*m_archive), expected);
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
    m_archive = CreateDocument(m_path);
    std::string const before = ReadWhole(m_path);
    auto const root = MakeCounted<Folder>();
    root->onSave = [](FileStoreOut& out) { out.CreateFile(Str("root/part"), MakeCounted<BytesItem>("1")); };
    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateFileEnumerationSession(handle, nullptr));
    handle->SetEnumerateUsedFiles(true);
    handle->CreateFile(Str("root"), root);
    EXPECT_EQ(handle->GetEnumeratedPaths(), (std::set<String8>{Str("root"), Str("root/part")}));
    m_archive->CloseSession(handle, false);
    EXPECT_EQ(ReadWhole(m_path), before);
}

TEST_F(ArchiveAftermathTest, GuardWhoseStepOnlySeemedToFailIsStillOurs)
{
    m_archive = CreateDocument(m_path);
    {
        // All bytes that matter arrive, each time.
        TestSupport::FaultyFiles files;
        files.Plan({.call = TestSupport::FileCall::Write,
                    .forEver = true,
                    .error = EIO,
                    .part = TestSupport::Fault::Part::AllButOne});
        EXPECT_EQ(SessionResult(*m_archive), Archive::SessionFileUnusable);
    }
    EXPECT_EQ(m_archive->GetLastRestoreResult(), Archive::RestoreGuardUnwritable);
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    // A step that is not ours is still seen.
    WriteWhole(m_path, ReadWhole(m_path).replace(68, 1, "\x7F"));
    EXPECT_EQ(SessionResult(*m_archive), Archive::SessionFileUnusable);
    EXPECT_EQ(m_archive->GetLastRestoreResult(), Archive::RestoreNotTheFile);
}

TEST_F(ArchiveAftermathTest, FileThatHasMovedIsUsedWhereItIsThoughItsFolderCannotBeFlushed)
{
    std::string const path = m_folder / "to";
    ASSERT_TRUE(Save(*CreateDocument(m_path), {{"a", "1"}}));
    TestSupport::FaultyFiles files;
    TestSupport::Fault const fault{.call = TestSupport::FileCall::FlushFolder, .forEver = true, .error = EIO};
    files.Plan(fault);
    Archive::OpenResult opened{};
    m_archive = Archive::OpenMigrate(Str(m_path), Str(path), c_documentTag, opened);
    ASSERT_TRUE(m_archive);
    AddScratch();
    EXPECT_EQ(m_archive->MigratePrepare(Str(m_folder / "moved")), Archive::MigrateDone);
    EXPECT_EQ(m_archive->MigrateRestore(Str(m_folder / "moved")), Archive::OpenOk);
    EXPECT_EQ(Get(*m_archive, "a"), "1");
    m_archive = nullptr;
    // A save that may not last is no success, but stays where it is.
    Archive::CreateResult result;
    m_archive = Archive::CreateWithAdjacentTemporary(Str(path), c_documentTag, result, {});
    ASSERT_TRUE(m_archive);
    EXPECT_THROW(Save(*m_archive, {{"a", "new"}}), ArchiveFileException);
    EXPECT_EQ(Get(*m_archive, "a"), "new");
    Reopen(path);
    EXPECT_EQ(m_archive->CaptureToThrowaway(), Archive::CaptureDone);
    EXPECT_EQ(Get(*m_archive, "a"), "new");
    m_archive = nullptr;
}

} // namespace
} // namespace KernelTest

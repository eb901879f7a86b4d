#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/streams/InStream.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"
#include "support/FakeClock.h"
#include "support/FaultyFiles.h"

#include <atomic>
#include <cerrno>
#include <cstring>
#include <gtest/gtest.h>
#include <thread>
#include <utility>

// How the files of an open archive come and go under it.

namespace KernelTest {
namespace {

using namespace Kernel;
using TestSupport::ArchiveBuilder;
using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using Items = std::map<std::string, std::string>;
using ArchiveFileAccessTest = OneItemTest;

TEST_F(ArchiveFileAccessTest, ClosedFileMayMoveOnButNotBack)
{
    MakeDocument();
    Counted<Archive> const archive = OpenDocument(m_path);
    std::string const older = ReadWhole(m_path);
    EXPECT_FALSE(archive->CheckForReplacedFile());
    archive->SetKeepOpen(false);
    EXPECT_FALSE(archive->GetKeepOpen());
    ASSERT_TRUE(Save(*archive, {{"a", "22"}}));
    std::string const held = ReadWhole(m_path);
    // Free between accesses: somebody else saves.
    ASSERT_TRUE(Save(*OpenDocument(m_path), {{"a", "333"}}));
    EXPECT_TRUE(archive->CheckForReplacedFile());
    EXPECT_EQ(Get(*archive, "a"), "22"); // Its own state is still all there.
    EXPECT_EQ(archive->GetLastRestoreResult(), Archive::RestoreOk);
    std::string const newer = ReadWhole(m_path);
    ArchiveSessionHandle handle;
    EXPECT_EQ(SessionResult(*archive), Archive::SessionFileUnusable);
    EXPECT_EQ(ReadWhole(m_path), newer);
    EXPECT_TRUE(archive->IsBroken());

    struct
    {
        char const* what;
        std::string bytes;
        Archive::RestoreResult result;
    } const cases[] = {{"rolled back", older, Archive::RestoreNotTheFile},
                       {"another kind", ArchiveBuilder(12).Build(), Archive::RestoreNotTheFile},
                       {"empty", "", Archive::RestoreNotTheFile},
                       {"not rolled back", held, Archive::RestoreOk}};
    for (auto const& c : cases) {
        WriteWhole(m_path, newer);
        Counted<Archive> const other = OpenDocument(m_path);
        other->SetKeepOpen(false);
        WriteWhole(m_path, c.result == Archive::RestoreOk ? newer : c.bytes);
        EXPECT_EQ(Get(*other, "a"), c.result == Archive::RestoreOk ? std::optional<std::string>("333") : std::nullopt)
            << c.what;
        EXPECT_EQ(other->GetLastRestoreResult(), c.result) << c.what;
    }
}

TEST_F(ArchiveFileAccessTest, ReopeningTriesThreeTimesWhereItMayHelpAndKeepsTheCause)
{
    struct
    {
        int error;
        Archive::RestoreResult result;
        size_t pauses;
    } const cases[] = {{ENOENT, Archive::RestoreNotFound, 0},      {EACCES, Archive::RestoreNotPermitted, 0},
                       {EAGAIN, Archive::RestoreLocked, 2},        {ETIMEDOUT, Archive::RestoreTimedOut, 2},
                       {ECONNREFUSED, Archive::RestoreRefused, 2}, {EROFS, Archive::RestoreReadOnlyVolume, 0},
                       {EMFILE, Archive::RestoreOther, 0}};
    for (auto const& c : cases) {
        SCOPED_TRACE(std::strerror(c.error));
        MakeDocument();
        TestSupport::FakeClock const clock;
        Counted<Archive> const archive = OpenDocument(m_path);
        archive->SetKeepOpen(false);
        FaultyFiles files;
        files.Plan({FileCall::Open, 1, true, c.error});
        EXPECT_FALSE(Get(*archive, "a"));
        EXPECT_EQ(archive->GetLastRestoreResult(), c.result);
        EXPECT_EQ(clock.GetSleeps(), std::vector<i64>(c.pauses, 1000));
        EXPECT_TRUE(archive->IsBroken());
        EXPECT_FALSE(archive->IsCorrupted());
        // The failure stands, without another try.
        files.ResetCounts();
        EXPECT_FALSE(Get(*archive, "a"));
        EXPECT_EQ(files.GetCount(FileCall::Open), 0);
    }
}

/// Says what it is told to, and counts.
class Adorner : public Archive::AccessBlockAdorner
{
public:
    Adorner(bool agrees, bool writes) : m_agrees(agrees), m_writes(writes) {}
    bool Begin() override { return m_agrees; }
    /// Forgets, once it has been asked.
    bool WantsWriteAccess() const override { return std::exchange(m_writes, false); }

private:
    bool const m_agrees;
    mutable bool m_writes;
};

TEST_F(ArchiveFileAccessTest, AdornersDecideAboutBlocksAndCoordinatedWriting)
{
    MakeDocument();
    bool agrees = true;
    std::vector<std::pair<bool, bool>> asked;
    Archive::OpenResult result{};
    Counted<Archive> const archive = Archive::Open(
        Str(m_path), Archive::OpenModeCoordinated, c_documentTag, result,
        [&](bool exclusive, bool upgradeable) {
            asked.emplace_back(exclusive, upgradeable);
            return MakeCounted<Adorner>(agrees, exclusive || upgradeable);
        },
        nullptr);
    ASSERT_TRUE(archive);
    EXPECT_FALSE(archive->IsReadOnly());
    archive->SetKeepOpen(false);
    EXPECT_EQ(Get(*archive, "a"), "1");
    {
        // Reopened for reading, it stands in nobody's way.
        Counted<InStream> const in = archive->OpenFileInStream(Str("a"));
        ASSERT_TRUE(in);
        EXPECT_EQ(archive->GetAccessCount(), 1u);
        EXPECT_EQ(ResultOfOpening(m_path, Archive::OpenModeReadWrite), Archive::OpenOk);
        // A session asks for more, and gets it while the reader reads on.
        ASSERT_TRUE(Save(*archive, {{"b", "2"}}));
        char one = 0;
        EXPECT_EQ(in->ReadBlock(&one, 1), 1u);
    }
    EXPECT_FALSE(archive->HaveAccessCount());
    {
        Counted<InStream> const in = archive->OpenFileInStream(Str("a"));
        EXPECT_EQ(ResultOfOpening(m_path, Archive::OpenModeReadWrite), Archive::OpenOk);
    }
    using P = std::pair<bool, bool>;
    EXPECT_EQ(asked, (std::vector<P>{P(false, false), P(false, true), P(false, false)}));
    EXPECT_FALSE(archive->CreateAccessBlock(MakeCounted<Adorner>(false, true)));
    EXPECT_TRUE(archive->CreateAccessBlock(nullptr));
    agrees = false;
    EXPECT_FALSE(archive->OpenFileInStream(Str("a")));
    ArchiveSessionHandle handle;
    EXPECT_EQ(SessionResult(*archive), Archive::SessionNoMemory);
    EXPECT_FALSE(archive->HaveAccessCount());
}

TEST_F(ArchiveFileAccessTest, SuspendedArchiveLeavesItsFileAloneUntilItGoesOn)
{
    MakeDocument(std::string(100'000, 'x'));
    Counted<Archive> const archive = OpenDocument(m_path);
    ASSERT_TRUE(archive->Suspend());
    EXPECT_TRUE(archive->IsSuspended());
    archive->Unsuspend();
    // Readers, savers and loaders on other threads never have the file open while this one has it suspended.
    std::atomic<bool> stop{false};
    std::atomic<int> reads{0};
    std::vector<std::thread> threads;
    FaultyFiles files;
    threads.emplace_back([&] {
        for (; !stop; ++reads) ASSERT_TRUE(Get(*archive, "a"));
    });
    threads.emplace_back([&] {
        for (; !stop; ++reads) ASSERT_TRUE(archive->OpenFileInStream(Str("a")));
    });
    threads.emplace_back([&] {
        for (int n = 0; !stop; ++n) ASSERT_TRUE(Save(*archive, {{"n", std::to_string(n)}}));
    });
    while (reads == 0) std::this_thread::yield();
    int found = 0;
    for (int n = 0; n < 15; ++n) {
        ASSERT_TRUE(archive->Suspend());
        for (int look = 0; look < 20; ++look) {
            found += files.GetOpenHandles() != 0;
            std::this_thread::yield();
        }
        archive->Unsuspend();
    }
    stop = true;
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(found, 0);
    // A block in use holds the suspension up, unless it is overridden.
    Counted<Archive::AccessBlock> block = archive->CreateAccessBlock(nullptr);
    archive->IncrementAccessOverride();
    EXPECT_TRUE(archive->Suspend());
    archive->Unsuspend();
    archive->DecrementAccessOverride();
    std::thread waiter([&] { EXPECT_TRUE(archive->Suspend()); });
    EXPECT_FALSE(archive->IsSuspended());
    block = nullptr;
    waiter.join();
    EXPECT_TRUE(archive->IsSuspended());
    archive->Unsuspend();
    Archive::CreateResult result;
    EXPECT_FALSE(Archive::CreateWithTemporary(Str(m_folder / "t"), c_documentTag, result)->Suspend());
}

// Or a question that whoever suspended it has would not be answered.
TEST_F(ArchiveFileAccessTest, WhoWaitsForASuspendedArchiveHoldsNoLock)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    std::atomic<bool> stop{false};
    std::thread saver([&] {
        for (int n = 0; !stop; ++n) {
            String8 report;
            ArchiveSessionHandle handle;
            ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
            handle->CreateFile(Str("n"), MakeCounted<BytesItem>(std::to_string(n)));
            ASSERT_EQ(archive->CloseSessionAndVerifyFileState(handle, report, false), Archive::VerifyMatch);
        }
    });
    std::thread extractor([&] {
        while (!stop) archive->ExtractToRawData();
    });
    for (int n = 0; n < 30; ++n) {
        ASSERT_TRUE(archive->Suspend());
        for (int look = 0; look < 20; ++look) std::this_thread::yield();
        archive->RequiresStreamlining();
        archive->Unsuspend();
    }
    stop = true;
    saver.join();
    extractor.join();
}

TEST_F(ArchiveFileAccessTest, ScratchFileMovesAndComesBack)
{
    MakeDocument();
    std::string const to = m_folder / "elsewhere";
    EXPECT_EQ(OpenDocument(m_path)->MigratePrepare(Str(to)), Archive::MigrateNoScratch);
    Counted<Archive> const archive = MakePair();
    EXPECT_EQ(archive->MigratePrepare(String8()), Archive::MigrateEmptyPath);
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateScratchSession(handle, Archive::SessionTypeFull, nullptr));
    EXPECT_EQ(archive->MigratePrepare(Str(to)), Archive::MigrateBusy);
    handle.Release();
    EXPECT_EQ(archive->MigrateRestore(Str(m_scratchPath)), Archive::OpenInUse); // Nothing has been moved away.
    Items const all = {{"a", "1"}, {"s", "scratch"}};
    {
        FaultyFiles files;
        TestSupport::FakeClock const clock;
        files.Plan({FileCall::Rename, 1, true, EACCES});
        EXPECT_EQ(archive->MigratePrepare(Str(to)), Archive::MigrateMoveFailed);
        EXPECT_EQ(GetAll(*archive), all);
    }
    ASSERT_EQ(archive->MigratePrepare(Str(to)), Archive::MigrateDone);
    EXPECT_TRUE(GetAll(*archive).empty());
    EXPECT_FALSE(archive->OpenFileInStream(Str("a")));
    EXPECT_EQ(SessionResult(*archive), Archive::SessionMoved);
    EXPECT_EQ(archive->MigrateRestore(Str(m_scratchPath)), Archive::OpenNotFound);
    EXPECT_EQ(SessionResult(*archive), Archive::SessionMoved);
    ASSERT_EQ(archive->MigrateRestore(Str(to)), Archive::OpenOk);
    EXPECT_EQ(GetAll(*archive), all);
    EXPECT_EQ(archive->GetScratchPath().GetData(), to);
    ASSERT_TRUE(Save(*archive, {{"m", "2"}}));
    EXPECT_EQ(GetAll(*archive).size(), 3u);
}

TEST_F(ArchiveFileAccessTest, ThirdPartyMayReplaceTheMaster)
{
    Counted<Archive> archive = MakePair();
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    EXPECT_EQ(archive->ExternalUpdatePrepare(), Archive::ExternalUpdateBusy);
    handle.Release();
    EXPECT_FALSE(archive->ReadyForExternalUpdate());
    EXPECT_FALSE(archive->ExternalUpdateRestore());
    ASSERT_EQ(archive->ExternalUpdatePrepare(), Archive::ExternalUpdateDone);
    EXPECT_EQ(archive->ExternalUpdatePrepare(), Archive::ExternalUpdateAlreadyPrepared);
    EXPECT_TRUE(archive->ReadyForExternalUpdate());
    EXPECT_FALSE(Get(*archive, "a"));
    EXPECT_EQ(SessionResult(*archive), Archive::SessionMoved);
    std::filesystem::rename(m_path, m_path + "2");
    EXPECT_TRUE(archive->ExternalUpdateRestore(Str(m_path + "2")));
    EXPECT_EQ(Get(*archive, "a"), "1");
    ASSERT_TRUE(Save(*archive, {{"b", "2"}}));

    ASSERT_TRUE(Save(*archive, {{"s", "3"}}, true));
    ASSERT_EQ(archive->ExternalUpdatePrepare(), Archive::ExternalUpdateDone);
    std::filesystem::remove(m_path + "2");
    EXPECT_TRUE(archive->ExternalUpdateRestoreToUnsaved());
    EXPECT_TRUE(archive->IsJustScratchFile());
    EXPECT_EQ(Get(*archive, "s"), "3");
    EXPECT_FALSE(Get(*archive, "a"));
    ASSERT_TRUE(Save(*archive, {{"t", "4"}}, true));
    EXPECT_EQ(Get(*archive, "t"), "4");

    // Another file at its place is not taken.
    MakeDocument("22");
    archive = OpenDocument(m_path);
    ASSERT_EQ(archive->ExternalUpdatePrepare(), Archive::ExternalUpdateDone);
    ASSERT_TRUE(Save(*OpenDocument(m_path), {{"a", "333"}}));
    EXPECT_FALSE(archive->ExternalUpdateRestore());
    EXPECT_EQ(archive->GetLastRestoreResult(), Archive::RestoreNotTheFile);
}

TEST_F(ArchiveFileAccessTest, ReadOnlyAttributeIsReadAgain)
{
    MakeDocument();
    Counted<Archive> const archive = OpenDocument(m_path);
    EXPECT_FALSE(archive->CheckForReadOnlyChange());
    std::filesystem::permissions(m_path, std::filesystem::perms::owner_read);
    EXPECT_TRUE(archive->CheckForReadOnlyChange());
    EXPECT_TRUE(archive->IsReadOnly());
    EXPECT_FALSE(archive->CheckForReadOnlyChange());
    std::filesystem::permissions(m_path, std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
    EXPECT_TRUE(archive->CheckForReadOnlyChange());
    EXPECT_FALSE(archive->IsReadOnly());
    EXPECT_TRUE(archive->UpdateModifiedTimestamp());
}

} // namespace
} // namespace KernelTest

#include "libkernel/core/LogSink.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/platform/Errors.h"
#include "support/CrashImages.h"
#include "support/FakeClock.h"
#include "support/FaultyFiles.h"
#include "support/FileFixture.h"
#include "support/Rows.h"

#include <vector>

namespace Kernel {
namespace {

using TestSupport::FakeClock;
using TestSupport::Fault;
using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::MemoryDisk;
using TestSupport::ReadWholeFile;
using TestSupport::S;
using TestSupport::WriteWholeFile;
using MoveResult = FileSystem::SafeMoveFileResult;

/// Puts two volumes in place: what is called "old" lies on another one than the rest and can't be renamed.
class TwoVolumes
{
public:
    TwoVolumes()
    {
        static Platform::FileCalls s_calls;
        s_calls = Platform::GetSystemFileCalls();
        s_calls.rename = [](char const* from, char const* to) {
            return std::string(from).ends_with("/old") ? EXDEV : Platform::GetSystemFileCalls().rename(from, to);
        };
        Platform::SetFileCalls(&s_calls);
    }
    ~TwoVolumes() { Platform::SetFileCalls(nullptr); }
};

/// A folder with "old" and "target", a clock that stands still, a log that is kept, and files that can fail.
class FileSystemMovesTest : public TestSupport::FileFixture, LogSink
{
protected:
    FileSystemMovesTest()
    {
        m_before = SetLogSink(this);
        Make("old", "new content");
        Make("target", "target content");
    }
    ~FileSystemMovesTest() override { SetLogSink(m_before); }

    void WriteMessage(int level, String8 const& text) override
    {
        EXPECT_EQ(level, 1);
        m_log.push_back(text.GetData());
    }

    std::string Read(std::string const& name) const { return ReadWholeFile(m_folder / name); }
    std::vector<std::string> List() const
    {
        std::vector<std::string> names;
        for (auto const& e : std::filesystem::directory_iterator(m_folder.GetPath()))
            names.push_back(e.path().filename());
        std::sort(names.begin(), names.end());
        return names;
    }

    FakeClock m_clock;
    std::vector<std::string> m_log;
    LogSink* m_before;
};

using Names = std::vector<std::string>;
using Pauses = std::vector<i64>;

TEST_F(FileSystemMovesTest, MoveReplacesTheTargetAndFlushesContentsAndName)
{
    FaultyFiles faults;
    faults.Plan({.call = FileCall::Rename, .n = 1, .error = EACCES}); // A failure that passes costs one pause.
    EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("old"), At("target"), 3), MoveResult::Moved);
    EXPECT_EQ(m_clock.GetSleeps(), Pauses{1000});
    EXPECT_EQ(Read("target"), "new content");
    EXPECT_EQ(List(), Names{"target"});
    EXPECT_GE(faults.GetCount(FileCall::Flush), 1);
    EXPECT_GE(faults.GetCount(FileCall::FlushFolder), 1);
    EXPECT_EQ(faults.GetOpenHandles(), 0);
    EXPECT_TRUE(m_log.empty());
}

TEST_F(FileSystemMovesTest, RenameIsTriedAgainOnlyWhereTheFailureMayPass)
{
    // Retried by a move and a delete, and by a rename.
    std::vector<std::tuple<int, bool, bool>> cases;
    for (int const error : {EMFILE, ENFILE, EACCES, EPERM}) cases.emplace_back(error, true, true);
    for (int const error : {EBUSY, ETXTBSY}) cases.emplace_back(error, false, true);
    for (int const error : {ENOSPC, EIO, EROFS}) cases.emplace_back(error, false, false);
    for (auto const& [failure, isRetriedByMove, isRetriedByRename] : cases) {
        int const error = failure;
        SCOPED_TRACE(error);
        FaultyFiles faults;
        auto const run = [&](FileCall call, bool isRetried, auto const& operation) {
            FakeClock clock;
            faults.Clear();
            faults.ResetCounts();
            faults.Plan({.call = call, .forEver = true, .error = error});
            operation();
            EXPECT_EQ(clock.GetSleeps(), isRetried ? Pauses({1000, 1000}) : Pauses());
            return faults.GetCount(call);
        };
        int const tries = isRetriedByMove ? 3 : 1;
        // One more rename than the tries: that of the copy beside the target.
        EXPECT_EQ(run(FileCall::Rename, isRetriedByMove,
                      [&] { EXPECT_NE(FileSystem::SafeMoveFileAdv(At("old"), At("target"), 2), MoveResult::Moved); }),
                  tries + 1);
        EXPECT_EQ(run(FileCall::Rename, isRetriedByRename,
                      [&] { EXPECT_FALSE(FileSystem::RenameFile(At("old"), At("target"), 2)); }),
                  isRetriedByRename ? 3 : 1);
        EXPECT_EQ(run(FileCall::Unlink, isRetriedByMove, [&] { EXPECT_FALSE(FileSystem::Delete(At("old"), 2)); }),
                  tries);
        EXPECT_EQ(List(), (Names{"old", "target"}));
        EXPECT_EQ(Read("target"), "target content");
    }
}

TEST_F(FileSystemMovesTest, MissingSourceFailsWithoutPauseCopyOrMessage)
{
    FaultyFiles faults;
    EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("missing"), At("target"), 5), MoveResult::Failed);
    EXPECT_TRUE(FileSystem::Delete(At("missing"), 5));
    EXPECT_FALSE(FileSystem::RenameFile(At("missing"), At("target"), 5));
    EXPECT_EQ(m_clock.GetSleeps(), Pauses());
    EXPECT_EQ(faults.GetCount(FileCall::Write), 0);
    EXPECT_TRUE(m_log.empty());
    EXPECT_EQ(Read("target"), "target content");
}

TEST_F(FileSystemMovesTest, HeldTargetIsTriedOnceAndThenCopiedOver)
{
    FaultyFiles faults;
    faults.Plan({.call = FileCall::Rename, .n = 1, .error = EACCES});
    EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("old"), At("target"), 0), MoveResult::Moved);
    EXPECT_EQ(Read("target"), "new content");
    EXPECT_EQ(List(), Names{"target"});
    std::string const old = m_folder / "old", target = m_folder / "target";
    EXPECT_EQ(m_log, std::vector<std::string>({"SafeMoveFile error: MoveFileExW failed with code " +
                                               std::to_string(EACCES) + "!\n\tOld: " + old + "\n\tNew: " + target}));

    WriteWholeFile(old, "again");
    faults.Clear();
    faults.Plan({.call = FileCall::Rename, .forEver = true, .error = EACCES});
    EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("old"), At("target"), 0), MoveResult::AccessDenied);
    EXPECT_EQ(List(), (Names{"old", "target"}));
    EXPECT_EQ(m_log.back(), "SafeMoveFile error: CopyFileExW failed with code " + std::to_string(EACCES) +
                                "!\n\tOld: " + old + "\n\tNew: " + target);
}

TEST_F(FileSystemMovesTest, MoveBetweenVolumesKeepsTheFileWholeAndFollowsNoPlantedLink)
{
    namespace fs = std::filesystem;
    std::string big(2'500'000, 'b');
    WriteWholeFile(m_folder / "old", big);
    bool const hasMarks = FileSystem::SetFileHidden(At("old"), true);
    fs::permissions(m_folder / "old", fs::perms(0640));
    // The names that are tried next for a temporary are all taken by links to a precious file.
    WriteWholeFile(m_folder / "precious", "precious");
    for (int i = 0; i < 200; ++i) fs::create_symlink("precious", m_folder / ("~move" + std::to_string(i)));
    TwoVolumes const volumes;
    FaultyFiles faults;
    EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("old"), At("target"), 0), MoveResult::Moved);
    EXPECT_EQ(Read("target"), big);
    EXPECT_EQ(Read("precious"), "precious");
    EXPECT_FALSE(fs::exists(m_folder / "old"));
    EXPECT_EQ(List().size(), 202u);
    EXPECT_EQ(fs::symlink_status(m_folder / "target").permissions(), fs::perms(0640));
    EXPECT_EQ(FileSystem::GetFileHidden(At("target")).second, hasMarks);
    EXPECT_TRUE(m_log.empty());
    EXPECT_EQ(faults.GetOpenHandles(), 0);
}

TEST_F(FileSystemMovesTest, SourceThatStaysAfterTheCopyIsAWarning)
{
    TwoVolumes const volumes;
    FaultyFiles faults;
    faults.Plan({.call = FileCall::Unlink, .forEver = true, .error = EBUSY});
    EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("old"), At("target"), 4), MoveResult::Moved);
    EXPECT_EQ(Read("target"), "new content");
    EXPECT_EQ(List(), (Names{"old", "target"}));
    ASSERT_EQ(m_log.size(), 1u);
    EXPECT_EQ(m_log[0], "SafeMoveFile warning: DeleteFileW failed with code " + std::to_string(EBUSY) +
                            "!\n\tPath: " + (m_folder / "old"));
}

TEST_F(FileSystemMovesTest, EveryFaultOfACopyingMoveLeavesSourceOrTargetWhole)
{
    for (auto const& row : Rows<Fault, MoveResult>{
             {{.call = FileCall::Read, .error = EIO}, MoveResult::Failed},
             {{.call = FileCall::Write, .error = ENOSPC, .part = Fault::Part::Half}, MoveResult::DiskFull},
             {{.call = FileCall::Write, .error = EDQUOT, .part = Fault::Part::AllButOne}, MoveResult::DiskFull},
             {{.call = FileCall::Write, .part = Fault::Part::Half}, MoveResult::Failed},
             {{.call = FileCall::Flush, .error = EIO}, MoveResult::Failed},
             {{.call = FileCall::Flush, .error = ENOSPC}, MoveResult::DiskFull},
             {{.call = FileCall::FlushFolder, .error = EIO}, MoveResult::Failed},
             {{.call = FileCall::Open, .error = EMFILE}, MoveResult::Failed},
             {{.call = FileCall::Open, .error = EACCES}, MoveResult::AccessDenied},
             {{.call = FileCall::Close, .error = EIO}, MoveResult::Failed},
             {{.call = FileCall::SetAttributes, .error = EPERM}, MoveResult::Moved},
             {{.call = FileCall::Rename, .error = EROFS}, MoveResult::Failed},
         })
    {
        Fault const& fault = std::get<0>(row);
        MoveResult const expected = std::get<1>(row);
        TwoVolumes const volumes;
        MoveResult result = MoveResult::Moved;
        auto const operation = [&](FaultyFiles& faults) {
            WriteWholeFile(m_folder / "old", "new content");
            WriteWholeFile(m_folder / "target", "target content");
            result = FileSystem::SafeMoveFileAdv(At("old"), At("target"), 0);
            EXPECT_EQ(faults.GetOpenHandles(), 0);
        };
        auto const check = [&](int n) {
            SCOPED_TRACE(testing::Message() << "call " << int(fault.call) << " error " << fault.error << " n " << n);
            // A fault in opening the source for its flush, or in closing it, is passed over.
            EXPECT_TRUE(result == expected || result == MoveResult::Moved) << int(result);
            std::string const target = Read("target");
            EXPECT_TRUE(target == "target content" || target == "new content");
            EXPECT_TRUE(target == "new content" || Read("old") == "new content");
            EXPECT_TRUE(target == "new content" || result != MoveResult::Moved);
            EXPECT_EQ(List(), result == MoveResult::Moved ? Names{"target"} : Names({"old", "target"}));
        };
        int const fired = TestSupport::ForEachFault(fault, operation, check, 100);
        EXPECT_TRUE(fired > 0 && fired < 100);
    }
}

TEST_F(FileSystemMovesTest, PowerCutDuringAMoveLeavesOldOrNewContent)
{
    std::string const fresh(3000, 'N');
    auto const replaced = std::make_shared<std::string const>(2000, 't');
    for (bool between : {false, true}) {
        SCOPED_TRACE(between);
        MemoryDisk disk;
        disk.Load({{"/ram/old", std::make_shared<std::string const>(3000, 'n')}, {"/ram/target", replaced}});
        disk.StartRecording();
        // Written and closed, but not flushed, as a writer without guarantees leaves it.
        Platform::FileHandle handle = Platform::c_noHandle;
        auto const& calls = Platform::GetFileCalls();
        ASSERT_EQ(calls.open("/ram/old", {.write = true, .truncate = true}, handle), 0);
        calls.write(handle, fresh.data(), fresh.size());
        calls.close(handle);
        FaultyFiles faults;
        if (between) faults.Plan({.call = FileCall::Rename, .forEver = true, .error = EXDEV, .path = "/old\n"});
        ASSERT_EQ(FileSystem::SafeMoveFileAdv("/ram/old", "/ram/target", 0), MoveResult::Moved);
        MemoryDisk::Recording const recording = disk.StopRecording();
        TestSupport::ForEachCrashImage(recording, {}, [&](MemoryDisk::Image const& image, u64 steps) {
            bool const returned = steps == recording.steps.size();
            std::string const& target = *image.at("/ram/target");
            ASSERT_TRUE(target == fresh || (target == *replaced && !returned)) << "behind step " << steps;
        });
    }
}

TEST_F(FileSystemMovesTest, MoveThatMayNotLastFailsButTellsThatItWasMade)
{
    FaultyFiles faults;
    faults.Plan({.call = FileCall::FlushFolder, .forEver = true, .error = EIO});
    bool isMade = false;
    EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("old"), At("target"), 0, &isMade), MoveResult::Failed);
    EXPECT_TRUE(isMade);
    EXPECT_FALSE(FileSystem::RenameFile(At("target"), At("third"), 0, &isMade));
    EXPECT_TRUE(isMade);
    EXPECT_EQ(Read("third"), "new content");
    String8 out;
    EXPECT_EQ(FileSystem::RenameFileForBackup(At("third"), out), FileSystem::RenameFileForBackupResult::Failed);
    EXPECT_EQ(out, At("third_backup1"));
    faults.Clear();
    faults.Plan({.call = FileCall::Rename, .forEver = true, .error = EIO});
    EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("third_backup1"), At("old"), 0, &isMade), MoveResult::Failed);
    EXPECT_FALSE(isMade);
    EXPECT_EQ(Read("third_backup1"), "new content");
}

TEST_F(FileSystemMovesTest, MoveBetweenNamesOfOneFileLeavesTheNewNameAlone)
{
    std::filesystem::create_directory(m_folder / "sub");
    auto const rename = [&](auto const& to) { return FileSystem::RenameFile(At("old"), At(to), 0); };
    auto const move = [&](auto const& to) { return FileSystem::SafeMoveFile(At("old"), At(to)); };
    auto const run = [&](std::string const& to, auto const& operation) {
        Make("old", "content");
        std::filesystem::remove(m_folder / "third");
        std::filesystem::create_hard_link(m_folder / "old", m_folder / "third");
        bool const oldGoes = to.ends_with("second"); // Otherwise it is the same name.
        if (oldGoes) std::filesystem::create_hard_link(m_folder / "old", m_folder / to);
        EXPECT_TRUE(operation(to)) << to;
        EXPECT_EQ(std::filesystem::exists(m_folder / "old"), !oldGoes) << to;
        EXPECT_EQ(Read(to), "content") << to;
        std::filesystem::remove(m_folder / to);
    };
    for (char const* const to : {"second", "sub/second", "old", "sub/.././old"}) {
        run(to, rename);
        run(to, move);
        // Where nothing can be renamed a copy would take its place, and the file's only name would go.
        TwoVolumes const volumes;
        FaultyFiles faults;
        run(to, move);
        EXPECT_EQ(faults.GetCount(FileCall::Write), 0);
    }
}

TEST_F(FileSystemMovesTest, LinkMovesBetweenVolumesAsALink)
{
    std::filesystem::remove(m_folder / "old");
    for (char const* const leadsTo : {"precious", "nowhere"}) {
        WriteWholeFile(m_folder / "precious", "precious");
        std::filesystem::create_symlink(leadsTo, m_folder / "old");
        TwoVolumes const volumes;
        EXPECT_EQ(FileSystem::SafeMoveFileAdv(At("old"), At("target"), 0), MoveResult::Moved);
        EXPECT_EQ(List(), (Names{"precious", "target"}));
        EXPECT_TRUE(std::filesystem::is_symlink(m_folder / "target"));
        EXPECT_EQ(std::filesystem::read_symlink(m_folder / "target"), leadsTo);
        EXPECT_EQ(Read("precious"), "precious");
    }
}

TEST_F(FileSystemMovesTest, BackupTakesTheFirstFreeNumber)
{
    String8 out;
    WriteWholeFile(m_folder / "old_backup1", "taken");
    std::filesystem::create_symlink("nowhere", m_folder / "old_backup2");
    EXPECT_EQ(FileSystem::RenameFileForBackup(At("old"), out), FileSystem::RenameFileForBackupResult::Renamed);
    EXPECT_EQ(out, At("old_backup3"));
    EXPECT_EQ(Read("old_backup3"), "new content");
    EXPECT_EQ(Read("old_backup1"), "taken");

    using Result = FileSystem::RenameFileForBackupResult;
    FaultyFiles faults;
    for (auto const& [error, result] :
         {std::pair{EACCES, Result::AccessDenied}, {ENOSPC, Result::DiskFull}, {EIO, Result::Failed}})
    {
        faults.Clear();
        faults.Plan({.call = FileCall::Rename, .forEver = true, .error = error});
        out = "untouched";
        EXPECT_EQ(FileSystem::RenameFileForBackup(At("target"), out), result);
        EXPECT_EQ(out, "untouched");
    }
}

TEST_F(FileSystemMovesTest, CopyOverwritesFollowsLinksAndSparesDevicesAndItself)
{
    std::filesystem::create_symlink("target", m_folder / "link");
    EXPECT_TRUE(FileSystem::CopyFile(At("old"), At("link")));
    EXPECT_EQ(Read("target"), "new content");
    EXPECT_TRUE(std::filesystem::is_symlink(m_folder / "link"));
    EXPECT_TRUE(FileSystem::CopyFile(At("old"), At("fresh")));
    EXPECT_EQ(Read("fresh"), "new content");

    std::filesystem::create_hard_link(m_folder / "old", m_folder / "hard");
    for (String8 const& target : {At("old"), At("hard"), At("no/such/folder"), S(m_folder.GetPath())})
        EXPECT_FALSE(FileSystem::CopyFile(At("old"), target)) << target.GetData();
    EXPECT_FALSE(FileSystem::CopyFile(At("missing"), At("fresh")));
    EXPECT_EQ(FileSystem::CopyFileAdv(At("old"), "/dev/null"), FileSystem::CopyFileResult::Failed);
    EXPECT_EQ(Read("old"), "new content");
    EXPECT_EQ(Read("fresh"), "new content");
    EXPECT_EQ(List(), (Names{"fresh", "hard", "link", "old", "target"}));
}

} // namespace
} // namespace Kernel

#include "CrashJudge.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/FileInOutStream.h"
#include "support/ArchiveFixture.h"
#include "support/FakeClock.h"
#include "support/LongTests.h"

#include <algorithm>
#include <cstring>
#include <iostream>

// Power cuts at every moment of every short history of a document.

namespace KernelTest {
namespace {

using namespace Kernel;
using TestSupport::MemoryDisk;
using Image = MemoryDisk::Image;

class CrashSimulatorTest : public testing::Test
{
protected:
    static constexpr int c_shards = 4;
    static constexpr int c_depth = 3;

    CrashSimulatorTest()
    {
        m_plan = IsLongRun() ? TestSupport::CrashPlan{10'000, 2'460, 1'000} : TestSupport::CrashPlan{60, 60, 24};
        m_secondCuts = IsLongRun() ? 8 : 2;
        Platform::GetFileCalls().makeFolder("/ram/tmp");
        Platform::GetFileCalls().makeFolder("/ram/tmp/second");
        std::vector<String8> rescued;
        TempFile::SetTempPath("/ram/tmp", "/ram/tmp/second", rescued);
    }
    ~CrashSimulatorTest() override
    {
        Archive::PostShutdown();
        TempFile::SetTempPath(String8());
    }

    // Records @p operation on @p before and leaves the disk as it was afterwards.
    MemoryDisk::Recording Record(CrashOperation const& operation, int n, Image& before, Image& after)
    {
        m_clock.AdvanceMs(m_pauseMs);
        m_disk.Load(before);
        operation.prepare(n);
        before = m_disk.GetImage();
        m_clock.AdvanceMs(m_pauseMs);
        m_disk.StartRecording();
        operation.run(n);
        MemoryDisk::Recording recording = m_disk.StopRecording();
        after = m_disk.GetImage();
        EXPECT_EQ(m_disk.GetOpenHandles(), 0u);
        return recording;
    }

    // One history in c_shards is judged, so that the shards can run side by side.
    void Explore(Image const& start, bool withScratch, int shard, int depth, std::string const& history)
    {
        for (CrashOperation const& operation : GetCrashOperations()) {
            if (operation.needsScratchFile && !withScratch) continue;
            Image before = start;
            Image after;
            MemoryDisk::Recording const recording = Record(operation, depth + 1, before, after);
            std::string const name = history + ", " + operation.name;
            if (HasFatalFailure()) return;
            ASSERT_EQ(after.size(), withScratch ? 2u : 1u) << "history:" << name;
            ASSERT_EQ(CheckCrashTrace(recording, operation.kind), "") << "history:" << name;
            if (m_histories++ % c_shards == shard) {
                ++m_figures.recordings;
                CrashJudge judge(m_disk, m_figures, operation.kind, before, after, withScratch);
                judge.Run(recording, m_plan, m_secondCuts, 4);
                ASSERT_EQ(judge.GetFault(), "") << "history:" << name;
            }
            if (depth + 1 < c_depth) Explore(after, withScratch, shard, depth + 1, name);
            if (HasFatalFailure()) return;
        }
    }

    MemoryDisk m_disk;
    TestSupport::FakeClock m_clock;
    TestSupport::CrashPlan m_plan;
    u64 m_secondCuts;
    i64 m_pauseMs = 2000; // Between two saves.
    CrashFigures m_figures;
    int m_histories = 0;
};

class CrashHistoriesTest : public CrashSimulatorTest, public testing::WithParamInterface<int>
{
};

TEST_P(CrashHistoriesTest, EveryPowerCutOfEveryShortHistoryLeavesTheOldOrTheNewState)
{
    Explore(MakeCrashDocument(m_disk, false), false, GetParam(), 0, "alone");
    ASSERT_FALSE(HasFatalFailure());
    Explore(MakeCrashDocument(m_disk, true), true, GetParam(), 0, "with scratch");
    ASSERT_FALSE(HasFatalFailure());
    m_pauseMs = 0; // All saves of a history within one second.
    Explore(MakeCrashDocument(m_disk, true), true, GetParam(), c_depth - 2, "in one second");
    CrashFigures const& f = m_figures;
    std::cout << "recorded " << f.recordings << " operations, " << f.images << " distinct images: " << f.old << " old, "
              << f.fresh << " new, " << f.recovered << " recovered, " << f.elsewhere << " with the document elsewhere, "
              << f.unread << " scratch files unread, " << f.smashed << " recovered without an info block\n";
    EXPECT_GT(f.images, (IsLongRun() ? 1'000'000u : 100'000u) / c_shards);
    EXPECT_GT(f.elsewhere, 0u);
}

// A save into a temporary that then takes the document's place: some whole document is always there, and the target
// is never in part.
TEST_F(CrashSimulatorTest, EveryPowerCutOfAReplacementLeavesAWholeDocument)
{
    u64 images = 0;
    for (CrashReplacement const& replacement : GetCrashReplacements()) {
        SCOPED_TRACE(replacement.name);
        CrashOperation const operation = {"replace", CrashOperation::Kind::Streamline, [&](int n) {
                                              Archive::CreateResult result;
                                              Counted<Archive> const archive = replacement.create(result);
                                              ASSERT_TRUE(archive && SaveStep(*archive, n));
                                          }};
        Image before = replacement.hasOld ? MakeCrashDocument(m_disk, false) : Image();
        Image after;
        MemoryDisk::Recording const recording = Record(operation, 1, before, after);
        ASSERT_FALSE(HasFatalFailure());
        if (replacement.hasOld) {
            ASSERT_EQ(CheckCrashTrace(recording, operation.kind), "");
        }
        m_disk.Load(before);
        View const old = Look(c_crashMaster);
        m_disk.Load(after);
        View const fresh = Look(c_crashMaster);
        ASSERT_TRUE(fresh.IsOpen() && old.IsOpen() == replacement.hasOld && !fresh.IsSame(old));
        ASSERT_EQ(after.size(), 1u);
        std::unordered_set<u64> seen;
        TestSupport::ForEachCrashImage(recording, m_plan, [&](Image const& image, u64 steps) {
            bool const returned = steps == recording.steps.size();
            if (HasFatalFailure() || !seen.insert(TestSupport::HashImage(image) * 2 + returned).second) return;
            ++images;
            m_disk.Load(image);
            bool someWhole = !replacement.hasOld && !returned;
            for (auto const& [path, content] : image) {
                View const view = Look(path);
                someWhole |= view.IsSame(old) || view.IsSame(fresh);
                // The name of a new document is taken by an empty file until the document moves there.
                bool const isReserved = !replacement.hasOld && content->empty();
                if (path == c_crashMaster) {
                    ASSERT_TRUE(view.IsSame(fresh) || (!returned && (view.IsSame(old) || isReserved)))
                        << Describe(view);
                }
            }
            ASSERT_TRUE(someWhole) << "behind step " << steps;
            ASSERT_TRUE(!returned || image.size() == 1) << image.size();
        });
    }
    EXPECT_GT(images, 100u);
}

// Takes the last table in the file for the newest, whole or not.
Counted<Archive> RecoverWithoutCheck(String8 const& path, Archive::OpenMode mode, IDTag tag,
                                     Archive::OpenResult& result)
{
    Counted<FileInOutStream> const file = FileInOutStream::Open(path.GetData());
    std::string bytes(file->GetSizeInStream(), '\0');
    file->ReadAt(0, bytes.data(), bytes.size());
    std::string info(52, '\0');
    u64 const numbers[] = {bytes.rfind("#FT4"), bytes.size()}; // The newest table, and where the next save goes.
    info.replace(0, 4, "#Inf");
    std::memcpy(info.data() + 4, numbers, sizeof(numbers));
    file->WriteAt(12, info.data(), info.size());
    file->Close();
    return Archive::Open(path, mode, tag, result);
}

// The simulator is only as good as the mistakes it finds: each of these is planted into a record of what was done.
TEST_F(CrashSimulatorTest, PlantedMistakesAreFound)
{
    using Steps = std::vector<MemoryDisk::Step>;
    auto const isFlush = [](MemoryDisk::Step const& step) { return step.kind == MemoryDisk::Kind::Flush; };
    auto const findInfo = [](Steps& steps) {
        return std::find_if(steps.begin(), steps.end(), [](MemoryDisk::Step const& step) {
            return step.kind == MemoryDisk::Kind::Write && step.offset == 12 && step.data.size() == 52;
        });
    };
    struct Mistake
    {
        char const* name;
        char const* operation;
        std::function<void(Steps&)> plant;
        Opener recover = Archive::RecoverArchive;
    };
    Mistake const mistakes[] = {
        {"no flush before the info block", "full",
         [&](Steps& steps) { steps.erase(std::find_if(steps.begin(), steps.end(), isFlush)); }},
        {"no flush behind the info block", "full",
         [&](Steps& steps) { steps.erase(std::find_if(findInfo(steps), steps.end(), isFlush)); }},
        {"scratch file cleared before the commit", "roll down",
         [&](Steps& steps) {
             std::stable_partition(
                 steps.begin(), steps.end(),
                 [master = findInfo(steps)->file](MemoryDisk::Step const& step) { return step.file != master; });
         }},
        {"table written over live bytes", "full",
         [&](Steps& steps) {
             MemoryDisk::Step stray = *std::max_element(steps.begin(), steps.end(),
                                                        [](auto& a, auto& b) { return a.data.size() < b.data.size(); });
             stray.offset -= 40; // The end of the newest table.
             stray.data.resize(30);
             steps.insert(steps.begin(), stray);
         }},
        {"recovery without its check", "full", [](Steps&) {}, RecoverWithoutCheck},
        {"renamed before it was flushed", "streamline",
         [&](Steps& steps) { steps.erase(std::remove_if(steps.begin(), steps.end(), isFlush), steps.end()); }},
        {"written over without the mark", "overwrite",
         [](Steps& steps) {
             steps.erase(std::find_if(steps.begin(), steps.end(), [](MemoryDisk::Step const& step) {
                 return step.kind == MemoryDisk::Kind::Write && step.offset == 0 && step.data.size() == 12;
             }));
         }},
    };
    for (Mistake const& mistake : mistakes) {
        SCOPED_TRACE(mistake.name);
        CrashOperation const& operation = FindCrashOperation(mistake.operation);
        bool const withScratch = operation.needsScratchFile;
        for (bool const isPlanted : {false, true}) {
            Image before = MakeCrashDocument(m_disk, withScratch);
            Image after;
            MemoryDisk::Recording recording = Record(operation, 2, before, after); // 2: stored as it is.
            CrashJudge judge(m_disk, m_figures, operation.kind, before, after, withScratch);
            if (isPlanted) {
                mistake.plant(recording.steps);
                judge.SetRecovery(mistake.recover);
            }
            judge.Run(recording, m_plan, 0, 1);
            EXPECT_EQ(judge.GetFault() != "", isPlanted) << judge.GetFault();
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Shard, CrashHistoriesTest, testing::Range(0, 4));

} // namespace
} // namespace KernelTest

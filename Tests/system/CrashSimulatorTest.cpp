#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/platform/PlatformFile.h"
#include "support/ArchiveFixture.h"
#include "support/CrashImages.h"
#include "support/FakeClock.h"
#include "support/LongTests.h"
#include "support/MemoryDisk.h"

#include <algorithm>
#include <cstring>
#include <functional>
#include <gtest/gtest.h>
#include <iostream>
#include <set>
#include <unordered_set>

// Power cuts at every moment of every short history of a document. Each state that a cut could leave is opened,
// compared item by item with the states that may be found there, saved into, cut short again and reopened.

namespace KernelTest {
namespace {

using namespace Kernel;
using TestSupport::MemoryDisk;
using Items = std::map<std::string, std::string>;
using Image = MemoryDisk::Image;

std::string const c_master = "/ram/doc";
std::string const c_scratch = "/ram/scratch";

// What a person finds when he opens a path.
struct View
{
    Archive::OpenResult result = Archive::OpenNotFound;
    Items items;
    u32 saveCount = 0;
    u64 revisions = 0;
    bool scratchRevisions = false;
    std::string thumbnail;
    bool wasRecovered = false;

    bool IsOpen() const { return result == Archive::OpenOk; }
    /// The same document. Thumbnails are compared apart, since a crash may take them; the count of saves may be the
    /// other state's where the info block was torn.
    bool IsSame(View const& o) const
    {
        return IsOpen() && o.IsOpen() && items == o.items && revisions == o.revisions &&
               scratchRevisions == o.scratchRevisions;
    }
    bool IsSameSave(View const& o) const { return IsSame(o) && saveCount == o.saveCount; }
};

std::string Describe(View const& view)
{
    std::string text = "result " + std::to_string(view.result) + " saves " + std::to_string(view.saveCount) +
                       " revisions " + std::to_string(view.revisions) + (view.scratchRevisions ? " with scratch" : "");
    for (auto const& [path, bytes] : view.items) text += " " + path + "=" + bytes.substr(0, 4);
    return text;
}

View ViewOf(Archive& archive)
{
    View view;
    view.result = Archive::OpenOk;
    view.items = GetAll(archive);
    view.saveCount = StateOf(archive).saveCount;
    std::vector<Counted<Archive::Revision const>> revisions;
    archive.GetRevisions(revisions);
    view.revisions = revisions.size();
    view.scratchRevisions = archive.HaveScratchRevisions();
    if (Counted<ArchiveThumbnails const> const thumbnails = archive.LoadThumbnails()) {
        for (auto const& record : thumbnails->GetRecs())
            view.thumbnail.append(static_cast<char const*>(record.data->GetData()), record.data->GetSize());
    }
    return view;
}

using Opener = Counted<Archive> (*)(String8 const&, Archive::OpenMode, IDTag, Archive::OpenResult&);

View LookWith(Opener open, std::string const& path)
{
    View view;
    Counted<Archive> const archive = open(Str(path), Archive::OpenModeReadWrite, c_documentTag, view.result);
    return archive ? ViewOf(*archive) : view;
}

View Look(std::string const& path)
{
    return LookWith(Archive::Open, path);
}

// A chain that cannot be walked is what recovery is for.
View LookOrRecover(std::string const& path)
{
    View const view = Look(path);
    if (view.result != Archive::OpenCorrupt && view.result != Archive::OpenTruncated) return view;
    View recovered = LookWith(Archive::RecoverArchive, path);
    recovered.wasRecovered = true;
    return recovered;
}

// The operations that a history is made of. Each opens the document, works, and closes it. @p n differs for each step
// of a history, so that every save changes something.
struct Operation
{
    char const* name;
    std::function<void(int n)> run;
    bool needsScratchFile = false;
    std::function<void(int n)> prepare = [](int) {}; // Done before recording begins.
};

std::string Text(int n, u64 size)
{
    std::string text(size, static_cast<char>('A' + n % 26));
    for (u64 i = 0; i < size; i += 7) text[i] = static_cast<char>('a' + (i + static_cast<u64>(n)) % 26);
    return text;
}

Changes ChangesOf(int n)
{
    return {{"a", Text(n, 1300)}, {"b/" + std::to_string(n), Text(n + 1, 40)}, {"c", Text(n + 2, 700)}};
}

std::string DocumentPath()
{
    IDTag tag;
    return Archive::GetArchiveUID(Str(c_scratch), tag) == Archive::OpenOk ? c_scratch : c_master;
}

void SaveAs(int n, Archive::SessionType type, bool scratch)
{
    Counted<Archive> const archive = OpenDocument(DocumentPath());
    ASSERT_TRUE(archive && Save(*archive, ChangesOf(n), scratch, type, n % 2 == 1));
}

void SaveWithThumbnails(int n)
{
    Counted<Archive> const archive = OpenDocument(DocumentPath());
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive && archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->CreateFile(Str("a"), MakeCounted<BytesItem>(Text(n, 900)));
    auto thumbnails = MakeCounted<ArchiveThumbnails>();
    auto data = MakeCounted<RawData>(1500);
    std::memset(data->GetData(), 'a' + n, data->GetSize());
    thumbnails->AddFile(ArchiveThumbnails::FileType::Picture, data);
    handle->SetThumbnails(thumbnails);
    std::string const userData = Text(n, 90);
    ASSERT_TRUE(handle->SetUserData(userData.data(), userData.size()));
    archive->CloseSession(handle, false);
}

void DeleteSome(int n)
{
    Counted<Archive> const archive = OpenDocument(DocumentPath());
    ASSERT_TRUE(archive && Save(*archive, {{"c", std::nullopt}, {"d", Text(n, 5)}}));
}

void ReplaceThroughTemporary(int n)
{
    Counted<Archive> const old = OpenDocument(c_master);
    Archive::CreateResult result;
    Counted<Archive> const fresh = old->CreateReplacementWithTemporary(result, {});
    ASSERT_TRUE(fresh && Save(*fresh, ChangesOf(n)));
}

std::vector<Operation> const& GetOperations()
{
    auto const save = [](Archive::SessionType type, bool scratch = false) {
        return [type, scratch](int n) { SaveAs(n, type, scratch); };
    };
    static std::vector<Operation> const operations = {
        {"full", save(Archive::SessionTypeFull)},
        {"incremental", save(Archive::SessionTypeIncremental)},
        {"rewrite", save(Archive::SessionTypeRewrite)},
        {"export", save(Archive::SessionTypeExport)},
        {"delete", DeleteSome},
        {"thumbnails", SaveWithThumbnails},
        {"scratch", save(Archive::SessionTypeFull, true), true},
        {"roll down", [](int n) { SaveAs(n + 13, Archive::SessionTypeFull, false); }, true,
         save(Archive::SessionTypeFull, true)},
    };
    return operations;
}

// The order of writes that every save keeps to, whatever a cut at that moment happens to show. Empty, or what is wrong.
std::string CheckTrace(MemoryDisk::Recording const& recording, std::string const& path)
{
    auto const name = recording.names.find(path);
    if (name == recording.names.end()) return "no such file";
    u64 const file = name->second;
    std::string const& before = *recording.contents.at(file);
    u64 fileEnd = 0; // A number of 8 bytes at 24; what lies before it is live.
    std::memcpy(&fileEnd, before.data() + 24, sizeof(fileEnd));
    bool pending = false; // Blocks or a table behind the last flush.
    bool infoPending = false;
    u64 infos = 0;
    for (MemoryDisk::Step const& step : recording.steps) {
        std::string const where = TestSupport::Describe(step);
        if (step.kind == MemoryDisk::Kind::Flush && step.file == file) {
            pending = infoPending = false;
        } else if (step.kind != MemoryDisk::Kind::Write || step.file != file) {
            if (infoPending) return "another file is touched before the info block is safe: " + where;
        } else if (step.offset >= fileEnd) {
            pending = true;
        } else if (step.offset == 12 && step.data.size() == 52) {
            if (pending) return "the info block goes out before what it names: " + where;
            infoPending = true;
            ++infos;
        } else if (!(step.offset == 0 && step.data.size() == 12) && !(step.offset == 64 && step.data.size() == 8)) {
            return "live bytes are written: " + where;
        }
    }
    if (infoPending || pending) return "the save returned before it was flushed";
    return infos == 1 ? "" : "the info block was written " + std::to_string(infos) + " times";
}

constexpr size_t c_delete = 4; // In the list above.
constexpr size_t c_scratchSave = 6;

struct Figures
{
    u64 recordings = 0;
    u64 images = 0; // Distinct ones, those of the second cut among them.
    u64 old = 0;
    u64 fresh = 0;
    u64 recovered = 0;
    u64 unread = 0; // Scratch files of a master whose info block was torn.
};

// Judges the images of one recorded operation.
class Judge
{
public:
    Judge(MemoryDisk& disk, Figures& figures, Image const& before, Image const& after, bool hasScratch)
        : m_disk(disk), m_figures(figures), m_hasScratch(hasScratch)
    {
        m_old = LookAt(before);
        m_new = LookAt(after);
        for (std::string const& path : {c_master, c_scratch})
            for (Image const* image : {&before, &after}) m_infos[path].insert(InfoOf(*image, path));
        m_masterChanges = !m_old.master.IsSameSave(m_new.master);
    }

    /// Calls nobody; the first fault found is told by GetFault.
    void Run(MemoryDisk::Recording const& recording, TestSupport::CrashPlan const& plan, u64 secondCuts)
    {
        m_secondCuts = secondCuts;
        m_commit = FindCommit(recording);
        if (m_commit > recording.steps.size()) {
            m_fault = "the save returned before it was safe";
            return;
        }
        TestSupport::ForEachCrashImage(recording, plan, [&](Image const& image, u64 steps) {
            bool const committed = steps >= m_commit;
            if (!m_fault.empty() || !m_seen.insert(TestSupport::HashImage(image) * 2 + committed).second) return;
            ++m_figures.images;
            Check(image, committed);
            if (m_fault.empty()) return;
            m_fault += "; cut behind step " + std::to_string(steps) + " of:";
            for (u64 i = 0; i < recording.steps.size(); ++i)
                m_fault += "\n" + std::to_string(i) + ": " + TestSupport::Describe(recording.steps[i]);
        });
    }

    std::string const& GetFault() const { return m_fault; }

private:
    struct Pair
    {
        View master;
        View scratch; // Through the scratch file's path.
    };

    // The info block's bytes; it is torn if they are neither those before nor those after the save.
    static std::string InfoOf(Image const& image, std::string const& path)
    {
        auto const found = image.find(path);
        return found == image.end() || found->second->size() < 64 ? std::string() : found->second->substr(12, 52);
    }
    bool IsTorn(Image const& image, std::string const& path) const
    {
        return m_infos.at(path).count(InfoOf(image, path)) == 0;
    }

    Pair LookAt(Image const& image)
    {
        m_disk.Load(image);
        return {LookOrRecover(c_master), m_hasScratch ? LookOrRecover(c_scratch) : View()};
    }

    // The number of steps behind which the new master, or without one the new scratch state, is on the device.
    u64 FindCommit(MemoryDisk::Recording const& recording)
    {
        for (u64 i = 0; i < recording.steps.size(); ++i) {
            auto const kind = recording.steps[i].kind;
            if (kind != MemoryDisk::Kind::Flush && kind != MemoryDisk::Kind::FlushFolder) continue;
            Pair const found = LookAt(TestSupport::MakeDurableImage(recording, i + 1));
            bool const isNew =
                m_masterChanges ? found.master.IsSameSave(m_new.master) : found.scratch.IsSame(m_new.scratch);
            if (isNew) return i + 1;
        }
        return recording.steps.size() + 1;
    }

    void Check(Image const& image, bool committed)
    {
        Pair const found = LookAt(image);
        if (!IsAllowed(found, image, committed)) {
            m_fault = "found " + Describe(found.master) + " | " + Describe(found.scratch) + "; old " +
                      Describe(m_old.master) + " | " + Describe(m_old.scratch) + "; new " + Describe(m_new.master) +
                      " | " + Describe(m_new.scratch);
            return;
        }
        SaveAgain(found);
    }

    bool IsAllowed(Pair const& found, Image const& image, bool committed)
    {
        using R = Archive::OpenResult;
        View const& master = found.master;
        // Only an info block of which some bytes are new and the rest old can name no table.
        m_figures.recovered += master.wasRecovered;
        if (master.wasRecovered && (committed || !IsTorn(image, c_master))) return false;
        if (!IsWholeThumbnail(master)) return false;
        bool const isOld = master.IsSame(m_old.master);
        bool const isNew = master.IsSame(m_new.master);
        if (!isOld && !isNew) return false;
        if (!m_hasScratch) {
            ++(isNew ? m_figures.fresh : m_figures.old);
            return isNew || !committed;
        }
        View const& scratch = found.scratch;
        if (!m_masterChanges) { // A save into the scratch file.
            bool const isNewScratch = scratch.IsSame(m_new.scratch);
            ++(isNewScratch ? m_figures.fresh : m_figures.old);
            m_figures.recovered += scratch.wasRecovered;
            if (scratch.wasRecovered && (committed || !IsTorn(image, c_scratch))) return false;
            return isNewScratch || (!committed && scratch.IsSame(m_old.scratch));
        }
        ++(isNew ? m_figures.fresh : m_figures.old);
        if (!isNew) {
            if (committed) return false;
            if (scratch.IsSame(m_old.scratch)) return true;
            // A torn info block can hide to which of two saves of one second the scratch file belongs, or show the
            // count of a first save that did not come about; a torn position of the table leaves the scratch file
            // unread.
            bool const isRefused = scratch.result == R::OpenLinkMismatch || scratch.wasRecovered;
            m_figures.unread += isRefused;
            return isRefused && IsTorn(image, c_master);
        }
        static std::set<R> const refusals = {R::OpenLinkMismatch, R::OpenNotArchive, R::OpenCorrupt, R::OpenBadInfo,
                                             R::OpenTruncated};
        return scratch.IsSame(m_new.scratch) || refusals.count(scratch.result) != 0;
    }

    // Old ones, none, or the new ones; never a mixture.
    bool IsWholeThumbnail(View const& view) const
    {
        return view.thumbnail.empty() || view.thumbnail == m_old.master.thumbnail ||
               view.thumbnail == m_new.master.thumbnail;
    }

    // A document that opens but breaks at its next save has not survived.
    void SaveAgain(Pair const& pair)
    {
        bool const throughScratch = m_hasScratch && pair.scratch.IsOpen();
        std::string const& path = throughScratch ? c_scratch : c_master;
        View const& found = throughScratch ? pair.scratch : pair.master;
        bool const cutsAgain = m_secondCuts > 0 && ++m_saves % m_secondCuts == 0;
        if (cutsAgain) m_disk.StartRecording();
        bool saved = false;
        {
            Archive::OpenResult result{};
            Opener open = Archive::Open;
            if (found.wasRecovered) open = Archive::RecoverArchive;
            Counted<Archive> const archive = open(Str(path), Archive::OpenModeReadWrite, c_documentTag, result);
            saved = archive && Save(*archive, {{"after", "the crash"}});
        }
        MemoryDisk::Recording const recording = cutsAgain ? m_disk.StopRecording() : MemoryDisk::Recording();
        Items expected = found.items;
        expected["after"] = "the crash";
        View const again = Look(path);
        if (!saved || again.items != expected) {
            m_fault = "the next save came to " + Describe(again) + " from " + Describe(found);
            return;
        }
        u64 const steps = recording.steps.size();
        for (u64 cut = 0; cutsAgain && cut < c_pointsOfSecondCut && m_fault.empty(); ++cut) {
            Image const image =
                TestSupport::MakeCrashImage(recording, steps * cut / c_pointsOfSecondCut, m_saves * 31 + cut);
            if (!m_seen.insert(TestSupport::HashImage(image) * 2).second) continue;
            ++m_figures.images;
            Pair const second = LookAt(image);
            View const& seen = throughScratch && second.scratch.IsOpen() ? second.scratch : second.master;
            bool const isMasterAlone = throughScratch && !second.scratch.IsOpen() && seen.items == pair.master.items;
            if (seen.items != found.items && seen.items != expected && !isMasterAlone)
                m_fault = "a second cut left " + Describe(seen) + " from " + Describe(found);
        }
    }

    static constexpr u64 c_pointsOfSecondCut = 20;

    MemoryDisk& m_disk;
    Figures& m_figures;
    bool const m_hasScratch;
    Pair m_old;
    Pair m_new;
    std::map<std::string, std::set<std::string>> m_infos;
    bool m_masterChanges;
    u64 m_commit = 0;
    u64 m_saves = 0;
    u64 m_secondCuts = 1;
    std::unordered_set<u64> m_seen;
    std::string m_fault;
};

class CrashSimulatorTest : public testing::Test
{
protected:
    static constexpr int c_shards = 4;
    static constexpr int c_depth = 3;

    CrashSimulatorTest()
    {
        m_plan = IsLongRun() ? TestSupport::CrashPlan{10'000, 2'460, 1'000} : TestSupport::CrashPlan{60, 60, 24};
        m_secondCuts = IsLongRun() ? 8 : 2;
    }

    Image MakeDocument(bool withScratch)
    {
        m_disk.Load({});
        {
            Counted<Archive> const archive = CreateDocument(c_master);
            Archive::CreateResult result;
            EXPECT_TRUE(Save(*archive, ChangesOf(0)));
            if (withScratch) {
                EXPECT_TRUE(archive->AddScratchFile(Str(c_scratch), result));
            }
        }
        return m_disk.GetImage();
    }

    // Records @p operation on @p before and leaves the disk as it was afterwards.
    MemoryDisk::Recording Record(Operation const& operation, int n, Image& before, Image& after)
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
        for (Operation const& operation : GetOperations()) {
            if (operation.needsScratchFile && !withScratch) continue;
            Image before = start;
            Image after;
            MemoryDisk::Recording const recording = Record(operation, depth + 1, before, after);
            std::string const name = history + ", " + operation.name;
            if (HasFatalFailure()) return;
            ASSERT_EQ(CheckTrace(recording, &operation == &GetOperations()[c_scratchSave] ? c_scratch : c_master), "")
                << "history:" << name;
            if (m_histories++ % c_shards == shard) {
                ++m_figures.recordings;
                Judge judge(m_disk, m_figures, before, after, withScratch);
                judge.Run(recording, m_plan, m_secondCuts);
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
    Figures m_figures;
    int m_histories = 0;
};

class CrashHistoriesTest : public CrashSimulatorTest, public testing::WithParamInterface<int>
{
};

TEST_P(CrashHistoriesTest, EveryPowerCutOfEveryShortHistoryLeavesTheOldOrTheNewState)
{
    Explore(MakeDocument(false), false, GetParam(), 0, "alone");
    ASSERT_FALSE(HasFatalFailure());
    Explore(MakeDocument(true), true, GetParam(), 0, "with scratch");
    ASSERT_FALSE(HasFatalFailure());
    m_pauseMs = 0; // All saves of a history within one second.
    Explore(MakeDocument(true), true, GetParam(), c_depth - 2, "in one second");
    Figures const& f = m_figures;
    std::cout << "recorded " << f.recordings << " operations, " << f.images << " distinct images: " << f.old << " old, "
              << f.fresh << " new, " << f.recovered << " recovered, " << f.unread << " scratch files unread\n";
    EXPECT_GT(m_figures.images, (IsLongRun() ? 1'000'000u : 100'000u) / c_shards);
}

// A save into a temporary that then takes the document's place: some whole document is always there, and the target
// is never in part.
TEST_F(CrashSimulatorTest, EveryPowerCutOfAReplacementLeavesAWholeDocument)
{
    Image before = MakeDocument(false);
    Image after;
    Operation const operation = {"replace", ReplaceThroughTemporary};
    MemoryDisk::Recording const recording = Record(operation, 1, before, after);
    m_disk.Load(before);
    View const old = Look(c_master);
    m_disk.Load(after);
    View const fresh = Look(c_master);
    ASSERT_TRUE(fresh.IsOpen() && !fresh.IsSame(old));
    ASSERT_EQ(after.size(), 1u);
    u64 images = 0;
    std::unordered_set<u64> seen;
    TestSupport::ForEachCrashImage(recording, m_plan, [&](Image const& image, u64 steps) {
        bool const returned = steps == recording.steps.size();
        if (HasFatalFailure() || !seen.insert(TestSupport::HashImage(image) * 2 + returned).second) return;
        ++images;
        m_disk.Load(image);
        bool someWhole = false;
        for (auto const& [path, content] : image) {
            View const view = Look(path);
            someWhole |= view.IsSame(old) || view.IsSame(fresh);
            if (path == c_master) {
                ASSERT_TRUE(view.IsSame(fresh) || (!returned && view.IsSame(old))) << Describe(view);
            }
        }
        ASSERT_TRUE(someWhole) << "behind step " << steps;
        ASSERT_TRUE(!returned || image.size() == 1) << image.size();
    });
    EXPECT_GT(images, 20u);
}

// Streamlining after every operation, on both roads. Either a whole document is at its path, or it says of itself that
// it was being written over, or it is missing; and then a whole one lies elsewhere.
TEST_F(CrashSimulatorTest, EveryPowerCutOfAStreamlineLeavesAWholeDocument)
{
    Platform::GetFileCalls().makeFolder("/ram/tmp");
    Platform::GetFileCalls().makeFolder("/ram/tmp/second");
    std::vector<String8> rescued;
    TempFile::SetTempPath("/ram/tmp", "/ram/tmp/second", rescued);
    u64 images = 0;
    u64 missing = 0;
    u64 marked = 0;
    auto const isWhole = [](Image const& image, Items const& items) {
        return std::any_of(image.begin(), image.end(), [&](auto const& file) {
            return file.first != c_master && file.first != c_scratch && Look(file.first).items == items;
        });
    };
    for (bool const withScratch : {false, true}) {
        for (Operation const& operation : GetOperations()) {
            if (operation.needsScratchFile && !withScratch) continue;
            Image start = MakeDocument(withScratch);
            Image before;
            Record(operation, 1, start, before);
            Record(GetOperations()[c_delete], 2, before, start); // So that there is always something to drop.
            for (bool const overwrite : {false, true}) {
                SCOPED_TRACE(std::string(operation.name) + (overwrite ? " overwrite" : "") +
                             (withScratch ? " with scratch" : ""));
                before = start;
                Image after;
                Operation const streamline = {"streamline", [&](int) {
                                                  Counted<Archive> const archive = OpenDocument(DocumentPath());
                                                  archive->SetAlwaysStreamlineOverwrite(overwrite);
                                                  ASSERT_EQ(archive->Streamline(nullptr, nullptr, nullptr),
                                                            Archive::StreamlineDone);
                                              }};
                MemoryDisk::Recording const recording = Record(streamline, 3, before, after);
                m_disk.Load(before);
                View const oldMaster = Look(c_master);
                View const oldPair = withScratch ? Look(c_scratch) : oldMaster;
                m_disk.Load(after);
                View const fresh = Look(c_master);
                ASSERT_TRUE(fresh.IsOpen() && fresh.revisions == 1 && fresh.items == oldPair.items) << Describe(fresh);
                ASSERT_EQ(after.size(), withScratch ? 2u : 1u);
                std::unordered_set<u64> seen;
                TestSupport::ForEachCrashImage(recording, m_plan, [&](Image const& image, u64 steps) {
                    bool const returned = steps == recording.steps.size();
                    if (HasFatalFailure() || !seen.insert(TestSupport::HashImage(image) * 2 + returned).second) return;
                    ++images;
                    m_disk.Load(image);
                    View const master = Look(c_master);
                    bool const isMarked = overwrite && !returned && Archive::IsMidStreamlineFile(Str(c_master));
                    missing += master.result == Archive::OpenNotFound;
                    marked += isMarked;
                    if (isMarked || master.result == Archive::OpenNotFound) {
                        ASSERT_TRUE(!returned && isWhole(image, fresh.items)) << "behind step " << steps;
                        return;
                    }
                    bool const isOld = !returned && master.IsSame(oldMaster);
                    ASSERT_TRUE(isOld || master.IsSame(fresh)) << steps << ": " << Describe(master);
                    if (!withScratch) return;
                    View const pair = Look(c_scratch);
                    ASSERT_TRUE(pair.items == oldPair.items || (!pair.IsOpen() && !isOld))
                        << steps << ": " << Describe(pair);
                });
                ASSERT_FALSE(HasFatalFailure());
            }
        }
    }
    std::cout << "streamlining: " << images << " distinct images, " << missing
              << " with the document under another name, " << marked << " marked\n";
    EXPECT_GT(missing, 0u);
    EXPECT_GT(marked, 0u);
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
        bool rollDown;
        std::function<void(Steps&)> plant;
    };
    Mistake const mistakes[] = {
        {"no flush before the info block", false,
         [&](Steps& steps) { steps.erase(std::find_if(steps.begin(), steps.end(), isFlush)); }},
        {"no flush behind the info block", false,
         [&](Steps& steps) { steps.erase(std::find_if(findInfo(steps), steps.end(), isFlush)); }},
        {"scratch file cleared before the commit", true,
         [&](Steps& steps) {
             std::stable_partition(
                 steps.begin(), steps.end(),
                 [master = findInfo(steps)->file](MemoryDisk::Step const& step) { return step.file != master; });
         }},
        {"table written over live bytes", false,
         [&](Steps& steps) {
             MemoryDisk::Step stray = *std::max_element(steps.begin(), steps.end(),
                                                        [](auto& a, auto& b) { return a.data.size() < b.data.size(); });
             stray.offset = 90;
             stray.data.resize(30);
             steps.insert(steps.begin(), stray);
         }},
    };
    for (Mistake const& mistake : mistakes) {
        SCOPED_TRACE(mistake.name);
        Image before = MakeDocument(mistake.rollDown);
        Image after;
        Operation const& operation = mistake.rollDown ? GetOperations().back() : GetOperations().front();
        MemoryDisk::Recording recording = Record(operation, 1, before, after);
        mistake.plant(recording.steps);
        Judge judge(m_disk, m_figures, before, after, mistake.rollDown);
        judge.Run(recording, m_plan, 0);
        EXPECT_NE(judge.GetFault(), "");
    }
}

INSTANTIATE_TEST_SUITE_P(Shard, CrashHistoriesTest, testing::Range(0, 4));

} // namespace
} // namespace KernelTest

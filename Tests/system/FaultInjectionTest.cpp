#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/filestore/FileStoreBackData.h"
#include "libkernel/platform/PlatformFile.h"
#include "support/ArchiveOperations.h"
#include "support/FakeClock.h"
#include "support/FaultyFiles.h"
#include "support/LongTests.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <gtest/gtest.h>
#include <iostream>
#include <mutex>
#include <set>

// Every operation on a document, with every call that it makes failing in every way: it ends in a result that it names,
// leaves nothing open and nothing lying about, the document holds what it held or what was saved, and when the fault
// has gone the same operation succeeds.

namespace KernelTest {
namespace {

using namespace Kernel;
using TestSupport::Fault;
using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::MemoryDisk;

// Which names were touched since the start: written to in the fixed part, emptied, renamed or removed. Below the faulty
// files, so that it sees what was really done.
class TouchedNames
{
public:
    TouchedNames()
    {
        s_next = &Platform::GetFileCalls();
        Clear();
        s_table = *s_next;
        s_table.open = [](char const* path, Platform::OpenFlags const& flags, Platform::FileHandle& out) {
            int const error = s_next->open(path, flags, out);
            std::lock_guard const lock(s_mutex);
            if (!error) s_paths[out] = path;
            if (!error && (flags.truncate || flags.create)) s_touched.insert(path);
            return error;
        };
        s_table.writeAt = [](Platform::FileHandle handle, void const* data, u64 size, u64 offset) {
            constexpr u64 c_infoEnd = 64;
            std::lock_guard const lock(s_mutex);
            if (offset < c_infoEnd && size > 0) s_touched.insert(s_paths[handle]);
            return s_next->writeAt(handle, data, size, offset);
        };
        s_table.rename = [](char const* from, char const* to) {
            int const error = s_next->rename(from, to);
            std::lock_guard const lock(s_mutex);
            if (!error) s_touched.insert(from), s_touched.insert(to);
            return error;
        };
        s_table.unlink = [](char const* path) {
            std::lock_guard const lock(s_mutex);
            s_touched.insert(path);
            return s_next->unlink(path);
        };
        Platform::SetFileCalls(&s_table);
    }
    ~TouchedNames() { Platform::SetFileCalls(s_next); }

    void Clear() { s_touched.clear(); }
    bool Has(std::string const& path) const { return s_touched.count(path) > 0; }

private:
    static inline Platform::FileCalls const* s_next = nullptr;
    static inline Platform::FileCalls s_table;
    static inline std::mutex s_mutex;
    static inline std::map<Platform::FileHandle, std::string> s_paths;
    static inline std::set<std::string> s_touched;
};

std::vector<Fault> MakeFaults()
{
    struct
    {
        FileCall call;
        std::vector<int> errors;
    } const kinds[] = {
        {FileCall::Read, {EIO}},
        {FileCall::Write, {ENOSPC, EIO, EDQUOT, EFBIG}},
        {FileCall::Flush, {EIO, ENOSPC}},
        {FileCall::FlushFolder, {EIO, ENOSPC}},
        {FileCall::SetSize, {EIO}},
        {FileCall::GetSize, {EIO}},
        {FileCall::Open, {EACCES, EPERM, EROFS, EMFILE, ENFILE, ENOENT, EISDIR}},
        {FileCall::Rename, {EACCES, EXDEV, ENOSPC}},
        {FileCall::Unlink, {EACCES, EBUSY}},
        {FileCall::Stat, {EIO}},
        {FileCall::ListFolder, {EIO}},
        {FileCall::SetAttributes, {EIO}},
    };
    std::vector<Fault> faults;
    for (auto const& kind : kinds)
        for (int const error : kind.errors) faults.push_back({.call = kind.call, .error = error});
    for (FileCall const call : {FileCall::Read, FileCall::Write})
        for (Fault::Part const part : {Fault::Part::Half, Fault::Part::AllButOne})
            faults.push_back({.call = call, .part = part});
    faults.push_back({.call = FileCall::Write, .error = ENOSPC, .part = Fault::Part::Half});
    faults.push_back({.call = FileCall::Flush, .error = EIO, .loseWrites = true});
    faults.push_back({.call = FileCall::Flush, .error = ENOSPC, .loseWrites = true});
    size_t const count = faults.size();
    for (size_t i = 0; i < count; ++i) {
        faults.push_back(faults[i]);
        faults.back().forEver = true;
    }
    return faults;
}

std::string Describe(Fault const& fault, int n)
{
    return "call " + std::to_string(static_cast<int>(fault.call)) + " part " +
           std::to_string(static_cast<int>(fault.part)) + " error " + std::to_string(fault.error) +
           (fault.loseWrites ? " losing" : "") + (fault.forEver ? " from" : " at") + " n " + std::to_string(n);
}

struct Figures
{
    u64 fired = 0;
    u64 failed = 0;      // Runs in which the operation did not give "ok".
    u64 committed = 0;   // Of those, with the new state in the file.
    u64 sameObjects = 0; // Retried without reopening, and succeeded.
    u64 leftCopies = 0;  // Names left over, as the result says.
    u64 faults = 0;      // Breaches found.
};

// One operation with its states before and after, as runs without a fault give them.
class Bench
{
public:
    Bench(OperationDisk& disk, ArchiveOperation const& operation) : m_disk(disk), m_operation(operation)
    {
        Archive::PostShutdown(); // Copies of data that the process shares.
        m_disk.Load(m_operation.start);
        m_before = LookAtDisk(m_disk.GetDisk());
        NoteNames();
        World world;
        if (m_operation.prepare) m_operation.prepare(world);
        m_clean = RunOperation(m_operation, world);
        Drop(world);
        m_after = LookAtDisk(m_disk.GetDisk());
        Archive::PostShutdown();
        NoteNames();
    }

    std::string const& GetCleanResult() const { return m_clean; }

    /// Runs it with something that goes wrong. @p arm sets that up, @p disarm takes it away and tells whether it
    /// struck. Gives what is wrong with the outcome, or nothing.
    template <class Arm, class Disarm>
    std::string Run(Arm const& arm, Disarm const& disarm, std::string const& allowed, std::vector<Fault> const& faults,
                    bool reuse, bool& fired, Figures& figures)
    {
        Archive::PostShutdown();
        m_disk.Load(m_operation.start);
        TouchedNames touched;
        FaultyFiles files;
        World world;
        m_operation.prepare(world);
        touched.Clear();
        arm(files, world);
        std::string const result = RunOperation(m_operation, world);
        fired = disarm(files, world);
        if (!fired) {
            Drop(world);
            FindOpenHandles();
            Archive::PostShutdown();
            return result == "ok" ? "" : "without a fault: " + result;
        }
        ++figures.fired;
        bool const ok = result == "ok";
        if (!IsNamed(m_operation, result) && result != allowed) return "result " + result;
        // The reason is that of the error: 1 is a lack of space, 7 what has no value of its own.
        if (faults.size() == 1 &&
            ((faults[0].error == EIO && result == "file 1") || (faults[0].error == ENOSPC && result == "file 7")))
            return "result " + result;
        if (!ok) ++figures.failed;

        DiskView const seen = LookAtDisk(m_disk.GetDisk());
        // A move by copy is done when the copy is there, even if the source cannot be removed.
        DiskView judged = seen;
        bool const keepsSource = std::any_of(faults.begin(), faults.end(),
                                             [](Fault const& fault) { return fault.call == FileCall::Unlink; });
        for (auto& [path, one] : judged)
            if (keepsSource && one == m_before.at(path) && m_after.at(path).result == Archive::OpenNotFound)
                one = m_after.at(path);
        std::string wrong = Compare(judged, ok);
        for (auto const& [path, one] : seen)
            if (wrong.empty() && !ok && !(one == m_before.at(path)) && !touched.Has(path) && !touched.Has("/ram/doc"))
                wrong = path + " is new before the commit";
        bool const isNew = !(seen == m_before);
        if (!ok && isNew) ++figures.committed;
        // A save that stands in a temporary whose last move failed has been made.
        if (wrong.empty() && !ok && world.item && world.archive && !world.item->IsDirty(*world.archive) &&
            Get(*world.archive, "a") != world.item->bytes)
            wrong = "item clean though nothing was saved";
        if (!wrong.empty()) return "result " + result + ": " + wrong;

        if (reuse && !ok && !isNew && world.archive && RunOperation(m_operation, world) == "ok") {
            ++figures.sameObjects;
            wrong = CompareViews(LookAtDisk(m_disk.GetDisk()), m_after, m_after, true);
            if (!wrong.empty()) return "retried after " + result + ": " + wrong;
        }
        // Whether the save that stands in a temporary was told, before the archive goes.
        bool const standsInTemporary = world.item && world.archive && !world.item->IsDirty(*world.archive);
        Drop(world);
        wrong = FindLeftovers(result, standsInTemporary, faults, figures);
        if (wrong.empty()) wrong = FindOpenHandles();
        if (!wrong.empty()) return "result " + result + ": " + wrong;
        wrong = Again(result);
        Archive::PostShutdown();
        if (wrong.empty()) wrong = FindOpenHandles();
        return wrong;
    }

private:
    // A replacement that failed half way may have left the document under another name only.
    std::string Compare(DiskView const& found, bool succeeded)
    {
        std::string const wrong = CompareViews(found, m_before, m_after, succeeded);
        PathView const& document = found.at("/ram/doc");
        bool const away = document.result == Archive::OpenNotFound || Archive::IsMidStreamlineFile(Str("/ram/doc"));
        if (wrong.empty() || succeeded || !away) return wrong;
        bool const hasCopy =
            HasCopy(m_disk.GetDisk(), m_before.at("/ram/doc")) || HasCopy(m_disk.GetDisk(), m_after.at("/ram/doc"));
        if (!hasCopy) return wrong;
        DiskView other = found;
        other["/ram/doc"] = m_before.at("/ram/doc");
        return CompareViews(other, m_before, m_after, succeeded);
    }

    static void Drop(World& world)
    {
        world.archive = nullptr;
        world.other = nullptr;
    }

    void NoteNames()
    {
        for (auto const& [path, bytes] : m_disk.GetDisk().GetImage()) m_names.insert(path);
    }

    static bool IsSharedCopy(std::string const& path) { return path.size() > 4 && path.ends_with(".bak"); }

    std::string FindOpenHandles()
    {
        u64 shared = 0;
        for (auto const& [path, bytes] : m_disk.GetDisk().GetImage()) shared += IsSharedCopy(path) ? 2 : 0;
        u64 const open = m_disk.GetDisk().GetOpenHandles();
        return open > shared ? std::to_string(open - shared) + " handles open" : std::string();
    }

    // What may stay: the only whole copy where a replacement failed half way, a save that was made but not moved, and
    // what cannot be removed or moved.
    std::string FindLeftovers(std::string const& result, bool standsInTemporary, std::vector<Fault> const& faults,
                              Figures& figures)
    {
        bool const named = result == "streamline 7" || result == "streamline 8" || standsInTemporary;
        bool const stuck = std::any_of(faults.begin(), faults.end(), [](Fault const& fault) {
            return fault.call == FileCall::Unlink || fault.call == FileCall::Rename ||
                   fault.call == FileCall::FlushFolder;
        });
        for (auto const& [path, bytes] : m_disk.GetDisk().GetImage()) {
            if (m_names.count(path) || IsSharedCopy(path)) continue;
            if (!named && !stuck) return "left " + path;
            ++figures.leftCopies;
        }
        return {};
    }

    // The same operation on what the failure left; where it has been done already, a save into that.
    std::string Again(std::string const& result)
    {
        DiskView const left = LookAtDisk(m_disk.GetDisk());
        World world;
        bool const usable = left.at("/ram/doc").recovered == m_before.at("/ram/doc").recovered;
        if (left == m_before && usable) {
            m_operation.prepare(world);
            std::string const again = RunOperation(m_operation, world);
            Drop(world);
            if (again != "ok") return "after " + result + " the next run gives " + again;
            std::string const wrong = CompareViews(LookAtDisk(m_disk.GetDisk()), m_after, m_after, true);
            return wrong.empty() ? wrong : "after " + result + " and the next run: " + wrong;
        }
        // From the last: a scratch file that was moved does not outlive a save into its master by that's own name.
        for (auto it = left.rbegin(); it != left.rend(); ++it) {
            auto const& [path, one] = *it;
            if (one.result != Archive::OpenOk || !one.bytes.empty() || path == "/ram/scratch") continue;
            Archive::OpenResult opened{};
            world.archive = Archive::RecoverArchive(Str(path), Archive::OpenModeReadWrite, c_documentTag, opened);
            if (!world.archive || !Save(*world.archive, {{"later", "1"}}) || Get(*world.archive, "later") != "1")
                return "after " + result + " no save into " + path;
            Drop(world);
        }
        return {};
    }

    OperationDisk& m_disk;
    ArchiveOperation const& m_operation;
    DiskView m_before;
    DiskView m_after;
    std::set<std::string> m_names;
    std::string m_clean;
};

class FaultInjectionTest : public testing::Test
{
protected:
    // Tells the first few breaches of each operation, and counts the others.
    void Judge(ArchiveOperation const& operation, std::string const& wrong, std::string const& where)
    {
        if (wrong.empty()) return;
        ++m_figures.faults;
        if (++m_told[operation.name] <= 8) ADD_FAILURE() << operation.name << ", " << where << ": " << wrong;
    }

    void Print(char const* what, u64 operations) const
    {
        std::chrono::duration<double> const seconds = std::chrono::steady_clock::now() - m_start;
        std::cout << what << ": " << operations << " operations, " << m_figures.fired << " faults fired, "
                  << m_figures.failed << " runs failed (" << m_figures.committed << " of them with the new state), "
                  << m_figures.sameObjects << " retried on the same objects, " << m_figures.leftCopies
                  << " copies left as named, " << seconds.count() << " s\n";
    }

    TestSupport::FakeClock m_clock;
    OperationDisk m_disk;
    Figures m_figures;
    std::map<std::string, int> m_told;
    std::chrono::steady_clock::time_point m_start = std::chrono::steady_clock::now();
};

TEST_F(FaultInjectionTest, EveryCallFailingInEveryWayEndsInANamedResultAndAWholeDocument)
{
    std::vector<Fault> const faults = MakeFaults();
    constexpr int c_most = 5000; // Calls of one kind; an operation that makes more does not end.
    for (ArchiveOperation const& operation : GetArchiveOperations()) {
        Bench bench(m_disk, operation);
        ASSERT_EQ(bench.GetCleanResult(), "ok") << operation.name;
        u64 const before = m_figures.fired;
        for (Fault fault : faults) {
            bool fired = true;
            for (int n = 1; fired; ++n) {
                ASSERT_LT(n, c_most) << operation.name << " " << Describe(fault, n);
                fault.n = n;
                std::string const wrong = bench.Run([&](FaultyFiles& files, World&) { files.Plan(fault); },
                                                    [](FaultyFiles& files, World&) {
                                                        bool const struck = files.HasFired();
                                                        files.Clear();
                                                        return struck;
                                                    },
                                                    "", {fault}, n % 2 == 0, fired, m_figures);
                Judge(operation, wrong, Describe(fault, n));
            }
        }
        EXPECT_GT(m_figures.fired, before) << operation.name;
    }
    Print("Faults", GetArchiveOperations().size());
    EXPECT_EQ(m_figures.faults, 0u);
}

// What comes in answer to one failure may fail too.
TEST_F(FaultInjectionTest, SecondFailureBehindTheFirstCostsNothingEither)
{
    std::vector<Fault> seconds;
    for (FileCall const call : {FileCall::Write, FileCall::Flush, FileCall::Open, FileCall::Rename, FileCall::Unlink})
        seconds.push_back({.call = call, .forEver = true, .error = EACCES});
    int const step = IsLongRun() ? 1 : 23; // Of the second failure's places, so that the short run takes a few seconds.
    int place = 0;
    for (ArchiveOperation const& operation : GetArchiveOperations()) {
        Bench bench(m_disk, operation);
        for (Fault first : MakeFaults()) {
            if (first.forEver) continue;
            for (Fault second : seconds) {
                bool bothFired = true;
                for (int m = 1 + place++ % step; bothFired; m += step) {
                    bothFired = false;
                    bool fired = true;
                    second.n = m;
                    for (int n = 1; fired; ++n) {
                        first.n = n;
                        bool isFirst = false;
                        std::string const wrong = bench.Run(
                            [&](FaultyFiles& files, World&) {
                                files.ResetCounts();
                                files.Plan(first);
                                files.Plan(second);
                            },
                            [&](FaultyFiles& files, World&) {
                                isFirst = files.GetCount(first.call) >= n;
                                bothFired |= isFirst && files.GetCount(second.call) >= m;
                                bool const struck = files.HasFired();
                                files.Clear();
                                return struck;
                            },
                            "", {first, second}, false, fired, m_figures);
                        Judge(operation, wrong, Describe(first, n) + " and " + Describe(second, m));
                        fired = fired && isFirst;
                    }
                }
            }
        }
    }
    Print("Pairs of faults", GetArchiveOperations().size());
    EXPECT_EQ(m_figures.faults, 0u);
}

TEST_F(FaultInjectionTest, CopyThatCannotBeWrittenCostsNoCopyThatWasMade)
{
    m_disk.Load(StartState::Document);
    FaultyFiles files;
    Counted<Archive> const archive = OpenDocument("/ram/doc");
    auto const copy = [&](char const* path) {
        Counted<Archive::Revision const> const revision = archive->GetHeadRevisionForFile(Str(path));
        return archive->CreateBackData(revision, Str(path));
    };
    Counted<FileStoreBackData const> const made = copy("a");
    ASSERT_TRUE(made);
    files.Plan({.call = FileCall::Write, .forEver = true, .error = ENOSPC});
    EXPECT_THROW(copy("b"), BackstoreException);
    files.Clear();
    auto const item = MakeCounted<BytesItem>();
    EXPECT_TRUE(made->LoadItem(*item));
    EXPECT_EQ(item->bytes, std::string(1300, 'a'));
    EXPECT_TRUE(copy("b"));
    Archive::PostShutdown();
}

TEST_F(FaultInjectionTest, AbortAtEveryMomentKeepsTheOldStateOrHasSaved)
{
    u64 operations = 0;
    for (ArchiveOperation const& operation : GetArchiveOperations()) {
        Bench bench(m_disk, operation);
        u64 const before = m_figures.fired;
        bool fired = true;
        // The flag is set before the first call and before each later one: between any two polls that do something.
        for (int n = 1; fired; ++n) {
            int calls = 0;
            std::string const wrong = bench.Run(
                [&](FaultyFiles& files, World& world) {
                    files.SetObserver([&, n](FileCall, std::string const&) { world.abort |= ++calls >= n; });
                },
                [](FaultyFiles& files, World& world) {
                    files.SetObserver(nullptr);
                    return std::exchange(world.abort, false);
                },
                operation.failures.find("streamline") == std::string::npos ? "abort" : "streamline 1", {}, true, fired,
                m_figures);
            Judge(operation, wrong, "aborted at call " + std::to_string(n));
        }
        operations += m_figures.fired > before;
    }
    Print("Aborts", operations);
    EXPECT_EQ(m_figures.faults, 0u);
    EXPECT_GE(m_figures.failed, 100u);
}

} // namespace
} // namespace KernelTest

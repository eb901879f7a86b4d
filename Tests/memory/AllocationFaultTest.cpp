#include "libkernel/platform/PlatformFile.h"
#include "memory/RefusedMemory.h"
#include "support/ArchiveOperations.h"
#include "support/FakeClock.h"

#include <gtest/gtest.h>
#include <iostream>
#include <set>
#include <sys/wait.h>
#include <unistd.h>

// Memory that is refused at every allocation of every operation on a document, of every text conversion and of every
// compression: once, and from then on.

namespace KernelTest {
namespace {

using namespace Kernel;

// File calls take their memory from the system, and the disk behind them is not under test.
Platform::FileCalls const* s_next = nullptr;

template <auto Member>
struct Quiet;
template <class... Arguments, class Result, Result (*Platform::FileCalls::*Member)(Arguments...)>
struct Quiet<Member>
{
    static Result Call(Arguments... arguments)
    {
        QuietMemory const quiet;
        return (s_next->*Member)(arguments...);
    }
    static void Put(Platform::FileCalls& table) { table.*Member = Call; }
};

class QuietFiles
{
public:
    QuietFiles()
    {
        using F = Platform::FileCalls;
        s_next = &Platform::GetFileCalls();
        m_table = *s_next;
        PutAll<&F::open, &F::close, &F::read, &F::write, &F::readAt, &F::writeAt, &F::setSize, &F::stat, &F::access,
               &F::rename, &F::unlink, &F::listFolder, &F::flush, &F::flushFolder, &F::setTimes, &F::setMode,
               &F::getAttribute, &F::setAttribute, &F::removeAttribute>();
        Platform::SetFileCalls(&m_table);
    }
    ~QuietFiles() { Platform::SetFileCalls(s_next); }

private:
    template <auto... Members>
    void PutAll()
    {
        (Quiet<Members>::Put(m_table), ...);
    }
    Platform::FileCalls m_table;
};

std::string RunRefusing(ArchiveOperation const& operation, World& world, long step)
{
    EmptyCodecPools const pools;
    RefusedStep const refused(step);
    return RunOperation(operation, world);
}

// What is made once for a process is made in it: each run is a child of a process that has done none of this. Threads,
// above all, have nobody to tell that they lack memory.
TEST(AllocationFaultTest, FirstUseWithoutMemoryEndsNoProcess)
{
    static std::set<std::string> const chosen = {"full save", "offlining", "streamline and verify", "back data"};
    enum Outcome : int
    {
        Fine,
        NothingRefused,
        NotNext
    };
    TestSupport::FakeClock const clock;
    OperationDisk disk;
    QuietFiles const quiet;
    for (ArchiveOperation const& operation : GetArchiveOperations()) {
        int status = 0;
        for (long step = 0; chosen.count(operation.name) && status == Fine; ++step) {
            SCOPED_TRACE(testing::Message() << operation.name << " step " << step);
            pid_t const child = fork();
            ASSERT_GE(child, 0);
            if (child == 0) {
                disk.Load(operation.start);
                World world;
                operation.prepare(world);
                RunRefusing(operation, world, step);
                bool const refused = RefusedMemory::HasRefused();
                world = World();
                disk.Load(operation.start);
                operation.prepare(world);
                bool const isFine = RunOperation(operation, world) == "ok";
                _exit(!isFine ? NotNext : refused ? Fine : NothingRefused);
            }
            waitpid(child, &status, 0);
            EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) != NotNext) << status;
        }
    }
}

TEST(AllocationFaultTest, MemoryRefusedAtEveryAllocationEndsInANamedResultAndAWholeDocument)
{
    static std::set<std::string> const named = {"memory",    "open 15", "create 15", "session 10", "no session",
                                                "convert 3", "null",    "false",     "no memory"};
    TestSupport::FakeClock const clock;
    OperationDisk disk;
    QuietFiles const quiet;
    u64 refused = 0;
    u64 failed = 0;
    u64 committed = 0;
    int breaches = 0;
    for (ArchiveOperation const& operation : GetArchiveOperations()) {
        auto const drop = [](World& world) {
            world = World();
            Archive::PostShutdown();
        };
        DiskView before;
        DiskView after;
        for (int warm = 0; warm < 2; ++warm) {
            disk.Load(operation.start);
            before = LookAtDisk(disk.GetDisk());
            World world;
            operation.prepare(world);
            ASSERT_EQ(RunOperation(operation, world), "ok") << operation.name;
            drop(world);
            after = LookAtDisk(disk.GetDisk());
        }
        for (long step = 0;; ++step) {
            u64 const handles = disk.GetDisk().GetOpenHandles();
            disk.Load(operation.start);
            World world;
            operation.prepare(world);
            std::string const result = RunRefusing(operation, world, step);
            if (!RefusedMemory::HasRefused()) break;
            ++refused;
            bool const ok = result == "ok";
            failed += !ok;
            DiskView const seen = LookAtDisk(disk.GetDisk());
            committed += !ok && !(seen == before);
            std::string wrong = CompareViews(seen, before, after, ok);
            if (!ok && !named.count(result) && !IsNamed(operation, result)) wrong = "not named";
            if (wrong.empty() && world.archive && world.archive->IsCorrupted()) wrong = "counts as corrupt";
            if (wrong.empty() && !ok && seen == before && world.item && world.archive &&
                !world.item->IsDirty(*world.archive) && Get(*world.archive, "a") != world.item->bytes)
                wrong = "item clean though nothing was saved";
            drop(world);
            if (wrong.empty() && disk.GetDisk().GetOpenHandles() != handles)
                wrong = std::to_string(handles) + " handles became " + std::to_string(disk.GetDisk().GetOpenHandles());
            if (wrong.empty() && !ok && seen == before) {
                operation.prepare(world);
                std::string const again = RunOperation(operation, world);
                drop(world);
                if (again != "ok") wrong = "the next run gives " + again;
                if (wrong.empty()) wrong = CompareViews(LookAtDisk(disk.GetDisk()), after, after, true);
            }
            if (wrong.empty()) continue;
            if (++breaches <= 40)
                ADD_FAILURE() << operation.name << ", n " << 1 + step / 2 << (step % 2 ? " for ever" : "") << ", "
                              << result << ": " << wrong;
        }
    }
    std::cout << "Memory: " << refused << " allocations refused, " << failed << " runs failed (" << committed
              << " of them with the new state)\n";
    EXPECT_EQ(breaches, 0);
    EXPECT_GT(failed, 1000u);
}

TEST(AllocationFaultTest, RefusedMemoryLeaksNothing)
{
    TestSupport::FakeClock const clock;
    OperationDisk disk;
    QuietFiles const quiet;
    std::map<std::string, long> leaks;
    for (ArchiveOperation const& operation : GetArchiveOperations()) {
        auto const run = [&](long step) {
            disk.Load(operation.start);
            {
                World world;
                operation.prepare(world);
                RunRefusing(operation, world, step);
            }
            Archive::PostShutdown();
            disk.Load(StartState::Nothing);
        };
        for (int warm = 0; warm < 3; ++warm) run(RefusedStep::c_noStep);
        // What a failed run leaves for good grows with each; a cache that fills grows once, a worker that frees jobs
        // keeps some dozens, and a job of another thread may not have let go yet.
        for (long step = 0;; ++step) {
            run(step);
            if (!RefusedMemory::HasRefused()) break;
            long grown = 2;
            for (int attempt = 0; attempt < 150 && grown >= 2; ++attempt) {
                long const before = GetLiveBlocks();
                run(step);
                run(step);
                grown = GetLiveBlocks() - before;
            }
            if (grown >= 2) leaks[operation.name] += grown;
        }
    }
    for (auto const& [name, count] : leaks) ADD_FAILURE() << name << ": " << count << " blocks";
}

} // namespace
} // namespace KernelTest

#include "libkernel/platform/PlatformFile.h"
#include "support/ArchiveOperations.h"
#include "support/FakeClock.h"

#include <atomic>
#include <cstdlib>
#include <gtest/gtest.h>
#include <iostream>
#include <new>
#include <set>

// Memory that is refused at every allocation of every operation on a document. This program has an operator new of its
// own, which can be told to refuse the n-th call from now on; what malloc gives is not refused.

namespace {

std::atomic<long> s_left{0}; // Allocations until the one that is refused; 0 for none.
std::atomic<long> s_live{0};
std::atomic<bool> s_refused{false};
thread_local int s_quiet = 0; // Above 0 in code that is not under test.

void* Allocate(size_t size, size_t alignment)
{
    if (s_quiet == 0 && s_left.load(std::memory_order_relaxed) > 0 && s_left.fetch_sub(1) == 1) {
        s_refused = true;
        throw std::bad_alloc();
    }
    size_t const rounded = (size + alignment - 1) / alignment * alignment;
    void* const block = alignment > alignof(std::max_align_t) ? std::aligned_alloc(alignment, rounded)
                                                              : std::malloc(size == 0 ? 1 : size);
    if (!block) throw std::bad_alloc();
    s_live.fetch_add(1, std::memory_order_relaxed);
    return block;
}

void Free(void* block) noexcept
{
    if (!block) return;
    s_live.fetch_sub(1, std::memory_order_relaxed);
    std::free(block);
}

} // namespace

// Those for arrays call these.
void* operator new(size_t size)
{
    return Allocate(size, 1);
}
void* operator new(size_t size, std::align_val_t alignment)
{
    return Allocate(size, static_cast<size_t>(alignment));
}
void* operator new(size_t size, std::nothrow_t const&) noexcept
try {
    return Allocate(size, 1);
} catch (std::bad_alloc const&) {
    return nullptr;
}
void operator delete(void* block) noexcept
{
    Free(block);
}
void operator delete(void* block, size_t) noexcept
{
    Free(block);
}
void operator delete(void* block, std::align_val_t) noexcept
{
    Free(block);
}
void operator delete(void* block, size_t, std::align_val_t) noexcept
{
    Free(block);
}

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
        ++s_quiet;
        Result const result = (s_next->*Member)(arguments...);
        --s_quiet;
        return result;
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

std::string RunRefusing(ArchiveOperation const& operation, World& world, long n)
{
    s_refused = false;
    s_left = n;
    std::string const result = RunOperation(operation, world);
    s_left = 0;
    return result;
}

// Its job runs on another thread, whose own allocations have nobody to tell.
bool RunsElsewhere(ArchiveOperation const& operation)
{
    return std::string(operation.name) == "offlining";
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
        if (RunsElsewhere(operation)) continue;
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
        for (long n = 1;; ++n) {
            u64 const handles = disk.GetDisk().GetOpenHandles();
            disk.Load(operation.start);
            World world;
            operation.prepare(world);
            std::string const result = RunRefusing(operation, world, n);
            if (!s_refused) break;
            ++refused;
            bool const ok = result == "ok";
            failed += !ok;
            DiskView const seen = LookAtDisk(disk.GetDisk());
            committed += !ok && !(seen == before);
            std::string wrong = CompareViews(seen, before, after, ok);
            if (!ok && !named.count(result) && !IsNamed(operation, result)) wrong = "not named";
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
            if (++breaches <= 40) ADD_FAILURE() << operation.name << ", n " << n << ", " << result << ": " << wrong;
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
        if (RunsElsewhere(operation)) continue;
        auto const run = [&](long n) {
            disk.Load(operation.start);
            {
                World world;
                operation.prepare(world);
                RunRefusing(operation, world, n);
            }
            Archive::PostShutdown();
            disk.Load(StartState::Nothing);
        };
        for (int warm = 0; warm < 3; ++warm) run(0);
        // What a failed run leaves for good grows with each; a cache that fills grows once.
        for (long n = 1;; ++n) {
            run(n);
            if (!s_refused) break;
            long const before = s_live;
            run(n);
            run(n);
            if (long const grown = s_live - before; grown >= 2) leaks[operation.name] += grown;
        }
    }
    for (auto const& [name, count] : leaks) ADD_FAILURE() << name << ": " << count << " blocks";
}

} // namespace
} // namespace KernelTest

#include "libkernel/core/Countable.h"

#include "libkernel/core/Abortable.h"

#include <gtest/gtest.h>
#include <thread>
#include <vector>

namespace Kernel {
namespace {

class Probe : public Countable
{
public:
    explicit Probe(int& deaths) : m_deaths(deaths) {}
    ~Probe() override { ++m_deaths; }

private:
    int& m_deaths;
};

class Other : public Countable
{
};

TEST(CountableTest, NewObjectHasNoOwnerUntilTheFirstCountedTakesIt)
{
    int deaths = 0;
    auto* const probe = new Probe(deaths);
    EXPECT_EQ(probe->GetReferenceCount(), 0);
    {
        Counted<Probe> const first(probe);
        Counted<Countable const> const wider(first);
        EXPECT_EQ(probe->GetReferenceCount(), 2);
        EXPECT_EQ(deaths, 0);
    }
    EXPECT_EQ(deaths, 1);
}

TEST(CountableTest, AssignmentKeepsWhatItIsAboutToTake)
{
    int deaths = 0;
    Counted<Probe> p = MakeCounted<Probe>(deaths);
    Counted<Probe>& same = p;
    p = same;
    p = p.Get();
    EXPECT_EQ(deaths, 0);
    p = MakeCounted<Probe>(deaths);
    EXPECT_EQ(deaths, 1);
    Counted<Probe> moved(std::move(p));
    EXPECT_FALSE(p);
    moved = nullptr;
    EXPECT_EQ(deaths, 2);
}

TEST(CountableTest, CopiedObjectStartsWithItsOwnCountAndIsCastToItsClassOnly)
{
    Counted<Other> const original = MakeCounted<Other>();
    Counted<Countable> const copy = MakeCounted<Other>(*original);
    EXPECT_EQ(original->GetReferenceCount(), 1);
    EXPECT_EQ(copy->GetReferenceCount(), 1);
    EXPECT_TRUE(CountedCast<Other>(copy));
    EXPECT_FALSE(CountedCast<Probe>(copy));
}

TEST(CountableTest, ThreadsThatShareAnObjectDestroyItOnce)
{
    int deaths = 0;
    {
        Counted<Probe> const shared = MakeCounted<Probe>(deaths);
        std::vector<std::thread> threads;
        for (int t = 0; t < 4; ++t)
            threads.emplace_back([shared] {
                for (int i = 0; i < 20000; ++i) Counted<Probe> const copy(shared);
            });
        for (std::thread& t : threads) t.join();
        EXPECT_EQ(shared->GetReferenceCount(), 1);
    }
    EXPECT_EQ(deaths, 1);
}

class Work : public Abortable
{
};

TEST(AbortableTest, CopyStandsAloneOrSharesTheOuterFlagUntilThatIsTaken)
{
    Work alone;
    alone.SetAbort(true);
    Work copy(alone);
    EXPECT_TRUE(copy.IsAborting());
    copy.SetAbort(false);
    EXPECT_TRUE(alone.IsAborting());

    bool outer = false;
    Work sharing;
    sharing.SetAbort(true);
    sharing.SetAbortPointer(&outer);
    EXPECT_FALSE(sharing.IsAborting());
    copy = sharing;
    Work second(sharing);
    EXPECT_EQ(copy.GetAbortPointer(), &outer);
    EXPECT_EQ(second.GetAbortPointer(), &outer);
    EXPECT_FALSE(copy.IsAborting());
    second.SetAbort(true);
    EXPECT_TRUE(outer);
    copy.SetAbortPointer(nullptr);
    EXPECT_NE(copy.GetAbortPointer(), &outer);
    EXPECT_TRUE(copy.IsAborting()); // The value of the other's own flag came along.
}

TEST(AbortableTest, AnotherThreadMayAbort)
{
    Work work;
    std::thread other([&] { work.SetAbort(true); });
    while (!work.IsAborting()) std::this_thread::yield();
    other.join();
    EXPECT_TRUE(IsAbortFlagSet(work.GetAbortPointer()));
    EXPECT_FALSE(IsAbortFlagSet(nullptr));
}

} // namespace
} // namespace Kernel

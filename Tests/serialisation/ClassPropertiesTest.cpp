#include "serialisation/WriterTestSupport.h"

#include <cstdlib>
#include <thread>

namespace KernelTest {
namespace {

auto const s_sizes = Defaults::Make(Defaults::Value("Size", 3));
ClassProperties const s_sized = MakeClass("tSiz", s_sizes);
ClassPropertiesBase::Init const s_init(&s_sized);

TEST(ClassPropertiesDeathTest, SecondRegistrationStopsTheProcess)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    ClassProperties const same = MakeClass("tSiz");
    for (ClassPropertiesBase const* const again :
         {static_cast<ClassPropertiesBase const*>(&same), static_cast<ClassPropertiesBase const*>(&s_sized),
          static_cast<ClassPropertiesBase const*>(nullptr)})
        EXPECT_DEATH(ClassPropertiesBase::Init{again}, "");
}

TEST(ClassPropertiesDeathTest, ShutdownLetsGoOfTheDefaults)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    auto const shutDown = [] {
        ShutdownSerialisation();
        std::exit(s_sized.GetDefaults().empty() ? 0 : 1);
    };
    EXPECT_FALSE(s_sized.GetDefaults().empty());
    EXPECT_EXIT(shutDown(), testing::ExitedWithCode(0), "");
}

TEST(Serialisable, EqualityNeedsOneDescription)
{
    ClassProperties const child = MakeClass("tChi", {Defaults::Item()}, &s_sized);
    auto const thing = [](ClassProperties const& of, int value) { return MakeCounted<Thing>(&of, nullptr, value); };
    auto const one = thing(s_sized, 1);
    EXPECT_TRUE(one->Equals(thing(s_sized, 1)) && one->Equals(one));
    EXPECT_FALSE(one->Equals(thing(s_sized, 2)) || one->Equals(thing(child, 1)) || one->Equals(nullptr));
    EXPECT_TRUE(Serialisable::Equals(nullptr, nullptr) && !Serialisable::Equals(nullptr, one));
}

class SharedClassPropertiesTest : public testing::Test
{
protected:
    Counted<SharedThing> Make(int value) const { return MakeCounted<SharedThing>(&description, value); }
    int CountAlive() const { return SharedThing::s_alive - m_before; }

private:
    static int CountOthers()
    {
        SharedClassProperties::SweepAll(true);
        return SharedThing::s_alive;
    }
    int const m_before = CountOthers();

protected:
    SharedClassProperties const description = MakeSharedClass("tLab");
};

TEST_F(SharedClassPropertiesTest, EqualObjectsBecomeOne)
{
    auto const first = Make(1);
    auto const second = Make(1);
    EXPECT_TRUE(first->Equals(Counted<SharedSerialisable const>(second)));
    EXPECT_FALSE(first->Equals(Counted<SharedSerialisable const>(Make(2))));
    EXPECT_FALSE(description.FindConsolidatedObject(first));
    EXPECT_EQ(description.ConsolidateObjectSacrifice(first).Get(), first.Get());
    EXPECT_EQ(description.ConsolidateObjectSacrifice(second).Get(), first.Get());
    EXPECT_EQ(description.FindConsolidatedObject(second).Get(), first.Get());
    EXPECT_EQ(Consolidate(Counted<SharedSerialisable>(first)).Get(), first.Get());
    EXPECT_TRUE(first->IsConsolidated());
    EXPECT_FALSE(second->IsConsolidated());
    EXPECT_EQ(first->m_consolidations, 1);
    EXPECT_FALSE(description.ConsolidateObjectSacrifice(nullptr));
}

TEST_F(SharedClassPropertiesTest, SweepLetsGoOfWhatNobodyHoldsAndUntilStableOfWhatThatHeld)
{
    SharedClassProperties const second = MakeSharedClass("tSnd");
    auto const kept = MakeShared(description, 100);
    for (bool const untilStable : {false, true}) {
        MakeShared(second, 2, [inner = MakeShared(description, 1)](OutSerialiser&) {});
        EXPECT_EQ(CountAlive(), 3);
        SharedClassProperties::SweepAll(untilStable);
        EXPECT_EQ(CountAlive(), untilStable ? 1 : 2);
        description.Sweep(false);
        EXPECT_EQ(CountAlive(), 1);
    }
    EXPECT_EQ(description.FindConsolidatedObject(Make(100)).Get(), kept.Get());
    auto const next = Make(1);
    EXPECT_EQ(description.ConsolidateObjectSacrifice(next).Get(), next.Get());
}

TEST_F(SharedClassPropertiesTest, SetSweepsItselfAsItGrows)
{
    int most = 0;
    for (int i = 0; i < 10000; ++i) {
        MakeShared(description, i);
        most = std::max(most, CountAlive());
    }
    // At the thirty-second the first thirty-one go, and the next sweep comes 32 behind what was left.
    EXPECT_LE(most, 33);
    EXPECT_GE(most, 32);
}

TEST_F(SharedClassPropertiesTest, ThreadsAgreeOnTheCanonicalCopy)
{
    std::vector<Consolidated<SharedSerialisable>> found[4];
    {
        std::vector<std::jthread> threads;
        for (auto& mine : found)
            threads.emplace_back([&] {
                for (int i = 0; i < 500; ++i) mine.push_back(MakeShared(description, i));
            });
    }
    for (auto const& mine : found) EXPECT_TRUE(mine == found[0]);
}

} // namespace
} // namespace KernelTest

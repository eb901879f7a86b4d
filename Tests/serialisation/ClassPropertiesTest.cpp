#include "serialisation/ReaderClasses.h"
#include "serialisation/WriterTestSupport.h"

#include <cstdlib>
#include <thread>

namespace KernelTest {
namespace {

using Kernel::Test::ReaderDerived;
using Kernel::Test::ReaderNode;

auto const s_sizes = Defaults::Make(Defaults::Value("Size", 3), Defaults::Value("Size", 4));
ClassProperties const s_sized = MakeClass("tSiz", s_sizes);
ClassPropertiesBase::Init const s_init(&s_sized);

TEST(ClassProperties, TypeIsItsOwnAndItsParents)
{
    ClassPropertiesBase const& derived = ReaderDerived::ms_ClassProperties;
    EXPECT_TRUE(derived.IsPolymorphicType("RdDv") && derived.IsPolymorphicType("RdNo"));
    EXPECT_FALSE(ReaderNode::ms_ClassProperties.IsPolymorphicType("RdDv"));
}

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

TEST(ClassProperties, LaterDefaultOfATagCountsForItsOwnClassAlone)
{
    ClassPropertiesBase const& description = s_sized;
    ClassProperties const child = MakeClass("tChi", {Defaults::Item()}, &s_sized);
    ASSERT_EQ(description.GetDefaults().size(), 1u);
    int const former = 3;
    int const value = 4;
    struct
    {
        ClassPropertiesBase const& description;
        IDTag tag;
        PropType type;
        int const& value;
        u64 size;
        bool isDefault;
    } const cases[] = {
        {description, "Size", PropType::Int32, value, 4, true},
        {description, "Size", PropType::Int32, former, 4, false},
        {description, "Size", PropType::UInt32, value, 4, false},
        {description, "Size", PropType::Int32, value, 2, false},
        {description, "None", PropType::Int32, value, 4, false},
        {child, "Size", PropType::Int32, value, 4, false},
    };
    for (auto const& c : cases) EXPECT_EQ(c.description.TestDefaultType(c.tag, c.type, &c.value, c.size), c.isDefault);
    EXPECT_FALSE(description.TestDefaultCustom("Size", &value, 4));
}

TEST(ClassProperties, DefaultsCompareEveryPart)
{
    EnumSerialiser enums;
    enums.RegisterEnumSet({{1}, {2}});
    FlagSerialiser flags;
    flags.RegisterFlagIndices({{1}, {0}});
    u16 const two[] = {1, 2};
    auto const items = Defaults::Make(
        Defaults::Bools("Bool", {true, false, true, false, false, false, false, false, true}),
        Defaults::Values("Numb", std::vector<u16>{1, 2}), Defaults::Texts("Text", {"a", "b"}),
        Defaults::Customs("Cust", std::vector<u16>{1, 2}), Defaults::EnumValues("Enum", std::vector<int>{2, 1}, enums),
        Defaults::Flags("Flag", u8{2}, flags), Defaults::EnumValue("NoEn", 9, enums),
        Defaults::Flags("NoFl", u8{4}, flags));
    ClassProperties const description = MakeClass("tDef", items);
    bool bits[] = {true, false, true, false, false, false, false, false, true};
    EXPECT_TRUE(description.TestDefaultTypeArray("Bool", bits, 9));
    EXPECT_FALSE(description.TestDefaultTypeArray("Bool", bits, 8));
    bits[8] = false;
    EXPECT_FALSE(description.TestDefaultTypeArray("Bool", bits, 9));
    EXPECT_FALSE(description.TestDefaultTypeArray("Numb", bits, 2));
    EXPECT_FALSE(description.TestDefaultTypeArray("Numb", PropType::UInt16, two, 2, 1));
    EXPECT_FALSE(description.TestDefaultTypeArray("Numb", PropType::Int16, two, 2, 2));
    String8 const texts[] = {"a", "b", "c"};
    EXPECT_TRUE(description.TestDefaultStringArray("Text", texts, 2));
    EXPECT_FALSE(description.TestDefaultStringArray("Text", texts, 3));
    EXPECT_FALSE(description.TestDefaultCustomArray("Cust", two, 1, 4));
    unsigned short const codes[] = {1, 0};
    EXPECT_FALSE(description.TestDefaultEnumArray("Enum", codes, 2, 1));
    EXPECT_FALSE(description.TestDefaultFlagSet("Flag", 1, 1));
    EXPECT_TRUE(description.TestDefaultEnum("NoEn", 0, 0));
    EXPECT_TRUE(description.TestDefaultFlagSet("NoFl", 0, 0));
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

TEST_F(SharedClassPropertiesTest, SweepLetsGoOfWhatNobodyHolds)
{
    auto const kept = MakeShared(description, 100);
    MakeShared(description, 101);
    EXPECT_EQ(CountAlive(), 2);
    description.Sweep(false);
    EXPECT_EQ(CountAlive(), 1);
    EXPECT_EQ(description.FindConsolidatedObject(Make(100)).Get(), kept.Get());
    auto const next = Make(101);
    EXPECT_EQ(description.ConsolidateObjectSacrifice(next).Get(), next.Get());
}

TEST_F(SharedClassPropertiesTest, SweepUntilStableFollowsWhatObjectsHold)
{
    SharedClassProperties const second = MakeSharedClass("tSnd");
    auto const make = [&] { MakeShared(second, 2, [inner = MakeShared(description, 1)](OutSerialiser&) {}); };
    make();
    SharedClassProperties::SweepAll(false);
    EXPECT_EQ(CountAlive(), 1);
    SharedClassProperties::SweepAll(false);
    EXPECT_EQ(CountAlive(), 0);
    make();
    SharedClassProperties::SweepAll(true);
    EXPECT_EQ(CountAlive(), 0);
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

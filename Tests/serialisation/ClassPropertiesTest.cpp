#include "libkernel/serialisation/ClassProperties.h"

#include "libkernel/core/Hash.h"
#include "libkernel/serialisation/CompareContext.h"
#include "libkernel/serialisation/OutSerialiser.h"

#include <cstdlib>
#include <gtest/gtest.h>
#include <thread>

namespace KernelTest {
namespace {

using namespace Kernel;

class Label : public SharedSerialisable
{
public:
    explicit Label(int value = 0, SharedClassProperties const* description = &ms_ClassProperties,
                   Consolidated<SharedSerialisable> held = {})
        : m_value(value), m_description(description), m_held(std::move(held))
    {
        ++s_alive;
    }
    static SharedClassProperties const ms_ClassProperties;
    static ClassPropertiesBase::Init s_init;
    static SharedClassProperties const* GetTypeSharedClassProperties() { return &ms_ClassProperties; }

    void Save(OutSerialiser&) const override {}
    bool Load(InSerialiser const&, FileStore&, unsigned short) override { return true; }
    void AccumulateHash(HashAccumulator& hash) const override { hash.AddToHash(&m_value, sizeof m_value); }
    SharedClassProperties const* GetObjectClassProperties() const override { return m_description; }
    bool CompareMembers(SharedSerialisable const& other, CompareContext const&) const override
    {
        return m_value == static_cast<Label const&>(other).m_value;
    }
    void OnConsolidated() const override { ++m_consolidations; }

    int const m_value;
    SharedClassProperties const* m_description;
    Consolidated<SharedSerialisable> m_held;
    mutable int m_consolidations = 0;
    static std::atomic<int> s_alive;

protected:
    ~Label() override { --s_alive; }
};

std::atomic<int> Label::s_alive;
SharedClassProperties const Label::ms_ClassProperties("tLab", &SharedClassProperties::CreateNew<Label>, 1, nullptr,
                                                      nullptr);
ClassPropertiesBase::Init Label::s_init(&Label::ms_ClassProperties);

class Shape : public Serialisable
{
public:
    explicit Shape(int value = 0) : m_value(value) {}
    static ClassPropertiesBase::DefaultItem const* __GetDefaultSerialisation()
    {
        static auto const items = Defaults::Make(Defaults::Value("Size", 3), Defaults::Value("Size", 4));
        return items.data();
    }
    static ClassProperties const ms_ClassProperties;
    static ClassPropertiesBase::Init s_init;
    void Save(OutSerialiser&) const override {}
    bool Load(InSerialiser const&, FileStore&, unsigned short) override { return true; }
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }
    bool CompareMembers(Serialisable const& other, CompareContext const&) const override
    {
        return m_value == static_cast<Shape const&>(other).m_value;
    }
    int m_value;

protected:
    ~Shape() override = default;
};

class Circle : public Shape
{
public:
    static ClassProperties const ms_ClassProperties;
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }

protected:
    ~Circle() override = default;
};

// The child is made before its parent, as can happen between two sources.
ClassProperties const Circle::ms_ClassProperties("tCir", &ClassProperties::CreateNew<Circle>, 1, nullptr,
                                                 &Shape::ms_ClassProperties);
ClassPropertiesBase::Init s_circle(&Circle::ms_ClassProperties);
ClassProperties const Shape::ms_ClassProperties("tSha", &ClassProperties::CreateNew<Shape>, 7,
                                                Shape::__GetDefaultSerialisation(), nullptr);
ClassPropertiesBase::Init Shape::s_init(&Shape::ms_ClassProperties);

TEST(ClassProperties, TypeIsItsOwnAndItsParents)
{
    auto const* const found = ClassPropertiesBase::FindClassPropertiesBase("tCir");
    ASSERT_EQ(found, &Circle::ms_ClassProperties);
    EXPECT_TRUE(found->IsPolymorphicType("tCir") && found->IsPolymorphicType("tSha"));
    EXPECT_FALSE(Shape::ms_ClassProperties.IsPolymorphicType("tCir"));
}

TEST(ClassPropertiesDeathTest, SecondRegistrationStopsTheProcess)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    ClassProperties const same("tSha", static_cast<ClassProperties::CreateFunc>(nullptr), 1, nullptr, nullptr);
    EXPECT_DEATH(ClassPropertiesBase::Init{&same}, "");
    EXPECT_DEATH(ClassPropertiesBase::Init{&Shape::ms_ClassProperties}, "");
    EXPECT_DEATH(ClassPropertiesBase::Init{nullptr}, "");
}

// In a process of its own, since nothing can be saved afterwards.
TEST(ClassPropertiesDeathTest, ShutdownLetsGoOfTheDefaults)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    auto const shutDown = [] {
        ShutdownSerialisation();
        std::exit(Shape::ms_ClassProperties.GetDefaults().empty() ? 0 : 1);
    };
    EXPECT_FALSE(Shape::ms_ClassProperties.GetDefaults().empty());
    EXPECT_EXIT(shutDown(), testing::ExitedWithCode(0), "");
}

TEST(ClassProperties, LaterDefaultOfATagCountsForItsOwnClassAlone)
{
    ClassPropertiesBase const& description = Shape::ms_ClassProperties;
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
        {Circle::ms_ClassProperties, "Size", PropType::Int32, value, 4, false},
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
    ClassProperties const description("tDef", static_cast<ClassProperties::CreateFunc>(nullptr), 1, items.data(),
                                      nullptr);
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
    auto const shape = MakeCounted<Shape>(1);
    auto const same = MakeCounted<Shape>(1);
    auto const other = MakeCounted<Shape>(2);
    auto const circle = MakeCounted<Circle>();
    circle->m_value = 1;
    EXPECT_TRUE(shape->Equals(same) && shape->Equals(shape));
    EXPECT_FALSE(shape->Equals(other) || shape->Equals(circle) || shape->Equals(nullptr));
    EXPECT_TRUE(Serialisable::Equals(nullptr, nullptr) && !Serialisable::Equals(nullptr, shape));
    auto const label = MakeCounted<Label>(1);
    EXPECT_TRUE(label->Equals(Counted<SharedSerialisable const>(MakeCounted<Label>(1))));
    EXPECT_FALSE(label->Equals(Counted<SharedSerialisable const>(MakeCounted<Label>(2))));
}

TEST(SharedClassProperties, EqualObjectsBecomeOne)
{
    auto const first = MakeCounted<Label>(1);
    auto const second = MakeCounted<Label>(1);
    auto const& description = Label::ms_ClassProperties;
    EXPECT_FALSE(description.FindConsolidatedObject(first));
    EXPECT_EQ(description.ConsolidateObjectSacrifice(first).Get(), first.Get());
    EXPECT_EQ(description.ConsolidateObjectSacrifice(second).Get(), first.Get());
    EXPECT_EQ(description.FindConsolidatedObject(second).Get(), first.Get());
    EXPECT_EQ(Consolidate(first).Get(), first.Get());
    EXPECT_TRUE(first->IsConsolidated());
    EXPECT_FALSE(second->IsConsolidated());
    EXPECT_EQ(first->m_consolidations, 1);
    EXPECT_FALSE(description.ConsolidateObjectSacrifice(nullptr));
}

TEST(SharedClassProperties, SweepLetsGoOfWhatNobodyHolds)
{
    auto const& description = Label::ms_ClassProperties;
    description.Sweep(true);
    int const before = Label::s_alive;
    auto const kept = Consolidate(MakeCounted<Label>(100));
    Consolidate(MakeCounted<Label>(101));
    EXPECT_EQ(Label::s_alive, before + 2);
    description.Sweep(false);
    EXPECT_EQ(Label::s_alive, before + 1);
    EXPECT_EQ(description.FindConsolidatedObject(MakeCounted<Label>(100)).Get(), kept.Get());
    auto const next = MakeCounted<Label>(101);
    EXPECT_EQ(Consolidate(next).Get(), next.Get());
}

TEST(SharedClassProperties, SweepUntilStableFollowsWhatObjectsHold)
{
    SharedClassProperties const first("tFst", &SharedClassProperties::CreateNew<Label>, 1, nullptr, nullptr);
    SharedClassProperties const second("tSnd", &SharedClassProperties::CreateNew<Label>, 1, nullptr, nullptr);
    SharedClassProperties::SweepAll(true);
    int const before = Label::s_alive;
    auto const make = [&] {
        auto const inner = first.ConsolidateObjectSacrifice(MakeCounted<Label>(1, &first));
        second.ConsolidateObjectSacrifice(MakeCounted<Label>(2, &second, inner));
    };
    make();
    SharedClassProperties::SweepAll(false);
    EXPECT_EQ(Label::s_alive, before + 1);
    SharedClassProperties::SweepAll(false);
    EXPECT_EQ(Label::s_alive, before);
    make();
    SharedClassProperties::SweepAll(true);
    EXPECT_EQ(Label::s_alive, before);
}

TEST(SharedClassProperties, SetSweepsItselfAsItGrows)
{
    SharedClassProperties const description("tGro", &SharedClassProperties::CreateNew<Label>, 1, nullptr, nullptr);
    int const before = Label::s_alive;
    int most = 0;
    for (int i = 0; i < 10000; ++i) {
        description.ConsolidateObjectSacrifice(MakeCounted<Label>(i, &description));
        most = std::max(most, Label::s_alive - before);
    }
    // At the thirty-second the first thirty-one go, and the next sweep comes 32 behind what was left.
    EXPECT_LE(most, 33);
    EXPECT_GE(most, 32);
}

TEST(SharedClassProperties, ThreadsAgreeOnTheCanonicalCopy)
{
    SharedClassProperties const description("tThr", &SharedClassProperties::CreateNew<Label>, 1, nullptr, nullptr);
    constexpr int values = 500;
    std::vector<Consolidated<SharedSerialisable>> found[4];
    {
        std::vector<std::jthread> threads;
        for (auto& mine : found)
            threads.emplace_back([&] {
                for (int i = 0; i < values; ++i)
                    mine.push_back(description.ConsolidateObjectSacrifice(MakeCounted<Label>(i, &description)));
            });
    }
    for (auto const& mine : found) EXPECT_TRUE(mine == found[0]);
}

} // namespace
} // namespace KernelTest

#include "serialisation/WriterTestSupport.h"

#include <deque>

namespace KernelTest {
namespace {

SharedClassProperties const& SharedClass()
{
    static SharedClassProperties const description = MakeSharedClass("Shar");
    return description;
}

TEST(OutSerialiserObjects, FirstAppearanceDescribesTheClassAndItsParentsAndLaterOnesRefer)
{
    auto const rootDefaults = Defaults::Make(Defaults::Value("Size", u16{7}));
    ClassProperties const root = MakeClass("Root", rootDefaults);
    ClassProperties const middle = MakeClass("Midd", {Defaults::Item()}, &root);
    auto const leafDefaults = Defaults::Make(Defaults::Bool("Bold", true));
    ClassProperties const leaf = MakeClass("Leaf", leafDefaults, &middle);
    auto const object = MakeCounted<Thing>(&leaf, [](OutSerialiser& out) { out.SaveType("Kind", u8{1}); });
    auto const sibling = MakeCounted<Thing>(&middle);
    sibling->m_save = [&](OutSerialiser& out) { out.SaveObject("Self", sibling.Get(), false); };
    std::string const list = SaveList([&](OutSerialiser& out) {
        out.SaveObject("Obj1", object);
        out.SaveObject("Obj2", sibling, false);
        out.SaveObject("Obj3", object);
    });
    EXPECT_EQ(Show(list),
              Show(Bytes("31 [Obj1] 01 00 00 00 00 | 00 [Leaf] 02 00 | 29 [Bold] 01 | 00"
                         "| 00 [Midd] 02 00 00 | 00 [Root] 02 00 | 02 [Size] 07 00 | 00 | 02 | 01 [Kind] 01 | 00"
                         "| 31 [Obj2] 01 01 00 00 00 | 01 [Midd] | 31 [Self] 02 01 00 00 00 | 00"
                         "| 31 [Obj3] 02 00 00 00 00 | 00")));
}

TEST(OutSerialiserObjects, ArraysHoldRecordsAndShareTheIndices)
{
    ClassProperties const description = MakeClass("Thng");
    auto const plain = MakeCounted<Thing>(&description);
    auto const shared = MakeShared(SharedClass(), 5);
    std::string const list = SaveList([&](OutSerialiser& out) {
        out.SaveObjects("Plai", std::vector<Counted<Thing>>{plain, nullptr, plain});
        out.SaveSharedObjects("Shar", std::vector<Consolidated<SharedSerialisable>>{shared, {}});
        out.SaveSharedObject("Agai", shared);
        out.SaveObjects("None", std::vector<Thing*>());
    });
    EXPECT_EQ(Show(list),
              Show(Bytes("B1 [Plai] 03 00 00 00 | 01 00 00 00 00 00 [Thng] 02 00 00 02 00 | 00 | 02 00 00 00 00"
                         "| B1 [Shar] 02 00 00 00 | 01 01 00 00 00 00 [Shar] 01 00 00 02 01 [Valu] 05 00 | 00"
                         "| 31 [Agai] 02 01 00 00 00 | B1 [None] 00 00 00 00 | 00")));
}

// Every kind of default, its item in a description, a save of an equal value, and of one that differs in a part.
TEST(OutSerialiserObjects, EqualValuesAreLeftOutForEveryKindOfDefault)
{
    EnumSerialiser enums;
    enums.RegisterEnumSet({{4}, {9}});
    FlagSerialiser flags;
    flags.RegisterFlagIndices({{8}, {0}});
    auto const shared = MakeShared(SharedClass(), 5);
    u32 const custom = 0x01020304;
    std::vector<bool> bits = {true, false, true, false, false, false, false, false, true};
    // The last two values are unknown to their serialisers.
    auto const defaults = Defaults::Make(
        Defaults::Value("A000", 9), Defaults::Value("A000", 3), Defaults::Values("A001", std::vector<u16>{1, 2}),
        Defaults::Text("A002", "ab"), Defaults::Custom("A004", custom),
        Defaults::Customs("A005", std::vector<u32>{custom}), Defaults::EnumValue("A006", 9, enums),
        Defaults::EnumValues("A007", std::vector<int>{9, 4}, enums), Defaults::Flags("A008", u16{0x100}, flags),
        Defaults::Object("A009", shared), Defaults::Objects("A010", {shared, {}}), Defaults::Bools("A011", bits),
        Defaults::Value("A012", ClassUID("Font")), Defaults::EnumValue("A013", 1, enums),
        Defaults::Flags("A014", u8{4}, flags));
    ClassProperties const description = MakeClass("Thng", defaults);
    auto const equal = MakeCounted<Thing>(&description, [&, bits](OutSerialiser& out) {
        out.SaveType("A000", 3);
        out.SaveTypes("A001", std::vector<u16>{1, 2});
        out.SaveType("A002", String16(u"ab"));
        out.SavePropertyStruct("A004", custom);
        out.SavePropertyStructs("A005", std::vector<u32>{custom});
        out.SaveEnum("A006", enums, 9);
        out.SaveEnums("A007", enums, std::vector<int>{9, 4});
        out.SaveFlagSet("A008", flags, u16{0x100});
        out.SaveSharedObject("A009", shared);
        out.SaveSharedObjects("A010", std::vector<Consolidated<SharedSerialisable>>{shared, {}});
        out.SaveTypes("A011", bits);
        out.SaveType("A012", ClassUID("Font"));
        out.SaveEnum("A013", enums, 4);
        out.SaveFlagSet("A014", flags, u8{0});
        EXPECT_TRUE(out.HasProperty("A000"));
    });
    bits[8] = false;
    auto const other = MakeCounted<Thing>(&description, [&](OutSerialiser& out) {
        out.SaveTypes("A001", std::vector<u16>{1, 2, 3});
        out.SaveType("A002", "aB");
        out.SavePropertyStruct("A004", custom + 1);
        out.SavePropertyStructs("A005", std::vector<u16>{0x0304, 0x0102});
        out.SaveEnum("A006", enums, 4);
        out.SaveEnums("A007", enums, std::vector<int>{9, 9});
        out.SaveFlagSet("A008", flags, u16{0x101});
        out.SaveSharedObject("A009", nullptr);
        out.SaveSharedObjects("A010", std::vector<Consolidated<SharedSerialisable>>{shared, shared});
        out.SaveTypes("A011", bits);
        out.SaveType("A012", IDTag("Font")); // Another type of the same size.
    });
    auto const kinds = MakeCounted<Thing>(&description, [&](OutSerialiser& out) {
        out.SaveRawStruct("A000", 3); // Raw values and data are never left out.
        out.SaveRawData("A004", &custom, 4);
        out.SaveType("A001", 3);
        out.SaveTypes("A011", std::deque<bool>{true, false});
        out.SavePropertyStruct("A012", ClassUID("Font"));
    });
    std::string const list = SaveList([&](OutSerialiser& out) {
        out.SaveObject("Equa", equal);
        out.SaveObject("Othe", other);
        out.SaveObject("Kind", kinds);
    });
    EXPECT_EQ(
        Show(list),
        Show(Bytes("31 [Equa] 01 00 00 00 00 | 00 [Thng] 02 00 | 07 [A000] 03 00 00 00"
                   "| 82 [A001] 02 00 00 00 01 00 02 00 | 2B [A002] 02 00 00 00 'ab' | 2C [A004] 04 00 04 03 02 01"
                   "| AC [A005] 01 00 00 00 04 00 04 03 02 01 | 2A [A006] 01 00 00 00"
                   "| AA [A007] 02 00 00 00 00 00 01 00 00 00 | 75 [A008] 00 00 01 01"
                   "| 31 [A009] 01 01 00 00 00 00 [Shar] 01 00 00 02 01 [Valu] 05 00"
                   "| B1 [A010] 02 00 00 00 02 01 00 00 00 00 | A9 [A011] 09 00 00 00 05 01 | 34 [A012] 'tnoF'"
                   "| 2A [A013] 00 00 00 00 | 75 [A014] 00 00 00 | 00 | 02 | 00"
                   "| 31 [Othe] 01 02 00 00 00 | 01 [Thng] | 82 [A001] 03 00 00 00 01 00 02 00 03 00 | 2B [A002] 02 00 "
                   "00 00 'aB'"
                   "| 2C [A004] 04 00 05 03 02 01 | AC [A005] 02 00 00 00 02 00 04 03 02 01 | 2A [A006] 00 00 00 00"
                   "| AA [A007] 02 00 00 00 00 00 01 00 01 00 | 75 [A008] 00 00 01 03 | 31 [A009] 00"
                   "| B1 [A010] 02 00 00 00 02 01 00 00 00 02 01 00 00 00 | A9 [A011] 09 00 00 00 05 00 | 2F [A012] "
                   "'tnoF' | 00"
                   "| 31 [Kind] 01 03 00 00 00 | 01 [Thng] | 38 [A000] 03 00 00 00 | 2D [A004] 04 00 00 00 04 03 02 01"
                   "| 07 [A001] 03 00 00 00 | A9 [A011] 02 00 00 00 01 | 2C [A012] 04 00 'tnoF' | 00 | 00")));
}

TEST(OutSerialiserObjects, NearestDefaultOfTheChainLeavesAValueOut)
{
    auto const rootDefaults = Defaults::Make(Defaults::Value("Size", u8{7}), Defaults::Value("Only", u8{1}));
    ClassProperties const root = MakeClass("Root", rootDefaults);
    std::vector<Defaults::Item> leafDefaults = {Defaults::Value("Size", u8{8})};
    for (u32 i = 0; i < 20; ++i) leafDefaults.push_back(Defaults::Value(IDTag(i * 0x1000000 + 1), u8{1}));
    leafDefaults.push_back(nullptr);
    ClassProperties const leaf = MakeClass("Leaf", leafDefaults, &root);
    auto const save = [](u8 size, u8 only) {
        return [=](OutSerialiser& out) {
            out.SaveType("Size", size);
            out.SaveType("Only", only);
            for (u32 i = 0; i < 20; ++i) out.SaveType(IDTag(i * 0x1000000 + 1), u8{1});
        };
    };
    auto const first = MakeCounted<Thing>(&leaf);
    auto const list = [&](SaveFunction const& function) {
        auto const object = MakeCounted<Thing>(&leaf, function);
        std::string const saved = SaveList([&](OutSerialiser& out) {
            out.SaveObject("Frst", first);
            out.SaveObject("Item", object);
        });
        return Show(saved.substr(saved.find(Bytes("31 [Item]")) + 15));
    };
    EXPECT_EQ(list(save(8, 1)), Show(Bytes("00 00")));
    // The leaf replaces this one: left out, it would come back as 8.
    EXPECT_EQ(list(save(7, 1)), Show(Bytes("01 [Size] 07 | 00 00")));
    EXPECT_EQ(list(save(9, 2)), Show(Bytes("01 [Size] 09 | 01 [Only] 02 | 00 00")));
}

// A writer expects of each object what the last ones of its class did, which must not show. An object's properties are
// a text here: a and b are numbers, m an array, o an object of the same class, all others texts. Small letters save the
// class's defaults, where it has them.
class LetterObjects
{
public:
    Counted<Thing> Make(std::string const& letters) const
    {
        return MakeCounted<Thing>(&m_description, [this, letters](OutSerialiser& out) { Save(out, letters); });
    }
    static std::string SaveAll(std::vector<Counted<Thing>> const& objects)
    {
        return SaveList([&](OutSerialiser& out) { out.SaveObjects("Objs", objects); });
    }
    /// What follows the object's index and class record, which a first object of the class has in between.
    std::string SaveAlone(std::string const& letters) const
    {
        Counted<Thing> const first = Make("");
        return SaveAll({first, Make(letters)}).substr(SaveAll({first}).size() + 9);
    }

private:
    void Save(OutSerialiser& out, std::string const& letters) const
    {
        for (size_t i = 0; i < letters.size(); ++i) {
            char const lower = static_cast<char>(letters[i] | 0x20);
            bool const other = letters[i] != lower;
            IDTag const tag(static_cast<u32>(lower));
            EXPECT_EQ(out.HasProperty(tag), letters.substr(0, i).find(lower) != std::string::npos);
            if (lower == 'a' || lower == 'b')
                out.SaveType(tag, other ? u8{2} : u8{1});
            else if (lower == 'm')
                out.SaveTypes(tag, std::vector<u16>{1, other ? u16{3} : u16{2}});
            else if (lower == 'o')
                out.SaveObject(tag, Make("B"));
            else
                out.SaveType(tag, String8(other ? "else" : "text"));
        }
    }

    std::vector<Defaults::Item> const m_defaults =
        Defaults::Make(Defaults::Value(IDTag('a'), u8{1}), Defaults::Text(IDTag('s'), String8("text")),
                       Defaults::Values(IDTag('m'), std::vector<u16>{1, 2}));
    ClassProperties const m_description = MakeClass("Thng", m_defaults);
};

TEST(OutSerialiserObjects, ObjectsBeforeItDoNotChangeHowAnObjectIsSaved)
{
    LetterObjects const letters;
    std::vector<std::string> const rows[] = {
        {"", "absm", "absm", "ABSM", "aBsM"},
        {"", "abst", "ab", "abst", "abstm", "abstm", "", "a", "t"},
        {"", "ab", "ba", "bsa", "sab", "mab", "bma", "abm", "ab", "ba"}, // More orders than are learned.
        {"", "abcdefghijklnpqrstuvwxyz", "abcdefghijklnpqrstuvwxyzm", "abcdefghijklnpqrstuvwxyzm"},
    };
    for (auto const& row : rows) {
        std::vector<Counted<Thing>> objects;
        for (std::string const& one : row) objects.push_back(letters.Make(one));
        std::string const list = letters.SaveAll(objects);
        size_t at = letters.SaveAll({objects[0]}).size() - 1;
        for (size_t i = 1; i < row.size(); ++i) {
            std::string const alone = letters.SaveAlone(row[i]);
            EXPECT_EQ(Show(list.substr(at + 10, alone.size() - 1)), Show(alone.substr(0, alone.size() - 1))) << row[i];
            at += 10 + alone.size() - 1;
        }
        EXPECT_EQ(at + 1, list.size());
    }
    // A tag twice is found out wherever its first use lies, in the order of the objects before or out of it.
    for (std::string const twice : {"aa", "absota", "abstot", "absoo", "baab", "abstmm", "botB"})
        EXPECT_EQ(SaveCode([&] {
                      letters.SaveAll({letters.Make("abso"), letters.Make("abso"), letters.Make(twice)});
                  }),
                  3)
            << twice;
}

TEST(OutSerialiserObjects, SharedObjectThatReachesItselfIsRefused)
{
    SharedClassProperties const description = MakeSharedClass("Cycl");
    Consolidated<SharedSerialisable> object;
    object = MakeShared(description, 1, [&](OutSerialiser& out) { out.SaveSharedObject("Self", object); });
    EXPECT_EQ(ListCode([&](OutSerialiser& out) { out.SaveSharedObject("Item", object); }), 5);
    object = {};
    description.Sweep(true);
}

TEST(OutSerialiserObjects, DefaultObjectOfTheClassBeingDescribedIsRefused)
{
    auto const value = MakeShared(SharedClass(), 9);
    ClassProperties const outer = MakeClass("Outr", Defaults::Make(Defaults::Object("Defa", value)));
    // The default's class has the same object among its own defaults.
    auto const defaults = Defaults::Make(Defaults::Object("Self", value));
    SharedClassProperties const cyclic = MakeSharedClass("Cycl", defaults);
    auto const user = cyclic.ConsolidateObjectSacrifice(MakeCounted<SharedThing>(&cyclic, u8{1}));
    static_cast<SharedThing*>(value.Get())->m_description = &cyclic;
    EXPECT_EQ(ListCode([&](OutSerialiser& out) { out.SaveSharedObject("Item", user); }), 5);
    EXPECT_EQ(ListCode([&](OutSerialiser& out) { out.SaveObject("Item", MakeCounted<Thing>(&outer)); }), 5);
    static_cast<SharedThing*>(value.Get())->m_description = &SharedClass();
}

TEST(OutSerialiserObjects, ClassThatCannotBeDescribedIsRefused)
{
    class UnknownDefault : public Defaults::DefaultBase
    {
    public:
        UnknownDefault() : DefaultBase("Unkn") {}
        Defaults::DefaultItemType GetDefaultType() const override { return static_cast<Defaults::DefaultItemType>(11); }

    protected:
        ~UnknownDefault() override = default;
    };
    ClassProperties const texts = MakeClass("Text", Defaults::Make(Defaults::Texts("Txts", {"a"})));
    std::vector<Defaults::Item> const unknownDefaults = {MakeCounted<UnknownDefault>(), nullptr};
    ClassProperties const unknown = MakeClass("Unkn", unknownDefaults);
    for (ClassProperties const* const description : {static_cast<ClassProperties const*>(nullptr), &texts, &unknown})
        EXPECT_EQ(ListCode([&](OutSerialiser& out) { out.SaveObject("Item", MakeCounted<Thing>(description)); }), 5);
}

struct Nest
{
    static ClassUID GetClassUID() { return "Nest"; }
    static unsigned short GetSchemaVersion() { return 1; }
    void Save(OutSerialiser& out) const
    {
        if (levels > 1) out.SaveClass("Nest", Nest{levels - 1});
    }
    int levels;
};

TEST(OutSerialiserObjects, NestingIsLimited)
{
    EXPECT_EQ(ListCode([](OutSerialiser& out) { out.SaveClass("Nest", Nest{1024}); }), -1);
    EXPECT_EQ(ListCode([](OutSerialiser& out) { out.SaveClass("Nest", Nest{1025}); }), 5);
    // The levels of the failed save are given back.
    EXPECT_EQ(ListCode([](OutSerialiser& out) { out.SaveClass("Nest", Nest{1024}); }), -1);
}

TEST(OutSerialiserObjects, ManyObjectsKeepTheirIndices)
{
    ClassProperties const description = MakeClass("Thng");
    std::vector<Counted<Thing>> objects;
    for (int i = 0; i < 5000; ++i) objects.push_back(MakeCounted<Thing>(&description));
    std::string const list = SaveList([&](OutSerialiser& out) {
        out.SaveObjects("Frst", objects);
        out.SaveObjects("Scnd", objects);
    });
    std::string expected = Bytes("B1 [Scnd] 88 13 00 00");
    for (u32 i = 0; i < 5000; ++i) expected += '\x02' + std::string(reinterpret_cast<char const*>(&i), 4);
    EXPECT_TRUE(list.ends_with(expected + '\0'));
}

} // namespace
} // namespace KernelTest

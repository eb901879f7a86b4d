#include "PropertyChecks.h"
#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/core/RawData.h"
#include "libkernel/core/Uuid.h"
#include "libkernel/serialisation/OutSerialiserPropertyDataStream.h"
#include "serialisation/WriterTestSupport.h"
#include "support/Rows.h"

#include <array>
#include <deque>
#include <map>
#include <nlohmann/json.hpp>
#include <span>

namespace KernelTest {
namespace {

enum class Colour
{
    Red = 10,
    Green = 11,
    Blue = 40
};

EnumSerialiser const& Colours()
{
    static EnumSerialiser const serialiser = [] {
        EnumSerialiser made;
        made.RegisterEnumSet({{10}, {11}});
        made.RegisterEnumSet({{10}, {11}, {40}});
        return made;
    }();
    return serialiser;
}

// Two flags from the third on, or all 64.
FlagSerialiser const& Styles(int first = 3, int count = 2)
{
    static std::map<int, FlagSerialiser> s_made;
    auto const [at, isNew] = s_made.try_emplace(count);
    std::vector<FlagSerialiser::FlagIndex> entries;
    for (int i = 0; i < count; ++i) entries.push_back({first + i});
    if (isNew) at->second.RegisterFlagIndices(entries.data(), entries.size());
    return at->second;
}

struct Pair
{
    u16 a;
    u16 b;
};

struct Point
{
    static ClassUID GetClassUID() { return "Poin"; }
    static unsigned short GetSchemaVersion() { return 3; }
    void Save(OutSerialiser& out) const { out.SaveType("XXXX", x); }
    u8 x = 0;
};

constexpr double c_half = 0.5;
u8 const c_block[] = {1, 2, 3, 4, 5};
float const c_floats[] = {1, 2};
unsigned int const c_smile[] = {0x1F600, 0};

std::array<Pair, 2> const c_pairs = {{{1, 2}, {3, 4}}};
std::array<Point, 2> const c_points = {{{1}, {2}}};
Point const* const c_nullAndPoint[] = {nullptr, &c_points[0]};
std::array<Colour, 2> const c_redAndBlue = {Colour::Red, Colour::Blue};

template <class T>
SaveFunction One(T value)
{
    return [=](OutSerialiser& out) { out.SaveType("Tag1", value); };
}

template <class R>
SaveFunction Many(R values)
{
    return [=](OutSerialiser& out) { out.SaveTypes("Tag1", values); };
}

// What it is, a save, and the list without its closing 0.
Rows<char const*, SaveFunction, char const*> const& Items()
{
    static Rows<char const*, SaveFunction, char const*> const items = {
        {"nothing", [](OutSerialiser&) {}, ""},
        {"u8", One(u8{0xFE}), "01 [Tag1] FE"},
        {"u16", One(u16{0x1234}), "02 [Tag1] 34 12"},
        {"u32", One(u32{0x12345678}), "03 [Tag1] 78 56 34 12"},
        {"u64", One(u64{0x1122334455667788}), "04 [Tag1] 88 77 66 55 44 33 22 11"},
        {"i8", One(i8{-1}), "05 [Tag1] FF"},
        {"i16", One(i16{-2}), "06 [Tag1] FE FF"},
        {"i32", One(-3), "07 [Tag1] FD FF FF FF"},
        {"i64", One(i64{-4}), "08 [Tag1] FC FF FF FF FF FF FF FF"},
        {"float", One(1.0f), "09 [Tag1] 00 00 80 3F"},
        {"double", One(c_half), "0A [Tag1] 00 00 00 00 00 00 E0 3F"},
        {"tag", One(IDTag("Item")), "2F [Tag1] 'metI'"},
        {"class code", One(ClassUID("Font")), "34 [Tag1] 'tnoF'"},
        {"bool", One(true), "29 [Tag1] 01"},
        {"vector of floats", [](OutSerialiser& o) { o.SaveTypeI("Tag1", static_cast<PropType>(21), c_floats, 8); },
         "15 [Tag1] 00 00 80 3F 00 00 00 40"},
        {"u16 vector", Many(std::vector<u16>{1, 2, 0x300}), "82 [Tag1] 03 00 00 00 | 01 00 02 00 00 03"},
        {"u8 span", Many(std::span(c_block)), "81 [Tag1] 05 00 00 00 | 01 02 03 04 05"},
        {"i32 array", Many(std::array<int, 1>{-1}), "87 [Tag1] 01 00 00 00 FF FF FF FF"},
        {"no doubles", Many(std::vector<double>()), "8A [Tag1] 00 00 00 00"},
        {"class codes", Many(std::vector<ClassUID>{"Font"}), "B4 [Tag1] 01 00 00 00 'tnoF'"},
        {"no bools", Many(std::vector<bool>()), "A9 [Tag1] 00 00 00 00"},
        {"nine bools", Many(std::vector<bool>{true, false, true, true, false, false, false, true, true}),
         "A9 [Tag1] 09 00 00 00 | 8D 01"},
        {"deque of bools", Many(std::deque<bool>{false, true}), "A9 [Tag1] 02 00 00 00 02"},
        {"array of bools", Many(std::array<bool, 3>{true, true, true}), "A9 [Tag1] 03 00 00 00 07"},
        {"enum in the first set", [](OutSerialiser& o) { o.SaveEnum("Tag1", Colours(), Colour::Green); },
         "2A [Tag1] 01 00 00 00"},
        {"enum of version 1", [](OutSerialiser& o) { o.SaveEnum("Tag1", Colours(), Colour::Blue); },
         "2A [Tag1] 02 00 01 00"},
        {"enums of version 1", [](OutSerialiser& o) { o.SaveEnums("Tag1", Colours(), c_redAndBlue); },
         "AA [Tag1] 02 00 00 00 | 01 00 | 00 00 02 00"},
        {"string", One(String8("ab\xC3\xA9")), "2B [Tag1] 04 00 00 00 'ab' C3 A9"},
        {"empty string", One(""), "2B [Tag1] 00 00 00 00"},
        {"UTF-16 string", One(String16(u"\u00E9")), "2B [Tag1] 02 00 00 00 C3 A9"},
        {"UTF-32 string", One(String32(c_smile)), "2B [Tag1] 04 00 00 00 F0 9F 98 80"},
        {"strings", Many(std::vector<String8>{"a", "", "bcd"}),
         "AB [Tag1] 10 00 00 00 | 03 00 00 00 | 01 00 00 00 'a' | 00 00 00 00 | 03 00 00 00 'bcd'"},
        {"UTF-16 strings", Many(std::vector<String16>{u"\u00E9"}),
         "AB [Tag1] 06 00 00 00 | 01 00 00 00 | 02 00 00 00 C3 A9"},
        {"JSON", One(nlohmann::json::parse("{ \"a\" : [1, true] }")), "2B [Tag1] 0E 00 00 00 '{\"a\":[1,true]}'"},
        {"JSON array", Many(std::vector<nlohmann::json>{1, nullptr}),
         "AB [Tag1] 0D 00 00 00 | 02 00 00 00 | 01 00 00 00 '1' | 04 00 00 00 'null'"},
        {"struct", [](OutSerialiser& o) { o.SavePropertyStruct("Tag1", c_pairs[0]); }, "2C [Tag1] 04 00 | 01 00 02 00"},
        {"structs", [](OutSerialiser& o) { o.SavePropertyStructs("Tag1", c_pairs); },
         "AC [Tag1] 02 00 00 00 | 04 00 | 01 00 02 00 03 00 04 00"},
        {"raw struct", [](OutSerialiser& o) { o.SaveRawStruct("Tag1", c_pairs[0]); }, "38 [Tag1] 01 00 02 00"},
        {"smallest raw struct", [](OutSerialiser& o) { o.SaveRawStruct("Tag1", u8{7}); }, "35 [Tag1] 07"},
        {"raw data", [](OutSerialiser& o) { o.SaveRawData("Tag1", c_block, 5); },
         "2D [Tag1] 05 00 00 00 | 01 02 03 04 05"},
        {"flags of a base", [](OutSerialiser& o) { o.SaveFlagSet("Tag1", Styles(), u32{0x18}); },
         "75 [Tag1] 00 00 | 01 | 03"},
        {"no flags", [](OutSerialiser& o) { o.SaveFlagSet("Tag1", Styles(), u8{0}); }, "75 [Tag1] 00 00 | 00"},
        {"high flags", [](OutSerialiser& o) { o.SaveFlagSet("Tag1", Styles(0, 64), u64{0x8000000000000100}); },
         "75 [Tag1] 00 00 | 08 | 00 01 00 00 00 00 00 80"},
        {"inline class", [](OutSerialiser& o) { o.SaveClass("Tag1", Point{9}); },
         "32 [Tag1] 01 | [Poin] 03 00 | 01 [XXXX] 09 | 00"},
        {"null class", [](OutSerialiser& o) { o.SaveClass("Tag1", static_cast<Point const*>(nullptr)); },
         "32 [Tag1] 00"},
        {"inline classes", [](OutSerialiser& o) { o.SaveClasses("Tag1", c_points); },
         "B2 [Tag1] 02 00 00 00 [Poin] 03 00 | 01 01 [XXXX] 01 00 | 01 01 [XXXX] 02 00"},
        {"classes with a null", [](OutSerialiser& o) { o.SaveClasses("Tag1", c_nullAndPoint); },
         "B2 [Tag1] 02 00 00 00 [Poin] 03 00 | 00 | 01 01 [XXXX] 01 00"},
        {"null object", [](OutSerialiser& o) { o.SaveObject("Tag1", nullptr); }, "31 [Tag1] 00"},
        {"null shared object", [](OutSerialiser& o) { o.SaveSharedObject("Tag1", nullptr); }, "31 [Tag1] 00"},
        {"identifier", [](OutSerialiser& o) { Uuid("00112233-4455-6677-8899-AABBCCDDEEFF").Save(o, "Tag1"); },
         "44 [Tag1] 33221100 5544 7766 8899AABBCCDDEEFF"},
    };
    return items;
}

// What the library reads in a list, saved again.
std::string ReadAndSave(std::string const& list)
{
    Kernel::Test::PropertyBytes const file = Kernel::Test::PropertyBytes().Header().Text(list);
    Counted<InSerialiserFile> const in = Kernel::Test::Parse(file.bytes);
    if (!in) return "unread";
    return SaveList([&](OutSerialiser& out) { Kernel::Fuzz::PropertyCopier(&out).CopyList(*in); });
}

TEST(OutSerialiserItems, EveryFormIsWrittenAndReadAsTheTableSays)
{
    for (auto const& [what, save, expected] : Items()) {
        SCOPED_TRACE(what);
        std::string const list = Bytes(expected) + '\0';
        EXPECT_EQ(Show(SaveList(save)), Show(list));
        if (std::string_view(what).ends_with("version 1")) continue; // The copier has one version.
        EXPECT_EQ(Show(ReadAndSave(list)), Show(list));
    }
}

TEST(OutSerialiserItems, FragmentedDataIsWrittenWithItsBlockSize)
{
    auto const data = MakeCounted<FragmentedRawData>(u64{20000});
    ASSERT_TRUE(data->SetSize(20003, true));
    std::string const list = SaveList([&](OutSerialiser& out) { out.SaveFragmentedRawData("Tag1", *data); });
    EXPECT_EQ(Show(list.substr(0, 13)), Show(Bytes("76 [Tag1] 23 4E 00 00 | 20 4E 00 00")));
    EXPECT_EQ(list.substr(13), std::string(20003 + 1, '\0'));
    EXPECT_TRUE(ReadAndSave(list) == list);
}

// A root list begins at 16, which is a multiple of every alignment, so a byte of padding more or less is told by the
// items before the data.
TEST(OutSerialiserItems, AlignedDataStandsAtItsMultipleBehindZeros)
{
    std::string const block(40, '\x5A');
    for (u64 alignment = 0; alignment <= 8; ++alignment)
        for (u64 shift = 0; shift < 9; ++shift) {
            SCOPED_TRACE(testing::Message() << alignment << " after " << shift);
            std::string const before(shift, 'x');
            std::string const list = SaveList([&](OutSerialiser& out) {
                out.SaveRawData("Befo", before.data(), before.size());
                out.SaveAlignedRawData("Data", block.data(), block.size(), alignment);
            });
            u64 const item = 9 + shift;
            u64 const place = list.find(block);
            ASSERT_NE(place, std::string::npos);
            EXPECT_EQ((16 + place) % std::max<u64>(alignment, 1), 0u);
            bool const isPlain = alignment < 2 || (16 + item + 9) % alignment == 0;
            EXPECT_EQ(static_cast<u8>(list[item]), isPlain ? 0x2D : 0x77);
            EXPECT_EQ(isPlain, place == item + 9);
            EXPECT_LT(place - item, 11 + std::max<u64>(alignment, 1));
            if (isPlain) continue;
            EXPECT_EQ(list.substr(item + 11, place - item - 11), std::string(place - item - 11, '\0'));
            EXPECT_EQ(static_cast<u64>(list[item + 9]), place - item - 11);
        }
    std::string const padded = Bytes("77 [Data] 01 00 00 00 | 05 00 | 00 00 00 00 00 | AA | 00");
    EXPECT_EQ(Show(ReadAndSave(padded)), Show(Bytes("2D [Data] 01 00 00 00 | AA | 00")));
}

TEST(OutSerialiserItems, DataStreamHoldsUntaggedValuesInOrder)
{
    u8 const raw[] = {0xAB};
    std::string const list = SaveList([&](OutSerialiser& out) {
        {
            OutSerialiserPropertyDataStream stream(out, "AStr", 0x0102);
            stream.SaveValue(u8{5});
            stream.SaveValue(IDTag("Item"));
            stream.SaveValue(true);
            stream.SaveValue("hi");
            stream.SaveValue(String16(u"\u00E9"));
            stream.SaveValue(nlohmann::json(nullptr));
            stream.SaveValues(std::vector<u16>{1, 2});
            stream.SaveValues(std::vector<bool>{true, false, true});
            stream.SaveValues(std::deque<bool>{true});
            stream.SaveValues(std::vector<String8>{"a", "bc"});
            stream.SaveValueStruct(Pair{1, 2});
            stream.SaveValueStructs(std::vector<Pair>{{3, 4}});
            stream.SaveValueRaw(raw, 1);
            stream.SaveEnum(Colours(), Colour::Green);
            stream.SaveEnums(Colours(), std::vector<Colour>{Colour::Red});
            stream.SaveValueI(RawStructType(3), "abc", 3);
            stream.StartNewValueArrayI(PropType::UInt8, 2);
            stream.AppendI("x", 1);
            stream.AppendI("y", 1);
            stream.StartNewValueCustomPackI(1, 1);
            stream.AppendI("z", 1);
            EXPECT_TRUE(out.HaveChildActive());
            stream.Close();
            stream.Close();
        }
        OutSerialiserPropertyDataStream(out, "Aban", 1); // Not closed, which does not block the list.
        out.SaveType("Next", u8{1});
    });
    EXPECT_EQ(Show(list),
              Show(Bytes("30 [AStr] 02 01 | 01 05 | 2F 'metI' | 29 01 | 2B 02 00 00 00 'hi' | 2B 02 00 00 00 C3 A9"
                         "| 2B 04 00 00 00 'null' | 82 02 00 00 00 01 00 02 00 | A9 03 00 00 00 05 | A9 01 00 00 00 01"
                         "| AB 0B 00 00 00 02 00 00 00 01 00 00 00 'a' 02 00 00 00 'bc' | 2C 04 00 01 00 02 00"
                         "| AC 01 00 00 00 04 00 03 00 04 00 | 2D 01 00 00 00 AB | 2A 01 00 00 00"
                         "| AA 01 00 00 00 00 00 00 00 | 37 'abc' | 81 02 00 00 00 'xy' | AC 01 00 00 00 01 00 'z' | 00"
                         "| 30 [Aban] 01 00 | 01 [Next] 01 | 00")));
    std::string const closed = list.substr(0, list.find(Bytes("30 [Aban]"))) + '\0';
    EXPECT_EQ(Show(ReadAndSave(closed)), Show(closed));
}

TEST(OutSerialiserItems, StrategiesAndPathAreInherited)
{
    class Advice : public SerialisationStrategy
    {
        ~Advice() override = default;
    };
    struct Inner
    {
        static ClassUID GetClassUID() { return "Innr"; }
        static unsigned short GetSchemaVersion() { return 1; }
        void Save(OutSerialiser& out) const
        {
            EXPECT_EQ(out.GetStrategies().size(), 1u);
            EXPECT_EQ(out.GetFilePath(), "/a/b");
            out.PushStrategy(MakeCounted<Advice>());
            out.SetFilePath("/c");
        }
    };
    SaveList([](OutSerialiser& out) {
        out.SetFilePath("/a/b");
        {
            SerialisationStrategySession const pushed(out, MakeCounted<Advice>());
            SerialisationStrategySession const nothing(out, nullptr);
            out.SaveClass("Innr", Inner());
            EXPECT_EQ(out.GetStrategies().size(), 1u);
            EXPECT_EQ(out.GetFilePath(), "/a/b");
        }
        EXPECT_TRUE(out.GetStrategies().empty());
    });
}

} // namespace
} // namespace KernelTest

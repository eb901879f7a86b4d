#include "libkernel/serialisation/InSerialiser.h"

#include "libkernel/core/Uuid.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/FlagSerialiser.h"
#include "libkernel/serialisation/InSerialiserPropertyDataStream.h"
#include "serialisation/ReaderClasses.h"
#include "support/LoadEverything.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

namespace Kernel::Test {
namespace {

struct Number
{
    char const* what;
    u8 type;
    bool (*loads)(InSerialiser const&, IDTag);
};

template <class T>
bool Loads(InSerialiser const& in, IDTag tag)
{
    T value{};
    return in.LoadType(tag, value);
}

constexpr Number c_numbers[] = {{"u8", 1, &Loads<u8>},          {"u16", 2, &Loads<u16>},    {"u32", 3, &Loads<u32>},
                                {"u64", 4, &Loads<u64>},        {"i8", 5, &Loads<i8>},      {"i16", 6, &Loads<i16>},
                                {"i32", 7, &Loads<i32>},        {"i64", 8, &Loads<i64>},    {"float", 9, &Loads<float>},
                                {"double", 10, &Loads<double>}, {"bool", 41, &Loads<bool>}, {"tag", 47, &Loads<IDTag>},
                                {"uid", 52, &Loads<ClassUID>}};

TEST(InSerialiserTest, NumberLoadsAsItsOwnTypeAlone)
{
    for (Number const& stored : c_numbers) {
        PropertyBytes b;
        b.Header().Item(stored.type, "Valu").Zeros(c_propSizes[stored.type]).End();
        Counted<InSerialiserFile> const file = Parse(b.bytes);
        ASSERT_TRUE(file) << stored.what;
        for (Number const& asked : c_numbers) {
            EXPECT_EQ(asked.loads(*file, IDTag("Valu")), asked.type == stored.type)
                << stored.what << " as " << asked.what;
            EXPECT_FALSE(asked.loads(*file, IDTag("Othr")));
        }
    }
}

TEST(InSerialiserTest, RefusedLoadLeavesTheOutputUntouched)
{
    PropertyBytes b;
    b.Header().U32Item("Numb", 5).TextItem("Text", "t").Item(0x83, "Arry").U32(1).U32(9).End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    ASSERT_TRUE(file);
    u64 wide = 77;
    String8 text = "before";
    std::vector<u32> values{1, 2};
    u32 two[2] = {3, 4};
    EXPECT_FALSE(file->LoadType("Numb", wide));
    EXPECT_FALSE(file->LoadType("Numb", text));
    EXPECT_FALSE(file->LoadTypes("Numb", values));
    EXPECT_FALSE(file->LoadTypes("Arry", two, 2));
    u32 narrow = 88;
    EXPECT_FALSE(file->LoadType("Arry", narrow));
    EXPECT_FALSE(file->LoadTypeI("Numb", PropType::UInt32, &narrow, 2));
    Uuid id;
    Uuid const before = id;
    EXPECT_FALSE(id.Load(*file, "Numb"));
    EXPECT_EQ(id, before);
    EXPECT_EQ(wide, 77u);
    EXPECT_EQ(narrow, 88u);
    EXPECT_EQ(text, "before");
    EXPECT_EQ(values, (std::vector<u32>{1, 2}));
    EXPECT_EQ(two[0], 3u);
}

// Each form alone is read where it is written; here stands what no writer writes, and what hangs together.
TEST(InSerialiserTest, EveryItemFormLoadsByEveryDelivery)
{
    PropertyBytes const b = EveryItemForm();
    for (Delivery delivery : c_deliveries) {
        SCOPED_TRACE(static_cast<int>(delivery));
        Counted<InSerialiserFile> const in = Parse(b.bytes, true, delivery);
        ASSERT_TRUE(in);
        u8 block[64];
        EXPECT_TRUE(in->LoadTypeI(IDTag(0x10000 + 30), static_cast<PropType>(30), block, 48));
        EXPECT_EQ(block[47], 48);
        EXPECT_TRUE(in->LoadRawStructI(IDTag(0x10000 + 116), block, 64));
        EXPECT_FALSE(in->LoadRawStructI(IDTag(0x10000 + 116), block, 63));
        Uuid id;
        EXPECT_TRUE(id.Load(*in, IDTag(0x10044)));
        EXPECT_EQ(id, Uuid("04030201-0605-0807-090A-0B0C0D0E0F10"));
        EXPECT_FALSE(in->LoadTypeCustomI("Cust", block, 2));
        String16 text;
        EXPECT_TRUE(in->LoadType("Text", text));
        EXPECT_EQ(text.GetLength(), 5);
        EXPECT_FALSE(in->LoadType("Shpd", text));
        Counted<FragmentedRawData> fragments;
        ASSERT_TRUE(in->LoadFragmentedRawData("Frag", fragments));
        EXPECT_EQ(fragments->GetData(3, block, 9), 1u);
        ClassUID uid;
        unsigned short version = 0;
        auto const* const lists = in->LoadClassesI("Clss", uid, version);
        ASSERT_TRUE(lists && lists->size() == 3);
        EXPECT_TRUE((*lists)[0] && !(*lists)[1] && (*lists)[2]);
        EXPECT_TRUE(!in->LoadClassI("ClsN", uid, version) && uid.value == 0);
        Counted<DelayLoadHolder> holder;
        EXPECT_TRUE(in->LoadDelayLoadObject("DlyN", holder) && !holder);
        EXPECT_TRUE(in->LoadDelayLoadObject("DlyZ", holder) && !holder);
        Counted<ReaderNode> root;
        ASSERT_TRUE(in->LoadObject("Root", root));
        EXPECT_EQ(root->number, 100u);
        EXPECT_EQ(root->name, "default name");
        EXPECT_FALSE(root->sawUnloaded); // An owner loads after what it owns.
        ASSERT_EQ(root->kids.size(), 3u);
        EXPECT_EQ(root->kids[2], root->child);
        EXPECT_EQ(root->reference.Get(), root->child.Get());
        Consolidated<ReaderShared> shared;
        EXPECT_TRUE(in->LoadSharedObject("Shar", shared));
        EXPECT_TRUE(root->shared && shared->next == root->shared);
        Counted<ReaderLegacy> legacy;
        EXPECT_TRUE(in->LoadObject("Lgcy", legacy));
        EXPECT_EQ(legacy->madeWith, 77u);
        EXPECT_GT(LoadEverything(*in), 300u);
    }
}

TEST(InSerialiserTest, CapacityRuleHoldsForEveryKindOfArray)
{
    Counted<InSerialiserFile> const in = Parse(EveryItemForm().bytes);
    ASSERT_TRUE(in);
    u64 stored = 0;
    bool bits[12];
    EXPECT_FALSE(in->LoadTypes("Bits", bits, 12));
    EXPECT_TRUE(in->LoadTypes("Bits", bits, 11));
    EXPECT_TRUE(in->LoadTypes("Bits", bits, 2, &stored));
    EXPECT_EQ(stored, 11u);
    String8 texts[3] = {"x", "x", "x"};
    EXPECT_FALSE(in->LoadTypes("Txts", texts, 3));
    EXPECT_TRUE(in->LoadTypes("Txts", texts, 3, &stored));
    EXPECT_EQ(stored, 2u);
    EXPECT_EQ(texts[0], "ab");
    EXPECT_EQ(texts[2], "x");
    u32 numbers[4] = {9, 9, 9, 9};
    EXPECT_FALSE(in->LoadTypes(IDTag(0x20003), numbers, 1));
    EXPECT_TRUE(in->LoadTypes(IDTag(0x20003), numbers, 1, &stored));
    EXPECT_EQ(stored, 2u);
    EXPECT_EQ(numbers[0], 0u);
    EXPECT_EQ(numbers[1], 9u);
}

TEST(InSerialiserTest, EnumsAndFlagsGoThroughTheirSerialisers)
{
    Counted<InSerialiserFile> const in = Parse(EveryItemForm().bytes);
    ASSERT_TRUE(in);
    EnumSerialiser enums;
    enums.RegisterEnumSet({{10}, {20}, {30, 1}});
    FlagSerialiser flags;
    FlagSerialiser::FlagIndex const indices[] = {{0}, {1}, {2}, {3}, {4}, {5}, {6}, {7}, {20}};
    flags.RegisterFlagIndices(indices);
    int value = 0;
    int two[2] = {};
    u64 stored = 0;
    EXPECT_TRUE(in->LoadEnumI("Enum", enums, value));
    EXPECT_EQ(value, 30);
    EXPECT_FALSE(in->LoadEnumI("Enms", enums, two, 2));
    EXPECT_TRUE(in->LoadEnumI("Enms", enums, two, 2, &stored));
    EXPECT_EQ(two[1], 10);
    EXPECT_EQ(stored, 3u);
    u64 bits = 7;
    EXPECT_FALSE(in->LoadFlagSetI("Flag", flags, bits, 2)); // Bit 20 needs three bytes.
    EXPECT_EQ(bits, 7u);
    EXPECT_TRUE(in->LoadFlagSetI("Flag", flags, bits, 4));
    EXPECT_EQ(bits, 0x100018u);
    EXPECT_THROW(in->LoadEnumI("Enum", EnumSerialiser(), value), UnknownEnumVersionException);
    EXPECT_THROW(in->LoadFlagSetI("Flag", FlagSerialiser(), bits, 8), UnknownFlagVersionException);
    for (u8 size : {u8(9), u8(255)}) { // More than a word.
        PropertyBytes b;
        b.Header().Item(0x75, "Flag").U16(0).U8(size).Zeros(size).End();
        EXPECT_FALSE(Parse(b.bytes)->LoadFlagSetI("Flag", flags, bits, 8));
    }
}

TEST(InSerialiserTest, SwappedRawDataComesBackOnTheNextLoad)
{
    PropertyBytes b;
    b.Header().Item(0x2D, "Data").U32(2).Raw({5, 6}).Item(0x2D, "None").U32(0).End();
    Counted<InSerialiserFile> const in = Parse(b.bytes);
    ASSERT_TRUE(in);
    RawDataBlock mine(7);
    void const* const before = mine.GetData();
    ASSERT_TRUE(in->LoadRawData("Data", mine, true));
    EXPECT_EQ(mine.GetSize(), 2u);
    EXPECT_EQ(mine.GetBytes()[1], 6);
    RawDataBlock second;
    ASSERT_TRUE(in->LoadRawData("Data", second, true));
    EXPECT_EQ(second.GetData(), before);
    EXPECT_EQ(second.GetSize(), 7u);
    ASSERT_TRUE(in->LoadRawData("None", second));
    EXPECT_EQ(second.GetSize(), 0u);
}

TEST(InSerialiserTest, LaterItemReplacesEarlierOfItsTag)
{
    for (int others : {0, 40}) // Short lists and long ones are sorted in different ways.
    {
        PropertyBytes b;
        b.Header().Item(0x2D, "Twic").U32(1).U8(1).U32Item("Aaaa", 1);
        for (int i = others; i > 0; --i) b.U8(1).U32(static_cast<u32>(i)).U8(0);
        b.U32Item("Twic", 2).U32Item("Zzzz", 3).U32Item("Twic", 4).End();
        Counted<InSerialiserFile> const in = Parse(b.bytes);
        ASSERT_TRUE(in);
        u32 value = 0;
        EXPECT_TRUE(in->LoadType("Twic", value));
        EXPECT_EQ(value, 4u);
        EXPECT_EQ(in->GetTags().size(), 3u + static_cast<size_t>(others));
        in->TearDown("Twic");
        EXPECT_FALSE(in->HasProperty("Twic"));
        EXPECT_TRUE(in->LoadType("Zzzz", value));
        in->TearDownAllProperties();
        EXPECT_FALSE(in->HasProperty("Zzzz"));
    }
}

TEST(InSerialiserTest, TearDownReleasesWhatItHolds)
{
    int const before = ReaderNode::s_alive;
    PropertyBytes b;
    b.Header().Item(0x31, "Objt").Object(0).RootClass("RdNo").End();
    b.Item(0xB1, "Arry").U32(2).Object(1).KnownClass("RdNo").End().U8(0).End();
    Counted<InSerialiserFile> const in = Parse(b.bytes);
    ASSERT_TRUE(in);
    EXPECT_EQ(ReaderNode::s_alive, before + 2);
    in->TearDown("Arry");
    EXPECT_EQ(ReaderNode::s_alive, before + 1);
    in->TearDownAllProperties();
    EXPECT_EQ(ReaderNode::s_alive, before);
}

TEST(InSerialiserTest, NullAnswersForPlainAndShared)
{
    Counted<InSerialiserFile> const in = Parse(EveryItemForm().bytes);
    ASSERT_TRUE(in);
    Counted<ReaderNode> node(new ReaderNode);
    Consolidated<ReaderShared> shared;
    std::vector<Counted<ReaderNode>> nodes;
    std::vector<Consolidated<ReaderShared>> allShared;
    EXPECT_TRUE(in->LoadObject("NulO", node));
    EXPECT_FALSE(node);
    EXPECT_TRUE(in->LoadSharedObject("NulO", shared));
    EXPECT_TRUE(in->LoadObjects("NulA", nodes) && nodes.size() == 4 && !nodes[3]);
    EXPECT_TRUE(in->LoadSharedObjects("NulA", allShared) && allShared.size() == 4);
}

TEST(InSerialiserTest, ObjectOfAnotherClassIsRefusedBeforeItIsCast)
{
    Counted<InSerialiserFile> const in = Parse(EveryItemForm().bytes);
    ASSERT_TRUE(in);
    Counted<ReaderLegacy> legacy;
    Consolidated<ReaderShared> shared;
    std::vector<Counted<ReaderLegacy>> legacies;
    Counted<Serialisable> plain;
    EXPECT_FALSE(in->LoadObject("Root", legacy));
    EXPECT_FALSE(in->LoadSharedObject("Root", shared));
    EXPECT_FALSE(in->LoadObjects("Shrs", legacies));
    EXPECT_FALSE(in->LoadObject("Shar", plain));
    EXPECT_TRUE(in->LoadObjectOrSharedObjectI("Root", plain,
                                              reinterpret_cast<Consolidated<SharedSerialisable>&>(shared), true));
    EXPECT_TRUE(plain);
}

TEST(InSerialiserTest, JsonTextLoadsUnlessItIsBadOrTooDeep)
{
    struct
    {
        char const* what;
        std::string text;
        bool loads;
    } const cases[] = {
        {"object", R"({"a": [1, 2.5, "x"]})", true},
        {"comment", "/* \" [ */ [1] // [", true},
        {"cut", "[1", false},
        {"deepest", std::string(1000, '[') + std::string(1000, ']'), true},
        {"too deep", std::string(1001, '[') + std::string(1001, ']'), false},
        {"too deep behind a quote in a comment", "/*\"*/" + std::string(1001, '['), false},
    };
    for (auto const& c : cases) {
        PropertyBytes b;
        b.Header().TextItem("Json", c.text).End();
        Counted<InSerialiserFile> const in = Parse(b.bytes);
        ASSERT_TRUE(in);
        nlohmann::json value = 5;
        EXPECT_EQ(in->LoadType("Json", value), c.loads) << c.what;
        EXPECT_EQ(value == 5, !c.loads) << c.what;
    }
}

TEST(InSerialiserTest, LongTextsAreSharedAndCorrect)
{
    std::string const longText(100000, 'x');
    PropertyBytes b;
    b.Header().TextItem("Long", longText).TextItem("Shrt", "s").End();
    for (Delivery delivery : c_deliveries) {
        Counted<InSerialiserFile> const in = Parse(b.bytes, true, delivery);
        ASSERT_TRUE(in);
        String8 first;
        String8 second;
        EXPECT_TRUE(in->LoadType("Long", first) && in->LoadType("Long", second));
        EXPECT_EQ(first.GetView(), longText);
        EXPECT_TRUE(first.SharesBlockWith(second));
    }
}

// Data streams.

TEST(InSerialiserPropertyDataStreamTest, MismatchDoesNotAdvance)
{
    PropertyBytes b;
    b.Header().Item(0x30, "Strm").U16(1).U8(3).U32(5).U8(0x83).U32(1).U32(6).End().End();
    Counted<InSerialiserFile> const in = Parse(b.bytes);
    InSerialiserPropertyDataStream s;
    ASSERT_TRUE(in && in->LoadDataStream("Strm", s));
    u64 wide = 1;
    u32 number = 0;
    std::vector<u32> numbers;
    EXPECT_FALSE(s.LoadValue(wide));
    EXPECT_FALSE(s.LoadValues(numbers));
    EXPECT_EQ(wide, 1u);
    EXPECT_TRUE(s.LoadValue(number));
    EXPECT_FALSE(s.LoadValue(number));
    EXPECT_TRUE(s.LoadValues(numbers));
}

TEST(InSerialiserPropertyDataStreamTest, ReferencesAndUnknownTypesCanNotStandInIt)
{
    for (int type : {0x30, 0x31, 0x32, 0x33, 0x75, 0x76, 0x77, 0x78, 0x7F, 0x2E, 0x80, 0xAD, 0xB1, 0xFF}) {
        PropertyBytes b;
        b.Header().Item(0x30, "Strm").U16(1).U8(static_cast<u8>(type)).Zeros(40);
        EXPECT_FALSE(Parse(b.bytes)) << type;
        EXPECT_FALSE(Parse(b.bytes, false)) << type;
    }
}

TEST(InSerialiserPropertyDataStreamTest, LongStreamGrowsInOnePiece)
{
    PropertyBytes b;
    b.Header().Item(0x30, "Strm").U16(1);
    for (u32 i = 0; i < 50000; ++i) b.U8(3).U32(i);
    b.U8(0x2D).U32(3000000).Zeros(3000000).U8(1).U8(99).End().U32Item("Next", 8).End();
    for (Delivery delivery : c_deliveries) {
        Counted<InSerialiserFile> const in = Parse(b.bytes, true, delivery);
        InSerialiserPropertyDataStream s;
        ASSERT_TRUE(in && in->LoadDataStream("Strm", s));
        u32 number = 0;
        for (u32 i = 0; i < 50000; ++i) ASSERT_TRUE(s.LoadValue(number) && number == i);
        RawDataBlock raw;
        u8 last = 0;
        EXPECT_TRUE(s.LoadValueRaw(raw) && raw.GetSize() == 3000000);
        EXPECT_TRUE(s.LoadValue(last) && last == 99);
        EXPECT_TRUE(in->LoadType("Next", number) && number == 8);
    }
}

} // namespace
} // namespace Kernel::Test

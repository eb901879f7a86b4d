#include "libkernel/serialisation/InSerialiser.h"

#include "PropertyChecks.h"
#include "libkernel/core/Uuid.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/FlagSerialiser.h"
#include "libkernel/serialisation/InSerialiserPropertyDataStream.h"
#include "serialisation/ReaderClasses.h"
#include "support/LoadEverything.h"
#include "support/Rows.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

namespace Kernel::Test {
namespace {

template <class T>
bool Loads(InSerialiser const& in, IDTag tag)
{
    T value{};
    return in.LoadType(tag, value);
}

constexpr std::pair<u8, bool (*)(InSerialiser const&, IDTag)> c_numbers[] = {
    {1, &Loads<u8>},    {2, &Loads<u16>},    {3, &Loads<u32>},      {4, &Loads<u64>},   {5, &Loads<i8>},
    {6, &Loads<i16>},   {7, &Loads<i32>},    {8, &Loads<i64>},      {9, &Loads<float>}, {10, &Loads<double>},
    {41, &Loads<bool>}, {47, &Loads<IDTag>}, {52, &Loads<ClassUID>}};

TEST(InSerialiserTest, NumberLoadsAsItsOwnTypeAlone)
{
    for (auto const& [stored, ignored] : c_numbers) {
        PropertyBytes const b = PropertyBytes().Header().Item(stored, "Valu").Zeros(c_propSizes[stored]).End();
        Counted<InSerialiserFile> const file = Parse(b.bytes);
        ASSERT_TRUE(file) << int(stored);
        for (auto const& [asked, loads] : c_numbers) {
            EXPECT_EQ(loads(*file, IDTag("Valu")), asked == stored) << int(stored) << " as " << int(asked);
            EXPECT_FALSE(loads(*file, IDTag("Othr")));
        }
    }
}

TEST(InSerialiserTest, RefusedLoadLeavesTheOutputUntouched)
{
    auto const file = ParseItems("03 [Numb] 05000000 | 2B [Text] 01000000 't' | 83 [Arry] 01000000 09000000");
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

// Each form alone is read where it is written, and both forms of the parse, every delivery and the check of streams are
// held against each other here; what no writer writes, and what hangs together, is asked for by hand.
TEST(InSerialiserTest, EveryItemFormLoadsByEveryDelivery)
{
    PropertyBytes const b = EveryItemForm();
    for (Delivery delivery : c_deliveries) Fuzz::CheckProperties(b.bytes, true, delivery);
    Counted<InSerialiserFile> const in = Parse(b.bytes);
    ASSERT_TRUE(in);
    u8 block[64];
    EXPECT_FALSE(in->LoadRawStructI(IDTag(0x10000 + 116), block, 63));
    EXPECT_FALSE(in->LoadTypeCustomI("Cust", block, 2));
    Uuid id;
    EXPECT_TRUE(id.Load(*in, IDTag(0x10044)));
    EXPECT_EQ(id, Uuid("04030201-0605-0807-090A-0B0C0D0E0F10"));
    String16 text;
    EXPECT_TRUE(in->LoadType("Text", text));
    EXPECT_EQ(text.GetLength(), 5);
    EXPECT_FALSE(in->LoadType("Shpd", text));
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

// As many as there is room for, and with the number stored more room than needed.
template <class T, size_t N>
void ExpectCapacityRule(IDTag tag, T (&values)[N], u64 expected)
{
    Counted<InSerialiserFile> const in = Parse(EveryItemForm().bytes);
    T const last = values[N - 1];
    u64 stored = 0;
    EXPECT_FALSE(in->LoadTypes(tag, values, N));
    EXPECT_TRUE(in->LoadTypes(tag, values, expected));
    values[N - 1] = last;
    EXPECT_TRUE(in->LoadTypes(tag, values, N, &stored));
    EXPECT_EQ(stored, expected);
    EXPECT_EQ(values[N - 1], last);
    EXPECT_TRUE(in->LoadTypes(tag, values, 1, &stored));
    EXPECT_EQ(stored, expected);
}

TEST(InSerialiserTest, CapacityRuleHoldsForEveryKindOfArray)
{
    bool bits[12] = {};
    String8 texts[3] = {"x", "x", "x"};
    u32 numbers[4] = {9, 9, 9, 9};
    ExpectCapacityRule("Bits", bits, 11);
    ExpectCapacityRule("Txts", texts, 2);
    ExpectCapacityRule(IDTag(0x20003), numbers, 2);
    EXPECT_EQ(texts[0], "ab");
    EXPECT_EQ(numbers[1], 0u);
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
    auto const in = ParseItems("2D [Data] 02000000 0506 | 2D [None] 00000000");
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
    auto const in = ParseItems("31 [Objt] 01 00000000 00 [RdNo] 0100 00 02 00"
                               "B1 [Arry] 02000000 01 01000000 01 [RdNo] 00 00");
    ASSERT_TRUE(in);
    EXPECT_EQ(ReaderNode::s_alive, before + 2);
    in->TearDown("Arry");
    EXPECT_EQ(ReaderNode::s_alive, before + 1);
    in->TearDownAllProperties();
    EXPECT_EQ(ReaderNode::s_alive, before);
}

TEST(InSerialiserTest, NullIsOfAnyClassAndAnotherClassIsRefusedBeforeItIsCast)
{
    Counted<InSerialiserFile> const in = Parse(EveryItemForm().bytes);
    ASSERT_TRUE(in);
    Counted<ReaderNode> node(new ReaderNode);
    Consolidated<ReaderShared> shared;
    std::vector<Counted<ReaderNode>> nodes;
    std::vector<Consolidated<ReaderShared>> allShared;
    EXPECT_TRUE(in->LoadObject("NulO", node) && !node);
    EXPECT_TRUE(in->LoadSharedObject("NulO", shared));
    EXPECT_TRUE(in->LoadObjects("NulA", nodes) && nodes.size() == 4 && !nodes[3]);
    EXPECT_TRUE(in->LoadSharedObjects("NulA", allShared) && allShared.size() == 4);

    Counted<ReaderLegacy> legacy;
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
    std::string const deepest = std::string(1000, '[') + std::string(1000, ']');
    for (auto const& [text, loads] : Rows<std::string, bool>{{R"({"a": [1, 2.5, "x"]})", true},
                                                             {"/* \" [ */ [1] // [", true},
                                                             {"[1", false},
                                                             {deepest, true},
                                                             {"[" + deepest + "]", false},
                                                             {"/*\"*/" + std::string(1001, '['), false}})
    {
        Counted<InSerialiserFile> const in = Parse(PropertyBytes().Header().TextItem("Json", text).End().bytes);
        ASSERT_TRUE(in);
        nlohmann::json value = 5;
        EXPECT_EQ(in->LoadType("Json", value), loads) << text.substr(0, 30);
        EXPECT_EQ(value == 5, !loads) << text.substr(0, 30);
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
    auto const in = ParseItems("30 [Strm] 0100 | 03 05000000 | 83 01000000 06000000 | 00");
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

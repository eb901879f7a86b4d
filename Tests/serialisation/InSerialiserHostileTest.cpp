#include "libkernel/core/Limits.h"
#include "libkernel/core/NestingGuard.h"
#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/PropertyStreamDump.h"
#include "serialisation/AllocationWatch.h"
#include "serialisation/ReaderClasses.h"
#include "serialisation/WriterTestSupport.h"
#include "support/LoadEverything.h"

#include <ctime>
#include <gtest/gtest.h>

namespace Kernel::Test {
namespace {

// Buffers of the parse itself: a read block, buckets of both pools, the first lists.
constexpr u64 c_parseOverhead = 256 * 1024;

enum class Outcome
{
    Parsed,
    Null,
    Thrown
};

Outcome TryParse(std::vector<u8> const& bytes, bool checks, Delivery delivery = Delivery::Memory)
{
    Outcome outcome = Outcome::Null;
    try {
        Counted<InSerialiserFile> const file = Parse(bytes, checks, delivery);
        if (file) {
            LoadEverything(*file);
            outcome = Outcome::Parsed;
        }
    } catch (FutureVersionException const&) {
        outcome = Outcome::Thrown;
    }
    ReaderNode::DropAll();
    return outcome;
}

PropertyBytes Start()
{
    return PropertyBytes().Header();
}

// With what follows the header, as WriterTestSupport.h writes bytes.
PropertyBytes Start(std::string_view more)
{
    return Start().Text(KernelTest::Bytes(more));
}

// Who sees that a stream is bad: readers that skip, too; those that look up its objects; those with the classes, or the
// registry of item types.
enum class Told
{
    Always,
    ByObjects,
    ByClasses
};

struct Case
{
    char const* what;
    PropertyBytes bytes;
    Told told = Told::Always;
};

// Inputs whose lengths promise more than there is, or that break a rule of the format.
std::vector<Case> BadStreams()
{
    return {
        {"raw data of 4 GiB", Start().Item(0x2D, "Data").U32(0xFFFFFFFF).U8(1)},
        {"bool array of 4 G bits", Start().Item(0xA9, "Bits").U32(0xFFFFFFFF).U8(1)},
        {"custom array, size 2 in 32 bits", Start().Item(0xAC, "Csts").U32(0x80000001).U16(2).Raw({1, 2})},
        {"string inside passes the total", Start().Item(0xAB, "Txts").U32(8).U32(1).U32(0x7FFFFFFF).Raw({1, 2, 3, 4})},
        {"total below its strings", Start().Item(0xAB, "Txts").U32(0).U32(0xFFFFFFFF).End()},
        {"total above its strings", Start().Item(0xAB, "Txts").U32(6).U32(1).U32(1).Raw({1, 2}).End()},
        {"object array of 4 G", Start().Item(0xB1, "Arry").U32(0xFFFFFFFF).U8(0)},
        {"class array of 4 G", Start().Item(0xB2, "Arry").U32(0xFFFFFFFF).Code("InRg").U16(1).U8(0)},
        {"path of 4 GiB", Start().Item(0x33, "Dely").Code("Xxxx").U32(0xFFFFFFFF).U8('a')},
        {"array of paths", Start().Item(0xB3, "Dely").U32(0).U32(0).End()},
        {"unregistered item type", Start().Item(0x33, "Dely").Code("Xxxx").U32(1).U8('a').End(), Told::ByClasses},
        {"array of flag sets", Start().Item(0xF5, "Flag").Zeros(8).End()},
        {"array of raw data", Start().Item(0xAD, "Data").Zeros(12)},
        {"array of data streams", Start().Item(0xB0, "Strm").Zeros(12)},
        {"array bit alone", Start().Item(0x80, "None").Zeros(12)},
        {"string of 4 GiB", Start().Item(0x2B, "Text").U32(0xFFFFFFFF).U8(1)},
        {"number array of 4 G", Start().Item(0x84, "Nums").U32(0xFFFFFFFF).U8(1)},
        {"enum array of 4 G", Start().Item(0xAA, "Enms").U32(0xFFFFFFFF).U16(0).U8(1)},
        {"aligned data of 4 GiB", Start().Item(0x77, "Algn").U32(0xFFFFFFFF).U16(65535).U8(1)},
        {"aligned data with a pad beyond the end", Start().Item(0x77, "Algn").U32(1).U16(65535).U8(1)},
        {"fragments of 4 GiB", Start().Item(0x76, "Frag").U32(0xFFFFFFFF).U32(1).U8(1)},
        {"raw data of 4 GiB in a data stream", Start().Item(0x30, "Strm").U16(1).U8(0x2D).U32(0xFFFFFFFF).U8(1)},
        {"strings of 4 GiB in a data stream",
         Start().Item(0x30, "Strm").U16(1).U8(0xAB).U32(8).U32(1).U32(0x7FFFFFFF).Zeros(9)},
        {"plain and shared in one array",
         Start("B1 [Arry] 02000000 | 01 00000000 00 [RdNo] 0100 00 02 00 | 01 "
               "01000000 00 [RdSh] 0100 00 02 03 [Numb] 01000000 00 | 00"),
         Told::ByClasses},
        {"index used twice",
         Start("B1 [Arry] 02000000 | 01 00000000 00 [RdNo] 0100 00 02 00 | 01 00000000 01 [RdNo] 00 | 00"),
         Told::ByObjects},
        {"index of a shared object used inside it",
         Start("31 [Shar] 01 00000000 00 [RdSh] 0100 00 02 03 [Numb] 01000000 | 31 [Next] 01 00000000 01 [RdSh] 03 "
               "[Numb] 02000000 00 | 00 00"),
         Told::ByObjects},
        {"shared object that holds itself",
         Start("31 [Shar] 01 00000000 00 [RdSh] 0100 00 02 03 [Numb] 01000000 | 31 [Next] 02 00000000 | 00 00"),
         Told::ByClasses},
        {"index unknown", Start().Item(0x31, "Objt").BackReference(3).End(), Told::ByObjects},
        {"first byte of an object", Start().Item(0x31, "Objt").U8(3).Zeros(20)},
        {"first byte of a class record", Start().Item(0x31, "Objt").Object(0).U8(3).Zeros(20)},
        {"first byte of an inline class", Start().Item(0x32, "Clas").U8(2).Zeros(20)},
        {"object without a class", Start().Item(0x31, "Objt").Object(0).U8(2).End().End()},
        {"class never described", Start().Item(0x31, "Objt").Object(0).KnownClass("RdNo").End().End()},
        {"class described twice",
         Start("B1 [Arry] 02000000 | 01 00000000 00 [RdNo] 0100 00 02 00 | 01 01000000 00 [RdNo] 0100 00 02 00 | 00")},
        {"class that is its own parent",
         Start("31 [Objt] 01 00000000 | 00 [RdNo] 0100 00 | 01 [RdNo] | 03 [Numb] 01000000 00 00")},
        {"classes that are each other's parents through a default object",
         Start("31 [Objt] 01 00000000 | 00 [RdNo] 0100 31 [Dflt] 01 01000000 | 00 [RdDv] 0100 00 01 [RdNo] | 00 00 02 "
               "00 00")},
        {"other format", PropertyBytes().U32(0x4C4BFF00).U16(2).Code("Test").U16(1).U32(24).End(), Told::ByObjects},
        {"header cut at 13 bytes", PropertyBytes().U32(0x534BFF00).U16(2).Code("Test").U16(1).U8(0), Told::ByObjects},
    };
}

// By both forms, below an object of an unknown class, which is skipped, and by the check that needs no classes.
TEST(InSerialiserHostileTest, BadStreamGivesNullAndTakesNoMemory)
{
    for (Case const& c : BadStreams()) {
        PropertyBytes skipped = Start().Item(0x31, "Unkn").Object(100).RootClass("Xxxx");
        if (c.told == Told::Always)
            skipped.bytes.insert(skipped.bytes.end(), c.bytes.bytes.begin() + 16, c.bytes.bytes.end());
        for (Delivery delivery : c_deliveries) {
            SCOPED_TRACE(std::string(c.what) + ", delivery " + std::to_string(static_cast<int>(delivery)));
            u64 const ahead = delivery == Delivery::Unsized ? c_unsizedReadAhead : 0;
            for (bool checks : {true, false}) {
                AllocationWatch const watch;
                EXPECT_EQ(TryParse(c.bytes.bytes, checks, delivery), Outcome::Null);
                EXPECT_LE(AllocationWatch::GetPeak(), c_parseOverhead + ahead);
            }
            EXPECT_TRUE(c.told != Told::Always || TryParse(skipped.bytes, false, delivery) == Outcome::Null);
        }
        if (c.told == Told::ByClasses) continue;
        PropertyStreamReport const report = CheckPropertyStream(*Deliver(c.bytes.bytes, Delivery::Memory));
        EXPECT_FALSE(report.IsGood() || report.reason.IsEmpty()) << c.what;
        EXPECT_LE(report.offset, c.bytes.bytes.size()) << c.what;
    }
}

TEST(InSerialiserHostileTest, EmptyElementsOfAnyCountAreKept)
{
    PropertyBytes const b = Start().Item(0xAC, "Csts").U32(0xFFFFFFFF).U16(0).End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    ASSERT_TRUE(file);
    u64 count = 0;
    EXPECT_TRUE(file->LoadTypeCustomArrayI("Csts", 0, count));
    EXPECT_EQ(count, 0xFFFFFFFFu);
    EXPECT_FALSE(file->LoadTypeCustomArrayI("Csts", 1, count));
}

TEST(InSerialiserHostileTest, FragmentBlockIsCutToTheData)
{
    struct
    {
        u32 size;
        u32 block;
        u64 expected;
    } const cases[] = {
        {1, 0xFFFFFFFF, 16384},         {1, 0, 16384},          {1, 1u << 20, 1u << 20},      {50000, 20000, 20000},
        {3000000, 0x80000000, 3000000}, {0, 0xFFFFFFFF, 16384}, {3000000, 1u << 20, 1u << 20}};
    for (auto const& c : cases) {
        for (Delivery delivery : c_deliveries) {
            PropertyBytes const b = Start().Item(0x76, "Frag").U32(c.size).U32(c.block).Zeros(c.size).End();
            AllocationWatch const watch;
            Counted<InSerialiserFile> const file = Parse(b.bytes, true, delivery);
            Counted<FragmentedRawData> data;
            ASSERT_TRUE(file && file->LoadFragmentedRawData("Frag", data));
            EXPECT_EQ(data->GetBlockSize(), c.expected);
            EXPECT_EQ(data->GetSize(), c.size);
            EXPECT_LE(AllocationWatch::GetPeak(), c_parseOverhead + 4 * u64(c.size) + (2u << 20));
        }
    }
}

TEST(InSerialiserHostileTest, UnsizedSourceTakesMemoryAsBytesCome)
{
    constexpr u32 c_there = 3u << 20;
    PropertyBytes const cases[] = {
        Start().Item(0x2D, "Data").U32(0x7FFFFFFF).Zeros(c_there),
        Start().Item(0x2B, "Text").U32(0x7FFFFFFF).Zeros(c_there),
        Start().Item(0x84, "Nums").U32(0x0FFFFFFF).Zeros(c_there),
        Start().Item(0x76, "Frag").U32(0x7FFFFFFF).U32(65536).Zeros(c_there),
        Start().Item(0x76, "Frag").U32(0x7FFFFFFF).U32(0x7FFFFFFF).Zeros(c_there),
        Start().Item(0x30, "Strm").U16(1).U8(0x2D).U32(0x7FFFFFFF).Zeros(c_there),
        Start().Item(0xB1, "Arry").U32(0x7FFFFFFF).Zeros(c_there),
    };
    for (PropertyBytes const& b : cases) {
        Counted<InStream> const in = Deliver(b.bytes, Delivery::Unsized);
        AllocationWatch const watch;
        EXPECT_FALSE(InSerialiserFile::ParseWithChecks(*in));
        EXPECT_LE(AllocationWatch::GetPeak(), c_parseOverhead + c_there + 2 * c_unsizedReadAhead);
    }
}

// Nesting.

struct Nest
{
    char const* what;
    PropertyBytes open; // Once a level.
    bool isUnknown;     // The levels lie below an object of an unknown class.
};

std::vector<Nest> Nests()
{
    return {
        {"inline classes", PropertyBytes().Item(0x32, "Clas").U8(1).Code("InRg").U16(1), false},
        {"inline class arrays", PropertyBytes().Item(0xB2, "Clas").U32(1).Code("InRg").U16(1).U8(1), false},
        {"skipped inline classes", PropertyBytes().Item(0x32, "Clas").U8(1).Code("InRg").U16(1), true},
        {"skipped inline class arrays", PropertyBytes().Item(0xB2, "Clas").U32(1).Code("InRg").U16(1).U8(1), true},
    };
}

PropertyBytes MakeNest(Nest const& nest, u32 levels, bool close)
{
    PropertyBytes b = Start();
    if (nest.isUnknown) b.Item(0x31, "Unkn").Object(0).RootClass("Xxxx");
    for (u32 i = 0; i < levels; ++i) b.Append(nest.open);
    // Nulls are no level.
    b.Item(0x31, "None").U8(0).Item(0x32, "NoCl").U8(0);
    b.Item(0xB2, "NoCs").U32(1).Code("InRg").U16(1).U8(0);
    if (close) b.Zeros(levels + 1 + nest.isUnknown);
    return b;
}

TEST(InSerialiserHostileTest, NestingIsLimited)
{
    for (Nest const& nest : Nests()) {
        SCOPED_TRACE(nest.what);
        u32 const deepest = c_maxNesting - nest.isUnknown;
        PropertyBytes const allowed = MakeNest(nest, deepest, true);
        EXPECT_TRUE(Parse(allowed.bytes, false));
        EXPECT_TRUE(CheckPropertyStream(*Deliver(allowed.bytes, Delivery::Memory)).IsGood());
        EXPECT_FALSE(Parse(MakeNest(nest, deepest + 1, true).bytes, false));
        EXPECT_FALSE(Parse(MakeNest(nest, 100000, true).bytes, false));
        EXPECT_FALSE(Parse(MakeNest(nest, 100000, false).bytes, false));
        EXPECT_EQ(NestingGuard::GetDepth(), 0u);
    }
}

PropertyBytes ObjectChain(u32 levels, char const (&tag)[5])
{
    PropertyBytes b = Start();
    for (u32 i = 0; i < levels; ++i) {
        b.Item(0x31, tag).Object(i);
        if (i == 0)
            b.RootClass("RdNo");
        else
            b.KnownClass("RdNo");
    }
    return b.Zeros(levels + 1);
}

TEST(InSerialiserHostileTest, ObjectsAreLimitedTogetherWithTheirParents)
{
    EXPECT_TRUE(Parse(ObjectChain(c_maxNesting, "Chld").bytes));
    EXPECT_FALSE(Parse(ObjectChain(c_maxNesting + 1, "Chld").bytes));
    EXPECT_FALSE(Parse(ObjectChain(100000, "Chld").bytes));

    // Parents, each of an unknown class: 8 bytes a level.
    for (u32 levels : {c_maxNesting - 1, c_maxNesting + 2, 100000u}) {
        PropertyBytes b = Start().Item(0x31, "Objt").Object(0);
        for (u32 i = 0; i < levels; ++i) b.U8(0).U32(0x78000000 + i).U16(1).End();
        b.U8(2).End().End();
        EXPECT_EQ(TryParse(b.bytes, false), levels < c_maxNesting ? Outcome::Parsed : Outcome::Null) << levels;
        Counted<InStream> const in = Deliver(b.bytes, Delivery::Memory);
        EXPECT_EQ(CheckPropertyStream(*in).IsGood(), levels < c_maxNesting);
    }
    // Objects as defaults of unknown classes, one in the other.
    PropertyBytes defaults = Start();
    for (u32 i = 0; i < 50000; ++i) defaults.Item(0x31, "Objt").Object(i).U8(0).U32(0x78000000 + i).U16(1);
    EXPECT_EQ(TryParse(defaults.bytes, false), Outcome::Null);
    EXPECT_EQ(TryParse(defaults.bytes, true), Outcome::Null);
    EXPECT_EQ(NestingGuard::GetDepth(), 0u);
}

// Damage.

TEST(InSerialiserHostileTest, StreamCutAtAnyByteGivesNull)
{
    PropertyBytes const b = EveryItemForm();
    for (size_t size = 0; size < b.bytes.size(); ++size) {
        std::vector<u8> const cut(b.bytes.begin(), b.bytes.begin() + static_cast<i64>(size));
        for (Delivery delivery : c_deliveries) {
            ASSERT_EQ(TryParse(cut, true, delivery), Outcome::Null) << size;
            ASSERT_EQ(TryParse(cut, false, delivery), Outcome::Null) << size;
        }
        Counted<InStream> const in = Deliver(cut, Delivery::Seekable);
        PropertyStreamReport const report = CheckPropertyStream(*in);
        ASSERT_FALSE(report.IsGood()) << size;
        ASSERT_LE(report.offset, size);
    }
}

TEST(InSerialiserHostileTest, ExceptionsLeaveNothingBehind)
{
    int const before = ReaderNode::s_alive;
    PropertyBytes b = Start().Append(EveryValueForm());
    b.Item(0x31, "Root").Object(0).RootClass("RdNo").Item(0xB1, "Kids").U32(3).Object(1).KnownClass("RdNo").End();
    b.Object(2).KnownClass("RdNo").U32Item("Refu", 1).End();
    EXPECT_THROW(Parse(b.bytes), FutureVersionException);
    EXPECT_EQ(ReaderNode::s_alive, before);
    EXPECT_EQ(NestingGuard::GetDepth(), 0u);
}

// Cost.

// The process's own time, which other load on the machine does not lengthen.
class Clock
{
public:
    double GetSeconds() const { return static_cast<double>(std::clock() - m_start) / CLOCKS_PER_SEC; }

private:
    std::clock_t const m_start = std::clock();
};

TEST(InSerialiserHostileTest, SharedObjectsOfOneHashLoadInTime)
{
    PropertyBytes b = Start().Item(0xB1, "Arry").U32(10000);
    for (u32 i = 0; i < 10000; ++i) {
        b.Object(i);
        if (i == 0)
            b.RootClass("RdSh");
        else
            b.KnownClass("RdSh");
        b.U32Item("Numb", i + 1000000).End();
    }
    b.End();
    ReaderShared::s_hashesAlike = true;
    Clock const clock;
    {
        Counted<InSerialiserFile> const file = Parse(b.bytes);
        EXPECT_TRUE(file);
    }
    EXPECT_LT(clock.GetSeconds(), 60.0); // 1 second on a quiet machine; a loaded one with a sanitiser takes its time.
    SharedClassProperties::SweepAll(true);
    ReaderShared::s_hashesAlike = false;
}

TEST(InSerialiserHostileTest, ManySmallThingsCostNoMoreThanTheirBytesAllow)
{
    struct
    {
        char const* what;
        PropertyBytes bytes;
    } cases[] = {{"values", Start()},      {"duplicates", Start()}, {"nulls", Start()},
                 {"empty lists", Start()}, {"defaults", Start()},   {"fragments", Start()}};
    constexpr u32 c_count = 150000;
    for (u32 i = c_count; i > 0; --i) {
        cases[0].bytes.U8(1).U32(i).U8(1);
        cases[1].bytes.U8(0x2D).U32(i % 2).U32(1).U8(1);
        cases[5].bytes.U8(0x76).U32(i).U32(1).U32(0xFFFFFFFF).U8(1);
    }
    cases[2].bytes.Item(0xB1, "Arry").U32(c_count).Zeros(c_count);
    cases[3].bytes.Item(0xB2, "Arry").U32(c_count).Code("InRg").U16(1);
    for (u32 i = 0; i < c_count; ++i) cases[3].bytes.U8(1).U8(0);
    cases[4].bytes.Item(0x31, "Objt").Object(0).U8(0).Code("RdNo").U16(1);
    for (u32 i = c_count; i > 0; --i) cases[4].bytes.U8(1).U32(i).U8(1);
    cases[4].bytes.End().U8(2).End();
    for (auto& c : cases) {
        c.bytes.End();
        Clock const clock;
        AllocationWatch const watch;
        EXPECT_TRUE(Parse(c.bytes.bytes)) << c.what;
        EXPECT_LT(clock.GetSeconds(), 20.0) << c.what;
        EXPECT_LE(AllocationWatch::GetPeak(), 4 * c.bytes.bytes.size() + (64u << 20)) << c.what;
    }
}

} // namespace
} // namespace Kernel::Test

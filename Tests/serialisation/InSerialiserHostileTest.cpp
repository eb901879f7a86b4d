#include "libkernel/core/Limits.h"
#include "libkernel/core/NestingGuard.h"
#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/PropertyStreamDump.h"
#include "serialisation/AllocationWatch.h"
#include "serialisation/ReaderClasses.h"
#include "support/LoadEverything.h"
#include "support/Rows.h"

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

PropertyBytes Start(std::string_view more = {})
{
    return PropertyBytes().Header().Put(more);
}

// Who sees that a stream is bad: readers that skip, too; those that look up its objects; those with the classes, or the
// registry of item types.
enum class Told
{
    Always,
    ByObjects,
    ByClasses,
    BySkipping // The form with checks throws.
};

struct Case
{
    char const* what;
    char const* text; // Behind the header.
    Told told = Told::Always;
    u32 zeros = 0; // Behind the text.
};

// Inputs whose lengths promise more than there is, or that break a rule of the format.
std::vector<Case> BadStreams()
{
    return {
        {"raw data of 4 GiB", "2D [Data] FFFFFFFF 01"},
        {"bool array of 4 G bits", "A9 [Bits] FFFFFFFF 01"},
        {"custom array, size 2 in 32 bits", "AC [Csts] 01000080 0200 0102"},
        {"string inside passes the total", "AB [Txts] 08000000 01000000 FFFFFF7F 01020304"},
        {"total below its strings", "AB [Txts] 00000000 FFFFFFFF 00"},
        {"total above its strings", "AB [Txts] 06000000 01000000 01000000 0102 00"},
        {"object array of 4 G", "B1 [Arry] FFFFFFFF 00"},
        {"class array of 4 G", "B2 [Arry] FFFFFFFF [InRg] 0100 00"},
        {"path of 4 GiB", "33 [Dely] [Xxxx] FFFFFFFF 61"},
        {"array of paths", "B3 [Dely] 00000000 00000000 00"},
        {"unregistered item type", "33 [Dely] [Xxxx] 01000000 61 00", Told::ByClasses},
        {"array of flag sets", "F5 [Flag] 0000000000000000 00"},
        {"array of raw data", "AD [Data]", Told::Always, 12},
        {"array of data streams", "B0 [Strm]", Told::Always, 12},
        {"array bit alone", "80 [None]", Told::Always, 12},
        {"string of 4 GiB", "2B [Text] FFFFFFFF 01"},
        {"number array of 4 G", "84 [Nums] FFFFFFFF 01"},
        {"enum array of 4 G", "AA [Enms] FFFFFFFF 0000 01"},
        {"aligned data of 4 GiB", "77 [Algn] FFFFFFFF FFFF 01"},
        {"aligned data with a pad beyond the end", "77 [Algn] 01000000 FFFF 01"},
        {"fragments of 4 GiB", "76 [Frag] FFFFFFFF 01000000 01"},
        {"raw data of 4 GiB in a data stream", "30 [Strm] 0100 2D FFFFFFFF 01"},
        {"strings of 4 GiB in a data stream", "30 [Strm] 0100 AB 08000000 01000000 FFFFFF7F 000000000000000000"},
        {"plain and shared in one array",
         "B1 [Arry] 02000000 | 01 00000000 00 [RdNo] 0100 00 02 00 | 01 "
         "01000000 00 [RdSh] 0100 00 02 03 [Numb] 01000000 00 | 00",
         Told::ByClasses},
        {"index used twice", "B1 [Arry] 02000000 | 01 00000000 00 [RdNo] 0100 00 02 00 | 01 00000000 01 [RdNo] 00 | 00",
         Told::ByObjects},
        {"index of a shared object used inside it",
         "31 [Shar] 01 00000000 00 [RdSh] 0100 00 02 03 [Numb] 01000000 | 31 [Next] 01 00000000 01 [RdSh] 03 "
         "[Numb] 02000000 00 | 00 00",
         Told::ByObjects},
        {"shared object that holds itself",
         "31 [Shar] 01 00000000 00 [RdSh] 0100 00 02 03 [Numb] 01000000 | 31 [Next] 02 00000000 | 00 00",
         Told::ByClasses},
        {"index unknown", "31 [Objt] 02 03000000 00", Told::ByObjects},
        {"first byte of an object", "31 [Objt] 03", Told::Always, 20},
        {"first byte of a class record", "31 [Objt] 01 00000000 03", Told::Always, 20},
        {"first byte of an inline class", "32 [Clas] 02", Told::Always, 20},
        {"object without a class", "31 [Objt] 01 00000000 02 00 00"},
        {"class never described", "31 [Objt] 01 00000000 01 [RdNo] 00 00"},
        {"class described twice",
         "B1 [Arry] 02000000 | 01 00000000 00 [RdNo] 0100 00 02 00 | 01 01000000 00 [RdNo] 0100 00 02 00 | 00"},
        {"class that is its own parent",
         "31 [Objt] 01 00000000 | 00 [RdNo] 0100 00 | 01 [RdNo] | 03 [Numb] 01000000 00 00"},
        {"classes that are each other's parents through a default object",
         "31 [Objt] 01 00000000 | 00 [RdNo] 0100 31 [Dflt] 01 01000000 | 00 [RdDv] 0100 00 01 [RdNo] | 00 00 02 "
         "00 00"},
        {"class that makes no object", "31 [Root] 01 00000000 00 [RdAb] 0100 00 02 00 00", Told::ByClasses},
        {"class that makes null", "31 [Root] 01 00000000 00 [RdNu] 0100 00 02 00 00", Told::ByClasses},
        {"reference to a skipped object", "31 [Unkn] 01 00000000 00 [Xxxx] 0100 00 02 00 | 31 [Refr] 02 00000000 00",
         Told::BySkipping},
        {"reference into a skipped object",
         "31 [Unkn] 01 00000000 00 [Xxxx] 0100 00 02 | 31 [Chld] 01 01000000 00 [RdNo] 0100 00 02 00 00"
         "31 [Refr] 02 01000000 00",
         Told::BySkipping},
        {"raw data cut at 3 MiB", "2D [Data] FFFFFF7F", Told::Always, 3 << 20},
        {"text cut at 3 MiB", "2B [Text] FFFFFF7F", Told::Always, 3 << 20},
        {"numbers cut at 3 MiB", "84 [Nums] FFFFFF0F", Told::Always, 3 << 20},
        {"fragments cut at 3 MiB", "76 [Frag] FFFFFF7F 00000100", Told::Always, 3 << 20},
        {"fragment of 2 GiB cut at 3 MiB", "76 [Frag] FFFFFF7F FFFFFF7F", Told::Always, 3 << 20},
        {"data in a data stream cut at 3 MiB", "30 [Strm] 0100 2D FFFFFF7F", Told::Always, 3 << 20},
        {"objects cut at 3 MiB", "B1 [Arry] FFFFFF7F", Told::Always, 3 << 20},
    };
}

// By both forms, below an object of an unknown class, which is skipped, and by the check that needs no classes.
TEST(InSerialiserHostileTest, BadStreamGivesNullAndTakesMemoryForNoMoreThanComes)
{
    for (Case const& c : BadStreams()) {
        PropertyBytes const plain = Start(c.text).Zeros(c.zeros);
        PropertyBytes const skipped = Start("31 [Unkn] 01 64000000 00 [Xxxx] 0100 00 02").Put(c.text).Zeros(c.zeros);
        for (Delivery delivery : c_deliveries) {
            SCOPED_TRACE(std::string(c.what) + ", delivery " + std::to_string(static_cast<int>(delivery)));
            u64 const ahead = delivery == Delivery::Unsized ? (c.zeros ? 2 : 1) * c_unsizedReadAhead : 0;
            for (bool checks : {true, false}) {
                AllocationWatch const watch;
                EXPECT_EQ(TryParse(plain.bytes, checks, delivery),
                          checks && c.told == Told::BySkipping ? Outcome::Thrown : Outcome::Null);
                EXPECT_LE(AllocationWatch::GetPeak(), c_parseOverhead + 2 * c.zeros + ahead); // One is the stream's.
            }
            EXPECT_TRUE(c.told != Told::Always || TryParse(skipped.bytes, false, delivery) == Outcome::Null);
        }
        if (c.told >= Told::ByClasses) continue;
        PropertyStreamReport const report = CheckPropertyStream(*Deliver(plain.bytes, Delivery::Memory));
        EXPECT_FALSE(report.IsGood() || report.reason.IsEmpty()) << c.what;
        EXPECT_LE(report.offset, plain.bytes.size()) << c.what;
    }
    for (char const* header : {"00FF4B4C 0200 [Test] 0100 18000000 00", "00FF4B53 0200 [Test] 0100 00"}) {
        PropertyBytes const b = PropertyBytes().Put(header); // Of another format; cut at 13 bytes.
        EXPECT_EQ(TryParse(b.bytes, true), Outcome::Null);
        EXPECT_FALSE(CheckPropertyStream(*Deliver(b.bytes, Delivery::Memory)).IsGood());
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
    for (auto const& [size, block, expected] : Rows<u32, u32, u64>{{1, 0xFFFFFFFF, 16384},
                                                                   {1, 0, 16384},
                                                                   {1, 1u << 20, 1u << 20},
                                                                   {50000, 20000, 20000},
                                                                   {3000000, 0x80000000, 3000000},
                                                                   {0, 0xFFFFFFFF, 16384},
                                                                   {3000000, 1u << 20, 1u << 20}})
        for (Delivery delivery : c_deliveries) {
            PropertyBytes const b = Start().Item(0x76, "Frag").U32(size).U32(block).Zeros(size).End();
            AllocationWatch const watch;
            Counted<InSerialiserFile> const file = Parse(b.bytes, true, delivery);
            Counted<FragmentedRawData> data;
            ASSERT_TRUE(file && file->LoadFragmentedRawData("Frag", data));
            EXPECT_EQ(data->GetBlockSize(), expected);
            EXPECT_EQ(data->GetSize(), size);
            EXPECT_LE(AllocationWatch::GetPeak(), c_parseOverhead + 4 * u64(size) + (2u << 20));
        }
}

// Nesting.

TEST(InSerialiserHostileTest, NestingIsLimited)
{
    // Inline classes and arrays of them, and both below an object of an unknown class.
    for (auto const& [outer, open] : Rows<char const*, PropertyBytes>{
             {"", PropertyBytes().Put("32 [Clas] 01 [InRg] 0100")},
             {"", PropertyBytes().Put("B2 [Clas] 01000000 [InRg] 0100 01")},
             {"31 [Unkn] 01 00000000 00 [Xxxx] 0100 00 02", PropertyBytes().Put("32 [Clas] 01 [InRg] 0100")},
             {"31 [Unkn] 01 00000000 00 [Xxxx] 0100 00 02", PropertyBytes().Put("B2 [Clas] 01000000 [InRg] 0100 01")}})
    {
        u32 const deepest = c_maxNesting - (*outer != 0);
        for (auto const& [levels, ends] :
             Rows<u32, bool>{{deepest, true}, {deepest + 1, true}, {100000, true}, {100000, false}})
        {
            SCOPED_TRACE(testing::Message() << outer << ' ' << open.bytes.size() << ' ' << levels);
            PropertyBytes b = Start(outer);
            for (u32 i = 0; i < levels; ++i) b.Append(open);
            b.Put("31 [None] 00 | 32 [NoCl] 00 | B2 [NoCs] 01000000 [InRg] 0100 00"); // Nulls are no level.
            if (ends) b.Zeros(levels + 1 + (*outer != 0));
            EXPECT_EQ(bool(Parse(b.bytes, false)), levels == deepest);
            EXPECT_EQ(CheckPropertyStream(*Deliver(b.bytes, Delivery::Memory)).IsGood(), levels == deepest);
            EXPECT_EQ(NestingGuard::GetDepth(), 0u);
        }
    }
}

TEST(InSerialiserHostileTest, ObjectsAreLimitedTogetherWithTheirParents)
{
    for (u32 levels : {c_maxNesting, c_maxNesting + 1, 100000u}) {
        PropertyBytes b = Start("31 [Chld] 01 00000000 00 [RdNo] 0100 00 02");
        for (u32 i = 1; i < levels; ++i) b.Item(0x31, "Chld").Object(i).KnownClass("RdNo");
        EXPECT_EQ(bool(Parse(b.Zeros(levels + 1).bytes)), levels == c_maxNesting) << levels;
    }
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
    for (u32 i = 0; i < 10000; ++i)
        b.Object(i).Put(i ? "01 [RdSh]" : "00 [RdSh] 0100 00 02").U32Item("Numb", i + 1000000).End();
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
    constexpr u32 c_count = 150000;
    std::pair<char const*, PropertyBytes> cases[] = {
        {"values", Start()},
        {"duplicates", Start()},
        {"nulls", Start("B1 [Arry]").U32(c_count).Zeros(c_count)},
        {"empty lists", Start("B2 [Arry]").U32(c_count).Put("[InRg] 0100")},
        {"defaults", Start("31 [Objt] 01 00000000 00 [RdNo] 0100")},
        {"fragments", Start()}};
    for (u32 i = c_count; i > 0; --i) {
        cases[0].second.U8(1).U32(i).U8(1);
        cases[1].second.U8(0x2D).U32(i % 2).U32(1).U8(1);
        cases[3].second.U8(1).U8(0);
        cases[4].second.U8(1).U32(i).U8(1);
        cases[5].second.U8(0x76).U32(i).U32(1).U32(0xFFFFFFFF).U8(1);
    }
    cases[4].second.Put("00 02 00");
    for (auto& [what, bytes] : cases) {
        bytes.End();
        Clock const clock;
        AllocationWatch const watch;
        EXPECT_TRUE(Parse(bytes.bytes)) << what;
        EXPECT_LT(clock.GetSeconds(), 20.0) << what;
        EXPECT_LE(AllocationWatch::GetPeak(), 4 * bytes.bytes.size() + (64u << 20)) << what;
    }
}

} // namespace
} // namespace Kernel::Test

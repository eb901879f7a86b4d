#include "libkernel/serialisation/EnumSerialiser.h"

#include "libkernel/serialisation/FlagSerialiser.h"

#include <gtest/gtest.h>
#include <random>

namespace KernelTest {
namespace {

using namespace Kernel;
using Entries = std::vector<EnumSerialiser::EnumEntry>;
using Indices = std::vector<FlagSerialiser::FlagIndex>;

// The plain search that every shape has to agree with.
int FindCode(Entries const& entries, int value)
{
    for (size_t i = 0; i < entries.size(); ++i)
        if (!entries[i].retired && entries[i].value == value) return static_cast<int>(i);
    return -1;
}

TEST(EnumSerialiser, EveryShapeAgreesWithAPlainSearch)
{
    constexpr int top = std::numeric_limits<int>::max();
    constexpr int bottom = std::numeric_limits<int>::min();
    Entries const tables[] = {
        {{0}},
        {{5}},
        {{5, 1}},
        {{0}, {1}, {2}},
        {{-2}, {-1}, {0}},
        {{top - 1}, {top}},
        {{bottom}, {bottom + 1}},
        {{bottom}, {0}, {top}},
        {{1}, {4}, {9}, {16}},
        {{9}, {4}, {1}},
        {{0}, {1, 1}, {2}},
        {{3}, {3}, {4}},
        {{3, 1}, {3}, {4}},
        {{0}, {2}, {1}},
    };
    for (size_t t = 0; t < std::size(tables); ++t) {
        SCOPED_TRACE(t);
        Entries const& table = tables[t];
        EnumSerialiser serialiser;
        serialiser.RegisterEnumSet(table.data(), table.size());
        for (int const value : {bottom, bottom + 1, -3, -2, -1, 0, 1, 2, 3, 4, 5, 6, 9, 15, 16, 17, top - 1, top}) {
            unsigned short code = 77;
            unsigned short version = 77;
            int const expected = FindCode(table, value);
            EXPECT_EQ(serialiser.EncodeToSerial(value, code, version), expected >= 0) << value;
            EXPECT_EQ(code, expected >= 0 ? expected : 77) << value;
            EXPECT_EQ(version, expected >= 0 ? 0 : 77) << value;
        }
        for (size_t i = 0; i < table.size(); ++i) {
            int value = 0;
            serialiser.DecodeFromSerial(static_cast<u16>(i), 0, value);
            EXPECT_EQ(value, table[i].value);
        }
        int value = 0;
        EXPECT_THROW(serialiser.DecodeFromSerial(static_cast<u16>(table.size()), 0, value),
                     UnknownEnumVersionException);
        EXPECT_THROW(serialiser.DecodeFromSerial(0, 1, value), UnknownEnumVersionException);
    }
}

TEST(EnumSerialiser, ValueIsStoredUnderTheOldestVersionThatHasIt)
{
    EnumSerialiser serialiser;
    serialiser.RegisterEnumSet({{0}, {1}, {2}});
    serialiser.RegisterEnumSet({{0}, {1, 1}, {7}});
    serialiser.RegisterEnumSet({{7}, {2}});
    struct
    {
        std::vector<int> values;
        int version; // -1 if no set knows them all.
        std::vector<unsigned short> codes;
    } const cases[] = {
        {{1}, 0, {1}},    {{7}, 1, {2}}, {{0, 7}, 1, {0, 2}}, {{2, 7}, 2, {1, 0}},
        {{1, 7}, -1, {}}, {{8}, -1, {}}, {{}, 0, {}},
    };
    for (auto const& one : cases) {
        SCOPED_TRACE(testing::PrintToString(one.values));
        std::vector<unsigned short> codes;
        unsigned short version = 9;
        bool const isKnown = serialiser.EncodeToSerial(one.values.data(), one.values.size(), codes, version);
        ASSERT_EQ(isKnown, one.version >= 0);
        if (!isKnown) continue;
        EXPECT_EQ(version, one.version);
        EXPECT_EQ(codes, one.codes);
        std::vector<int> values;
        serialiser.DecodeFromSerial(codes.data(), codes.size(), version, values);
        EXPECT_EQ(values, one.values);
    }
    int two[2] = {-1, -1};
    unsigned short const codes[] = {2, 1, 3};
    serialiser.DecodeFromSerial(codes, 3, 0, two, 2);
    EXPECT_EQ(two[0], 2);
    EXPECT_EQ(two[1], 1);
}

TEST(EnumSerialiser, TablesThatCodesCannotNameAreIgnored)
{
    Entries entries(65536);
    for (int i = 0; i < 65536; ++i) entries[static_cast<size_t>(i)].value = i;
    EnumSerialiser serialiser;
    unsigned short code = 0;
    unsigned short version = 0;
    serialiser.RegisterEnumSet(entries.data(), 65536);
    serialiser.RegisterEnumSet(nullptr, 1);
    serialiser.RegisterEnumSet(entries.data(), 0);
    EXPECT_FALSE(serialiser.EncodeToSerial(0, code, version));
    serialiser.RegisterEnumSet(entries.data(), 65535);
    EXPECT_TRUE(serialiser.EncodeToSerial(65534, code, version));
    EXPECT_EQ(code, 65534);
    EXPECT_FALSE(serialiser.EncodeToSerial(65535, code, version));
}

// Bit by bit, for tables of the shape that the fast forms do not cover.
bool EncodeSlowly(Indices const& entries, u64 flags, u64& encoded)
{
    encoded = 0;
    for (int bit = 0; bit < 64; ++bit) {
        if (!(flags >> bit & 1)) continue;
        bool isKnown = false;
        for (size_t i = 0; i < entries.size(); ++i) {
            if (entries[i].retired || entries[i].bit != bit) continue;
            encoded |= u64{1} << i;
            isKnown = true;
        }
        if (!isKnown) return false;
    }
    return true;
}

TEST(FlagSerialiser, MixedTablesMoveEachBit)
{
    std::mt19937_64 random(7);
    for (int round = 0; round < 200; ++round) {
        Indices entries;
        for (int bit = 0; bit < 64; ++bit)
            if (random() % 3) entries.push_back({bit, random() % 8 == 0});
        std::shuffle(entries.begin(), entries.end(), random);
        FlagSerialiser serialiser;
        serialiser.RegisterFlagIndices(entries.data(), entries.size());
        for (int i = 0; i < 20; ++i) {
            u64 const flags = random() & random() & random() & random();
            u64 expected = 0;
            u64 encoded = 0;
            unsigned short version = 9;
            bool const isKnown = EncodeSlowly(entries, flags, expected);
            ASSERT_EQ(serialiser.EncodeToSerial(flags, encoded, version), isKnown);
            if (!isKnown) continue;
            ASSERT_EQ(encoded, expected);
            u64 decoded = 0;
            unsigned char activeBytes = 0;
            serialiser.DecodeFromSerial(encoded, version, decoded, activeBytes);
            ASSERT_EQ(decoded, flags);
        }
    }
}

TEST(FlagSerialiser, LaterSetsTakeWhatEarlierOnesCannot)
{
    FlagSerialiser serialiser;
    Indices const tooMany(65, FlagSerialiser::FlagIndex{1});
    serialiser.RegisterFlagIndices(tooMany.data(), 65); // Ignored, as the next two.
    serialiser.RegisterFlagIndices(nullptr, 1);
    serialiser.RegisterFlagIndices(tooMany.data(), 0);
    serialiser.RegisterFlagIndices({{1}, {0}, {20, 1}});
    serialiser.RegisterFlagIndices({{20}, {0}});
    Indices all;
    for (int i = 0; i < 64; ++i) all.push_back({i});
    serialiser.RegisterFlagIndices(all.data(), 64);
    u64 encoded = 0;
    unsigned short version = 9;
    EXPECT_TRUE(serialiser.EncodeToSerial(1u << 20 | 1, encoded, version));
    EXPECT_EQ(encoded, 3u);
    EXPECT_EQ(version, 1);

    FlagSerialiser run;
    run.RegisterFlagIndices({{3}, {4}});
    struct
    {
        FlagSerialiser const& serialiser;
        u64 encoded;
        unsigned short version;
        u64 flags;
        int activeBytes; // 0: unknown.
    } const cases[] = {
        {serialiser, 4, 0, 1u << 20, 1}, // Retired, but it decodes.
        {serialiser, 1, 1, 1u << 20, 3},
        {serialiser, ~u64{0}, 2, ~u64{0}, 8},
        {serialiser, 8, 0, 0, 0},
        {serialiser, 0, 3, 0, 0},
        {run, 3, 0, 0x18, 1},
        {run, 4, 0, 0, 0},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.encoded);
        u64 flags = 0;
        unsigned char activeBytes = 0;
        try {
            c.serialiser.DecodeFromSerial(c.encoded, c.version, flags, activeBytes);
        } catch (UnknownFlagVersionException const&) {
            activeBytes = 0;
        }
        EXPECT_EQ(flags, c.flags);
        EXPECT_EQ(activeBytes, c.activeBytes);
    }
}

} // namespace
} // namespace KernelTest

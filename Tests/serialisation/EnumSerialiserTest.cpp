#include "libkernel/serialisation/EnumSerialiser.h"

#include "libkernel/serialisation/FlagSerialiser.h"

#include <gtest/gtest.h>
#include <random>

namespace KernelTest {
namespace {

using namespace Kernel;
using Entries = std::vector<EnumSerialiser::EnumEntry>;
using Indices = std::vector<FlagSerialiser::FlagIndex>;

class SerialiserModelTest : public testing::Test
{
protected:
    u64 Below(u64 bound) { return m_random() % bound; }
    std::mt19937_64 m_random{7};
};
using EnumSerialiserTest = SerialiserModelTest;
using FlagSerialiserTest = SerialiserModelTest;

// The plain searches that every shape of a table has to agree with. Sets are tried from the oldest on.
bool FindCodes(std::vector<Entries> const& sets, std::vector<int> const& values, std::vector<u16>& codes, u16& version)
{
    for (version = 0; version < sets.size(); ++version) {
        codes.clear();
        for (int const value : values) {
            auto const& set = sets[version];
            auto const is = [&](auto const& entry) { return !entry.retired && entry.value == value; };
            auto const found = std::find_if(set.begin(), set.end(), is);
            if (found != set.end()) codes.push_back(static_cast<u16>(found - set.begin()));
        }
        if (codes.size() == values.size()) return true;
    }
    return false;
}

TEST_F(EnumSerialiserTest, EveryShapeOfEveryVersionAgreesWithAPlainSearch)
{
    constexpr int top = std::numeric_limits<int>::max();
    constexpr int bottom = std::numeric_limits<int>::min();
    int const pool[] = {bottom, bottom + 1, -3, -2, -1, 0, 1, 2, 3, 4, 5, 9, 16, top - 1, top};
    for (int round = 0; round < 2000; ++round) {
        SCOPED_TRACE(round);
        std::vector<Entries> sets(1 + Below(3));
        EnumSerialiser serialiser;
        for (Entries& set : sets) {
            u64 const start = Below(std::size(pool));
            u64 const end = start + 1 + Below(std::size(pool) - start);
            for (u64 i = start; i < end; ++i) set.push_back({pool[i]}); // A run by 1, or ascending with gaps.
            if (Below(3) == 0) set[Below(set.size())].retired = 1;
            if (Below(3) == 0) std::shuffle(set.begin(), set.end(), m_random);
            if (Below(3) == 0) set.push_back(set[Below(set.size())]); // A value twice.
            serialiser.RegisterEnumSet(set.data(), set.size());
        }
        for (int i = 0; i < 30; ++i) {
            std::vector<int> values(i < 15 ? 1 : Below(4));
            for (int& value : values) value = pool[i < 15 ? static_cast<u64>(i) : Below(std::size(pool))];
            std::vector<u16> expected;
            std::vector<u16> codes;
            u16 expectedVersion = 0;
            u16 version = 9;
            bool const isKnown = FindCodes(sets, values, expected, expectedVersion);
            ASSERT_EQ(serialiser.EncodeToSerial(values.data(), values.size(), codes, version), isKnown);
            if (!isKnown) continue;
            ASSERT_TRUE(codes == expected && version == expectedVersion);
            std::vector<int> decoded;
            serialiser.DecodeFromSerial(codes.data(), codes.size(), version, decoded);
            ASSERT_EQ(decoded, values);
        }
        int value = 0;
        for (u16 version = 0; version < sets.size(); ++version) {
            for (size_t i = 0; i < sets[version].size(); ++i) {
                serialiser.DecodeFromSerial(static_cast<u16>(i), version, value);
                ASSERT_EQ(value, sets[version][i].value); // Retired ones too.
            }
            EXPECT_THROW(serialiser.DecodeFromSerial(static_cast<u16>(sets[version].size()), version, value),
                         UnknownEnumVersionException);
        }
        EXPECT_THROW(serialiser.DecodeFromSerial(0, static_cast<u16>(sets.size()), value), UnknownEnumVersionException);
    }
}

TEST_F(EnumSerialiserTest, TablesThatCodesCannotNameAreIgnored)
{
    Entries entries(65536);
    for (int i = 0; i < 65536; ++i) entries[static_cast<size_t>(i)].value = i;
    EnumSerialiser serialiser;
    u16 code = 77;
    u16 version = 77;
    serialiser.RegisterEnumSet(entries.data(), 65536);
    serialiser.RegisterEnumSet(nullptr, 1);
    serialiser.RegisterEnumSet(entries.data(), 0);
    EXPECT_FALSE(serialiser.EncodeToSerial(0, code, version));
    EXPECT_TRUE(code == 77 && version == 77);
    serialiser.RegisterEnumSet(entries.data(), 65535);
    EXPECT_TRUE(serialiser.EncodeToSerial(65534, code, version));
    EXPECT_EQ(code, 65534);
    EXPECT_FALSE(serialiser.EncodeToSerial(65535, code, version));
}

// Bit by bit. A run of bits takes whatever it is given, which then need not decode.
bool EncodeSlowly(std::vector<Indices> const& sets, u64 flags, u64& encoded, u16& version, bool& isCovered)
{
    for (version = 0; version < sets.size(); ++version) {
        Indices const& set = sets[version];
        u64 covered = encoded = 0;
        bool isRun = true;
        for (size_t i = 0; i < set.size(); ++i) {
            isRun = isRun && !set[i].retired && set[i].bit == set[0].bit + static_cast<int>(i);
            if (set[i].retired || !(flags >> set[i].bit & 1)) continue;
            covered |= u64{1} << set[i].bit;
            encoded |= u64{1} << i;
        }
        isCovered = covered == flags;
        if (isRun) encoded = flags >> set[0].bit;
        if (isRun || isCovered) return true;
    }
    return false;
}

TEST_F(FlagSerialiserTest, EveryShapeOfEveryVersionMovesEachBit)
{
    for (int round = 0; round < 500; ++round) {
        SCOPED_TRACE(round);
        std::vector<Indices> sets(1 + Below(3));
        FlagSerialiser serialiser;
        for (Indices& set : sets) {
            int const start = Below(2) ? static_cast<int>(Below(64)) : 0;
            int const end = start + 1 + static_cast<int>(Below(static_cast<u64>(64 - start)));
            bool const isRun = Below(2);
            for (int bit = start; bit < end; ++bit)
                if (isRun || bit == start || Below(3)) set.push_back({bit, !isRun && Below(8) == 0});
            if (!isRun) std::shuffle(set.begin(), set.end(), m_random);
            serialiser.RegisterFlagIndices(set.data(), set.size());
        }
        u64 value = 0;
        unsigned char activeBytes = 0;
        for (int i = 0; i < 20; ++i) {
            u64 const flags = m_random() & m_random() & (i < 10 ? u64{0xFF} << Below(64) : m_random());
            u64 expected = 0;
            u64 encoded = 0;
            u16 expectedVersion = 0;
            u16 version = 9;
            bool isCovered = false;
            bool const isKnown = EncodeSlowly(sets, flags, expected, expectedVersion, isCovered);
            ASSERT_EQ(serialiser.EncodeToSerial(flags, encoded, version), isKnown);
            if (!isKnown) continue;
            ASSERT_TRUE(encoded == expected && version == expectedVersion);
            if (!isCovered) continue;
            serialiser.DecodeFromSerial(encoded, version, value, activeBytes);
            ASSERT_EQ(value, flags);
        }
        for (u16 version = 0; version < sets.size(); ++version) {
            Indices const& set = sets[version];
            int last = -8;
            for (auto const& index : set)
                if (!index.retired) last = std::max(last, index.bit);
            for (size_t i = 0; i < set.size(); ++i) {
                serialiser.DecodeFromSerial(u64{1} << i, version, value, activeBytes);
                ASSERT_EQ(value, u64{1} << set[i].bit); // Retired ones too.
                ASSERT_TRUE(last < 0 || activeBytes == last / 8 + 1);
            }
            if (set.size() == 64) continue;
            EXPECT_THROW(serialiser.DecodeFromSerial(u64{1} << set.size(), version, value, activeBytes),
                         UnknownFlagVersionException);
        }
        EXPECT_THROW(serialiser.DecodeFromSerial(0, static_cast<u16>(sets.size()), value, activeBytes),
                     UnknownFlagVersionException);
    }
}

TEST_F(FlagSerialiserTest, TablesThatAWordCannotHoldAreIgnored)
{
    Indices const tooMany(65, FlagSerialiser::FlagIndex{1});
    FlagSerialiser serialiser;
    serialiser.RegisterFlagIndices(tooMany.data(), 65);
    serialiser.RegisterFlagIndices(nullptr, 1);
    serialiser.RegisterFlagIndices(tooMany.data(), 0);
    u64 encoded = 5;
    u16 version = 5;
    EXPECT_FALSE(serialiser.EncodeToSerial(0, encoded, version));
    EXPECT_TRUE(encoded == 5 && version == 5);
}

} // namespace
} // namespace KernelTest

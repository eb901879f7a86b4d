#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"
#include "support/FakeClock.h"

#include <gtest/gtest.h>

// Opening by search: the newest state that can be reached, whatever became of the info block.

namespace KernelTest {
namespace {

using namespace Kernel;
using TestSupport::ArchiveBuilder;
using Items = std::map<std::string, std::string>;

constexpr u64 c_infoPos = 12;
constexpr u64 c_infoSize = 52;

class ArchiveRecoverTest : public DocumentTest
{
protected:
    Counted<Archive> Recover(std::string const& path, Archive::OpenResult expected = Archive::OpenOk)
    {
        Archive::OpenResult result{};
        Counted<Archive> archive =
            Archive::RecoverArchive(Str(path), Archive::OpenModeReadWrite, c_documentTag, result);
        EXPECT_EQ(result, expected);
        return archive;
    }

    /// Recovers, compares, saves and opens as any other document.
    void ExpectRecovered(Items expected)
    {
        {
            Counted<Archive> const archive = Recover(m_path);
            ASSERT_TRUE(archive);
            EXPECT_EQ(GetAll(*archive), expected);
            ASSERT_TRUE(Save(*archive, {{"saved", "afterwards"}}));
        }
        expected["saved"] = "afterwards";
        Counted<Archive> const again = OpenDocument(m_path);
        ASSERT_TRUE(again);
        EXPECT_EQ(GetAll(*again), expected);
    }

    void Smash(std::string const& path, u64 at, std::string const& bytes)
    {
        std::string file = ReadWhole(path);
        file.replace(at, bytes.size(), bytes);
        WriteWhole(path, file);
    }

    TestSupport::FakeClock m_clock;
};

TEST_F(ArchiveRecoverTest, NewestStateComesBackFromAnyDamageOfTheInfoBlock)
{
    {
        Counted<Archive> const archive = CreateDocument(m_path);
        ASSERT_TRUE(Save(*archive, {{"a", "1"}, {"b", std::string(3000, 'b')}}));
        ASSERT_TRUE(Save(*archive, {{"a", "2"}}));
        ASSERT_TRUE(Save(*archive, {{"b", std::nullopt}, {"c", "3"}}));
    }
    std::string const sound = ReadWhole(m_path);
    Items const newest = {{"a", "2"}, {"c", "3"}};
    std::string const damages[] = {
        std::string(c_infoSize, 0),                          // All of it.
        "#Inf" + TestSupport::Little(76, 8),                 // The newest table in a file block,
        "#Inf" + TestSupport::Little(0x7FFFFFFFFFFFFFFF, 8), // or beyond the end.
        "#Inf" + TestSupport::Little(sound.size() - 20, 8),
        "#Imf",
    };
    for (std::string const& damage : damages) {
        WriteWhole(m_path, sound);
        Smash(m_path, c_infoPos, damage);
        EXPECT_NE(ResultOfOpening(m_path), Archive::OpenOk);
        ExpectRecovered(newest);
    }
    // One without any table stays empty.
    std::string const empty = m_folder / "empty";
    CreateDocument(empty);
    EXPECT_TRUE(Recover(empty)->IsEmpty());
    Smash(empty, c_infoPos, "xxxx");
    EXPECT_FALSE(Recover(empty, Archive::OpenCorrupt));
    WriteWhole(empty, "something else");
    EXPECT_FALSE(Recover(empty, Archive::OpenNotArchive));
    EXPECT_FALSE(Recover(m_folder / "missing", Archive::OpenNotFound));
}

TEST_F(ArchiveRecoverTest, OlderTablesTakeOverWhereNewerOnesAreDamaged)
{
    std::vector<u64> tables;
    std::vector<Items> states;
    {
        Counted<Archive> const archive = CreateDocument(m_path);
        for (int n = 0; n < 5; ++n) {
            ASSERT_TRUE(Save(*archive, {{"a", std::to_string(n)}, {"n" + std::to_string(n), "x"}}));
            tables.push_back(StateOf(*archive).firstFAT);
            states.push_back(GetAll(*archive));
        }
    }
    std::string const sound = ReadWhole(m_path);
    // Damage in the body of a table spoils the chain of every newer one; those before it stay.
    for (size_t broken = 1; broken < tables.size(); ++broken) {
        SCOPED_TRACE(broken);
        WriteWhole(m_path, sound);
        Smash(m_path, tables[broken] + 59 + 4, "\x07"); // A kind of record that there is not.
        ExpectRecovered(states[broken - 1]);
    }
    WriteWhole(m_path, sound);
    Smash(m_path, tables[0] + 59 + 4, "\x07");
    EXPECT_FALSE(Recover(m_path, Archive::OpenCorrupt));
    // What a later version wrote is no damage.
    WriteWhole(m_path, sound);
    Smash(m_path, tables.back(), "#FT5");
    EXPECT_FALSE(Recover(m_path, Archive::OpenTooNew));
}

TEST_F(ArchiveRecoverTest, FilesOfEveryKindOfTableAreSearchedAndStrayTablesAreNoTables)
{
    std::string inner;
    {
        ArchiveBuilder other;
        other.AddFile(1, "inside", "another document");
        inner = other.Build();
    }
    for (std::string const tag : {"#FAT", "#FT2", "#FT3", "#FT4"}) {
        SCOPED_TRACE(tag);
        ArchiveBuilder file;
        file.AddTable({.tag = tag, .records = {{1, 0, "old", file.AddBlock("1")}}});
        file.AddTable({.tag = tag, .records = {{2, 0, "a document", file.AddBlock(inner)}}});
        // Follows a table, not a block: only the next one leads to it.
        file.AddTable({.tag = tag, .records = {{1, 2}}});
        file.AddTable({.tag = tag, .records = {{3, 0, "new", file.AddBlock("3")}}});
        file.firstFAT = 90;
        if (tag == "#FT4") file.AddBlock(inner); // An item that was never committed, with a table inside.
        WriteWhole(m_path, file.Build());
        Counted<Archive> const archive = Recover(m_path);
        ASSERT_TRUE(archive);
        EXPECT_EQ(GetAll(*archive), (Items{{"a document", inner}, {"new", "3"}}));
    }
}

TEST_F(ArchiveRecoverTest, OfTwoTablesBehindOneTheLaterIsTriedFirst)
{
    for (bool const laterIsWhole : {true, false}) {
        ArchiveBuilder file;
        u64 const first = file.AddTable({.records = {{1, 0, "a", file.AddBlock("1")}}});
        file.AddTable({.records = {{2, 0, "abandoned", file.AddBlock("2")}}});
        ArchiveBuilder::Record const record{2, static_cast<u8>(laterIsWhole ? 0 : 9), "later", file.AddBlock("3")};
        file.AddTable({.records = {record}, .next = first});
        file.firstFAT = 80;
        WriteWhole(m_path, file.Build());
        Counted<Archive> const archive = Recover(m_path);
        ASSERT_TRUE(archive);
        // From the later one the way goes up to what both stand on, before any lower one is looked at.
        EXPECT_EQ(GetAll(*archive), (laterIsWhole ? Items{{"a", "1"}, {"later", "3"}} : Items{{"a", "1"}}));
    }
}

TEST_F(ArchiveRecoverTest, ScratchFilesComeBackWithTheirMasterAndOnlyInItsExactState)
{
    {
        Counted<Archive> const archive = CreateDocument(m_path);
        Archive::CreateResult result;
        ASSERT_TRUE(Save(*archive, {{"a", "master"}}));
        ASSERT_TRUE(archive->AddScratchFile(Str(m_scratchPath), result));
        // Leaves tables in the scratch file that are dead once the master is saved.
        for (int n = 0; n < 4; ++n) ASSERT_TRUE(Save(*archive, {{"a", std::string(500, 'x')}}, true));
        ASSERT_TRUE(Save(*archive, {{"b", "rolled down"}}));
        ASSERT_TRUE(Save(*archive, {{"a", "scratch"}}, true));
    }
    std::string const master = ReadWhole(m_path);
    Smash(m_scratchPath, c_infoPos + 4, TestSupport::Little(999, 8));
    {
        Counted<Archive> const archive = Recover(m_scratchPath);
        ASSERT_TRUE(archive);
        EXPECT_EQ(GetAll(*archive), (Items{{"a", "scratch"}, {"b", "rolled down"}}));
        EXPECT_TRUE(archive->HaveScratchRevisions());
    }
    // Of a master that has to be searched nobody can say that it is the one the scratch file means.
    Smash(m_path, c_infoPos + 4, TestSupport::Little(999, 8));
    EXPECT_FALSE(Recover(m_scratchPath, Archive::OpenCorrupt));
    ExpectRecovered({{"a", std::string(500, 'x')}, {"b", "rolled down"}});
    EXPECT_FALSE(Recover(m_scratchPath, Archive::OpenLinkMismatch));
}

TEST_F(ArchiveRecoverTest, LongChainsOnABrokenTableAreGivenUpAtOnce)
{
    // Each of these chains ends in the same damage: walked one by one they would take hours.
    constexpr int length = 30'000;
    enum class Damage
    {
        Body,
        Header, // Then the search does not see it.
        Contradiction
    };
    for (Damage const damage : {Damage::Body, Damage::Header, Damage::Contradiction}) {
        bool const contradicts = damage == Damage::Contradiction;
        ArchiveBuilder file;
        ArchiveBuilder::Table first{.records = {{1, static_cast<u8>(contradicts ? 0 : 9), "a", file.AddBlock("1")}}};
        if (damage == Damage::Header) first.tag = "#FT1";
        u64 const oldest = file.AddTable(first);
        std::string const end(4, '\xFF');
        for (int n = 0; n < length; ++n) {
            file.AddRaw(end);
            ArchiveBuilder::Table table;
            if (contradicts) table.records = {{1, 0, "b"}};
            if (n % 3 == 0 && damage == Damage::Body) table.next = oldest;
            file.AddTable(table);
        }
        file.firstFAT = 80;
        WriteWhole(m_path, file.Build());
        Archive::OpenResult result{};
        Counted<Archive> const archive =
            Archive::RecoverArchive(Str(m_path), Archive::OpenModeReadOnly, IDTag(), result);
        EXPECT_EQ(result, Archive::OpenCorrupt);
    }
}

TEST_F(ArchiveRecoverTest, AnArchiveWhoseFileWentAwayWorksAgainOnceItIsBack)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    ASSERT_TRUE(Save(*archive, {{"a", "1"}}));
    archive->SetKeepOpen(false);
    std::string const away = m_folder / "away";
    ASSERT_EQ(std::rename(m_path.c_str(), away.c_str()), 0);
    EXPECT_FALSE(Get(*archive, "a"));
    EXPECT_EQ(archive->GetLastRestoreResult(), Archive::RestoreNotFound);
    ASSERT_EQ(std::rename(away.c_str(), m_path.c_str()), 0);
    EXPECT_FALSE(Get(*archive, "a")); // The failure is kept until somebody says that it is over.
    EXPECT_EQ(archive->RecoverArchive(true), Archive::RestoreOk);
    EXPECT_EQ(Get(*archive, "a"), "1");
    EXPECT_FALSE(archive->IsBroken());
    EXPECT_TRUE(Save(*archive, {{"a", "2"}}));
}

} // namespace
} // namespace KernelTest

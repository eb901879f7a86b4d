#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/streams/InStream.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"
#include "support/CompressionFixture.h"
#include "support/TempFolder.h"

#include <cstring>
#include <gtest/gtest.h>

// Files as earlier programs left them, built from the layout alone: every version with every kind of table reads, and
// what a save makes of them.

namespace KernelTest {
namespace {

using namespace Kernel;
using TestSupport::ArchiveBuilder;

std::string Pixels(u64 size)
{
    Testing::Bytes const bytes = Testing::MakePixels(size, static_cast<u32>(size));
    return std::string(bytes.begin(), bytes.end());
}

/// The codes that a table can say: an old one knows zlib without striping.
std::vector<u8> CodesOf(std::string const& tag)
{
    if (tag == "#FAT" || tag == "#FT2") return {0, 0x01, 0x41, 0x81, 0xC1};
    return {0, 3, 0x01, 0x41, 0x81, 0xC1, 0xA1, 0xE1, 0x02, 0x42, 0x82, 0xC2, 0xA2, 0xE2};
}

/// Reads in pieces of odd sizes with a skip after every third, and holds what was read against the bytes.
void ExpectStreamOf(Archive& archive, std::string const& path, std::string const& bytes)
{
    Counted<InStream> const in = archive.OpenFileInStream(Str(path));
    ASSERT_TRUE(in);
    EXPECT_EQ(in->GetSize(), bytes.size());
    u64 at = 0;
    for (u64 n = 0; at < bytes.size(); ++n) {
        static constexpr u64 c_sizes[] = {1, 7, 4093, 3, 65537, 1'100'003};
        u64 const size = std::min<u64>(c_sizes[n % 6], bytes.size() - at);
        std::string part(size, 0);
        if (n % 3 == 2)
            ASSERT_TRUE(in->SkipBlock(size));
        else {
            ASSERT_EQ(in->ReadBlock(part.data(), size), size);
            ASSERT_TRUE(bytes.compare(at, size, part) == 0) << "at " << at;
        }
        at += size;
        ASSERT_EQ(in->TellInStream(), at);
    }
    char one = 0;
    EXPECT_EQ(in->ReadBlock(&one, 1), 0u);
    EXPECT_FALSE(in->SkipBlock(1));
}

void ExpectSame(Archive& archive, std::string const& path, std::string const& bytes)
{
    SCOPED_TRACE(path);
    EXPECT_TRUE(Get(archive, path) == bytes);
    ExpectStreamOf(archive, path, bytes);
    auto const item = MakeCounted<BytesItem>();
    EXPECT_TRUE(archive.LoadFile(Str(path), *item));
    EXPECT_TRUE(item->bytes == bytes);
}

TEST(ArchiveOldFilesTest, EveryVersionWithEveryKindOfTableReadsAndSavesBackAsToday)
{
    TestSupport::TempFolder const folder;
    for (u16 version = 7; version <= 11; ++version)
        for (std::string const tag : {"#FAT", "#FT2", "#FT3", "#FT4"}) {
            SCOPED_TRACE("version " + std::to_string(version) + " " + tag);
            ArchiveBuilder builder(version);
            ArchiveBuilder::Table first;
            first.tag = tag;
            std::map<std::string, std::string> expected;
            u32 uid = 0;
            for (u8 const code : CodesOf(tag))
                for (u64 const size : {u64{0}, u64{1003}, u64{70'001}}) {
                    std::string const path = "c" + std::to_string(code) + "/" + std::to_string(size);
                    expected[path] = Pixels(size);
                    first.records.push_back({++uid, 0, path, builder.AddBlock(expected[path], code)});
                }
            // What an old table's codes don't mean is direct.
            bool const isOld = tag == "#FAT" || tag == "#FT2";
            expected["unknown"] = "code";
            first.records.push_back({++uid, 0, "unknown", builder.AddBlock("code")});
            first.records.back().details.rawCode = isOld ? 5 : 3;
            first.records.push_back({++uid, 0, "gone", builder.AddBlock("soon")});
            first.pathCounts = {{"img", ".png", 5}, {"", "", 1}};
            first.userData = "user";
            builder.AddTable(first);
            ArchiveBuilder::Table second;
            second.tag = tag;
            second.revisionTag = 1;
            second.records = {{uid, 2}, {1, 1, "", builder.AddBlock("changed")}};
            second.pathCounts = {{"img", ".png", 3}};
            builder.AddTable(second);
            expected["c0/0"] = "changed";
            std::string const path = folder / (std::to_string(version) + tag);
            WriteWhole(path, builder.Build());

            Counted<Archive> archive = OpenDocument(path);
            ASSERT_TRUE(archive);
            ASSERT_EQ(GetAll(*archive).size(), expected.size());
            for (auto const& [name, bytes] : expected) ExpectSame(*archive, name, bytes);
            EXPECT_FALSE(archive->IsBroken());
            EXPECT_EQ(archive->GetLastSaveType(), Archive::RevisionTagIncremental);
            EXPECT_EQ(archive->GetFileCodeBaseBuildIndex(Str("c1/1003")), tag == "#FAT" ? 0u : 24u);
            auto const revisions = RevisionsOf(*archive);
            ASSERT_EQ(revisions.size(), 2u);
            ASSERT_TRUE(revisions[0]->GetUserData());
            EXPECT_EQ(std::memcmp(revisions[0]->GetUserData()->GetData(), "user", 4), 0);

            ASSERT_TRUE(InSession(*archive, [](ArchiveSession& session) {
                EXPECT_EQ(CreateGenerated(session, "img", ".png", "new"), "img6.png");
            }));
            expected["img6.png"] = "new";
            archive = nullptr;
            archive = OpenDocument(path);
            ASSERT_TRUE(archive);
            EXPECT_EQ(StateOf(*archive).fileVersion, 11);
            EXPECT_TRUE(GetAll(*archive) == expected);

            // Without room for a guard, a version 7 file takes one save.
            std::string const before = ReadWhole(path);
            EXPECT_EQ(SessionResult(*archive), version == 7 ? Archive::SessionFileUnusable : Archive::SessionOk);
            if (version == 7) {
                EXPECT_TRUE(ReadWhole(path) == before);
            }
        }
}

TEST(ArchiveOldFilesTest, StreamsReadAnySizesAcrossTheBufferOfAMegabyte)
{
    TestSupport::TempFolder const folder;
    ArchiveBuilder builder;
    ArchiveBuilder::Table table;
    std::string const bytes = Pixels(2'500'003);
    for (u8 const code : {0x00, 0x01, 0x81, 0xE1, 0x02, 0x42, 0xC2, 0xA2})
        table.records.push_back({code + 1u, 0, std::to_string(code), builder.AddBlock(bytes, code)});
    builder.AddTable(table);
    WriteWhole(folder / "a", builder.Build());
    Counted<Archive> const archive = OpenDocument(folder / "a", Archive::OpenModeReadOnly);
    ASSERT_TRUE(archive);
    for (auto const& record : table.records) ExpectSame(*archive, record.path, bytes);
}

TEST(ArchiveOldFilesTest, LinkAndReferencePathOutliveASaveThatRaisesTheVersion)
{
    for (u16 version = 7; version <= 11; ++version) {
        // And what has neither takes its first save.
        TestSupport::TempFolder const place;
        WriteWhole(place / "empty", ArchiveBuilder(version).Build());
        Counted<Archive> const empty = OpenDocument(place / "empty");
        ASSERT_TRUE(empty && empty->IsEmpty());
        EXPECT_EQ(StateOf(*empty).fileEnd, version == 7 ? 64u : 72u);
        EXPECT_TRUE(Save(*empty, {{"a", "1"}}));
        EXPECT_EQ(Get(*OpenDocument(place / "empty", Archive::OpenModeReadOnly), "a"), "1");
        for (bool const linked : {true, false}) {
            SCOPED_TRACE("version " + std::to_string(version) + (linked ? " linked" : " reference only"));
            TestSupport::TempFolder const folder;
            std::string const master = folder / "m";
            std::string const path = folder / "s";
            Archive::FileState masterState;
            {
                Counted<Archive> const archive = CreateDocument(master);
                ASSERT_TRUE(Save(*archive, {{"kept", "k"}, {"a", "old"}}));
                masterState = StateOf(*archive);
            }
            ArchiveBuilder builder(version);
            if (linked) builder.link = {masterState.saveTimeStamp.GetValue(), masterState.saveCount, master};
            builder.reference = "what it stands for";
            ArchiveBuilder::Table table;
            table.tag = version < 9 ? "#FT2" : "#FT4";
            table.records = {{2, linked ? u8{1} : u8{0}, "b", builder.AddBlock("scratch", 0x41)}};
            builder.AddTable(table);
            WriteWhole(path, builder.Build());
            std::map<std::string, std::string> expected = {{"b", "scratch"}};
            if (linked) {
                // UIDs go by rising path.
                Counted<Archive> const archive = OpenDocument(master);
                expected = {{"kept", "k"}, {"a", "old"}};
                expected[archive->GetFileInfo(Str("a"))->GetUID() == 2 ? "a" : "kept"] = "scratch";
            }
            for (int round = 0; round < 2; ++round) {
                Counted<Archive> const archive = OpenDocument(path);
                ASSERT_TRUE(archive);
                EXPECT_EQ(archive->HasScratchFile(), linked);
                EXPECT_EQ(GetAll(*archive), expected);
                ASSERT_TRUE(archive->GetReferenceInfo());
                EXPECT_EQ(archive->GetReferenceInfo()->GetPath(), "what it stands for");
                std::string const name = "n" + std::to_string(round);
                ASSERT_TRUE(Save(*archive, {{name, name}}, linked)) << archive->GetLastRestoreResult();
                expected[name] = name;
                Archive::FileState const state =
                    StateOf(*archive, linked ? Archive::ChoiceScratch : Archive::ChoiceMaster);
                EXPECT_EQ(state.fileVersion, version == 7 ? 7 : 11);
                EXPECT_EQ(state.flags, linked ? 3 : 2);
            }
            EXPECT_EQ(GetAll(*OpenDocument(path)), expected);
        }
    }
}

TEST(ArchiveOldFilesTest, TwoHundredRevisionsOfVersion8VerifyRecoverAndStreamlineWithTheSameItems)
{
    TestSupport::TempFolder const folder;
    constexpr u32 c_revisions = 200;
    constexpr u32 c_pages = 17;
    ArchiveBuilder builder(8);
    std::map<std::string, std::string> items;
    std::map<std::string, std::string> halfWay;
    for (u32 i = 0; i < c_revisions; ++i) {
        ArchiveBuilder::Table table;
        table.tag = "#FT2";
        table.revisionTag = i % 10 == 0 ? 0 : 1;
        table.time = 1'300'000'000 + 3600 * i;
        // A page that is there goes at every fifth turn, and is added again at its next one.
        u32 const uid = i % c_pages + 1;
        std::string const path = "pages/page" + std::to_string(uid);
        std::string const bytes = Pixels(2000 + 40 * i);
        u8 const code = CodesOf("#FT2")[i % 5];
        bool const isThere = items.count(path) != 0;
        if (isThere && i % 5 == 0) {
            table.records = {{uid, 2}};
            items.erase(path);
        } else {
            table.records = {{uid, isThere ? u8{1} : u8{0}, path, builder.AddBlock(bytes, code)}};
            items[path] = bytes;
        }
        builder.AddTable(table);
        if (i + 1 == c_revisions / 2) halfWay = items;
    }
    std::string const original = builder.Build();
    std::string const path = folder / "old";
    WriteWhole(path, original);

    Counted<Archive> archive = OpenDocument(path, Archive::OpenModeReadOnly);
    ASSERT_TRUE(archive);
    EXPECT_EQ(StateOf(*archive).fileVersion, 8);
    u32 const nextFreeUID = StateOf(*archive).nextFreeUID;
    EXPECT_TRUE(archive->StreamliningAdviseable() && archive->RequiresStreamlining());
    EXPECT_TRUE(GetAll(*archive) == items);
    std::vector<Counted<Archive::Revision const>> revisions;
    archive->GetRevisions(revisions);
    ASSERT_EQ(revisions.size(), c_revisions);
    for (auto const& revision : revisions)
        for (Archive::FileRevision const& entry : revision->GetEntries())
            EXPECT_TRUE(entry.IsDeletion() || archive->CheckStoredBlock(*revision, entry) == Archive::BlockCheck::Ok);
    for (u32 i = 0; i < c_revisions / 2; ++i) archive->RewindWorkingRevision();
    EXPECT_TRUE(GetAll(*archive) == halfWay);
    EXPECT_EQ(archive->StreamlineToNew(Str(folder / "half")), Archive::StreamlineDone);
    EXPECT_TRUE(GetAll(*OpenDocument(folder / "half")) == halfWay);

    std::string smashed = original;
    smashed.replace(16, 8, 8, '\x11'); // FirstFAT
    WriteWhole(folder / "smashed", smashed);
    Archive::OpenResult result{};
    archive = Archive::RecoverArchive(Str(folder / "smashed"), Archive::OpenModeReadOnly, c_documentTag, result);
    ASSERT_TRUE(archive) << result;
    archive->GetRevisions(revisions);
    EXPECT_EQ(revisions.size(), c_revisions);
    EXPECT_TRUE(GetAll(*archive) == items);

    // As it is and after a save of today, which makes the old tables part of a new file.
    for (bool const saved : {false, true}) {
        archive = nullptr;
        WriteWhole(path, original);
        archive = OpenDocument(path);
        ASSERT_TRUE(archive);
        String8 report;
        if (saved) {
            ArchiveSessionHandle handle;
            ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeIncremental, nullptr));
            handle->CreateFile(Str("today"), MakeCounted<BytesItem>("new"));
            EXPECT_EQ(archive->CloseSessionAndVerifyFileState(handle, report, false), Archive::VerifyMatch)
                << report.GetData();
            items["today"] = "new";
        }
        EXPECT_EQ(archive->StreamlineAndVerifyFileState(report, nullptr, nullptr, nullptr), Archive::StreamlineDone)
            << report.GetData();
        archive = nullptr;
        archive = OpenDocument(path);
        ASSERT_TRUE(archive);
        EXPECT_TRUE(GetAll(*archive) == items);
        archive->GetRevisions(revisions);
        EXPECT_EQ(revisions.size(), 1u);
        EXPECT_EQ(StateOf(*archive).fileVersion, 11);
        EXPECT_EQ(StateOf(*archive).nextFreeUID, nextFreeUID + (saved ? 1 : 0));
        EXPECT_FALSE(archive->StreamliningAdviseable() || archive->RequiresStreamlining());
    }
}

} // namespace
} // namespace KernelTest

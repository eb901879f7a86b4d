#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/OutStream.h"
#include "serialisation/AllocationWatch.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"

#include <cstring>
#include <ctime>
#include <gtest/gtest.h>
#include <sys/stat.h>

// Files made to hurt: a refusal is one of the documented results, at a cost that the size of the file justifies.

namespace KernelTest {
namespace {

using namespace Kernel;
using TestSupport::ArchiveBuilder;
using R = Archive::OpenResult;

constexpr u64 c_far = u64{1} << 63;

class ArchiveHostileTest : public DocumentTest
{
protected:
    R TestBytes(std::string const& bytes) const
    {
        auto const in = MakeCounted<MemoryInStream>(bytes.data(), bytes.size(), false);
        return Archive::TestArchive(*in, c_documentTag, nullptr, nullptr);
    }
    /// Opens, counting what that costs.
    Counted<Archive> Open(std::string const& bytes, R& result, Archive::OpenMode mode = Archive::OpenModeReadWrite)
    {
        WriteWhole(m_path, bytes);
        std::clock_t const start = std::clock();
        Kernel::Test::AllocationWatch const watch;
        Counted<Archive> const archive = Archive::Open(Str(m_path), mode, c_documentTag, result);
        EXPECT_LT(watch.GetPeak(), (u64{64} << 20) + 4 * bytes.size());
        EXPECT_LT(std::clock() - start, CLOCKS_PER_SEC);
        EXPECT_EQ(static_cast<bool>(archive), result == R::OpenOk);
        if (result == R::OpenOk) {
            EXPECT_EQ(TestBytes(bytes), R::OpenOk);
        }
        return archive;
    }
    /// A save goes in and comes back beside what could be read before.
    void ExpectSaves(Counted<Archive>& archive)
    {
        std::map<std::string, std::string> expected = GetAll(*archive);
        ASSERT_TRUE(Save(*archive, {{"saved", "after"}}));
        expected["saved"] = "after";
        archive = nullptr;
        archive = OpenDocument(m_path);
        ASSERT_TRUE(archive);
        ASSERT_EQ(GetAll(*archive), expected);
    }
};

ArchiveBuilder::Record Added(ArchiveBuilder& builder, u32 uid, std::string const& path, std::string const& bytes = "1")
{
    return {uid, 0, path, builder.AddBlock(bytes)};
}

TEST_F(ArchiveHostileTest, TablesThatMakeNoSenseAreRefusedWithTheirResult)
{
    using B = ArchiveBuilder;
    struct
    {
        char const* what;
        R result;
        void (*make)(B&, B::Table&); // Changes a sound newest table, before it is added behind another.
        void (*after)(B&);           // And the file, behind it.
    } const cases[] = {
        {"sound", R::OpenOk, nullptr, nullptr},
        {"FirstFAT far away", R::OpenTruncated, nullptr, [](B& b) { b.firstFAT = c_far; }},
        {"FirstFAT 58 from the end", R::OpenTruncated, nullptr, [](B& b) { b.firstFAT = b.GetEnd() - 58; }},
        {"FirstFAT in a block", R::OpenCorrupt, nullptr, [](B& b) { b.firstFAT = 73; }},
        {"names itself", R::OpenCorrupt, [](B& b, B::Table& t) { t.next = b.GetEnd(); }, nullptr},
        {"names a later one", R::OpenCorrupt, [](B& b, B::Table& t) { t.next = b.GetEnd() + 1; }, nullptr},
        {"names one far away", R::OpenCorrupt, [](B&, B::Table& t) { t.next = c_far; }, nullptr},
        {"names a block", R::OpenCorrupt, [](B&, B::Table& t) { t.next = 72; }, nullptr},
        {"names one that runs into it", R::OpenCorrupt, [](B& b, B::Table& t) { t.next = b.GetEnd() - 40; }, nullptr},
        {"4 G records", R::OpenCorrupt, [](B&, B::Table& t) { t.recordCount = 0xFFFFFFFF; }, nullptr},
        {"a record too few", R::OpenCorrupt, [](B&, B::Table& t) { t.recordCount = 0; }, nullptr},
        {"4 GB of user data", R::OpenCorrupt, [](B&, B::Table& t) { t.userDataSize = 0xFFFFFFFF; }, nullptr},
        {"65,535 path counts", R::OpenCorrupt, [](B&, B::Table& t) { t.pathCountCount = 0xFFFF; }, nullptr},
        {"body one short", R::OpenCorrupt, [](B&, B::Table& t) { t.bodySize = 46; }, nullptr},
        {"ends elsewhere", R::OpenCorrupt, [](B& b, B::Table& t) { t.fileEnd = b.GetEnd() + 1000; }, nullptr},
        {"kind 3", R::OpenCorrupt, [](B&, B::Table& t) { t.records[0].kind = 3; }, nullptr},
        {"#FT1", R::OpenCorrupt, [](B&, B::Table& t) { t.tag = "#FT1"; }, nullptr},
        {"#FT5", R::OpenTooNew, [](B&, B::Table& t) { t.tag = "#FT5"; }, nullptr},
        {"#FT9", R::OpenTooNew, [](B&, B::Table& t) { t.tag = "#FT9"; }, nullptr},
        {"#FT:", R::OpenCorrupt, [](B&, B::Table& t) { t.tag = "#FT:"; }, nullptr},
        {"one UID, two paths", R::OpenCorrupt, [](B&, B::Table& t) { t.records[0].uid = 1; }, nullptr},
        {"wrong guard", R::OpenBadInfo, nullptr, [](B& b) { b.guardTag = "Pro1"; }},
        {"wrong info", R::OpenBadInfo, nullptr, [](B& b) { b.infoTag = "#inf"; }},
        {"half of its bytes dead and more", R::OpenOk, nullptr, [](B& b) { b.deadBytes = c_far; }},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.what);
        B builder;
        builder.AddFile(1, "old", "bytes");
        B::Table table;
        table.records = {Added(builder, 2, "new")};
        if (c.make) c.make(builder, table);
        builder.AddTable(table);
        if (c.after) c.after(builder);
        R result{};
        Counted<Archive> archive = Open(builder.Build(), result);
        EXPECT_EQ(result, c.result);
        // Whoever walks the headers alone may see less, but no less than the way the tables are tied.
        if (std::strstr(c.what, "names itself")) {
            EXPECT_EQ(TestBytes(builder.Build()), R::OpenCorrupt);
        }
        if (archive) ExpectSaves(archive);
    }
}

TEST_F(ArchiveHostileTest, InfoBlockThatLagsIsRaisedFromTheTables)
{
    for (u64 const end : {u64{0}, u64{12}, u64{100}, u64{1} << 40, c_far}) {
        SCOPED_TRACE(end);
        ArchiveBuilder builder;
        builder.AddFile(7, "a", "bytes");
        builder.fileEnd = end;
        builder.nextFreeUID = 3;
        R result{};
        Counted<Archive> archive = Open(builder.Build(), result);
        ASSERT_TRUE(archive) << result;
        EXPECT_EQ(StateOf(*archive).fileEnd, builder.GetEnd());
        ExpectSaves(archive);
        EXPECT_EQ(archive->GetFileInfo(Str("saved"))->GetUID(), 8u);
    }
    ArchiveBuilder used;
    used.AddFile(0xFFFFFFFF, "a", "bytes");
    R result{};
    Counted<Archive> const archive = Open(used.Build(), result);
    ASSERT_TRUE(archive);
    EXPECT_THROW(Save(*archive, {{"b", "2"}}), OutStream::WriteException);
    EXPECT_TRUE(Save(*archive, {{"a", "2"}}));
    EXPECT_EQ(GetAll(*OpenDocument(m_path, Archive::OpenModeReadOnly)),
              (std::map<std::string, std::string>{{"a", "2"}}));
}

TEST_F(ArchiveHostileTest, PathsThatAreNotUniqueHaveOneOutcome)
{
    ArchiveBuilder builder;
    builder.AddFile(1, "twice", "old");
    builder.AddFile(2, "twice", "new");
    ArchiveBuilder::Table table;
    table.records = {{3, 1, "", builder.AddBlock("never named")}, {4, 2}};
    builder.AddTable(table);
    R result{};
    Counted<Archive> archive = Open(builder.Build(), result);
    ASSERT_TRUE(archive);
    EXPECT_EQ(GetAll(*archive), (std::map<std::string, std::string>{{"twice", "new"}}));
    ExpectSaves(archive);
}

TEST_F(ArchiveHostileTest, BlocksThatAreNotThereAreRefused)
{
    struct
    {
        char const* what;
        void (*change)(ArchiveBuilder::Details&);
        bool corrupt; // Opening a stream says corruption, and not only that it fails.
    } const cases[] = {
        {"position that wraps", [](ArchiveBuilder::Details& d) { d.pos = ~u64{3}; }, true},
        {"position far away", [](ArchiveBuilder::Details& d) { d.pos = u64{1} << 40; }, false},
        {"position in the header", [](ArchiveBuilder::Details& d) { d.pos = 1; }, true},
        {"tag in the info block",
         [](ArchiveBuilder::Details& d) {
             d = {40, 0, 0, 0};
         },
         true},
        {"an exabyte, stored 4", [](ArchiveBuilder::Details& d) { d.size = u64{1} << 60; }, true},
        {"an exabyte of zlib", [](ArchiveBuilder::Details& d) { d.size = u64{1} << 60, d.code = 1; }, true},
        {"an exabyte of zstd", [](ArchiveBuilder::Details& d) { d.size = u64{1} << 60, d.code = 2; }, true},
        {"2^64-1 both", [](ArchiveBuilder::Details& d) { d.size = d.stored = ~u64{0}; }, false},
        {"an exabyte both", [](ArchiveBuilder::Details& d) { d.size = d.stored = u64{1} << 60; }, false},
        {"an exabyte both, zstd", [](ArchiveBuilder::Details& d) { d.size = d.stored = u64{1} << 60, d.code = 2; },
         false},
        {"a megabyte of zlib that is none", [](ArchiveBuilder::Details& d) { d.size = 100'000, d.code = 1; }, false},
        {"wrong CRC", [](ArchiveBuilder::Details& d) { ++d.crc; }, false},
        {"tag in another's bytes", [](ArchiveBuilder::Details& d) { d.pos = 72 + 4 + 6; }, false},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.what);
        ArchiveBuilder builder;
        builder.deadBytes = 0x6C694623; // "#Fil", at 40.
        ArchiveBuilder::Table table;
        table.records = {Added(builder, 1, "holds", "inner #Fil others"), Added(builder, 2, "bad", "1234")};
        c.change(table.records[1].details);
        builder.AddTable(table);
        R result{};
        Counted<Archive> archive = Open(builder.Build(), result);
        ASSERT_TRUE(archive);
        Kernel::Test::AllocationWatch const watch;
        EXPECT_FALSE(Get(*archive, "bad"));
        bool corrupt = false;
        try {
            Counted<InStream> const in = archive->OpenFileInStream(Str("bad"));
            // Comes to its end with an error only.
            for (char buffer[1000]; in;) ASSERT_NE(in->ReadBlock(buffer, sizeof(buffer)), 0u);
        } catch (ArchiveCorruptionException const&) {
            corrupt = true;
        } catch (ArchiveFileException const&) {
        }
        if (c.corrupt) {
            EXPECT_TRUE(corrupt);
        }
        EXPECT_NE(archive->CheckStoredBlock(
                      *archive->GetHeadRevisionForFile(Str("bad")),
                      *archive->GetHeadRevisionForFile(Str("bad"))->Find(*archive->GetFileInfo(Str("bad")))),
                  Archive::BlockCheck::Ok);
        EXPECT_LT(watch.GetPeak(), u64{8} << 20);
        EXPECT_EQ(Get(*archive, "holds"), "inner #Fil others");
        EXPECT_TRUE(Save(*archive, {{"bad", "good"}}));
        EXPECT_EQ(Get(*archive, "bad"), "good");
    }
}

TEST_F(ArchiveHostileTest, LinksThatLeadNowhereHaveTheirResult)
{
    std::string const fifo = m_folder / "fifo";
    std::string const ring = m_folder / "ring";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    auto const linkTo = [](std::string const& path) {
        ArchiveBuilder builder;
        builder.link = {builder.saveTime, builder.saveCount, path};
        return builder.Build();
    };
    WriteWhole(ring, linkTo(m_path));
    struct
    {
        char const* what;
        std::string bytes;
        R readOnly, readWrite;
    } const cases[] = {
        {"itself", linkTo(m_path), R::OpenNotArchive, R::OpenReadOnlyArchive},
        {"ring", linkTo(ring), R::OpenNotArchive, R::OpenNotArchive},
        {"pipe", linkTo(fifo), R::OpenLinkedNotFound, R::OpenLinkedNotFound},
        {"folder", linkTo(m_folder.GetPath()), R::OpenIsDirectory, R::OpenIsDirectory},
        {"device", linkTo("/dev/zero"), R::OpenLinkedNotFound, R::OpenLinkedNotFound},
        {"nothing", linkTo(m_path + "x"), R::OpenLinkedNotFound, R::OpenLinkedNotFound},
        {"cut", linkTo(std::string(65535, 'x')).substr(0, 60'000), R::OpenTruncated, R::OpenTruncated},
        {"very long", linkTo(std::string(65535, 'x')), R::OpenLinkedNotFound, R::OpenLinkedNotFound},
        {"path with a zero", linkTo(std::string("x\0y", 3)), R::OpenLinkedNotFound, R::OpenLinkedNotFound},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.what);
        R result{};
        Open(c.bytes, result, Archive::OpenModeReadOnly);
        EXPECT_EQ(result, c.readOnly);
        Open(c.bytes, result);
        EXPECT_EQ(result, c.readWrite);
        EXPECT_FALSE(Archive::VerifyLinks(Str(m_path)));
        Archive::LinkInfo info;
        EXPECT_NE(Archive::TestForScratchLinkAndReferenceInfo(Str(m_path), true, info), R::OpenOk);
    }
    Archive::OpenResult result{};
    Archive::Open(Str(fifo), Archive::OpenModeReadOnly, IDTag(), result);
    EXPECT_EQ(result, R::OpenNotFound);
}

TEST_F(ArchiveHostileTest, ThumbnailBlocksThatClaimTooMuchAreNone)
{
    using T = ArchiveBuilder::Thumbnail;
    struct
    {
        char const* what;
        std::vector<T> entries;
        std::optional<u32> count, size;
        bool reads;
    } const cases[] = {
        {"sound", {{42, 3}, {45, 2}}, {}, {}, true},
        {"none", {}, {}, {}, true},
        {"4 G entries", {{29, 3}}, 0xFFFFFFFF, {}, false},
        {"4 G entries in 4 GB", {{29, 3}}, 0xFFFFFFFF, 0xFFFFFFFF, false},
        {"outside", {{31, 5}}, {}, {}, false},
        {"far away", {{~u64{0} - 2, 3}}, {}, {}, false},
        {"larger than the file", {{29, 0xFFFFFFFF}}, {}, {}, false},
        {"block past the end", {{29, 3}}, {}, 1000, false},
        {"many over one range", std::vector<T>(100'000, T{16, 1'300'000}), {}, {}, false},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.what);
        ArchiveBuilder builder;
        builder.AddFile(1, "a", "1");
        builder.AddThumbnails(c.entries, "abcde", c.count, c.size);
        R result{};
        Counted<Archive> const archive = Open(builder.Build(), result);
        ASSERT_TRUE(archive);
        Kernel::Test::AllocationWatch const watch;
        Counted<ArchiveThumbnails const> const thumbnails = archive->LoadThumbnails();
        EXPECT_EQ(static_cast<bool>(thumbnails), c.reads);
        if (thumbnails) {
            EXPECT_EQ(thumbnails->GetRecs().size(), c.entries.size());
        }
        EXPECT_LT(watch.GetPeak(), u64{8} << 20);
        EXPECT_TRUE(Save(*archive, {{"b", "2"}}));
        EXPECT_FALSE(archive->LoadThumbnails());
    }
}

TEST_F(ArchiveHostileTest, PathCounterThatIsUsedUpGivesNoPath)
{
    ArchiveBuilder builder;
    ArchiveBuilder::Table table;
    table.pathCounts = {{"a", "b", ~u64{0} - 1}};
    builder.AddTable(table);
    R result{};
    Counted<Archive> const archive = Open(builder.Build(), result);
    ASSERT_TRUE(archive);
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    String8 path;
    auto const item = MakeCounted<BytesItem>();
    EXPECT_TRUE(handle->GenerateIndexedPath({Str("a"), Str("b")}, item, nullptr, path));
    EXPECT_EQ(path, "affffffffffffffffb");
    auto const other = MakeCounted<BytesItem>();
    EXPECT_FALSE(handle->GenerateIndexedPath({Str("a"), Str("b")}, other, nullptr, path));
}

TEST_F(ArchiveHostileTest, BlockTagInPlaceOfTheGuardReadsAndTakesNoSave)
{
    ArchiveBuilder builder;
    builder.guardTag = "#Fil";
    builder.AddFile(1, "a", "1");
    R result{};
    Counted<Archive> const archive = Open(builder.Build(), result);
    ASSERT_TRUE(archive);
    EXPECT_EQ(Get(*archive, "a"), "1");
    EXPECT_EQ(SessionResult(*archive), Archive::SessionFileUnusable);
    EXPECT_EQ(archive->GetLastRestoreResult(), Archive::RestoreNotTheFile);
    EXPECT_EQ(ReadWhole(m_path), builder.Build());
}

TEST_F(ArchiveHostileTest, TableInTheFixedPartIsNone)
{
    // It would be written over by the next save.
    ArchiveBuilder builder;
    builder.link = ArchiveBuilder::Link{0, 0, std::string(4, '\xFF') + std::string("#FAT") + std::string(60, '\0')};
    builder.firstFAT = 90;
    std::string bytes = builder.Build();
    bytes[6] = 0; // Without the flag the link is the beginning of the content, and the table is read.
    R result{};
    EXPECT_TRUE(Open(bytes, result)) << result;
    bytes[6] = 1;
    EXPECT_FALSE(Open(bytes, result));
    EXPECT_EQ(result, R::OpenCorrupt);
    WriteWhole(m_path, bytes);
    EXPECT_FALSE(Archive::RecoverArchive(Str(m_path), Archive::OpenModeReadOnly, IDTag(), result));
    EXPECT_EQ(result, R::OpenCorrupt);
}

TEST_F(ArchiveHostileTest, OldFileWithoutABlockInFrontTakesNoSave)
{
    ArchiveBuilder builder(7);
    builder.AddRaw("####");
    builder.AddFile(1, "a", "1");
    R result{};
    Counted<Archive> archive = Open(builder.Build(), result);
    ASSERT_TRUE(archive);
    EXPECT_FALSE(Save(*archive, {{"b", "2"}}));
    archive = nullptr;
    EXPECT_EQ(ReadWhole(m_path), builder.Build());
}

TEST_F(ArchiveHostileTest, LongHistoriesOpenAndGoInTime)
{
    // 100,000 tables of one record each, over two blocks.
    for (bool const broken : {false, true}) {
        ArchiveBuilder builder;
        ArchiveBuilder::Table table;
        table.tag = broken ? "#FT1" : "#FT4";
        table.records = {Added(builder, 1, "a")};
        builder.AddTable(table);
        table.tag = "#FT4";
        table.records[0].kind = 1;
        for (int i = 0; i < 100'000; ++i) builder.AddTable(table);
        R result{};
        std::clock_t const start = std::clock();
        WriteWhole(m_path, builder.Build());
        Counted<Archive> archive = Archive::Open(Str(m_path), Archive::OpenModeReadOnly, c_documentTag, result);
        EXPECT_EQ(result, broken ? R::OpenCorrupt : R::OpenOk);
        if (archive) {
            EXPECT_EQ(Get(*archive, "a"), "1");
        }
        archive = nullptr;
        EXPECT_LT(std::clock() - start, 10 * CLOCKS_PER_SEC); // The file has 10 MB.
    }
}

} // namespace
} // namespace KernelTest

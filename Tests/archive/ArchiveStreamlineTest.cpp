#include "libkernel/archive/ArchiveStreamline.h"

#include "libkernel/archive/ArchiveReferenceInfo.h"
#include "libkernel/archive/ArchiveThumbnails.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/streams/FileInOutStream.h"
#include "libkernel/streams/InStream.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"
#include "support/FakeClock.h"
#include "support/FaultyFiles.h"
#include "support/TempFolder.h"
#include "support/TraceCapture.h"

#include <atomic>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <sstream>
#include <thread>

namespace KernelTest {
namespace {

using namespace Kernel;
using Result = Archive::StreamlineResult;
using Items = std::map<std::string, std::string>;

constexpr u16 c_midStreamline = 4;
constexpr u16 c_streamlined = 8;

/// Offers one item under a generated path, so that the document has a path count.
std::string SaveGenerated(Archive& archive, std::string const& bytes)
{
    ArchiveSessionHandle handle;
    EXPECT_TRUE(archive.CreateSession(handle, Archive::SessionTypeFull, nullptr));
    auto const item = MakeCounted<BytesItem>(bytes);
    String8 path;
    EXPECT_TRUE(handle->GenerateIndexedPath({String8("gen/"), String8(".x")}, item.Get(), nullptr, path));
    handle->CreateFile(path, item);
    archive.CloseSession(handle, false);
    return path.GetData();
}

void SaveWithThumbnail(Archive& archive, Changes const& changes, std::string const& picture, bool scratch = false)
{
    ArchiveSessionHandle handle;
    ASSERT_TRUE(scratch ? archive.CreateScratchSession(handle, Archive::SessionTypeFull, nullptr)
                        : archive.CreateSession(handle, Archive::SessionTypeFull, nullptr));
    for (auto const& [path, bytes] : changes) handle->CreateFile(Str(path), MakeCounted<BytesItem>(*bytes));
    auto const data = MakeCounted<RawData>(picture.size());
    std::copy(picture.begin(), picture.end(), data->GetBytes());
    auto const thumbnails = MakeCounted<ArchiveThumbnails>();
    thumbnails->AddFile(ArchiveThumbnails::FileType::Picture, data);
    handle->SetThumbnails(thumbnails);
    archive.CloseSession(handle, false);
}

std::string Thumbnail(Archive& archive)
{
    Counted<ArchiveThumbnails const> const thumbnails = archive.LoadThumbnails();
    if (!thumbnails || thumbnails->GetRecs().size() != 1) return {};
    RawData const& data = *thumbnails->GetRecs()[0].data;
    return std::string(static_cast<char const*>(data.GetData()), data.GetSize());
}

std::vector<Counted<Archive::Revision const>> RevisionsOf(Archive& archive)
{
    std::vector<Counted<Archive::Revision const>> revisions;
    archive.GetRevisions(revisions);
    return revisions;
}

u64 ReadLittle(std::string const& bytes, size_t at)
{
    u64 value = 0;
    for (size_t i = 8; i-- > 0;) value = value << 8 | static_cast<u8>(bytes[at + i]);
    return value;
}

/// The most memory that the process has had since its mark was last reset, in bytes.
u64 PeakMemory()
{
    std::ifstream in("/proc/self/status");
    for (std::string line; std::getline(in, line);)
        if (line.rfind("VmHWM:", 0) == 0) return std::stoull(line.substr(6)) << 10;
    return 0;
}

class StringOut : public OutStream
{
public:
    u64 WriteBlock(void const* from, u64 count) override
    {
        text.append(static_cast<char const*>(from), count);
        return count;
    }
    u64 GetSizeOutStream() const override { return text.size(); }
    u64 TellOutStream() const override { return text.size(); }
    std::string text;
};

class Progress : public ArchiveStreamlineProgress
{
public:
    void OnProgress(u64 done, u64 total) override
    {
        calls.emplace_back(done, total);
        if (onCall) onCall();
    }
    std::vector<std::pair<u64, u64>> calls;
    std::function<void()> onCall;
};

class ArchiveStreamlineTest : public testing::Test
{
protected:
    ArchiveStreamlineTest()
    {
        std::filesystem::create_directory(m_temporaries);
        std::filesystem::create_directory(m_second);
        std::vector<String8> rescued;
        TempFile::SetTempPath(Str(m_temporaries), Str(m_second), rescued);
    }
    ~ArchiveStreamlineTest() override { TempFile::SetTempPath(String8()); }

    /// Four revisions with dead bytes of each kind; gives what is alive in the end.
    Items Fill(Archive& archive)
    {
        EXPECT_TRUE(Save(archive, {{"a", "first"}, {"b", std::string(300'000, 'b')}, {"gone", "x"}}));
        EXPECT_TRUE(Save(archive, {{"a", "second"}, {"gone", std::nullopt}}));
        EXPECT_TRUE(Save(archive, {{"packed", std::string(2'500'000, 'p')}, {"empty", ""}}, false,
                         Archive::SessionTypeFull, true));
        SaveGenerated(archive, "generated");
        return GetAll(archive);
    }
    Items Make()
    {
        m_archive = CreateDocument(m_path);
        return Fill(*m_archive);
    }
    /// Every file in the folder of the document and in those of temporaries.
    std::string Listing() const
    {
        std::set<std::string> names;
        for (std::string const& folder : {m_folder.GetPath(), m_temporaries, m_second})
            for (auto const& entry : std::filesystem::directory_iterator(folder))
                if (entry.is_regular_file()) names.insert(entry.path().filename());
        std::string all;
        for (std::string const& name : names) all += name + " ";
        return all;
    }
    void ExpectCompact(Archive& archive, Items const& items, u16 flags)
    {
        EXPECT_EQ(GetAll(archive), items);
        auto const revisions = RevisionsOf(archive);
        ASSERT_EQ(revisions.size(), 1u);
        EXPECT_EQ(revisions[0]->GetTag(), Archive::RevisionTagStreamlined);
        EXPECT_EQ(revisions[0]->GetNextFAT(), 0u);
        Archive::FileState const state = StateOf(archive);
        EXPECT_EQ(state.fileVersion, 11);
        EXPECT_EQ(state.flags, flags);
        EXPECT_EQ(state.deadBytes, 0u);
        u64 stored = 0;
        for (Archive::FileRevision const& entry : revisions[0]->GetEntries()) {
            stored += entry.fileCompressedSize;
            EXPECT_TRUE(entry.added);
            EXPECT_EQ(archive.CheckStoredBlock(*revisions[0], entry), Archive::BlockCheck::Ok);
        }
        EXPECT_EQ(state.totalBytes, stored);
        EXPECT_FALSE(archive.RequiresStreamlining());
    }

    TestSupport::TempFolder m_folder;
    std::string const m_temporaries = m_folder / "temporaries";
    std::string const m_second = m_folder / "second";
    std::string const m_path = m_folder / "doc";
    std::string const m_scratchPath = m_folder / "doc.scratch";
    Counted<Archive> m_archive;
};

TEST_F(ArchiveStreamlineTest, OnlyAHistoryWithDeletionsOrReplacementsRequiresIt)
{
    struct Case
    {
        char const* what;
        std::vector<Changes> saves;
        int rewind;
        bool required;
    };
    Case const cases[] = {
        {"empty", {}, 0, false},
        {"one revision", {{{"a", "1"}}}, 0, false},
        {"second adds", {{{"a", "1"}}, {{"b", "1"}}}, 0, false},
        {"second replaces", {{{"a", "1"}}, {{"a", "2"}}}, 0, true},
        {"second deletes", {{{"a", "1"}, {"b", "1"}}, {{"a", std::nullopt}}}, 0, true},
        {"replacement rewound", {{{"a", "1"}}, {{"b", "1"}}, {{"a", "2"}}}, 1, false},
        {"rewound to before the oldest", {{{"a", "1"}}, {{"a", "2"}}}, 2, false},
    };
    for (Case const& c : cases) {
        SCOPED_TRACE(c.what);
        m_archive = nullptr;
        std::filesystem::remove(m_path);
        m_archive = CreateDocument(m_path);
        for (Changes const& save : c.saves) ASSERT_TRUE(Save(*m_archive, save));
        for (int i = 0; i < c.rewind; ++i) m_archive->RewindWorkingRevision();
        EXPECT_EQ(m_archive->RequiresStreamlining(), c.required);
        if (c.required) continue;
        std::string const before = ReadWhole(m_path);
        EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
        EXPECT_EQ(ReadWhole(m_path), before);
    }
}

/// The ways by which a compact file comes to stand in the master's place.
enum class Road
{
    Rename,
    Overwrite,
    SecondReference,
    Marshalled,
    NoBackupPossible
};

class ArchiveStreamlineRoadTest : public ArchiveStreamlineTest, public testing::WithParamInterface<Road>
{
protected:
    bool Overwrites() const { return GetParam() != Road::Rename && GetParam() != Road::Marshalled; }
    u16 Flags() const { return Overwrites() ? c_streamlined : c_midStreamline; }

    Result Run(Archive& archive, bool verify, Counted<ArchiveStreamlineProgress> const& progress = nullptr)
    {
        Archive::MarshalledFileAccess marshalled;
        TestSupport::FaultyFiles faults;
        Counted<Archive> holder;
        switch (GetParam()) {
        case Road::Overwrite: archive.SetAlwaysStreamlineOverwrite(true); break;
        case Road::SecondReference: {
            Archive::CreateResult result;
            holder = archive.CreateReplacementWithTemporary(result, {});
            EXPECT_TRUE(holder);
            break;
        }
        case Road::Marshalled:
            marshalled.path = Str(m_folder / "host.new");
            marshalled.backupPath = Str(m_folder / "host.old");
            marshalled.keepBackup = true;
            break;
        case Road::NoBackupPossible: {
            TestSupport::Fault fault;
            fault.call = TestSupport::FileCall::Rename;
            fault.forEver = true;
            fault.error = EIO;
            fault.path = "~backup";
            faults.Plan(fault);
            break;
        }
        default: break;
        }
        Archive::MarshalledFileAccess const* const access = GetParam() == Road::Marshalled ? &marshalled : nullptr;
        String8 report;
        return verify ? archive.StreamlineAndVerifyFileState(report, nullptr, progress, access)
                      : archive.Streamline(nullptr, progress, access);
    }
};

INSTANTIATE_TEST_SUITE_P(Roads, ArchiveStreamlineRoadTest,
                         testing::Values(Road::Rename, Road::Overwrite, Road::SecondReference, Road::Marshalled,
                                         Road::NoBackupPossible));

TEST_P(ArchiveStreamlineRoadTest, OneRevisionWithTheSameContentIsLeftInMemoryAndOnDisk)
{
    Items const items = Make();
    SaveWithThumbnail(*m_archive, {{"a", "second"}}, "picture");
    std::filesystem::permissions(m_path, std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
    Archive::FileState const before = StateOf(*m_archive);
    u32 const uid = m_archive->GetFileInfo(Str("b"))->GetUID();
    auto const progress = MakeCounted<Progress>();
    bool doing = false;
    progress->onCall = [&] { doing = doing || m_archive->IsDoingStreamline(); };
    ASSERT_EQ(Run(*m_archive, true, progress), Archive::StreamlineDone);
    EXPECT_TRUE(doing);
    EXPECT_FALSE(m_archive->IsDoingStreamline());
    ExpectCompact(*m_archive, items, Flags());
    EXPECT_EQ(Listing(), "doc ");
    EXPECT_EQ(Archive::IsMidStreamlineFile(Str(m_path)), !Overwrites());
    for (u64 i = 0; i < items.size(); ++i)
        EXPECT_EQ(progress->calls.at(i), std::make_pair(i + 1, u64{items.size() + 1}));

    Archive::FileState const state = StateOf(*m_archive);
    EXPECT_EQ(state.saveCount, before.saveCount + 1);
    EXPECT_EQ(state.writeCounter, before.writeCounter + 1);
    EXPECT_EQ(state.nextFreeUID, before.nextFreeUID);
    EXPECT_EQ(Thumbnail(*m_archive), "picture");
    EXPECT_EQ(m_archive->GetFileInfo(Str("b"))->GetUID(), uid);
    EXPECT_EQ(std::filesystem::status(m_path).permissions(),
              std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
    std::string const rendered = ReadWhole(m_path);
    EXPECT_EQ(rendered.size(), state.fileEnd + 16 + 13 + 7);

    // The next save continues the file, and its path counts.
    m_archive = nullptr;
    m_archive = OpenDocument(m_path);
    ExpectCompact(*m_archive, items, Flags());
    EXPECT_EQ(Thumbnail(*m_archive), "picture");
    EXPECT_EQ(SaveGenerated(*m_archive, "another"), "gen/2.x");
    ASSERT_TRUE(Save(*m_archive, {{"a", "third"}}));
    EXPECT_EQ(StateOf(*m_archive).flags & c_midStreamline, Flags() & c_midStreamline);
    EXPECT_EQ(Run(*m_archive, true), Archive::StreamlineDone);
    EXPECT_EQ(Get(*OpenDocument(m_path, Archive::OpenModeReadOnly), "a"), "third");
}

TEST_P(ArchiveStreamlineRoadTest, ScratchFileIsTakenInAndStartsAfresh)
{
    m_archive = CreateDocument(m_path);
    Archive::CreateResult created;
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}, {"gone", "1"}}));
    ASSERT_TRUE(m_archive->AddScratchFile(Str(m_scratchPath), created));
    ASSERT_TRUE(Save(*m_archive, {{"a", "2"}, {"new", "1"}, {"gone", std::nullopt}}, true));
    Items const items = GetAll(*m_archive);
    ASSERT_EQ(Run(*m_archive, true), Archive::StreamlineDone);
    ExpectCompact(*m_archive, items, Flags());
    EXPECT_FALSE(m_archive->HaveScratchRevisions());
    ASSERT_TRUE(Save(*m_archive, {{"a", "3"}}, true));

    m_archive = nullptr;
    EXPECT_EQ(GetAll(*OpenDocument(m_path)), items);
    m_archive = OpenDocument(m_scratchPath);
    EXPECT_EQ(Get(*m_archive, "a"), "3");
    EXPECT_EQ(Get(*m_archive, "new"), "1");
    EXPECT_EQ(StateOf(*m_archive, Archive::ChoiceScratch).fileEnd > 86, true);
}

TEST_P(ArchiveStreamlineRoadTest, HoldersKeepTheirBytesWhicheverVersionTheyStandAt)
{
    Make();
    Counted<DelayLoadHolder> const old = m_archive->CreateDelayLoadHolderDirect(Str("a"), &BytesItem::c_type, nullptr);
    ASSERT_TRUE(Save(*m_archive, {{"a", "third"}}));
    Counted<DelayLoadHolder> const alive =
        m_archive->CreateDelayLoadHolderDirect(Str("b"), &BytesItem::c_type, nullptr);
    Counted<DelayLoadHolder> const gone =
        m_archive->CreateDelayLoadHolderDirect(Str("packed"), &BytesItem::c_type, nullptr);
    ASSERT_TRUE(Save(*m_archive, {{"packed", std::nullopt}}));
    ASSERT_EQ(Run(*m_archive, false), Archive::StreamlineDone);

    EXPECT_TRUE(alive->IsBackedBy(*m_archive));
    EXPECT_FALSE(alive->GetBackData());
    EXPECT_FALSE(old->IsBackedBy(*m_archive));
    EXPECT_FALSE(gone->IsBackedBy(*m_archive));
    auto const bytesOf = [](DelayLoadHolder& holder) {
        JailCounted<FileStoreItem> item;
        holder.GetItemBase(item);
        return item ? static_cast<BytesItem const&>(*item).bytes : std::string("(nothing)");
    };
    EXPECT_EQ(bytesOf(*old), "second");
    EXPECT_EQ(bytesOf(*alive), std::string(300'000, 'b'));
    EXPECT_EQ(bytesOf(*gone), std::string(2'500'000, 'p'));
    EXPECT_EQ(Get(*m_archive, "a"), "third");
}

TEST_P(ArchiveStreamlineRoadTest, OffliningGoesOnWithTheNewFile)
{
    for (bool complete : {true, false}) {
        SCOPED_TRACE(complete);
        m_archive = nullptr;
        std::filesystem::remove(m_path);
        Items const items = Make();
        m_archive->StartOffline(nullptr);
        while (complete && m_archive->IsOfflining()) std::this_thread::yield();
        ASSERT_EQ(Run(*m_archive, false), Archive::StreamlineDone);
        while (m_archive->IsOfflining()) std::this_thread::yield();
        EXPECT_TRUE(m_archive->IsOffliningCompleted());
        std::filesystem::remove(m_path);
        for (auto const& [path, bytes] : items) {
            auto const item = MakeCounted<BytesItem>();
            EXPECT_TRUE(m_archive->LoadFile(Str(path), *item)) << path;
            EXPECT_EQ(item->bytes, bytes);
        }
    }
}

TEST_P(ArchiveStreamlineRoadTest, FileIsClosedBetweenAccessesIfThatIsAskedFor)
{
    Items const items = Make();
    m_archive->SetKeepOpen(false);
    TestSupport::FaultyFiles files;
    ASSERT_EQ(m_archive->StreamlineAndVerifyFileState(*std::make_unique<String8>(), nullptr, nullptr, nullptr),
              Archive::StreamlineDone);
    EXPECT_EQ(files.GetOpenHandles(), 0);
    ExpectCompact(*m_archive, items, c_midStreamline);
}

// Any number of reads on other threads see one state or the other, and none is refused.
TEST_P(ArchiveStreamlineRoadTest, ReadersOnOtherThreadsNeverNotice)
{
    m_archive = CreateDocument(m_path);
    Items items;
    for (int i = 0; i < 40; ++i) items["item" + std::to_string(i)] = std::string(static_cast<size_t>(i) * 97, 'x');
    ASSERT_TRUE(Save(*m_archive, Changes(items.begin(), items.end())));
    std::atomic<bool> stop{false};
    std::atomic<int> reads{0};
    std::thread reader([&] {
        while (!stop) {
            for (auto const& [path, bytes] : items) {
                ASSERT_EQ(Get(*m_archive, path), bytes);
                auto const item = MakeCounted<BytesItem>();
                ASSERT_TRUE(m_archive->LoadFile(Str(path), *item));
                ++reads;
            }
        }
    });
    // A stream that is open at that moment is a reason to refuse, and to try again.
    for (int done = 0; done < 8;) {
        ASSERT_TRUE(Save(*m_archive, {{"item3", items["item3"]}}));
        for (int tries = 0; tries < 100'000; ++tries) {
            Result const result = Run(*m_archive, false);
            if (result == Archive::StreamlineDone) break;
            ASSERT_EQ(result, Archive::StreamlineFailed);
        }
        ++done;
    }
    stop = true;
    reader.join();
    EXPECT_GT(reads, 0);
    EXPECT_FALSE(m_archive->IsBroken());
    EXPECT_EQ(GetAll(*m_archive), items);
}

// Another document's save takes stored bytes from here; they move between the queueing of the copy and its turn.
TEST_P(ArchiveStreamlineRoadTest, SaveElsewhereThatCopiesFromTheDocumentFindsTheBytesWhereTheyAreNow)
{
    Make();
    Counted<Archive> const other = CreateDocument(m_folder / "other");
    Counted<DelayLoadHolder> const holder =
        m_archive->CreateDelayLoadHolderDirect(Str("b"), &BytesItem::c_type, nullptr);
    ArchiveSessionHandle handle;
    ASSERT_TRUE(other->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->AddSourceArchive(m_archive);
    handle->AssignDelayLoadHolderPath(holder, Str("copied"));
    class BetweenQueueAndCopy : public ArchiveSessionProgress
    {
    public:
        void OnProgress(u32 done, u32) override
        {
            if (done == 0) run();
        }
        std::function<void()> run;
    };
    auto const progress = MakeCounted<BetweenQueueAndCopy>();
    progress->run = [&] { ASSERT_EQ(Run(*m_archive, false), Archive::StreamlineDone); };
    handle->SetProgressCallback(progress);
    handle->CreateFile(holder);
    other->CloseSession(handle, false);
    EXPECT_EQ(GetAll(*other), (Items{{"copied", std::string(300'000, 'b')}}));
}

TEST_F(ArchiveStreamlineTest, RewoundArchiveKeepsWhatItShows)
{
    Make();
    m_archive->RewindWorkingRevision();
    m_archive->RewindWorkingRevision();
    Items const shown = GetAll(*m_archive);
    ASSERT_EQ(shown.count("packed"), 0u);
    EXPECT_EQ(m_archive->StreamlineToNew(Str(m_folder / "copy")), Archive::StreamlineDone);
    EXPECT_EQ(GetAll(*OpenDocument(m_folder / "copy")), shown);
    ASSERT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    ExpectCompact(*m_archive, shown, c_midStreamline);
    EXPECT_TRUE(m_archive->IsWorkingRevisionAtHead());
}

TEST_F(ArchiveStreamlineTest, UnknownStoredCRCIsFilledInAndIsNeverZero)
{
    // The first bytes have the CRC-32 0.
    std::string const zero("\x9D\x0A\xD9\x6D", 4);
    TestSupport::ArchiveBuilder builder(9);
    builder.AddFile(1, "replaced", "x");
    TestSupport::ArchiveBuilder::Table table;
    table.tag = "#FT2";
    table.records.push_back({2, 0, "zero", builder.AddBlock(zero)});
    table.records.push_back({3, 0, "text", builder.AddBlock("text", 1)});
    table.records.push_back({1, 1, "", builder.AddBlock("y")});
    builder.AddTable(table);
    WriteWhole(m_path, builder.Build());
    m_archive = OpenDocument(m_path);
    EXPECT_TRUE(m_archive->StreamliningAdviseable());
    String8 report;
    ASSERT_EQ(m_archive->StreamlineAndVerifyFileState(report, nullptr, nullptr, nullptr), Archive::StreamlineDone);
    EXPECT_FALSE(m_archive->StreamliningAdviseable());
    Archive::FileRevision entry;
    Counted<Archive::Revision const> revision;
    ASSERT_TRUE(m_archive->GetFileRevision(Str("zero"), entry, revision));
    EXPECT_EQ(entry.crcUncompressed, 0u);
    EXPECT_EQ(entry.crcCompressed, 1u);
    ASSERT_TRUE(m_archive->GetFileRevision(Str("text"), entry, revision));
    EXPECT_EQ(entry.codeBaseIndex, 24u);
    EXPECT_NE(entry.crcCompressed, 0u);
    ExpectCompact(*OpenDocument(m_path, Archive::OpenModeReadOnly),
                  {{"zero", zero}, {"text", "text"}, {"replaced", "y"}}, c_midStreamline);
    // A file with a guard at last.
    EXPECT_TRUE(Save(*m_archive, {{"a", "1"}}));
}

TEST_F(ArchiveStreamlineTest, LongestPathGoesThrough)
{
    m_archive = CreateDocument(m_path);
    std::string const path(65535, 'p');
    ASSERT_TRUE(Save(*m_archive, {{path, "1"}}));
    ASSERT_TRUE(Save(*m_archive, {{path, "2"}}));
    EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    EXPECT_EQ(GetAll(*OpenDocument(m_path, Archive::OpenModeReadOnly)), (Items{{path, "2"}}));
}

TEST_F(ArchiveStreamlineTest, WhatStandsInTheWayIsRefusedAndNothingChanges)
{
    struct Case
    {
        char const* what;
        std::function<void()> prepare;
        Result inPlace;
        Result toNew;
    };
    ArchiveSessionHandle handle;
    Counted<InStream> stream;
    bool abort = true;
    Case const cases[] = {
        {"session", [&] { m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr); },
         Archive::StreamlineFailed, Archive::StreamlineFailed},
        {"open stream", [&] { stream = m_archive->OpenFileInStream(Str("a")); }, Archive::StreamlineFailed,
         Archive::StreamlineFailed},
        {"read-only",
         [&] {
             m_archive = nullptr;
             m_archive = OpenDocument(m_path, Archive::OpenModeReadOnly);
         },
         Archive::StreamlineFailed, Archive::StreamlineDone},
        {"no master",
         [&] {
             m_archive = nullptr;
             Archive::OpenResult result{};
             m_archive = Archive::OpenAsScratch(Str(m_path), c_documentTag, result);
         },
         Archive::StreamlineFailed, Archive::StreamlineDone},
        {"bad block",
         [&] {
             Archive::FileRevision entry;
             Counted<Archive::Revision const> revision;
             ASSERT_TRUE(m_archive->GetFileRevision(Str("b"), entry, revision));
             std::string bytes = ReadWhole(m_path);
             bytes[entry.filePos] = '?';
             std::fstream(m_path, std::ios::in | std::ios::out | std::ios::binary) << bytes;
         },
         Archive::StreamlineFailed, Archive::StreamlineFailed},
        {"taken by another process",
         [&] {
             m_archive->SetKeepOpen(false);
             ASSERT_TRUE(Save(*OpenDocument(m_path), {{"a", "theirs"}}));
         },
         Archive::StreamlineNoAccess, Archive::StreamlineNoAccess},
        {"file gone",
         [&] {
             m_archive->SetKeepOpen(false);
             std::filesystem::rename(m_path, m_path + ".away");
         },
         Archive::StreamlineNoAccess, Archive::StreamlineNoAccess},
    };
    for (Case const& c : cases) {
        SCOPED_TRACE(c.what);
        Make();
        c.prepare();
        std::string before = ReadWhole(m_path);
        String8 report;
        EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), c.inPlace);
        EXPECT_EQ(m_archive->StreamlineToNew(Str(m_folder / "copy")), c.toNew);
        EXPECT_EQ(std::filesystem::exists(m_folder / "copy"), c.toNew == Archive::StreamlineDone);
        EXPECT_EQ(ReadWhole(m_path), before);
        stream = nullptr;
        handle.Release();
        m_archive = nullptr;
        for (std::string const& name : {m_path, m_path + ".away", m_folder / "copy"}) std::filesystem::remove(name);
        EXPECT_EQ(Listing(), "");
    }
    Make();
    EXPECT_EQ(m_archive->Streamline(&abort, nullptr, nullptr), Archive::StreamlineAborted);
}

TEST_F(ArchiveStreamlineTest, AbortAtAnyPollLeavesEverythingAsItWas)
{
    Items const items = Make();
    for (bool overwrite : {false, true}) {
        m_archive->SetAlwaysStreamlineOverwrite(overwrite);
        std::string const before = ReadWhole(m_path);
        for (u64 n = 1; n <= items.size(); ++n) {
            bool abort = false;
            auto const progress = MakeCounted<Progress>();
            progress->onCall = [&, p = progress.Get()] { abort = p->calls.size() == n; };
            EXPECT_EQ(m_archive->Streamline(&abort, progress, nullptr), Archive::StreamlineAborted);
            progress->onCall = nullptr;
        }
        EXPECT_EQ(ReadWhole(m_path), before);
        EXPECT_EQ(Listing(), "doc ");
        EXPECT_EQ(GetAll(*m_archive), items);
    }
    EXPECT_TRUE(Save(*m_archive, {{"a", "4"}}));
}

TEST_F(ArchiveStreamlineTest, AbortBeforeTheThumbnailsDoesNotLoseThem)
{
    Items const items = Make();
    SaveWithThumbnail(*m_archive, {{"a", items.at("a")}}, "picture");
    std::string const before = ReadWhole(m_path);
    bool abort = false;
    auto const progress = MakeCounted<Progress>();
    TestSupport::FaultyFiles files;
    files.SetObserver([&](TestSupport::FileCall call, std::string const&) {
        if (call == TestSupport::FileCall::Write && progress->calls.size() == items.size()) abort = true;
    });
    EXPECT_EQ(m_archive->Streamline(&abort, progress, nullptr), Archive::StreamlineAborted);
    EXPECT_TRUE(abort);
    EXPECT_TRUE(ReadWhole(m_path) == before);
    EXPECT_EQ(Listing(), "doc ");
}

TEST_F(ArchiveStreamlineTest, BackupNameOfAHostThatIsInUseIsNotTaken)
{
    for (std::string const& backup : {m_path, m_scratchPath, m_folder / "host.new"}) {
        SCOPED_TRACE(backup);
        Items items = Make();
        Archive::CreateResult created;
        ASSERT_TRUE(m_archive->AddScratchFile(Str(m_scratchPath), created));
        ASSERT_TRUE(Save(*m_archive, {{"a", "scratch"}}, true));
        items["a"] = "scratch";
        Archive::MarshalledFileAccess const marshalled{Str(m_folder / "host.new"), Str(backup), true};
        EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, &marshalled), Archive::StreamlineDone);
        ExpectCompact(*m_archive, items, c_streamlined);
        m_archive = nullptr;
        ExpectCompact(*OpenDocument(m_path), items, c_streamlined);
        EXPECT_EQ(Listing(), "doc doc.scratch ");
        std::filesystem::remove(m_path);
        std::filesystem::remove(m_scratchPath);
    }
}

TEST_F(ArchiveStreamlineTest, NamesThatAreTakenArePassedOver)
{
    Items const items = Make();
    WriteWhole(m_path + "~tmp", "somebody's");
    std::filesystem::create_symlink(m_folder / "nowhere", m_path + "~tmp2");
    WriteWhole(m_path + "~backup", "somebody's");
    ASSERT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    ExpectCompact(*m_archive, items, c_midStreamline);
    EXPECT_EQ(ReadWhole(m_path + "~tmp"), "somebody's");
    EXPECT_EQ(ReadWhole(m_path + "~backup"), "somebody's");
    EXPECT_FALSE(std::filesystem::exists(m_folder / "nowhere"));
    EXPECT_EQ(Listing(), "doc doc~backup doc~tmp ");
}

TEST_F(ArchiveStreamlineTest, SearchForANameIsGivenUpInTimeAndTheDocumentOverwritten)
{
    struct
    {
        std::string name;
        int error;
        int opens; ///< Of candidates, that is.
    } const cases[] = {
        {"~tmp", EIO, 3},     {"~tmp", EPERM, 29},     {"~tmp", EROFS, 1},
        {"~backup", EIO, 30}, {"~backup", EAGAIN, 30}, {"~backup", EROFS, 1},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.name + " " + std::to_string(c.error));
        Items const items = Make();
        int opens = 0;
        {
            TestSupport::FaultyFiles files;
            TestSupport::Fault fault;
            fault.call = TestSupport::FileCall::Open;
            fault.forEver = true;
            fault.error = c.error;
            fault.path = c.name;
            files.Plan(fault);
            files.SetObserver([&](TestSupport::FileCall call, std::string const& path) {
                opens += call == TestSupport::FileCall::Open && path.find(c.name) != path.npos;
            });
            EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
        }
        EXPECT_EQ(opens, c.opens);
        ExpectCompact(*m_archive, items, c_streamlined);
        EXPECT_EQ(Listing(), "doc ");
        m_archive = nullptr;
        std::filesystem::remove(m_path);
    }
    // Names that are taken count as none of these, up to the last.
    for (int taken : {28, 29}) {
        Items const items = Make();
        for (int n = 1; n <= taken; ++n) WriteWhole(m_path + "~tmp" + (n > 1 ? std::to_string(n) : ""), "somebody's");
        EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
        ExpectCompact(*m_archive, items, taken == 28 ? c_midStreamline : c_streamlined);
        m_archive = nullptr;
        std::filesystem::remove(m_path);
    }
}

TEST_F(ArchiveStreamlineTest, OverwritingNeedsItsTemporaryFolder)
{
    Make();
    m_archive->SetAlwaysStreamlineOverwrite(true);
    EXPECT_TRUE(m_archive->GetAlwaysStreamlineOverwrite());
    TempFile::SetTempPath(String8());
    EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineFailed);
}

TEST_F(ArchiveStreamlineTest, SecondReferenceIsTraced)
{
    Make();
    Archive::CreateResult result;
    Counted<Archive> const other = m_archive->CreateReplacementWithTemporary(result, {});
    Kernel::Test::TraceCapture trace;
    ASSERT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    EXPECT_NE(trace.GetText().find(
                  "Archive::StreamlineInner - the file handle is held open by multiple ref-counts: " + m_path + "\n"),
              std::string::npos);
}

// Copies.

TEST_F(ArchiveStreamlineTest, CopiesToStreamsAndMemoryOpenLikeTheDocument)
{
    Items const items = Make();
    auto const out = MakeCounted<StringOut>();
    ASSERT_EQ(m_archive->StreamlineToOutStream(*out), Archive::StreamlineDone);
    Counted<FragmentedRawData> const counted = MakeCounted<FragmentedRawData>(0);
    FragmentedRawData& data = *counted;
    ASSERT_EQ(m_archive->StreamlineToFragmentedRawData(data), Archive::StreamlineDone);
    std::string fromMemory(data.GetSize(), 0);
    data.GetData(0, fromMemory.data(), fromMemory.size());
    for (std::string const& bytes : {out->text, fromMemory}) {
        WriteWhole(m_folder / "copy", bytes);
        Counted<Archive> const copy = OpenDocument(m_folder / "copy");
        ExpectCompact(*copy, items, 0);
        EXPECT_EQ(StateOf(*copy).saveCount, 1u);
        EXPECT_EQ(StateOf(*copy).writeCounter, StateOf(*m_archive).writeCounter + 1);
    }
    Archive::OpenResult opened{};
    EXPECT_EQ(GetAll(*Archive::OpenAsThrowaway(data, c_documentTag, opened)), items);
    EXPECT_EQ(RevisionsOf(*m_archive).size(), 4u);

    // One that needs no rewriting goes out byte for byte, without what lies behind its end.
    ASSERT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    ASSERT_TRUE(Save(*m_archive, {{"added", "1"}}));
    auto const plain = MakeCounted<StringOut>();
    ASSERT_EQ(m_archive->StreamlineToOutStream(*plain), Archive::StreamlineDone);
    std::string const& bytes = plain->text;
    EXPECT_EQ(bytes, ReadWhole(m_path).substr(0, StateOf(*m_archive).fileEnd));
    Counted<RawData> const extracted = m_archive->ExtractToRawData();
    ASSERT_TRUE(extracted);
    EXPECT_EQ(std::string(static_cast<char const*>(extracted->GetData()), extracted->GetSize()), bytes);

    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    EXPECT_FALSE(m_archive->ExtractToRawData());
    handle.Release();
    Archive::CreateResult created;
    ASSERT_TRUE(m_archive->AddScratchFile(Str(m_scratchPath), created));
    EXPECT_FALSE(m_archive->ExtractToRawData());
}

TEST_F(ArchiveStreamlineTest, TargetThatFillsUpIsToldApart)
{
    class Full : public OutStream
    {
    public:
        u64 WriteBlock(void const*, u64) override { return 0; }
        u64 GetSizeOutStream() const override { return 0; }
        u64 TellOutStream() const override { return 0; }
    };
    Make();
    EXPECT_EQ(m_archive->StreamlineToOutStream(*MakeCounted<Full>()), Archive::StreamlineNoAccess);
    EXPECT_EQ(m_archive->StreamlineToNew(String8()), Archive::StreamlineFailed);
    EXPECT_EQ(m_archive->StreamlineToNew(Str(m_folder / "no/such/folder")), Archive::StreamlineNotCreated);
    EXPECT_EQ(m_archive->StreamlineAndSwitch(Str(m_folder / "no/such/folder")), Archive::StreamlineNotCreated);
    std::string const before = ReadWhole(m_path);
    // Nor may a copy destroy what it is made from, under whatever name.
    std::filesystem::create_symlink(m_path, m_folder / "alias");
    m_archive = nullptr;
    m_archive = OpenDocument(m_path, Archive::OpenModeReadOnly);
    EXPECT_EQ(m_archive->StreamlineToNew(Str(m_folder / "alias")), Archive::StreamlineNotCreated);
    EXPECT_EQ(m_archive->StreamlineAndSwitch(Str(m_path)), Archive::StreamlineNotCreated);
    EXPECT_EQ(ReadWhole(m_path), before);
}

TEST_F(ArchiveStreamlineTest, SwitchingGoesOnInTheNewFile)
{
    struct Case
    {
        char const* what;
        bool asScratch;
        bool hasScratch;
        bool readOnly;
    };
    for (Case const& c : {Case{"plain", false, false, false}, Case{"with a scratch file", false, true, false},
                          Case{"from a read-only one", false, false, true}, Case{"as scratch", true, false, false},
                          Case{"as scratch, with one", true, true, false}})
    {
        SCOPED_TRACE(c.what);
        std::string const newPath = m_folder / "new";
        Make();
        Archive::CreateResult created;
        if (c.hasScratch) {
            ASSERT_TRUE(m_archive->AddScratchFile(Str(m_scratchPath), created));
            ASSERT_TRUE(Save(*m_archive, {{"scratched", "1"}, {"a", "in scratch"}}, true));
        }
        if (c.readOnly) {
            m_archive = nullptr;
            m_archive = OpenDocument(m_path, Archive::OpenModeReadOnly);
        }
        Items items = GetAll(*m_archive);
        std::string const before = ReadWhole(m_path);
        Counted<DelayLoadHolder> const holder =
            m_archive->CreateDelayLoadHolderDirect(Str("b"), &BytesItem::c_type, nullptr);
        ASSERT_EQ(c.asScratch ? m_archive->StreamlineAndSwitchAsScratch(Str(newPath))
                              : m_archive->StreamlineAndSwitch(Str(newPath)),
                  Archive::StreamlineDone);
        EXPECT_EQ(ReadWhole(m_path), before);
        EXPECT_TRUE(holder->IsBackedBy(*m_archive));
        EXPECT_EQ(GetAll(*m_archive), items);
        EXPECT_EQ(m_archive->IsJustScratchFile(), c.asScratch);
        EXPECT_EQ(c.asScratch ? m_archive->GetScratchPath() : m_archive->GetArchivePath(), Str(newPath));
        EXPECT_EQ(RevisionsOf(*m_archive).size(), 1u);
        ASSERT_TRUE(Save(*m_archive, {{"a", "later"}}, c.asScratch || c.hasScratch));
        items["a"] = "later";
        m_archive = nullptr;
        std::string const where = c.hasScratch && !c.asScratch ? m_scratchPath : newPath;
        EXPECT_EQ(GetAll(*OpenDocument(where)), items);
        for (std::string const& name : {m_path, m_scratchPath, newPath}) std::filesystem::remove(name);
    }
}

TEST_F(ArchiveStreamlineTest, ThrowAwayLeavesTheOldFilesAndTakesItsOwnWithIt)
{
    Make();
    Archive::CreateResult created;
    ASSERT_TRUE(m_archive->AddScratchFile(Str(m_scratchPath), created));
    ASSERT_TRUE(Save(*m_archive, {{"scratched", "1"}}, true));
    Items const items = GetAll(*m_archive);
    std::string const before = ReadWhole(m_path);
    ASSERT_EQ(m_archive->ConvertToThrowAway(), Archive::ConvertDone);
    EXPECT_TRUE(m_archive->IsThrowAway());
    EXPECT_FALSE(m_archive->HasScratchFile());
    ExpectCompact(*m_archive, items, 0);
    EXPECT_EQ(m_archive->ConvertToThrowAway(), Archive::ConvertDone);
    ASSERT_TRUE(Save(*m_archive, {{"a", "thrown away"}}));
    for (bool overwrite : {false, true}) {
        m_archive->SetAlwaysStreamlineOverwrite(overwrite);
        ASSERT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
        EXPECT_TRUE(m_archive->IsThrowAway());
        ASSERT_TRUE(Save(*m_archive, {{"a", "again"}}));
        EXPECT_EQ(Get(*m_archive, "a"), "again");
    }
    m_archive = nullptr;
    EXPECT_EQ(Listing(), "doc doc.scratch ");
    EXPECT_EQ(ReadWhole(m_path), before);

    m_archive = OpenDocument(m_path);
    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    EXPECT_EQ(m_archive->ConvertToThrowAway(), Archive::ConvertFailed);
    handle.Release();
    TempFile::SetTempPath(String8());
    EXPECT_EQ(m_archive->ConvertToThrowAway(), Archive::ConvertFailed);
    EXPECT_FALSE(m_archive->IsThrowAway());
}

// A gigantic item passes through one buffer.
TEST_F(ArchiveStreamlineTest, MemoryStaysFlatWhateverTheSizeOfAnItem)
{
    constexpr u64 c_size = u64{2} << 30;
    TestSupport::ArchiveBuilder front;
    front.AddFile(1, "small", "1");
    std::string const first = front.Build();
    {
        // The block is a hole in the file; its table lies behind it.
        TestSupport::ArchiveBuilder builder;
        builder.AddFile(1, "small", "1");
        u64 const blockPos = builder.GetEnd();
        u64 const tablePos = blockPos + 8 + c_size;
        std::string body = TestSupport::Little(2, 4) + std::string(1, '\0') + TestSupport::Little(blockPos, 8) +
                           TestSupport::Little(c_size, 8) + TestSupport::Little(c_size, 8) + TestSupport::Little(0, 4) +
                           std::string(1, '\0') + TestSupport::Little(24, 4) + TestSupport::Little(7, 4) +
                           TestSupport::Little(4, 2) + "huge" + TestSupport::Little(1, 4) + std::string(1, '\2');
        u64 const end = tablePos + 59 + body.size();
        std::string const table = "#FT4" + TestSupport::Little(ReadLittle(first, 16), 8) + TestSupport::Little(1, 8) +
                                  TestSupport::Little(end, 8) + TestSupport::Little(c_size + 1, 8) +
                                  TestSupport::Little(1, 8) + TestSupport::Little(2, 4) + TestSupport::Little(0, 4) +
                                  TestSupport::Little(body.size(), 4) + TestSupport::Little(0, 2) +
                                  std::string(1, '\0');
        builder.firstFAT = tablePos;
        builder.fileEnd = end;
        builder.nextFreeUID = 3;
        WriteWhole(m_path, builder.Build());
        std::fstream file(m_path, std::ios::in | std::ios::out | std::ios::binary);
        file.seekp(static_cast<std::streamoff>(blockPos)) << "#Fil";
        file.seekp(static_cast<std::streamoff>(tablePos - 4)) << "\xFF\xFF\xFF\xFF" << table << body;
    }
    class Counter : public OutStream
    {
    public:
        u64 WriteBlock(void const*, u64 count) override { return total += count, count; }
        u64 GetSizeOutStream() const override { return total; }
        u64 TellOutStream() const override { return total; }
        u64 total = 0;
    };
    m_archive = OpenDocument(m_path);
    ASSERT_TRUE(m_archive);
    ASSERT_TRUE(m_archive->RequiresStreamlining());
    std::ofstream("/proc/self/clear_refs") << "5";
    u64 const before = PeakMemory();
    auto const out = MakeCounted<Counter>();
    ASSERT_EQ(m_archive->StreamlineToOutStream(*out), Archive::StreamlineDone);
    EXPECT_GT(out->total, c_size);
    EXPECT_LT(PeakMemory(), before + (u64{64} << 20));
}

} // namespace
} // namespace KernelTest

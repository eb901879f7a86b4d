#include "archive/ArchiveStreamlineFixture.h"
#include "libkernel/streams/InStream.h"
#include "support/ArchiveBuilder.h"
#include "support/FaultyFiles.h"
#include "support/TraceCapture.h"

#include <atomic>
#include <cerrno>
#include <fstream>
#include <thread>

namespace KernelTest {
namespace {

using namespace Kernel;
using Result = Archive::StreamlineResult;

/// Thumbnails go with a save, so it writes one item again as it is.
void SaveThumbnail(Archive& archive)
{
    ASSERT_TRUE(InSession(archive, [&](ArchiveSession& session) {
        session.CreateFile(Str("a"), MakeCounted<BytesItem>(*Get(archive, "a")));
        session.SetThumbnails(MakeThumbnails("picture"));
    }));
}

std::string Thumbnail(Archive& archive)
{
    Counted<ArchiveThumbnails const> const thumbnails = archive.LoadThumbnails();
    if (!thumbnails || thumbnails->GetRecs().size() != 1) return {};
    RawData const& data = *thumbnails->GetRecs()[0].data;
    return std::string(static_cast<char const*>(data.GetData()), data.GetSize());
}

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
        std::string traced;
        switch (GetParam()) {
        case Road::Overwrite: archive.SetAlwaysStreamlineOverwrite(true); break;
        case Road::SecondReference: {
            Archive::CreateResult result;
            holder = archive.CreateReplacementWithTemporary(result, {});
            EXPECT_TRUE(holder);
            traced = "Archive::StreamlineInner - the file handle is held open by multiple ref-counts: " + m_path + "\n";
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
        Kernel::Test::TraceCapture trace;
        Result const result = verify ? archive.StreamlineAndVerifyFileState(report, nullptr, progress, access)
                                     : archive.Streamline(nullptr, progress, access);
        EXPECT_TRUE(result != Archive::StreamlineDone || trace.GetText().find(traced) != std::string::npos);
        return result;
    }
};

INSTANTIATE_TEST_SUITE_P(Roads, ArchiveStreamlineRoadTest,
                         testing::Values(Road::Rename, Road::Overwrite, Road::SecondReference, Road::Marshalled,
                                         Road::NoBackupPossible));

TEST_P(ArchiveStreamlineRoadTest, OneRevisionWithTheSameContentIsLeftInMemoryAndOnDisk)
{
    Items const items = Make();
    SaveThumbnail(*m_archive);
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
    Reopen(m_path);
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
    Counted<DelayLoadHolder> const old = HolderOf(*m_archive, "a");
    ASSERT_TRUE(Save(*m_archive, {{"a", "third"}}));
    Counted<DelayLoadHolder> const alive = HolderOf(*m_archive, "b");
    Counted<DelayLoadHolder> const gone = HolderOf(*m_archive, "packed");
    ASSERT_TRUE(Save(*m_archive, {{"packed", std::nullopt}}));
    ASSERT_EQ(Run(*m_archive, false), Archive::StreamlineDone);

    EXPECT_TRUE(alive->IsBackedBy(*m_archive));
    EXPECT_FALSE(alive->GetBackData());
    EXPECT_FALSE(old->IsBackedBy(*m_archive));
    EXPECT_FALSE(gone->IsBackedBy(*m_archive));
    EXPECT_EQ(BytesOf(*old), "second");
    EXPECT_EQ(BytesOf(*alive), std::string(300'000, 'b'));
    EXPECT_EQ(BytesOf(*gone), std::string(2'500'000, 'p'));
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
    for (int n = 0; n < 8; ++n) {
        EXPECT_TRUE(Save(*m_archive, {{"item3", items["item3"]}}));
        Result result = Archive::StreamlineFailed;
        for (int tries = 0; tries < 1'000'000 && result == Archive::StreamlineFailed; ++tries) {
            result = Run(*m_archive, false);
            std::this_thread::yield();
        }
        EXPECT_EQ(result, Archive::StreamlineDone);
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
    Counted<DelayLoadHolder> const holder = HolderOf(*m_archive, "b");
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
        {"read-only", [&] { Reopen(m_path, Archive::OpenModeReadOnly); }, Archive::StreamlineFailed,
         Archive::StreamlineDone},
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
    m_archive->SetAlwaysStreamlineOverwrite(true);
    TempFile::SetTempPath(String8()); // Overwriting needs its folder.
    EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineFailed);
}

TEST_F(ArchiveStreamlineTest, AbortBeforeTheThumbnailsDoesNotLoseThem)
{
    Items const items = Make();
    SaveThumbnail(*m_archive);
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

TEST_F(ArchiveStreamlineTest, ArchiveWhoseTablesWentWithAFailedSwapIsNotTakenForWell)
{
    Items const items = Make();
    {
        TestSupport::FaultyFiles files;
        for (char const* name : {"~tmp", "~move"})
            files.Plan({.call = TestSupport::FileCall::Rename, .forEver = true, .error = EIO, .path = name});
        EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineFailed);
    }
    EXPECT_TRUE(m_archive->IsEmpty());
    EXPECT_EQ(m_archive->RecoverArchive(true), Archive::RestoreNotTheFile);
    EXPECT_EQ(SessionResult(*m_archive), Archive::SessionFileBad);
    m_archive = nullptr;
    EXPECT_EQ(GetAll(*OpenDocument(m_path)), items);
    EXPECT_EQ(Listing(), "doc ");
}

TEST_F(ArchiveStreamlineTest, BackupNameOfAHostThatIsInUseIsNotTaken)
{
    for (std::string const& backup : {m_path, m_scratchPath, m_folder / "host.new"}) {
        SCOPED_TRACE(backup);
        Items items = Make();
        AddScratch();
        ASSERT_TRUE(Save(*m_archive, {{"a", "scratch"}}, true));
        items["a"] = "scratch";
        Archive::MarshalledFileAccess const marshalled{Str(m_folder / "host.new"), Str(backup), true};
        EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, &marshalled), Archive::StreamlineDone);
        ExpectCompact(*m_archive, items, c_streamlined);
        m_archive = nullptr;
        ExpectCompact(*OpenDocument(m_path), items, c_streamlined);
        EXPECT_EQ(Listing(), "doc scratch ");
        std::filesystem::remove(m_path);
        std::filesystem::remove(m_scratchPath);
    }
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
    // Names that are taken count as none of these, up to the last, and what has them stays.
    for (int taken : {28, 29}) {
        Items const items = Make();
        WriteWhole(m_path + "~backup", "somebody's");
        std::filesystem::create_symlink(m_folder / "nowhere", m_path + "~tmp");
        for (int n = 2; n <= taken; ++n) WriteWhole(m_path + "~tmp" + std::to_string(n), "somebody's");
        EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
        ExpectCompact(*m_archive, items, taken == 28 ? c_midStreamline : c_streamlined);
        EXPECT_EQ(ReadWhole(m_path + "~backup") + ReadWhole(m_path + "~tmp2"), "somebody'ssomebody's");
        EXPECT_FALSE(std::filesystem::exists(m_folder / "nowhere"));
        m_archive = nullptr;
        for (std::string const name : {"", "~tmp"}) std::filesystem::remove(m_path + name);
    }
}

} // namespace
} // namespace KernelTest

#include "libkernel/archive/ArchiveErrorCallback.h"
#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/filestore/FileStoreBackData.h"
#include "libkernel/streams/InStream.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"
#include "support/FaultyFiles.h"

#include <atomic>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <future>
#include <gtest/gtest.h>
#include <mutex>
#include <thread>
#include <utility>
#include <zlib.h>

// The reading side: revisions, damage, copies that outlive the file, and the background job that makes them all.

namespace KernelTest {
namespace {

using namespace Kernel;
using TestSupport::ArchiveBuilder;
using Items = std::map<std::string, std::string>;
using BackData = Counted<FileStoreBackData const>;

class ArchiveReadTest : public DocumentTest
{
protected:
    void SetUp() override
    {
        m_archive = CreateDocument(m_path);
        ASSERT_TRUE(m_archive);
    }
    std::vector<u64> GetBucketSizes() const
    {
        std::vector<u64> sizes;
        for (auto const& entry : std::filesystem::directory_iterator(m_temporaries)) sizes.push_back(entry.file_size());
        return sizes;
    }
    BackData Copy(std::string const& path)
    {
        return m_archive->CreateBackData(m_archive->GetHeadRevisionForFile(Str(path)), Str(path));
    }
    static std::string Load(BackData const& data)
    {
        auto const item = MakeCounted<BytesItem>();
        return data && data->LoadItem(*item) ? item->bytes : "(not loaded)";
    }
    /// Loads each as an item, for which its copy is enough.
    void ExpectLoads(Items const& items)
    {
        for (auto const& [path, bytes] : items) {
            auto const item = MakeCounted<BytesItem>("before");
            EXPECT_TRUE(m_archive->LoadFile(Str(path), *item)) << path;
            EXPECT_TRUE(item->bytes == bytes) << path;
        }
    }
    Archive::FileRevision EntryOf(std::string const& path) const
    {
        Archive::FileRevision entry;
        Counted<Archive::Revision const> revision;
        EXPECT_TRUE(m_archive->GetFileRevision(Str(path), entry, revision)) << path;
        return entry;
    }
    /// Changes the byte at an offset behind the file's back.
    void Damage(u64 offset) const
    {
        std::fstream file(m_path, std::ios::in | std::ios::out | std::ios::binary);
        file.seekg(static_cast<std::streamoff>(offset));
        char const byte = static_cast<char>(file.get() ^ 0x55);
        file.seekp(static_cast<std::streamoff>(offset));
        file.put(byte);
    }
};

TEST_F(ArchiveReadTest, EachRevisionIsReadAsItWas)
{
    std::vector<Items> const states = {
        {{"a", "1"}, {"b", "1"}}, {{"a", "22"}, {"b", "1"}, {"c", "3"}}, {{"b", "1"}, {"c", "3"}}};
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}, {"b", "1"}}));
    ASSERT_TRUE(Save(*m_archive, {{"a", "22"}, {"c", "3"}}, false, Archive::SessionTypeIncremental));
    ASSERT_TRUE(Save(*m_archive, {{"a", std::nullopt}}));
    auto const revisions = RevisionsOf(*m_archive);
    for (size_t at = states.size(); at-- > 0;) {
        SCOPED_TRACE(at);
        EXPECT_EQ(m_archive->GetRewindCount(), states.size() - 1 - at);
        EXPECT_EQ(m_archive->IsWorkingRevisionAtHead(), at + 1 == states.size());
        EXPECT_EQ(GetAll(*m_archive), states[at]);
        EXPECT_EQ(m_archive->GetLastSaveType(), at == 1 ? 1 : 0);
        for (char const* path : {"a", "b", "c", "never"}) {
            bool const there = states[at].count(path) != 0;
            EXPECT_EQ(m_archive->HasFile(Str(path)), there);
            EXPECT_EQ(m_archive->HasFileRevision(Str(path), revisions[at]), there);
            Counted<InStream> const in = m_archive->OpenFileInStream(Str(path), revisions[at]);
            EXPECT_EQ(static_cast<bool>(in), there);
            if (in) {
                EXPECT_EQ(in->GetSize(), states[at].at(path).size());
            }
            auto const item = MakeCounted<BytesItem>();
            EXPECT_EQ(m_archive->LoadFile(Str(path), revisions[at], *item, true), there);
            FileStoreStateObject::DirtyState state{};
            if (!there) continue;
            EXPECT_EQ(item->bytes, states[at].at(path));
            ASSERT_TRUE(item->GetDirtyStateForFileStore(*m_archive, state));
            bool const incremental = at > 0 && std::string(path) != "b";
            EXPECT_EQ(state, incremental ? FileStoreStateObject::DirtyStateIncremental
                                         : FileStoreStateObject::DirtyStateClean);
        }
        EXPECT_EQ(m_archive->RewindWorkingRevision(), at > 0);
    }
    EXPECT_FALSE(m_archive->RewindWorkingRevision());
    EXPECT_TRUE(GetAll(*m_archive).empty());
    EXPECT_FALSE(m_archive->HasFile(Str("b")));
    m_archive->ResetWorkingRevisionToHead();
    EXPECT_EQ(GetAll(*m_archive), states.back());
    EXPECT_FALSE(m_archive->OpenFileInStream(Str("a")));
    EXPECT_FALSE(m_archive->GetHeadRevisionForFile(Str("a")));
    EXPECT_EQ(m_archive->GetHeadRevisionForFile(Str("b")).Get(), revisions[0].Get());
    EXPECT_TRUE(m_archive->FileWasDeleted(Str("a")));
    // A revision of another archive, even of one that has gone, finds nothing.
    Counted<Archive> const other = CreateDocument(m_folder / "other");
    EXPECT_FALSE(other->HasFileRevision(Str("a"), revisions[0]));
    EXPECT_FALSE(other->CreateBackData(revisions[0], Str("a")));
}

/// Keeps what it is told.
class Callback : public ArchiveErrorCallback
{
public:
    std::vector<bool> calls;

private:
    void OnError(Error, Archive&, bool isNew) override { calls.push_back(isNew); }
};

TEST_F(ArchiveReadTest, DamagedBytesAreToldAndNeverDelivered)
{
    std::string const large(1'500'000, 'L');
    for (bool const packed : {false, true})
        for (bool const atTag : {false, true}) {
            SCOPED_TRACE(std::string(packed ? "packed " : "direct ") + (atTag ? "tag" : "data"));
            m_archive = nullptr;
            m_archive = CreateDocument(m_path);
            ASSERT_TRUE(Save(*m_archive, {{"a", large}, {"whole", "w"}}, false, Archive::SessionTypeFull, packed));
            Counted<Archive::Revision const> const revision = m_archive->GetHeadRevisionForFile(Str("a"));
            Archive::FileRevision const entry = EntryOf("a");
            EXPECT_EQ(m_archive->CheckStoredBlock(*revision, entry), Archive::BlockCheck::Ok);
            Damage(entry.filePos + (atTag ? 1 : 4 + entry.fileCompressedSize / 2));
            EXPECT_EQ(m_archive->CheckStoredBlock(*revision, entry),
                      atTag ? Archive::BlockCheck::BadTag : Archive::BlockCheck::BadStoredCRC);

            EXPECT_FALSE(Get(*m_archive, "a"));
            EXPECT_FALSE(m_archive->IsCorrupted());
            auto const item = MakeCounted<BytesItem>();
            auto const callback = MakeCounted<Callback>();
            if (atTag)
                EXPECT_THROW(m_archive->LoadFile(Str("a"), *item), ArchiveCorruptionException);
            else {
                // A copy finds it as well, and tells.
                m_archive->SetErrorCallback(callback);
                EXPECT_FALSE(Copy("a"));
                EXPECT_EQ(std::exchange(callback->calls, {}), std::vector<bool>{true});
            }
            EXPECT_TRUE(m_archive->IsCorrupted() && m_archive->IsBroken());
            m_archive->SetErrorCallback(callback);
            EXPECT_FALSE(m_archive->LoadFile(Str("a"), *item));
            EXPECT_FALSE(m_archive->LoadFile(Str("a"), *item));
            EXPECT_THROW(m_archive->LoadFile(Str("a"), revision, *item, false), ArchiveCorruptionException);
            EXPECT_EQ(callback->calls, (std::vector<bool>{atTag, false}));
            std::string bytes(large.size(), 0);
            EXPECT_THROW(
                {
                    Counted<InStream> const in = m_archive->OpenFileInStream(Str("a"));
                    if (in) in->ReadBlock(bytes.data(), bytes.size());
                },
                ArchiveCorruptionException);
            // From now on nothing here is worth a copy, though the rest reads and saves.
            EXPECT_FALSE(Copy("whole"));
            EXPECT_EQ(Get(*m_archive, "whole"), "w");
            EXPECT_TRUE(Save(*m_archive, {{"a", "mended"}}));
            EXPECT_EQ(Get(*m_archive, "a"), "mended");
            EXPECT_FALSE(m_archive->HaveAccessCount());
        }
}

TEST_F(ArchiveReadTest, FileThatShrinksUnderAReaderIsAReadFailure)
{
    std::string const bytes(3'000'000, 'x');
    ASSERT_TRUE(Save(*m_archive, {{"a", bytes}}));
    Counted<InStream> const in = m_archive->OpenFileInStream(Str("a"));
    std::string text(bytes.size(), 0);
    ASSERT_EQ(in->ReadBlock(text.data(), 10), 10u);
    std::filesystem::resize_file(m_path, 1'000'000);
    try {
        in->ReadBlock(text.data(), text.size());
        FAIL();
    } catch (ArchiveFileException const& e) {
        EXPECT_EQ(e.GetReason(), ArchiveFileException::Reason::ReadFailed);
        EXPECT_EQ(e.GetArchive(), m_archive.Get());
    }
    EXPECT_FALSE(Get(*m_archive, "a"));
    EXPECT_THROW(Copy("a"), ArchiveFileException);
    EXPECT_FALSE(m_archive->IsCorrupted());
}

TEST_F(ArchiveReadTest, CopiesOutliveTheArchiveAndItsFile)
{
    ArchiveBuilder builder;
    ArchiveBuilder::Table table;
    Items items;
    for (u8 const code : {0x00, 0x41, 0xE1, 0x02, 0x82, 0xA2}) {
        std::string const path = std::to_string(code);
        items[path] = std::string(200'001, static_cast<char>('a' + code % 26)) + path;
        table.records.push_back({code + 1u, 0, path, builder.AddBlock(items[path], code)});
        if (code == 0x41) table.records.back().details.storedCrc = 0; // As tables before today's had it.
    }
    table.records.push_back({1000, 0, "empty", builder.AddBlock("")});
    builder.AddTable(table);
    m_archive = nullptr;
    WriteWhole(m_path, builder.Build());
    m_archive = OpenDocument(m_path);
    ASSERT_TRUE(m_archive);
    EXPECT_FALSE(Copy("empty"));
    Counted<InStream> const in = m_archive->OpenFileInStream(Str("empty"));
    ASSERT_TRUE(in);
    char one = 0;
    EXPECT_EQ(in->ReadBlock(&one, 1), 0u);
    EXPECT_FALSE(Copy("none"));
    EXPECT_FALSE(m_archive->CreateBackData(nullptr, Str("0")));
    std::map<std::string, BackData> copies;
    for (auto const& [path, bytes] : items) {
        copies[path] = Copy(path);
        ASSERT_TRUE(copies[path]) << path;
        EXPECT_EQ(Copy(path).Get(), copies[path].Get());
    }
    EXPECT_EQ(GetBucketSizes().size(), 1u);
    // The archive itself uses them as well.
    std::filesystem::resize_file(m_path, 100);
    ExpectLoads({{"0", items["0"]}});
    m_archive = nullptr;
    std::filesystem::remove(m_path);
    for (auto const& [path, bytes] : items) EXPECT_TRUE(Load(copies[path]) == bytes) << path;
}

TEST_F(ArchiveReadTest, BucketTakesItsLimitToTheByteAndIsUsedAgainWhenEmpty)
{
    constexpr u64 limit = 134217728;
    // The large file is a hole of zeros.
    ArchiveBuilder builder;
    ArchiveBuilder::Table table;
    table.records = {{1, 0, "ten", builder.AddBlock("0123456789")}, {2, 0, "one", builder.AddBlock("x")}};
    u64 const tableSize = 59 + 3 * 44 + 3 + 3 + 5;
    u64 const pos = builder.GetEnd() + tableSize;
    std::string const zeros(limit - 10, 0);
    u32 const crc = static_cast<u32>(crc32_z(0, reinterpret_cast<Bytef const*>(zeros.data()), zeros.size()));
    table.records.push_back({3, 0, "large", {pos, limit - 10, limit - 10, crc, 0, 24, crc, {}}});
    builder.AddTable(table);
    ASSERT_EQ(builder.GetEnd(), pos);
    m_archive = nullptr;
    WriteWhole(m_path, builder.Build() + "#Fil");
    std::filesystem::resize_file(m_path, pos + 4 + limit);
    m_archive = OpenDocument(m_path, Archive::OpenModeReadOnly);
    ASSERT_TRUE(m_archive);

    BackData large = Copy("large");
    BackData ten = Copy("ten");
    ASSERT_TRUE(large && ten);
    EXPECT_EQ(GetBucketSizes(), std::vector<u64>{limit});
    BackData one = Copy("one");
    EXPECT_EQ(Load(one), "x");
    EXPECT_EQ(GetBucketSizes().size(), 2u);
    EXPECT_EQ(Load(ten), "0123456789");
    // The archive's entries hold the copies as well.
    m_archive = nullptr;
    large = nullptr;
    EXPECT_EQ(GetBucketSizes().size(), 2u);
    ten = nullptr; // All dead, and too large to be used again.
    EXPECT_EQ(GetBucketSizes(), std::vector<u64>{1});
    one = nullptr; // Small: stays, and begins anew.
    m_archive = OpenDocument(m_path, Archive::OpenModeReadOnly);
    one = Copy("one");
    EXPECT_EQ(Load(one), "x");
    EXPECT_EQ(GetBucketSizes(), std::vector<u64>{1});
}

TEST_F(ArchiveReadTest, BucketThatCannotBeMadeOrFilledIsSaid)
{
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    {
        TestSupport::FaultyFiles files;
        files.Plan(
            {TestSupport::FileCall::Open, 1, true, ENOSPC, TestSupport::Fault::Part::Nothing, false, "/temporaries/"});
        EXPECT_FALSE(Copy("a"));
    }
    for (int const error : {ENOSPC, EIO}) {
        TestSupport::FaultyFiles files;
        files.Plan(
            {TestSupport::FileCall::Write, 1, true, error, TestSupport::Fault::Part::Nothing, false, "/temporaries/"});
        try {
            Copy("a");
            FAIL();
        } catch (BackstoreException const& e) {
            EXPECT_EQ(e.GetOutOfSpace(), error == ENOSPC);
        }
        Archive::PostShutdown(); // Its stream is broken for good.
    }
    EXPECT_EQ(Load(Copy("a")), "1");
    EXPECT_FALSE(m_archive->HaveAccessCount());
}

TEST_F(ArchiveReadTest, ReaderOfScratchBytesKeepsThemWhileMasterAndScratchMoveOn)
{
    std::string const bytes(2'500'000, 's');
    AddScratch();
    ASSERT_TRUE(Save(*m_archive, {{"a", bytes}}, true));
    Counted<InStream> in = m_archive->OpenFileInStream(Str("a"));
    std::string text(bytes.size(), 0);
    ASSERT_EQ(in->ReadBlock(text.data(), 1), 1u);
    ASSERT_TRUE(Save(*m_archive, {{"m", "1"}}));
    for (int i = 0; i < 2; ++i) ASSERT_TRUE(Save(*m_archive, {{"b", std::string(bytes.size(), 'b')}}, true));
    ASSERT_EQ(in->ReadBlock(text.data() + 1, text.size() - 1), text.size() - 1);
    EXPECT_TRUE(text == bytes);
    EXPECT_GT(StateOf(*m_archive, Archive::ChoiceScratch).fileEnd, 3 * bytes.size());
    // Nobody holds them any more: the room is used again.
    in = nullptr;
    ASSERT_TRUE(Save(*m_archive, {{"m", "2"}}));
    ASSERT_TRUE(Save(*m_archive, {{"b", "3"}}, true));
    EXPECT_LT(StateOf(*m_archive, Archive::ChoiceScratch).fileEnd, 1000u);
    EXPECT_FALSE(m_archive->IsBroken());
    Reopen(m_scratchPath);
    EXPECT_EQ(Get(*m_archive, "b"), "3");
    EXPECT_TRUE(Get(*m_archive, "a") == bytes);
}

/// Called whenever a load has looked up where the bytes lie and makes the item for them.
std::function<void()> s_onCreate;

FileStoreItemType const c_watchedType(
    ClassUID("Wtch"),
    []() -> Counted<FileStoreItem> {
        if (s_onCreate) std::exchange(s_onCreate, nullptr)();
        return MakeCounted<BytesItem>();
    },
    FileStoreItemType::NotNestable, FileStoreItemType::NotRecoverable);

TEST_F(ArchiveReadTest, LoadThatASaveOvertakesFindsTheBytesWhereTheyWent)
{
    AddScratch();
    ASSERT_TRUE(Save(*m_archive, {{"a", "bytes"}}, true));
    Counted<DelayLoadHolder> const holder = m_archive->CreateDelayLoadHolderDirect(Str("a"), &c_watchedType, nullptr);
    s_onCreate = [&] { EXPECT_TRUE(Save(*m_archive, {{"m", "rolls down"}})); };
    JailCounted<FileStoreItem> item;
    ASSERT_TRUE(holder->GetItemBase(item) && item);
    EXPECT_EQ(dynamic_cast<BytesItem&>(*item).bytes, "bytes");
    EXPECT_FALSE(m_archive->HaveScratchRevisions());
}

/// Waits for what the background job says, without sleeping.
class Updater : public Archive::OffliningUpdater
{
public:
    void Progress(u64 total, u64 done) override
    {
        std::lock_guard const lock(m_mutex);
        EXPECT_LE(done, total);
        EXPECT_GE(done, m_lastDone);
        m_lastDone = done;
        ++m_steps;
    }
    void Complete() override { Set("complete"); }
    void Aborted() override { Set("aborted"); }
    void Failed(int reason) override { Set("failed " + std::to_string(reason)); }

    std::string Wait()
    {
        std::unique_lock lock(m_mutex);
        m_changed.wait_for(lock, std::chrono::seconds(20), [&] { return !m_end.empty(); });
        return std::exchange(m_end, {});
    }
    int GetSteps()
    {
        std::lock_guard const lock(m_mutex);
        return m_steps;
    }

private:
    void Set(std::string const& end)
    {
        std::lock_guard const lock(m_mutex);
        m_end = end;
        m_changed.notify_all();
    }

    std::mutex m_mutex;
    std::condition_variable m_changed;
    std::string m_end;
    u64 m_lastDone = 0;
    int m_steps = 0;
};

void WaitFor(Archive& archive, Archive::OffliningState state)
{
    auto const end = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    // Seen once is enough: a job that is woken looks whether it has to pause again.
    bool seen = false;
    while (!(seen = archive.GetOffliningState() == state) && std::chrono::steady_clock::now() < end)
        std::this_thread::yield();
    ASSERT_TRUE(seen) << state;
}

TEST_F(ArchiveReadTest, OfflinedDocumentLoadsWithoutItsFile)
{
    Items const items = {{"a", "1"}, {"b", std::string(300'000, 'b')}, {"empty", ""}};
    ASSERT_TRUE(Save(*m_archive, {{"a", "old"}, {"gone", "g"}}));
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}, {"b", items.at("b")}, {"empty", ""}, {"gone", std::nullopt}}));
    ASSERT_TRUE(Save(*m_archive, {{"p", "packed"}}, false, Archive::SessionTypeFull, true));
    Counted<DelayLoadHolder> const holder = HolderOf(*m_archive, "b");
    m_archive->StopOffline();
    EXPECT_EQ(m_archive->GetOffliningState(), Archive::OffliningNotStarted);
    m_archive->SetKeepOpen(false);
    auto const updater = MakeCounted<Updater>();
    m_archive->StartOffline(updater);
    EXPECT_EQ(updater->Wait(), "complete");
    EXPECT_EQ(updater->GetSteps(), 4);
    EXPECT_TRUE(m_archive->IsOffliningCompleted());
    std::filesystem::remove(m_path);
    EXPECT_FALSE(Get(*m_archive, "a"));
    EXPECT_EQ(m_archive->GetLastRestoreResult(), Archive::RestoreNotFound);
    EXPECT_FALSE(m_archive->IsBroken());
    ExpectLoads(items);
    ExpectLoads({{"p", "packed"}});
    EXPECT_EQ(BytesOf(*holder), items.at("b"));
    m_archive->StartOffline(updater); // Not from any state but the first.
    EXPECT_TRUE(m_archive->IsOffliningCompleted());
}

TEST_F(ArchiveReadTest, OffliningGivesWayToReadersAndSaves)
{
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}, {"b", "2"}}));
    ASSERT_TRUE(Save(*m_archive, {{"z", "3"}}, false, Archive::SessionTypeFull, true));
    auto const updater = MakeCounted<Updater>();
    {
        // A reader of packed bytes doesn't hold it up, one of plain bytes does.
        Counted<InStream> const packed = m_archive->OpenFileInStream(Str("z"));
        Counted<InStream> plain = m_archive->OpenFileInStream(Str("a"));
        m_archive->StartOffline(updater);
        WaitFor(*m_archive, Archive::OffliningPaused);
        EXPECT_TRUE(m_archive->IsOfflining());
        EXPECT_EQ(updater->GetSteps(), 0);
        // A save ends the job and starts it again behind it, with what is new.
        ASSERT_TRUE(Save(*m_archive, {{"b", "22"}, {"n", "new"}}));
        EXPECT_EQ(updater->Wait(), "aborted");
        WaitFor(*m_archive, Archive::OffliningPaused);
        EXPECT_EQ(GetAll(*m_archive), (Items{{"a", "1"}, {"b", "22"}, {"n", "new"}, {"z", "3"}}));
        plain = nullptr;
        EXPECT_EQ(updater->Wait(), "complete");
    }
    m_archive->SetKeepOpen(false);
    std::filesystem::remove(m_path);
    ExpectLoads({{"a", "1"}, {"b", "22"}, {"n", "new"}, {"z", "3"}});
}

TEST_F(ArchiveReadTest, OffliningForgetsScratchBlocksThatASaveMadeStale)
{
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    AddScratch();
    ASSERT_TRUE(Save(*m_archive, {{"a", "scratch"}, {"b", "scratch too"}, {"c", "third"}}, true));
    auto const updater = MakeCounted<Updater>();
    Counted<InStream> reader = m_archive->OpenFileInStream(Str("a"));
    m_archive->StartOffline(updater);
    WaitFor(*m_archive, Archive::OffliningPaused);
    // The roll down takes "c" along; the others are deleted and written. Then other bytes come where all of them lay.
    ASSERT_TRUE(Save(*m_archive, {{"a", std::nullopt}, {"b", "master"}}));
    EXPECT_EQ(updater->Wait(), "aborted");
    ASSERT_TRUE(Save(*m_archive, {{"d", std::string(500, 'd')}}, true));
    reader = nullptr;
    EXPECT_EQ(updater->Wait(), "complete");
    EXPECT_FALSE(m_archive->IsBroken());
    EXPECT_EQ(GetAll(*m_archive), (Items{{"b", "master"}, {"c", "third"}, {"d", std::string(500, 'd')}}));
}

TEST_F(ArchiveReadTest, OffliningEndsWhenItIsToldToAndWhenBytesAreBad)
{
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}, {"b", "2"}}));
    auto const updater = MakeCounted<Updater>();
    {
        Counted<InStream> const reader = m_archive->OpenFileInStream(Str("a"));
        m_archive->StartOffline(updater);
        WaitFor(*m_archive, Archive::OffliningPaused);
        m_archive->StopOffline();
        EXPECT_EQ(updater->Wait(), "aborted");
        EXPECT_EQ(m_archive->GetOffliningState(), Archive::OffliningAborted);
        EXPECT_EQ(updater->GetSteps(), 0);
    }
    EXPECT_EQ(Get(*m_archive, "a"), "1");
    EXPECT_FALSE(m_archive->IsOfflining());

    // Bytes are tested by the CRC of what is stored, and without one by unpacking.
    for (bool const known : {true, false}) {
        ArchiveBuilder builder;
        ArchiveBuilder::Table table;
        table.tag = known ? "#FT4" : "#FT3";
        table.records = {{1, 0, "a", builder.AddBlock(std::string(5000, 'a'), 0x41)}};
        builder.AddTable(table);
        std::string bytes = builder.Build();
        bytes[72 + 4 + 10] ^= 1;
        // Each in a file of its own: the job keeps the last archive a moment longer.
        std::string const path = m_folder / table.tag.substr(1);
        WriteWhole(path, bytes);
        m_archive = OpenDocument(path);
        ASSERT_TRUE(m_archive);
        m_archive->StartOffline(updater);
        EXPECT_EQ(updater->Wait(), "failed 1");
        EXPECT_EQ(m_archive->GetOffliningState(), Archive::OffliningFailed);
        EXPECT_TRUE(m_archive->IsCorrupted());
    }
}

TEST_F(ArchiveReadTest, CopiesLoadsAndSavesOnManyThreadsNeverWaitForEachOtherInACircle)
{
    // The lock ranks are asserted on the way; the watchdog is for what they do not cover.
    std::promise<void> done;
    std::thread watchdog([future = done.get_future()] {
        if (future.wait_for(std::chrono::seconds(60)) == std::future_status::ready) return;
        std::fputs("threads wait for each other\n", stderr);
        std::abort();
    });
    Changes first;
    for (int i = 0; i < 8; ++i) first[std::to_string(i)] = std::string(20'000, static_cast<char>('a' + i));
    ASSERT_TRUE(Save(*m_archive, first));
    AddScratch();
    std::atomic<bool> stop{false};
    std::atomic<int> wrong{0};
    std::vector<std::thread> threads;
    auto const run = [&](auto&& step) {
        threads.emplace_back([&, step] {
            for (int n = 0; !stop; ++n) step(std::to_string(n % 8));
        });
    };
    run([&](std::string const& path) {
        BackData const copy = Copy(path);
        std::string const bytes = Load(copy);
        if (copy && bytes.find_first_not_of(bytes[0]) != std::string::npos) ++wrong;
    });
    run([&](std::string const& path) {
        Counted<DelayLoadHolder> const holder = HolderOf(*m_archive, path);
        if (holder && BytesOf(*holder).size() != 20'000) ++wrong;
    });
    run([&](std::string const& path) {
        std::string text(20'000, 0);
        Counted<InStream> const in = m_archive->OpenFileInStream(Str(path));
        if (!in || in->ReadBlock(text.data(), text.size()) != text.size() || !m_archive->HasFile(Str(path))) ++wrong;
        if (text.find_first_not_of(text[0]) != std::string::npos || !Get(*m_archive, path)) ++wrong;
        m_archive->CheckForReadOnlyChange();
        m_archive->LoadThumbnails();
    });
    for (int n = 0; n < 40; ++n) {
        Changes const changes = {{std::to_string(n % 8), std::string(20'000, static_cast<char>('A' + n % 26))}};
        ASSERT_TRUE(Save(*m_archive, changes, n % 3 != 2, Archive::SessionTypeFull, n % 2 == 0));
        if (n % 5 == 0) m_archive->StartOffline(nullptr);
    }
    stop = true;
    for (std::thread& thread : threads) thread.join();
    done.set_value();
    watchdog.join();
    EXPECT_EQ(wrong.load(), 0);
    EXPECT_FALSE(m_archive->IsBroken());
    EXPECT_EQ(GetAll(*m_archive).size(), 8u);
}

} // namespace
} // namespace KernelTest

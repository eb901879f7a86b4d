#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/filestore/FileStorePostSaveInterface.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"
#include "support/FakeClock.h"
#include "support/FaultyFiles.h"
#include "support/TraceCapture.h"

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>

// Each check of a save or a streamline is shown by a file in which the one field that it is about was changed behind
// the archive's back, between the writing and the check.

namespace KernelTest {
namespace {

using namespace Kernel;
using Bytes = std::string;

u64 Read(Bytes const& bytes, u64 at, int size)
{
    u64 value = 0;
    for (int i = size; i-- > 0;) value = value << 8 | static_cast<u8>(bytes[at + static_cast<u64>(i)]);
    return value;
}

void Put(Bytes& bytes, u64 at, u64 value, int size)
{
    bytes.replace(at, static_cast<size_t>(size), TestSupport::Little(value, size));
}

void Raise(Bytes& bytes, u64 at, int size)
{
    Put(bytes, at, Read(bytes, at, size) + 1, size);
}

/// A table in the bytes of a file, by the layout alone.
class TableView
{
public:
    TableView(Bytes& bytes, u64 at) : m_bytes(bytes), m_at(at) {}

    /// The @p n-th from the newest.
    static TableView FromNewest(Bytes& bytes, int n)
    {
        u64 at = Read(bytes, 16, 8);
        while (n-- > 0) at = Read(bytes, at + 4, 8);
        return TableView(bytes, at);
    }
    u64 GetPosition() const { return m_at; }
    u64 GetRecordCount() const { return Read(m_bytes, m_at + 44, 4); }
    /// Behind the last one: the first path count.
    u64 GetRecord(u64 index) const
    {
        u64 at = m_at + 59;
        while (index-- > 0) at += SizeAt(at);
        return at;
    }
    u64 FindRecord(u32 uid) const
    {
        u64 at = m_at + 59;
        while (Read(m_bytes, at, 4) != uid) at += SizeAt(at);
        return at;
    }
    u64 GetPathCount() const { return GetRecord(GetRecordCount()); }
    /// Leaves out what lies last before the user data: the size stays the same, so that the table stays whole.
    void GiveToUserData(u64 countField, int countSize, u64 size)
    {
        Put(m_bytes, m_at + countField, Read(m_bytes, m_at + countField, countSize) - 1, countSize);
        Put(m_bytes, m_at + 48, Read(m_bytes, m_at + 48, 4) + size, 4);
    }

private:
    u64 SizeAt(u64 at) const
    {
        switch (m_bytes[at + 4]) {
        case 0: return 44 + Read(m_bytes, at + 42, 2);
        case 1: return 42;
        default: return 5;
        }
    }

    Bytes& m_bytes;
    u64 const m_at;
};

/// Writes the table at @p at anew at @p to, as the oldest versions did: 8 bytes a record shorter, and with a FileEnd
/// that nobody holds against its length. So there is room for a record and a path count more.
void MakeOlder(Bytes& bytes, u64 at, u64 to, Bytes const& record = {}, Bytes const& pathCount = {})
{
    TableView const table(bytes, at);
    Bytes older = "#FAT" + bytes.substr(at + 4, 55);
    for (u64 i = 0; i < table.GetRecordCount(); ++i) {
        Bytes one = bytes.substr(table.GetRecord(i), table.GetRecord(i + 1) - table.GetRecord(i));
        older += one.size() < 42 ? one : one.erase(34, 8);
    }
    u64 const counts = table.GetPathCount();
    older += record + bytes.substr(counts, at + 59 + Read(bytes, at + 52, 4) - counts) + pathCount;
    Put(older, 44, table.GetRecordCount() + !record.empty(), 4);
    Put(older, 52, older.size() - 59, 4);
    Put(older, 56, Read(older, 56, 2) + !pathCount.empty(), 2);
    bytes.replace(to, older.size(), older);
}

/// A table of nothing.
void PutEmptyTable(Bytes& bytes, u64 at)
{
    bytes.replace(at, 59, "#FAT" + Bytes(55, '\0'));
}

class Spoiler : public FileStorePostSaveInterface
{
public:
    explicit Spoiler(std::function<void()> f) : m_spoil(std::move(f)) {}
    void PostSave() override { m_spoil(); }

private:
    std::function<void()> const m_spoil;
};

constexpr u32 c_uidA = 1, c_uidB = 2, c_uidTilde = 4, c_uidC = 6, c_uidGap = 7;

class ArchiveVerifyTest : public DocumentTest
{
protected:
    ArchiveVerifyTest()
    {
        std::filesystem::create_directory(m_shunt);
        Archive::SetShuntPath(Str(m_shunt));
    }
    ~ArchiveVerifyTest() override { Archive::SetShuntPath(String8()); }

    static void HideThumbnails(Bytes& bytes) { bytes[bytes.rfind("Thmb")] = 'x'; }
    /// Where a link would lie, the bytes of the first item make an empty one.
    static std::string FirstItem() { return std::string("12345678\0\0 and so on", 20); }

    static void CountUp(Archive& archive, Changes const& changes)
    {
        ASSERT_TRUE(InSession(archive, [&](ArchiveSession& session) {
            for (auto const& [path, bytes] : changes) session.CreateFile(Str(path), MakeCounted<BytesItem>(*bytes));
            CreateGenerated(session, "p/", ".s", "generated");
        }));
    }
    /// A history in which every field that a check looks at can be changed by itself.
    void MakeHistory(Archive& archive)
    {
        CountUp(archive, {{"a", FirstItem()}, {"b", "1"}, {"z", "1"}, {"~", "1"}}); // p/1.s is 5.
        ASSERT_TRUE(InSession(archive, [](ArchiveSession& session) {
            // 6 is c, and 7 nobody has in the end.
            for (auto const& [path, bytes] : {std::pair("b", "22"), std::pair("c", "1"), std::pair("unsaved", "1")})
                session.CreateFile(Str(path), MakeCounted<BytesItem>(bytes));
            session.DeleteFile(Str("unsaved"));
            session.DeleteFile(Str("z"));
        }));
        ASSERT_TRUE(Save(archive, {{"c", "33"}, {"~", std::nullopt}}));
        CountUp(archive, {{"b", "444"}}); // p/2.s is 8.
        ASSERT_TRUE(Save(archive, {{"~", "5"}}));
        ASSERT_TRUE(Save(archive, {{"z", "6"}, {"b", "66"}}));
        ASSERT_TRUE(InSession(archive, [](ArchiveSession& session) {
            session.CreateFile(Str("b"), MakeCounted<BytesItem>("7"));
            session.DeleteFile(Str("p/2.s"));
            session.SetThumbnails(MakeThumbnails("abc"));
        }));
    }
    // From the newest, with the save that is checked: 0 that save; 1 b and the deletion of p/2.s; 2 b and z again;
    // 3 "~" again; 4 b, p/2.s and the count; 5 c and the deletion of "~"; 6 b, c and the deletion of z; 7 the first.

    Archive::VerifyResult SaveAndSpoil(Archive& archive, bool scratch, std::string const& path,
                                       std::function<void(Bytes&)> const& spoil)
    {
        ArchiveSessionHandle handle;
        EXPECT_TRUE(scratch ? archive.CreateScratchSession(handle, Archive::SessionTypeFull, nullptr)
                            : archive.CreateSession(handle, Archive::SessionTypeFull, nullptr));
        handle->CreateFile(Str("a"), MakeCounted<BytesItem>(FirstItem() + "!"));
        handle->SetThumbnails(MakeThumbnails("abc"));
        handle->AddPostSaveObject(MakeCounted<Spoiler>([&] { SpoilFile(path, spoil); }));
        return archive.CloseSessionAndVerifyFileState(handle, m_report, false);
    }
    static void SpoilFile(std::string const& path, std::function<void(Bytes&)> const& spoil)
    {
        Bytes bytes = ReadWhole(path);
        spoil(bytes);
        WriteWhole(path, bytes);
    }
    std::string Log() const { return ReadWhole(m_shunt + "/" + m_report.GetData() + "-log.txt"); }
    /// The number of the check that failed, as the log has it.
    int Code() const
    {
        std::string const log = Log();
        size_t const end = log.find(": ");
        return end == log.npos || end < 4 || log[end - 4] != 'E' ? 0 : std::stoi(log.substr(end - 3, 3));
    }
    void Clear()
    {
        for (auto const& entry : std::filesystem::directory_iterator(m_shunt)) std::filesystem::remove(entry.path());
        m_report = String8();
    }

    std::string const m_shunt = m_folder / "shunt";
    String8 m_report;
};

struct SpoiledField
{
    int code;
    std::function<void(Bytes&)> spoil;
    std::function<void(Bytes&)> prepare = nullptr; ///< Changes the document before it is opened.
};

/// Changes of the info block and header, which both tables share: the check that each sets off, from @p first on.
std::vector<SpoiledField> FileFields(int first)
{
    return {
        {first + 1, [](Bytes& b) { b += '\0', Raise(b, 24, 8); }}, // FileEnd.
        {first + 2, [](Bytes& b) { Raise(b, 32, 8); }},
        {first + 3, [](Bytes& b) { Raise(b, 40, 8); }},
        {first + 4, [](Bytes& b) { Raise(b, 48, 8); }},
        {first + 6, [](Bytes& b) { Raise(b, 56, 4); }},
        {first + 7, [](Bytes& b) { Raise(b, 68, 4); }},
        {first + 8, [](Bytes& b) { b[4] = 10; }},
    };
}

/// Changes of the details of record @p uid in the n-th table from the newest.
std::vector<SpoiledField> DetailFields(int first, int table, u32 uid)
{
    struct Field
    {
        int check;
        u64 offset;
        int size;
    };
    std::vector<SpoiledField> result;
    for (Field const& field : {Field{0, 5, 8}, {1, 13, 8}, {2, 21, 8}, {3, 29, 4}, {4, 33, 1}, {6, 38, 4}})
        result.push_back({first + field.check, [=](Bytes& b) {
                              Raise(b, TableView::FromNewest(b, table).FindRecord(uid) + field.offset, field.size);
                          }});
    return result;
}

void Append(std::vector<SpoiledField>& to, std::vector<SpoiledField> const& more)
{
    to.insert(to.end(), more.begin(), more.end());
}

TEST_F(ArchiveVerifyTest, EachFieldOfTheMasterThatDiffersIsNamed)
{
    MakeHistory(*CreateDocument(m_path));
    Bytes const original = ReadWhole(m_path);
    auto const view = [](Bytes& b, int n) { return TableView::FromNewest(b, n); };
    std::vector<SpoiledField> cases = {
        {0, [](Bytes&) {}},
        {0, HideThumbnails}, // A later save drops them anyway.
        {4, [](Bytes& b) { b[0] = 'x'; }},
        {5, [](Bytes& b) { b[6] |= 1; }},
        {6, [](Bytes& b) { Raise(b, 60, 4); }},
        {16, [&](Bytes& b) { Put(b, 16, view(b, 1).GetPosition(), 8); }},
        {25,
         [&](Bytes& b) {
             for (int n : {3, 7}) b[view(b, n).FindRecord(c_uidTilde) + 44] = 'z';
         }},
        {26,
         [&](Bytes& b) {
             u64 const record = view(b, 3).FindRecord(c_uidTilde);
             Put(b, record, c_uidGap, 4);
             b[record + 44] = '\x7F';
         }},
        {27, [&](Bytes& b) { b[view(b, 6).FindRecord(c_uidC) + 44] = 'd'; }},
        {28, [&](Bytes& b) { Put(b, view(b, 7).FindRecord(c_uidB), c_uidGap, 4); }},
        {29,
         [&](Bytes& b) {
             for (int n : {4, 7}) view(b, n).GiveToUserData(56, 2, 16);
         }},
        {30, [&](Bytes& b) { b[view(b, 7).GetPathCount() + 12] = 'q'; }},
        {31, [&](Bytes& b) { b[view(b, 4).GetPosition() + 58] = 1; }},
        {32,
         [&](Bytes& b) {
             for (int n : {4, 7}) b[view(b, n).GetPathCount() + 12] = 'q';
         }},
        {33, [&](Bytes& b) { Raise(b, view(b, 4).GetPathCount() + 4, 8); }},
        {34, [&](Bytes& b) { Put(b, view(b, 2).GetPosition() + 4, view(b, 4).GetPosition(), 8); }},
        {38, [&](Bytes& b) { Raise(b, view(b, 7).GetPosition() + 12, 8); }},
        {39, [&](Bytes& b) { b[view(b, 6).GetPosition() + 58] = 2; }},
        {40,
         [&](Bytes& b) {
             u64 const oldest = view(b, 7).GetPosition();
             MakeOlder(b, oldest, oldest + 4);
             Put(b, view(b, 6).GetPosition() + 4, oldest + 4, 8);
         }},
        {41,
         [&](Bytes& b) {
             u64 const oldest = view(b, 7).GetPosition();
             MakeOlder(b, oldest, oldest);
             Raise(b, oldest + 20, 8);
         }},
        {42, [&](Bytes& b) { Raise(b, view(b, 7).GetPosition() + 28, 8); }},
        {43, [&](Bytes& b) { Raise(b, view(b, 7).GetPosition() + 36, 8); }},
        {44, [&](Bytes& b) { view(b, 1).GiveToUserData(44, 4, 5); }},
        // Two files claim one path, and the older one goes.
        {45,
         [&](Bytes& b) {
             for (int n : {1, 2, 4, 6, 7}) Put(b, view(b, n).FindRecord(c_uidB), c_uidGap, 4);
         },
         [&](Bytes& b) { b[view(b, 5).FindRecord(c_uidC) + 44] = 'b'; }},
        {46, [&](Bytes& b) { Put(b, view(b, 2).FindRecord(c_uidB), c_uidA, 4); }},
        // Known by its path from an earlier revision, and the only record of its own.
        {52,
         [&](Bytes& b) {
             b[view(b, 3).FindRecord(c_uidTilde) + 4] = 1;
             Put(b, view(b, 3).GetPosition() + 48, 3, 4);
         }},
    };
    Append(cases, FileFields(16));
    Append(cases, DetailFields(47, 2, c_uidB));
    for (SpoiledField const& c : cases) {
        SCOPED_TRACE(c.code);
        WriteWhole(m_path, original);
        if (c.prepare) SpoilFile(m_path, c.prepare);
        Counted<Archive> const archive = OpenDocument(m_path);
        Archive::VerifyResult const result = SaveAndSpoil(*archive, false, m_path, c.spoil);
        EXPECT_EQ(result, c.code == 0 ? Archive::VerifyMatch : Archive::VerifyMismatch);
        EXPECT_EQ(Code(), c.code) << Log();
        Clear();
    }
}

TEST_F(ArchiveVerifyTest, EachFieldOfTheScratchFileThatDiffersIsNamed)
{
    {
        Counted<Archive> const archive = CreateDocument(m_path);
        ASSERT_TRUE(Save(*archive, {{"a", "1"}}));
        ASSERT_TRUE(Save(*archive, {{"a", "2"}}));
        Archive::CreateResult created;
        ASSERT_TRUE(archive->AddScratchFile(Str(m_scratchPath), created));
        ASSERT_TRUE(Save(*archive, {{"a", std::string(59, '3')}}, true));
    }
    Bytes const master = ReadWhole(m_path);
    Bytes const scratch = ReadWhole(m_scratchPath);
    std::vector<SpoiledField> cases = {
        {0, [](Bytes&) {}},
        {1, [](Bytes& b) { b[12] = 'x'; }},
        {2, [](Bytes& b) { b[86] ^= 1; }},
        {7, [](Bytes& b) { Put(b, 16, TableView::FromNewest(b, 1).GetPosition(), 8); }},
        {12, HideThumbnails},
        // As many revisions as there were, but one more of them in the scratch file.
        {37,
         [&](Bytes& b) {
             u64 const oldest = TableView::FromNewest(b, 1).GetPosition();
             PutEmptyTable(b, oldest - 63);
             Put(b, oldest + 4, oldest - 63, 8);
             SpoilFile(m_path, [](Bytes& m) {
                 MakeOlder(m, TableView::FromNewest(m, 1).GetPosition(), TableView::FromNewest(m, 0).GetPosition());
             });
         }},
    };
    Append(cases, FileFields(7));
    for (SpoiledField const& c : cases) {
        // A later FileEnd hides the thumbnails, but is found first.
        SCOPED_TRACE(c.code);
        WriteWhole(m_path, master);
        WriteWhole(m_scratchPath, scratch);
        Counted<Archive> const archive = OpenDocument(m_scratchPath);
        SaveAndSpoil(*archive, true, m_scratchPath, c.spoil);
        EXPECT_EQ(Code(), c.code) << Log();
        Clear();
    }
    // A document that has no master has no link either.
    std::string const alone = m_folder / "alone";
    Archive::CreateResult created;
    Counted<Archive> const archive = Archive::CreateAsScratch(Str(alone), c_documentTag, nullptr, created);
    ASSERT_TRUE(Save(*archive, {{"a", FirstItem()}}, true));
    EXPECT_EQ(SaveAndSpoil(*archive, true, alone, [](Bytes&) {}), Archive::VerifyMatch);
    EXPECT_EQ(SaveAndSpoil(*archive, true, alone, [](Bytes& b) { b[6] |= 1; }), Archive::VerifyMismatch);
    EXPECT_EQ(Code(), 3);
}

TEST_F(ArchiveVerifyTest, EachFieldOfAStreamlinedFileThatDiffersIsNamedAndTheMasterStays)
{
    MakeHistory(*CreateDocument(m_path));
    Bytes const original = ReadWhole(m_path);
    auto const table = [](Bytes& b) { return TableView::FromNewest(b, 0); };
    std::vector<SpoiledField> cases = {
        {101, [](Bytes& b) { b[0] = 'x'; }},
        {102, [](Bytes& b) { b[6] |= 1; }},
        {103, [](Bytes& b) { Raise(b, 60, 4); }},
        {104, [](Bytes& b) { Put(b, 16, 0, 8); }},
        {109, HideThumbnails},
        {113, [&](Bytes& b) { b[table(b).FindRecord(c_uidTilde) + 44] = 'a'; }},
        {114,
         [&](Bytes& b) {
             Bytes const record = TestSupport::Little(c_uidGap, 4) + Bytes(30, '\0') + Bytes("\1\0\x7F", 3);
             MakeOlder(b, table(b).GetPosition(), table(b).GetPosition(), record);
         }},
        {115, [&](Bytes& b) { b[table(b).FindRecord(c_uidB) + 44] = 'B'; }},
        {116, [&](Bytes& b) { Put(b, table(b).FindRecord(c_uidB), c_uidGap, 4); }},
        {117, [&](Bytes& b) { table(b).GiveToUserData(56, 2, 16); }},
        {118,
         [&](Bytes& b) {
             Bytes const count = Bytes("\1\0\0\0", 4) + TestSupport::Little(1, 8) + "z";
             MakeOlder(b, table(b).GetPosition(), table(b).GetPosition(), {}, count);
         }},
        {119, [&](Bytes& b) { b[table(b).GetPosition() + 58] = 1; }},
        {120, [&](Bytes& b) { b[table(b).GetPathCount() + 12] = 'q'; }},
        {121, [&](Bytes& b) { Raise(b, table(b).GetPathCount() + 4, 8); }},
        {122,
         [&](Bytes& b) {
             PutEmptyTable(b, 72);
             Put(b, table(b).GetPosition() + 4, 72, 8);
         }},
        {126, [&](Bytes& b) { Raise(b, table(b).GetPosition() + 12, 8); }},
        {127, [&](Bytes& b) { b[table(b).GetPosition() + 58] = 0; }},
        {129,
         [&](Bytes& b) {
             MakeOlder(b, table(b).GetPosition(), table(b).GetPosition());
             Raise(b, table(b).GetPosition() + 20, 8);
         }},
        {130, [&](Bytes& b) { Raise(b, table(b).GetPosition() + 28, 8); }},
        {131, [&](Bytes& b) { Raise(b, table(b).GetPosition() + 36, 8); }},
        {132,
         [&](Bytes& b) {
             Bytes const deletion = TestSupport::Little(c_uidGap, 4) + "\2";
             MakeOlder(b, table(b).GetPosition(), table(b).GetPosition(), deletion);
         }},
        // Of two records for one file the last one counts.
        {140,
         [&](Bytes& b) {
             Bytes const changed =
                 TestSupport::Little(c_uidA, 4) + "\1" + b.substr(table(b).FindRecord(c_uidA) + 5, 29);
             MakeOlder(b, table(b).GetPosition(), table(b).GetPosition(), changed);
         }},
    };
    Append(cases, FileFields(104));
    Append(cases, DetailFields(135, 0, c_uidB));
    for (SpoiledField const& c : cases) {
        for (bool overwrite : {false, true}) {
            SCOPED_TRACE(testing::Message() << c.code << (overwrite ? " overwriting" : " renaming"));
            WriteWhole(m_path, original);
            Counted<Archive> const archive = OpenDocument(m_path);
            archive->SetAlwaysStreamlineOverwrite(overwrite);
            TestSupport::FaultyFiles files;
            bool done = false;
            files.SetObserver([&](TestSupport::FileCall call, std::string const& path) {
                bool const temporary = path.find("~tmp") != path.npos || path.find("/second/") != path.npos;
                if (call != TestSupport::FileCall::Flush || !temporary || done) return;
                done = true;
                SpoilFile(path, c.spoil);
            });
            EXPECT_EQ(archive->StreamlineAndVerifyFileState(m_report, nullptr, nullptr, nullptr),
                      Archive::StreamlineNotVerified);
            files.SetObserver(nullptr);
            EXPECT_EQ(Code(), c.code) << Log();
            if (c.code == 101 && !overwrite) {
                EXPECT_EQ(Log(), "The streamlined file failed verification\n\nE101: Failed to load streamlined file\n"
                                 "Original paths:\nMaster: " +
                                     m_path + "\nStreamline: " + m_path + "~tmp\n\n\n");
            }
            EXPECT_TRUE(std::filesystem::exists(m_shunt + "/" + m_report.GetData() + "-streamline.corvane"));
            EXPECT_EQ(ReadWhole(m_path), original);
            EXPECT_FALSE(std::filesystem::exists(m_path + "~tmp"));
            EXPECT_TRUE(std::filesystem::is_empty(m_second));
            EXPECT_EQ(Get(*archive, "b"), "7");
            Clear();
        }
    }
}

// The file is what was written; here the archive goes back a revision meanwhile, and shows something else.
TEST_F(ArchiveVerifyTest, StreamlinedFileIsHeldAgainstWhatTheArchiveShows)
{
    using Hint = FileStoreCompressionHintGeneral;
    auto const hint = [](Hint::CompressionLevel level, CompressionPredictorType type) {
        return MakeCounted<Hint>(level, type, CompressionPredictorStripingType::None);
    };
    auto const plain = hint(Hint::CompressionLevelMin, CompressionPredictorType::None);
    struct Version
    {
        char const* bytes; ///< Null where the file is not there.
        Counted<FileStoreCompressionHint> hint = nullptr;
    };
    struct
    {
        int code;
        std::vector<Version> versions;
    } const cases[] = {
        {141, {{"1"}, {nullptr}, {"1"}}},
        {142, {{"1"}, {nullptr}}},
        {145, {{"1"}, {"22"}}},
        {146, {{"1"}, {"1", plain}}},
        {147, {{"1"}, {"2"}}},
        {148, {{"1", plain}, {"1", hint(Hint::CompressionLevelMin, CompressionPredictorType::UnsignedChar)}}},
        {150, {{nullptr}, {"1"}}},
        {151, {{"1", plain}, {"1", hint(Hint::CompressionLevelMax, CompressionPredictorType::None)}}},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.code);
        std::filesystem::remove(m_path);
        Counted<Archive> const archive = CreateDocument(m_path);
        ASSERT_TRUE(Save(*archive, {{"other", "1"}}));
        for (Version const& version : c.versions) {
            ASSERT_TRUE(InSession(*archive, [&](ArchiveSession& session) {
                session.CreateFile(Str("other"), MakeCounted<BytesItem>("1"));
                if (version.bytes) session.CreateFile(Str("b"), MakeCounted<BytesItem>(version.bytes), version.hint);
                if (!version.bytes) session.DeleteFile(Str("b"));
            }));
        }
        TestSupport::FaultyFiles files;
        bool done = false;
        files.SetObserver([&](TestSupport::FileCall call, std::string const& path) {
            if (call != TestSupport::FileCall::Flush || path.find("~tmp") == path.npos || done) return;
            done = true;
            archive->RewindWorkingRevision();
        });
        EXPECT_EQ(archive->StreamlineAndVerifyFileState(m_report, nullptr, nullptr, nullptr),
                  Archive::StreamlineNotVerified);
        EXPECT_EQ(Code(), c.code);
        EXPECT_NE(Log().find(": b\n"), std::string::npos) << Log();
        Clear();
    }
}

// Over every way of saving, a sound archive matches what it has written.
TEST_F(ArchiveVerifyTest, SoundSavesMatchWhateverTheirKind)
{
    TestSupport::FaultyFiles const files;
    Counted<Archive> archive = CreateDocument(m_path);
    Archive::CreateResult created;
    ASSERT_TRUE(archive->AddScratchFile(Str(m_scratchPath), created));
    archive->SetKeepOpen(false);
    int step = 0;
    for (bool scratch : {false, true, true, false, true}) {
        for (auto type : {Archive::SessionTypeFull, Archive::SessionTypeIncremental, Archive::SessionTypeRewrite,
                          Archive::SessionTypeExport})
        {
            SCOPED_TRACE(++step);
            ArchiveSessionHandle handle;
            ASSERT_TRUE(scratch ? archive->CreateScratchSession(handle, type, nullptr)
                                : archive->CreateSession(handle, type, nullptr));
            CreateGenerated(*handle, "g", "", std::to_string(step));
            if (step % 3 == 0) handle->DeleteFile(Str("g1"));
            if (step % 3 == 1) handle->CreateFile(Str("g1"), MakeCounted<BytesItem>("again"));
            ASSERT_EQ(archive->CloseSessionAndVerifyFileState(handle, m_report, false), Archive::VerifyMatch) << Log();
            if (step % 7 != 0) continue;
            ASSERT_EQ(archive->StreamlineAndVerifyFileState(m_report, nullptr, nullptr, nullptr),
                      Archive::StreamlineDone)
                << Log();
            EXPECT_EQ(files.GetOpenHandles(), 0); // Closed between accesses, as was asked for.
        }
    }
    // A count that counts nothing is none.
    TestSupport::ArchiveBuilder zero;
    zero.AddTable({.records = {{1, 0, "a", zero.AddBlock("old")}}, .pathCounts = {{"p", "s", 0}}});
    WriteWhole(m_folder / "zero", zero.Build());
    archive = OpenDocument(m_folder / "zero");
    ASSERT_TRUE(Save(*archive, {{"a", "new"}}));
    ASSERT_EQ(archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    EXPECT_EQ(SaveAndSpoil(*archive, false, m_folder / "zero", [](Bytes&) {}), Archive::VerifyMatch) << Log();
    // A version 7 file has a block where later ones have their guard.
    TestSupport::ArchiveBuilder old(7);
    old.AddFile(1, "a", "old");
    WriteWhole(m_folder / "old", old.Build());
    archive = OpenDocument(m_folder / "old");
    EXPECT_EQ(SaveAndSpoil(*archive, false, m_folder / "old", [](Bytes&) {}), Archive::VerifyMatch) << Log();
}

TEST_F(ArchiveVerifyTest, FilesThatCannotBeReachedCannotBeChecked)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->CreateFile(Str("a"), MakeCounted<BytesItem>("1"));
    handle->SetThumbnails(MakeThumbnails("lost"));
    TestSupport::FaultyFiles files;
    files.Plan({.call = TestSupport::FileCall::Flush, .n = 3, .error = EIO}); // Theirs: the save stands.
    handle->AddPostSaveObject(MakeCounted<Spoiler>([&] { std::filesystem::rename(m_path, m_path + "2"); }));
    EXPECT_EQ(archive->CloseSessionAndVerifyFileState(handle, m_report, false), Archive::VerifyNotRun);
    EXPECT_TRUE(std::filesystem::is_empty(m_shunt));
}

TEST_F(ArchiveVerifyTest, ShuntedFilesComeWithALogUnderTheTimeOfDay)
{
    TestSupport::FakeClock const clock(1'600'000'000);
    std::tm local{};
    ASSERT_TRUE(Platform::ToCivilLocal(1'600'000'000, local));
    char id[40];
    std::strftime(id, sizeof(id), "%Y%m%d-%H%M%S", &local);

    Counted<Archive> archive = CreateDocument(m_path);
    ASSERT_TRUE(Save(*archive, {{"a", "1"}}));
    EXPECT_EQ(SaveAndSpoil(*archive, false, m_path, [](Bytes& b) { Put(b, 60, 77, 4); }), Archive::VerifyMismatch);
    EXPECT_EQ(m_report, String8(id));
    std::string const base = m_shunt + "/" + id;
    EXPECT_EQ(ReadWhole(base + "-master.corvane"), ReadWhole(m_path));
    EXPECT_EQ(Log(), "The newly written files could not be matched back to the in-memory data\n\n"
                     "E006: NextFreeUID mismatch (2 : 77)\n\nOriginal paths:\nMaster: " +
                         m_path + "\n\n[No scratch]\n\n");

    // No copies where there are no files, and no log where there is no folder.
    archive = nullptr;
    archive = CreateDocument(m_path);
    ASSERT_TRUE(Save(*archive, {{"a", "1"}, {"b", "1"}}));
    ASSERT_TRUE(Save(*archive, {{"b", std::nullopt}}));
    Kernel::Test::TraceCapture trace;
    EXPECT_FALSE(archive->VerifyExistingFiles({Str("a"), Str("b"), Str("never")}, m_report));
    EXPECT_EQ(trace.GetText(), "Missing file: b [deleted]\nMissing file: never\n");
    EXPECT_EQ(Log(), "There are required files missing from the archive\n\nb [deleted]\nnever\n\n\nOriginal paths:\n"
                     "Master: " +
                         m_path + "\n\n[No scratch]\n\n");
    Archive::SetShuntPath(Str(m_folder / "no such folder"));
    EXPECT_FALSE(archive->VerifyExistingFiles({Str("b")}, m_report));
    EXPECT_EQ(m_report, Str(std::string(id) + "-NOLOG"));
    Archive::SetShuntPath(String8());
    EXPECT_FALSE(archive->VerifyExistingFiles({Str("b")}, m_report));
    EXPECT_EQ(m_report, Str("NOLOG"));
    m_report = String8();
    EXPECT_TRUE(archive->VerifyExistingFiles({}, m_report));
    EXPECT_TRUE(archive->VerifyExistingFiles({Str("a")}, m_report));
    EXPECT_TRUE(m_report.IsEmpty());
    archive->RewindWorkingRevision();
    EXPECT_TRUE(archive->VerifyExistingFiles({Str("a"), Str("b")}, m_report));

    // Copies that fail are said.
    Archive::SetShuntPath(Str(m_shunt));
    Archive::CreateResult created;
    ASSERT_TRUE(archive->AddScratchFile(Str(m_scratchPath), created));
    TestSupport::FaultyFiles files;
    files.Plan({.call = TestSupport::FileCall::Rename, .forEver = true, .error = ENOSPC, .path = ".corvane"});
    EXPECT_FALSE(archive->VerifyExistingFiles({Str("never")}, m_report));
    EXPECT_EQ(Log(),
              "There are required files missing from the archive\n\nnever\n\n\nOriginal paths:\nMaster: " + m_path +
                  "\nScratch: " + m_scratchPath + "\n\n[Failed to copy master]\n[Failed to copy scratch]\n\n");
}

TEST_F(ArchiveVerifyTest, AdditionalFilesAreThoseOfAnyRevision)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    EXPECT_FALSE(archive->TestForAdditionalFiles({}));
    ASSERT_TRUE(Save(*archive, {{"a", "1"}, {"b", "1"}}));
    EXPECT_FALSE(archive->TestForAdditionalFiles({Str("a"), Str("b"), Str("c")}));
    ASSERT_TRUE(Save(*archive, {{"b", std::nullopt}}));
    EXPECT_TRUE(archive->TestForAdditionalFiles({Str("a")}));
}

// The tables are read, and no block is.
TEST_F(ArchiveVerifyTest, CheckCostsOneReadOfTheTables)
{
    Counted<Archive> const archive = CreateDocument(m_path);
    for (int i = 0; i < 5; ++i) ASSERT_TRUE(Save(*archive, {{"a" + std::to_string(i), std::string(3'000'000, 'x')}}));
    TestSupport::FaultyFiles files;
    int saved = 0;
    ArchiveSessionHandle handle;
    ASSERT_TRUE(archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->CreateFile(Str("b"), MakeCounted<BytesItem>("1"));
    handle->AddPostSaveObject(MakeCounted<Spoiler>([&] { saved = files.GetCount(TestSupport::FileCall::Read); }));
    EXPECT_EQ(archive->CloseSessionAndVerifyFileState(handle, m_report, false), Archive::VerifyMatch);
    // Header, info, guard, twice six tables (header and body), the place of thumbnails, the guard's tag.
    EXPECT_LE(files.GetCount(TestSupport::FileCall::Read) - saved, 20);
}

} // namespace
} // namespace KernelTest

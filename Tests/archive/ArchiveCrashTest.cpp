#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/streams/OutStream.h"
#include "support/ArchiveFixture.h"
#include "support/CrashRecorder.h"
#include "support/FakeClock.h"
#include "support/FaultyFiles.h"
#include "support/TempFolder.h"

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <gtest/gtest.h>
#include <memory>
#include <set>

// Power cuts at every step of a save, and failing calls at every step: what is found afterwards is the old document or
// the new one, whole, and it can be saved into again.

namespace KernelTest {
namespace {

using namespace Kernel;
using Items = std::map<std::string, std::string>;

constexpr u64 c_randomImages = 6;

class ArchiveCrashTest : public testing::Test
{
protected:
    /// Calls @p check on each image of each step of what was recorded.
    template <class Check>
    void ForEachImage(TestSupport::CrashRecorder const& recorder, u64 steps, Check&& check)
    {
        for (u64 step = 0; step <= steps; ++step) {
            for (u64 seed = 0; seed < 3 + c_randomImages; ++seed) {
                for (auto const& entry : std::filesystem::directory_iterator(m_folder.GetPath()))
                    std::filesystem::remove_all(entry.path());
                recorder.MakeImage(step, seed < 3 ? seed : step * 1000 + seed, m_folder.GetPath());
                SCOPED_TRACE("step " + std::to_string(step) + " seed " + std::to_string(seed) +
                             ", before: " + (step < steps ? recorder.Describe(step) : "the end"));
                check(step == steps);
                if (HasFatalFailure()) return;
            }
        }
    }

    /// Opens, compares with the allowed states, saves into it, reopens and compares again.
    void ExpectOneOf(std::string const& path, std::vector<Items> const& allowed,
                     std::set<Archive::OpenResult> const& refusals)
    {
        Archive::OpenResult result{};
        Items found;
        {
            Counted<Archive> const archive =
                Archive::Open(Str(path), Archive::OpenModeReadWrite, c_documentTag, result);
            if (!archive) {
                ASSERT_TRUE(refusals.count(result)) << "result " << result;
                return;
            }
            found = GetAll(*archive);
            ASSERT_NE(std::find(allowed.begin(), allowed.end(), found), allowed.end()) << Describe(found);
            Counted<ArchiveThumbnails const> const thumbnails = archive->LoadThumbnails();
            if (thumbnails) {
                ASSERT_EQ(thumbnails->GetRecs().size(), 1u);
                RawData const& data = *thumbnails->GetRecs()[0].data;
                std::string const bytes(static_cast<char const*>(data.GetData()), data.GetSize());
                ASSERT_EQ(bytes, std::string(bytes.size(), bytes[0]));
            }
            ASSERT_TRUE(Save(*archive, {{"after", "the crash"}}));
        }
        found["after"] = "the crash";
        Counted<Archive> const again = OpenDocument(path);
        ASSERT_TRUE(again);
        ASSERT_EQ(GetAll(*again), found);
    }

    static std::string Describe(Items const& items)
    {
        std::string text;
        for (auto const& [path, bytes] : items)
            text += path + "=" + bytes.substr(0, 8) + "(" + std::to_string(bytes.size()) + ") ";
        return text;
    }

    static bool SaveWithThumbnail(Archive& archive, Changes const& changes, char fill)
    {
        ArchiveSessionHandle handle;
        if (!archive.CreateSession(handle, Archive::SessionTypeFull, nullptr)) return false;
        for (auto const& [path, bytes] : changes) {
            if (bytes)
                handle->CreateFile(Str(path), MakeCounted<BytesItem>(*bytes));
            else
                handle->DeleteFile(Str(path));
        }
        auto thumbnails = MakeCounted<ArchiveThumbnails>();
        auto data = MakeCounted<RawData>(3000);
        std::memset(data->GetData(), fill, 3000);
        thumbnails->AddFile(ArchiveThumbnails::FileType::Picture, data);
        handle->SetThumbnails(thumbnails);
        archive.CloseSession(handle, false);
        return true;
    }

    TestSupport::TempFolder m_folder;
    std::string const m_path = m_folder / "doc";
    std::string const m_scratch = m_folder / "scratch";
};

TEST_F(ArchiveCrashTest, PowerCutDuringAMasterSaveLeavesTheOldOrTheNewState)
{
    Items const before = {{"a", std::string(5000, 'a')}, {"b", "b"}};
    Items const after = {{"a", std::string(9000, 'A')}, {"c", std::string(700, 'c')}};
    {
        Counted<Archive> const archive = CreateDocument(m_path);
        ASSERT_TRUE(SaveWithThumbnail(*archive, {{"a", before.at("a")}, {"b", "b"}}, 't'));
    }
    TestSupport::CrashRecorder const recorder(m_folder.GetPath());
    {
        Counted<Archive> const archive = OpenDocument(m_path);
        ASSERT_TRUE(
            SaveWithThumbnail(*archive, {{"a", after.at("a")}, {"b", std::nullopt}, {"c", after.at("c")}}, 'T'));
    }
    u64 const steps = recorder.GetStepCount();
    ForEachImage(recorder, steps, [&](bool returned) {
        // Only an info block of which the first bytes are new and the rest old can name no table.
        std::set<Archive::OpenResult> refusals;
        if (!returned) refusals = {Archive::OpenCorrupt, Archive::OpenTruncated};
        ExpectOneOf(m_path, returned ? std::vector<Items>{after} : std::vector<Items>{before, after}, refusals);
    });
}

TEST_F(ArchiveCrashTest, PowerCutDuringARollDownNeverLosesTheMasterNorBringsAnOldScratchStateBack)
{
    TestSupport::FakeClock clock;
    Items const oldMaster = {{"a", "master"}, {"b", "stays"}};
    Items const oldPair = {{"a", std::string(4000, 's')}, {"b", "stays"}};
    Items const fresh = {{"a", std::string(4000, 's')}, {"b", "stays"}, {"n", "new"}};
    {
        Counted<Archive> const archive = CreateDocument(m_path);
        ASSERT_TRUE(Save(*archive, {{"a", "master"}, {"b", "stays"}}));
        Archive::CreateResult result;
        ASSERT_TRUE(archive->AddScratchFile(Str(m_scratch), result));
        ASSERT_TRUE(Save(*archive, {{"a", oldPair.at("a")}}, true));
    }
    TestSupport::CrashRecorder const recorder(m_folder.GetPath());
    {
        Counted<Archive> const archive = OpenDocument(m_scratch);
        ASSERT_TRUE(archive);
        clock.AdvanceMs(2000);
        ASSERT_TRUE(Save(*archive, {{"n", "new"}}));
    }
    u64 const steps = recorder.GetStepCount();
    ForEachImage(recorder, steps, [&](bool returned) {
        Archive::OpenResult pair{};
        Items found;
        bool scratchHasRevisions = false;
        {
            Counted<Archive> const archive =
                Archive::Open(Str(m_scratch), Archive::OpenModeReadWrite, c_documentTag, pair);
            if (archive) {
                found = GetAll(*archive);
                scratchHasRevisions = archive->HaveScratchRevisions();
            }
        }
        Archive::OpenResult alone{};
        Items master;
        {
            Counted<Archive> const archive =
                Archive::Open(Str(m_path), Archive::OpenModeReadWrite, c_documentTag, alone);
            if (archive) master = GetAll(*archive);
        }
        bool const isNew = alone == Archive::OpenOk && master == fresh;
        bool const isOld = alone == Archive::OpenOk && master == oldMaster;
        if (returned) {
            ASSERT_TRUE(isNew && pair == Archive::OpenOk && found == fresh);
        }
        ASSERT_TRUE(isNew || isOld || alone == Archive::OpenCorrupt || alone == Archive::OpenTruncated)
            << alone << " " << Describe(master);
        if (isOld) {
            ASSERT_TRUE(pair == Archive::OpenOk && found == oldPair) << pair << " " << Describe(found);
        }
        if (isNew) {
            std::set<Archive::OpenResult> const allowed = {Archive::OpenOk,         Archive::OpenLinkMismatch,
                                                           Archive::OpenNotArchive, Archive::OpenCorrupt,
                                                           Archive::OpenBadInfo,    Archive::OpenTruncated};
            ASSERT_TRUE(allowed.count(pair)) << pair;
            ASSERT_TRUE(pair != Archive::OpenOk || (found == fresh && !scratchHasRevisions));
            ExpectOneOf(m_path, {fresh}, {});
        }
    });
}

TEST_F(ArchiveCrashTest, CallThatFailsAtAnyStepOfASaveLeavesTheOldStateAndTheNextSaveWorks)
{
    Items const before = {{"a", std::string(5000, 'a')}};
    Changes const change = {{"a", std::string(2'000'000, 'n')}, {"b", "new"}};
    using TestSupport::Fault;
    using TestSupport::FileCall;
    std::vector<Fault> const faults = {
        {.call = FileCall::Write, .error = ENOSPC},
        {.call = FileCall::Write, .error = EIO, .part = Fault::Part::Half},
        {.call = FileCall::Write, .error = ENOSPC, .part = Fault::Part::AllButOne},
        {.call = FileCall::Read, .error = EIO},
        {.call = FileCall::Flush, .error = EIO},
        {.call = FileCall::Flush, .error = EIO, .loseWrites = true},
    };
    for (Fault const& fault : faults) {
        SCOPED_TRACE("call " + std::to_string(static_cast<int>(fault.call)) + " error " + std::to_string(fault.error));
        std::filesystem::remove(m_path);
        Counted<Archive> archive = CreateDocument(m_path);
        ASSERT_TRUE(Save(*archive, {{"a", before.at("a")}}));
        bool succeeded = false;
        int const runs = TestSupport::ForEachFault(
            fault,
            [&](TestSupport::FaultyFiles&) {
                succeeded = false;
                try {
                    succeeded = Save(*archive, change);
                } catch (ArchiveFileException const&) {
                } catch (OutStream::WriteException const&) {
                }
            },
            [&](int n) {
                SCOPED_TRACE(n);
                archive = nullptr;
                {
                    Counted<Archive> const again = OpenDocument(m_path);
                    ASSERT_TRUE(again);
                    Items const found = GetAll(*again);
                    Items const after = {{"a", *change.at("a")}, {"b", "new"}};
                    // Where the info block itself failed, in part or at its flush, either state may have arrived.
                    bool const open = fault.call == FileCall::Flush || fault.part != Fault::Part::Nothing;
                    bool const allowed = found == after ? succeeded || open : found == before && !succeeded;
                    ASSERT_TRUE(allowed) << Describe(found);
                    ASSERT_TRUE(Save(*again, {{"c", "1"}}));
                }
                std::filesystem::remove(m_path);
                archive = CreateDocument(m_path);
                Save(*archive, {{"a", before.at("a")}});
            });
        EXPECT_GT(runs, 0);
    }
}

} // namespace
} // namespace KernelTest

#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/filesystem/TempFile.h"
#include "support/ArchiveFixture.h"
#include "support/CrashRecorder.h"
#include "support/FakeClock.h"
#include "support/FaultyFiles.h"
#include "support/TempFolder.h"

#include <cerrno>
#include <filesystem>
#include <gtest/gtest.h>

// Power cuts and failing calls at every step of a streamline: whatever happens, the content stands whole under a name
// that can be told, and it can be saved into again.

namespace KernelTest {
namespace {

using namespace Kernel;
using Items = std::map<std::string, std::string>;

class ArchiveStreamlineFaultTest : public testing::TestWithParam<bool>
{
protected:
    ArchiveStreamlineFaultTest()
    {
        std::filesystem::create_directory(m_work);
        std::filesystem::create_directory(m_first);
        // Temporaries for overwriting lie beside the document here, so that one recorder sees both.
        std::vector<String8> rescued;
        TempFile::SetTempPath(Str(m_first), Str(m_work), rescued);
    }
    ~ArchiveStreamlineFaultTest() override { TempFile::SetTempPath(String8()); }

    bool Overwrites() const { return GetParam(); }
    Counted<Archive> Make() const
    {
        for (auto const& entry : std::filesystem::directory_iterator(m_work)) std::filesystem::remove(entry.path());
        Counted<Archive> archive = CreateDocument(m_path);
        EXPECT_TRUE(Save(*archive, {{"a", "old"}, {"b", std::string(3000, 'b')}, {"gone", "x"}}));
        EXPECT_TRUE(Save(*archive, {{"a", "new"}, {"gone", std::nullopt}}));
        Archive::CreateResult created;
        EXPECT_TRUE(archive->AddScratchFile(Str(m_path + ".scratch"), created));
        EXPECT_TRUE(Save(*archive, {{"a", "newest"}}, true));
        archive->SetAlwaysStreamlineOverwrite(Overwrites());
        return archive;
    }
    static Items Content() { return {{"a", "newest"}, {"b", std::string(3000, 'b')}}; }
    /// The master of @p path as Make leaves it, without the scratch file.
    static Items MasterContent() { return {{"a", "new"}, {"b", std::string(3000, 'b')}}; }

    static bool OpensWith(std::string const& path, Items const& items)
    {
        Archive::OpenResult result{};
        Counted<Archive> const archive = Archive::Open(Str(path), Archive::OpenModeReadWrite, c_documentTag, result);
        return archive && GetAll(*archive) == items && Save(*archive, {{"later", "1"}}) &&
               Get(*archive, "later") == "1";
    }
    /// The states that a streamline may leave: the pair as it was; the compact master, whatever the scratch file is;
    /// the backup or the temporary, when the master says that it is not to be trusted or is away.
    std::string Judge(std::string const& folder, bool returned) const
    {
        std::string const path = folder + "/doc";
        bool const there = std::filesystem::exists(path);
        if (there && !(Overwrites() && Archive::IsMidStreamlineFile(Str(path)))) {
            std::string const scratch = path + ".scratch";
            std::filesystem::copy_file(path, path + ".copy");
            bool const compact = OpensWith(path + ".copy", Content());
            std::filesystem::remove(path + ".copy");
            if (compact) {
                // An old scratch file may not pass for one of the new master.
                Archive::OpenResult result{};
                Counted<Archive> const pair =
                    Archive::Open(Str(scratch), Archive::OpenModeReadOnly, c_documentTag, result);
                return !pair || GetAll(*pair) == Content() ? "" : "scratch file over the compact master";
            }
            if (returned) return "returned, and the old file stands";
            if (!OpensWith(path, MasterContent())) return "master neither old nor new";
            return "";
        }
        if (returned && !there) return "returned, and nothing stands";
        for (auto const& entry : std::filesystem::directory_iterator(folder)) {
            std::string const name = entry.path();
            if (name == path || name.find(".scratch") != name.npos) continue;
            if (OpensWith(name, Content())) return "";
            if (name.find("~backup") != name.npos && OpensWith(name, MasterContent())) return "";
        }
        return "no whole copy";
    }

    TestSupport::TempFolder m_folder;
    std::string const m_work = m_folder / "work";
    std::string const m_first = m_folder / "first";
    std::string const m_path = m_work + "/doc";
};

INSTANTIATE_TEST_SUITE_P(Roads, ArchiveStreamlineFaultTest, testing::Bool());

TEST_P(ArchiveStreamlineFaultTest, PowerCutAtAnyStepLeavesAWholeCopyThatCanBeTold)
{
    Make();
    // The recorder knows the handles that are opened while it runs.
    auto const recorder = std::make_unique<TestSupport::CrashRecorder>(m_work);
    Counted<Archive> archive = OpenDocument(m_path + ".scratch");
    archive->SetAlwaysStreamlineOverwrite(Overwrites());
    ASSERT_EQ(archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    u64 const steps = recorder->GetStepCount();
    archive = nullptr;
    constexpr u64 c_seeds = 12;
    int images = 0;
    for (u64 step = 0; step <= steps; ++step) {
        for (u64 seed = 0; seed < c_seeds; ++seed) {
            TestSupport::TempFolder const image;
            recorder->MakeImage(step, seed, image.GetPath());
            std::string const fault = Judge(image.GetPath(), step == steps);
            ASSERT_EQ(fault, "") << "step " << step << " seed " << seed
                                 << (step ? " behind " + recorder->Describe(step - 1) : std::string());
            ++images;
        }
    }
    EXPECT_GT(images, 100);
}

TEST_P(ArchiveStreamlineFaultTest, CallThatFailsAtAnyStepEndsInADocumentedResult)
{
    using TestSupport::Fault;
    using TestSupport::FileCall;
    std::vector<Fault> const faults = {
        {.call = FileCall::Open, .error = EACCES},
        {.call = FileCall::Open, .error = EMFILE},
        {.call = FileCall::Read, .error = EIO},
        {.call = FileCall::Write, .error = EIO},
        {.call = FileCall::Write, .error = ENOSPC, .part = Fault::Part::Half},
        {.call = FileCall::Write, .error = EDQUOT},
        {.call = FileCall::Flush, .error = EIO},
        {.call = FileCall::Flush, .error = ENOSPC, .loseWrites = true},
        {.call = FileCall::FlushFolder, .error = EIO},
        {.call = FileCall::Rename, .error = EACCES},
        {.call = FileCall::Rename, .error = ENOSPC},
        {.call = FileCall::SetSize, .error = EIO},
        {.call = FileCall::Unlink, .error = EACCES},
        {.call = FileCall::SetAttributes, .error = EIO},
        {.call = FileCall::Stat, .error = EIO},
    };
    TestSupport::FakeClock const clock;
    for (Fault fault : faults) {
        for (bool forEver : {false, true}) {
            SCOPED_TRACE(testing::Message() << "call " << static_cast<int>(fault.call) << " error " << fault.error
                                            << (forEver ? " for ever" : ""));
            fault.forEver = forEver;
            Counted<Archive> archive = Make();
            Archive::StreamlineResult result{};
            TestSupport::ForEachFault(
                fault, [&](TestSupport::FaultyFiles&) { result = archive->Streamline(nullptr, nullptr, nullptr); },
                [&](int n) {
                    if (result == Archive::StreamlineDone) {
                        EXPECT_EQ(GetAll(*archive), Content()) << n;
                        EXPECT_TRUE(Save(*archive, {{"a", "newest"}})) << n;
                    } else if (!archive->IsDead() && !archive->IsEmpty()) {
                        // Nothing has happened: the same call works now.
                        EXPECT_EQ(GetAll(*archive), Content()) << n << " result " << result;
                        EXPECT_EQ(archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone) << n;
                    }
                    archive = nullptr;
                    EXPECT_EQ(Judge(m_work, result == Archive::StreamlineDone), "") << n << " result " << result;
                    archive = Make();
                });
        }
    }
}

} // namespace
} // namespace KernelTest

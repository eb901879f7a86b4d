#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/streams/OutStream.h"
#include "support/ArchiveFixture.h"
#include "support/FaultyFiles.h"
#include "support/TempFolder.h"

#include <filesystem>
#include <gtest/gtest.h>

// Failing calls at every step of a save: what is found afterwards is the old document or the new one, whole, and it can
// be saved into again.

namespace KernelTest {
namespace {

using namespace Kernel;
using Items = std::map<std::string, std::string>;

class ArchiveFaultTest : public testing::Test
{
protected:
    static std::string Describe(Items const& items)
    {
        std::string text;
        for (auto const& [path, bytes] : items)
            text += path + "=" + bytes.substr(0, 8) + "(" + std::to_string(bytes.size()) + ") ";
        return text;
    }

    TestSupport::TempFolder m_folder;
    std::string const m_path = m_folder / "doc";
};

TEST_F(ArchiveFaultTest, CallThatFailsAtAnyStepOfASaveLeavesTheOldStateAndTheNextSaveWorks)
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

// The helpers that other tests lean on: a fault that never strikes, or a crash image that is always whole, would let
// those tests pass for nothing.
#include "libkernel/platform/PlatformFile.h"
#include "support/CrashRecorder.h"
#include "support/FaultyFiles.h"
#include "support/TempFolder.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <set>

namespace {

using namespace Kernel;
using namespace Kernel::Platform;
using namespace TestSupport;

// Writes a new text to a temporary name and moves it over the old one: safe if and only if it flushes.
bool Replace(TempFolder const& folder, std::string const& text, bool flushes)
{
    FileCalls const& calls = GetFileCalls();
    std::string const temporary = folder / "temp";
    std::string const path = folder / "file";
    FileHandle handle;
    if (calls.open(temporary.c_str(), {.read = true, .write = true, .create = true, .truncate = true}, handle))
        return false;
    bool ok = calls.write(handle, text.data(), text.size()).count == text.size();
    if (flushes) ok = calls.flush(handle, FlushKind::Data) == 0 && ok;
    ok = calls.close(handle) == 0 && ok;
    ok = ok && calls.rename(temporary.c_str(), path.c_str()) == 0;
    return ok && (!flushes || calls.flushFolder(folder.GetPath().c_str()) == 0);
}

class CrashTest : public testing::Test
{
protected:
    // Every content that "file" can have after a crash anywhere.
    std::set<std::string> CrashEverywhere(bool flushes)
    {
        WriteWholeFile(m_folder / "file", "old");
        CrashRecorder const recorder(m_folder.GetPath());
        EXPECT_TRUE(Replace(m_folder, m_new, flushes));
        m_steps = recorder.GetStepCount();
        std::set<std::string> states;
        for (u64 step = 0; step <= m_steps; ++step) {
            for (u64 seed = 0; seed < 20; ++seed) {
                TempFolder const image;
                recorder.MakeImage(step, seed, image.GetPath());
                states.insert(ReadWholeFile(image / "file"));
            }
        }
        TempFolder const end;
        recorder.MakeImage(m_steps, CrashRecorder::c_loseAll, end.GetPath());
        m_afterReturn = ReadWholeFile(end / "file");
        return states;
    }

    TempFolder m_folder;
    std::string const m_new = std::string(1500, 'n');
    std::string m_afterReturn;
    u64 m_steps = 0;
};

TEST_F(CrashTest, FlushedReplacementIsOldOrNew)
{
    EXPECT_EQ((std::set<std::string>{"old", m_new}), CrashEverywhere(true));
    EXPECT_EQ(m_new, m_afterReturn);
    EXPECT_EQ(5u, m_steps) << "create, write, flush, rename, flush folder";
}

TEST_F(CrashTest, UnflushedReplacementIsCaught)
{
    std::set<std::string> const states = CrashEverywhere(false);
    EXPECT_EQ("old", m_afterReturn);
    EXPECT_TRUE(states.count("")) << "the name kept, the data lost";
    EXPECT_TRUE(states.count(std::string(512, 'n')) || states.count(std::string(1024, 'n'))) << "a torn write";
    for (std::string const& state : states) {
        EXPECT_TRUE(state == "old" || state == m_new || state.size() % 512 == 0) << state.size();
    }
}

TEST(FaultyFiles, PlansCountShortenAndLose)
{
    TempFolder const folder;
    FaultyFiles files;
    FileCalls const& calls = GetFileCalls();
    files.Plan({.call = FileCall::Write, .n = 2, .forEver = true, .error = ENOSPC, .part = Fault::Part::AllButOne});
    files.Plan({.call = FileCall::Flush, .error = EIO, .loseWrites = true});
    FileHandle handle;
    ASSERT_EQ(0, calls.open((folder / "file").c_str(), {.read = true, .write = true, .create = true}, handle));
    EXPECT_EQ(4u, calls.write(handle, "abcd", 4).count);
    for (int i = 0; i < 2; ++i) {
        IoResult const result = calls.writeAt(handle, "abcd", 4, 4);
        EXPECT_EQ(3u, result.count);
        EXPECT_EQ(ENOSPC, result.error);
    }
    EXPECT_EQ("abcdabc", ReadWholeFile(folder / "file"));
    EXPECT_EQ(EIO, calls.flush(handle, FlushKind::Data));
    EXPECT_EQ("", ReadWholeFile(folder / "file")) << "the dropped pages are gone";
    EXPECT_EQ(0, calls.flush(handle, FlushKind::Data));
    EXPECT_EQ(3, files.GetCount(FileCall::Write));
    EXPECT_EQ(1, files.GetOpenHandles());
    calls.close(handle);
}

} // namespace

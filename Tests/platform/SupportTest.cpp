// The helpers that other tests lean on: a fault that never strikes, or a crash image that is always whole, would let
// those tests pass for nothing.
#include "libkernel/platform/PlatformFile.h"
#include "support/CrashImages.h"
#include "support/FaultyFiles.h"
#include "support/TempFolder.h"

#include <gtest/gtest.h>
#include <set>

namespace {

using namespace Kernel;
using namespace Kernel::Platform;
using namespace TestSupport;

// A new text is written to a temporary name and moved over the old one: safe if and only if it is flushed.
TEST(CrashImages, ReplacementIsOldOrNewOnlyIfItIsFlushed)
{
    using States = std::set<std::string>;
    std::string const text(1500, 'n');
    for (bool flushes : {true, false}) {
        MemoryDisk disk;
        disk.Load({{"/ram/file", std::make_shared<std::string const>("old")}});
        disk.StartRecording();
        FileCalls const& calls = GetFileCalls();
        FileHandle handle;
        ASSERT_EQ(0, calls.open("/ram/temp", {.write = true, .create = true}, handle));
        EXPECT_EQ(text.size(), calls.write(handle, text.data(), text.size()).count);
        if (flushes) calls.flush(handle, FlushKind::Data);
        calls.close(handle);
        calls.rename("/ram/temp", "/ram/file");
        if (flushes) calls.flushFolder("/ram");
        MemoryDisk::Recording const recording = disk.StopRecording();
        States states;
        ForEachCrashImage(recording, {},
                          [&](MemoryDisk::Image const& image, u64) { states.insert(*image.at("/ram/file")); });
        EXPECT_EQ(states, flushes ? States({"old", text})
                                  : States({"", "old", text.substr(0, 512), text.substr(0, 1024), text}));
        EXPECT_EQ(*MakeDurableImage(recording, recording.steps.size()).at("/ram/file"), flushes ? text : "old");
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

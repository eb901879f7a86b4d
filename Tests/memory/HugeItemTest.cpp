#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"
#include "support/ArchiveFixture.h"
#include "support/TempFolder.h"

#include <algorithm>
#include <fstream>
#include <gtest/gtest.h>
#include <sys/statvfs.h>
#include <sys/wait.h>
#include <unistd.h>

// An item that is far larger than what a process may take of memory.

namespace KernelTest {
namespace {

using namespace Kernel;

constexpr u64 c_size = u64{2} << 30;
constexpr u64 c_piece = u64{1} << 20;
constexpr u64 c_mostMemory = u64{64} << 20;

// Zeros become holes, so that the disk keeps up.
class SparseFiles
{
public:
    SparseFiles()
    {
        s_next = &Platform::GetFileCalls();
        m_table = *s_next;
        m_table.writeAt = [](Platform::FileHandle handle, void const* data, u64 size, u64 offset) {
            auto const* const bytes = static_cast<char const*>(data);
            u64 now = 0;
            bool const isHole = size >= 4096 && std::all_of(bytes, bytes + size, [](char c) { return c == 0; }) &&
                                s_next->getSize(handle, now) == 0 && now <= offset &&
                                s_next->setSize(handle, offset + size) == 0;
            return isHole ? Platform::IoResult{size, 0} : s_next->writeAt(handle, data, size, offset);
        };
        Platform::SetFileCalls(&m_table);
    }
    ~SparseFiles() { Platform::SetFileCalls(s_next); }

private:
    static inline Platform::FileCalls const* s_next = nullptr;
    Platform::FileCalls m_table;
};

class ZeroItem : public BytesItem
{
public:
    void Save(OutStream& stream, FileStoreOut&) const override
    {
        std::vector<char> const zeros(c_piece);
        for (u64 done = 0; done < c_size; done += c_piece)
            if (stream.WriteBlock(zeros.data(), c_piece) != c_piece) throw OutStream::WriteException();
    }
};

bool ReadsBack(Archive& archive)
{
    Counted<InStream> const stream = archive.OpenFileInStream(Str("huge"));
    std::vector<char> bytes(c_piece);
    for (u64 done = 0; done < c_size; done += c_piece)
        if (!stream || stream->ReadBlock(bytes.data(), c_piece) != c_piece || bytes[done % c_piece] != 0) return false;
    return Get(archive, "small") == "3";
}

// The number of the step that failed, or 0.
int PassThrough(std::string const& path)
{
    SparseFiles const sparse;
    {
        Counted<Archive> const archive = CreateDocument(path);
        ArchiveSessionHandle handle;
        if (!archive || !Save(*archive, {{"small", "1"}}) ||
            !archive->CreateSession(handle, Archive::SessionTypeFull, nullptr))
            return 1;
        handle->CreateFile(Str("huge"), MakeCounted<ZeroItem>());
        archive->CloseSession(handle, false);
        if (!Save(*archive, {{"small", "3"}})) return 2;
    }
    {
        Counted<Archive> const archive = OpenDocument(path);
        if (!archive || !ReadsBack(*archive)) return 3;
        if (archive->Streamline(nullptr, nullptr, nullptr) != Archive::StreamlineDone || !ReadsBack(*archive)) return 4;
    }
    std::fstream(path, std::ios::in | std::ios::out | std::ios::binary).seekp(12).write("\xff\xff\xff\xff\xff\xff", 6);
    Archive::OpenResult result{};
    Counted<Archive> const archive =
        Archive::RecoverArchive(Str(path), Archive::OpenModeReadWrite, c_documentTag, result);
    return archive && ReadsBack(*archive) ? 0 : 5;
}

u64 GetPeakMemory()
{
    std::ifstream status("/proc/self/status");
    for (std::string line; std::getline(status, line);)
        if (line.rfind("VmHWM:", 0) == 0) return std::stoull(line.substr(6)) * 1024;
    return ~u64{0};
}

TEST(HugeItemTest, TwoGigabytesPassThroughSaveOpenStreamlineAndRecoverInLittleMemory)
{
    TestSupport::TempFolder const folder;
    struct statvfs disk = {};
    ASSERT_EQ(statvfs(folder.GetPath().c_str(), &disk), 0);
    // Two files, should the folder's file system know no holes.
    if (u64{disk.f_bavail} * disk.f_frsize < 2 * c_size + c_mostMemory) GTEST_SKIP() << "less than 4.1 GiB of disk";
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    pid_t const child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        std::ofstream("/proc/self/clear_refs") << "5";
        u64 const before = GetPeakMemory(); // What the tests before this one have left in the process.
        u64 report[2] = {static_cast<u64>(PassThrough(folder / "doc")), 0};
        report[1] = GetPeakMemory() - before;
        _exit(write(ends[1], report, sizeof(report)) == sizeof(report) ? 0 : 1);
    }
    close(ends[1]);
    u64 report[2] = {};
    EXPECT_EQ(read(ends[0], report, sizeof(report)), static_cast<ssize_t>(sizeof(report)));
    close(ends[0]);
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(report[0], 0u) << "step";
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
    EXPECT_LT(report[1], c_mostMemory); // A sanitizer's own memory counts as the process's.
#endif
    std::printf("2 GiB item: peak memory %.1f MiB\n", static_cast<double>(report[1]) / 1048576.0);
}

} // namespace
} // namespace KernelTest

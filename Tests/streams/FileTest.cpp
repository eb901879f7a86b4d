#include "libkernel/streams/File.h"

#include "libkernel/platform/Errors.h"
#include "libkernel/platform/FileMarks.h"
#include "libkernel/platform/PlatformFile.h"
#include "support/FaultyFiles.h"
#include "support/FileFixture.h"

#include <cstdio>
#include <sys/resource.h>
#include <sys/stat.h>

namespace Kernel {
namespace {

using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::ReadWholeFile;
using TestSupport::WriteWholeFile;
using Result = File::OpenUnmanagedResult;
using AccessMode = File::AccessMode;

using FileTest = TestSupport::FileFixture;

TEST_F(FileTest, ModesDoWhatTheCLibrarysDo)
{
    struct Case
    {
        AccessMode access;
        char const* mode;
        bool needsFile;
        char const* after; // Of a file that held "old", once "XY" was written; null where writing fails.
    };
    for (Case const& c :
         {Case{AccessMode::Read, "rbS", true, nullptr}, Case{AccessMode::ReadWrite, "r+b", true, "XYd"},
          Case{AccessMode::AppendRead, "a+b", false, "oldXY"}, Case{AccessMode::CreateRead, "w+b", false, "XY"},
          Case{AccessMode::Append, "ab", false, "oldXY"}, Case{AccessMode::Create, "wb", false, "XY"}})
        for (bool const byText : {false, true}) {
            SCOPED_TRACE(c.mode);
            File file;
            auto open = [&] {
                return byText ? file.OpenEx(m_path.c_str(), c.mode) : file.OpenEx(m_path.c_str(), c.access);
            };
            std::filesystem::remove(m_path);
            EXPECT_EQ(open(), c.needsFile ? Result::NotFound : Result::Opened);
            WriteWholeFile(m_path, "old");
            EXPECT_EQ(open(), Result::Opened);
            EXPECT_EQ(std::fwrite("XY", 1, 2, file) == 2 && file.Close(), c.after != nullptr);
            file.Close();
            EXPECT_EQ(ReadWholeFile(m_path), c.after ? c.after : "old");
        }
    WriteWholeFile(m_path, "kept");
    File file;
    for (int const mode : {-1, 6}) {
        errno = 0;
        EXPECT_EQ(file.OpenEx(m_path.c_str(), static_cast<AccessMode>(mode)), Result::Other);
        EXPECT_EQ(errno, EINVAL);
    }
    for (char const* const mode : {"", "x", "rw", "rx", "wq"}) EXPECT_FALSE(file.Open(m_path.c_str(), mode)) << mode;
    EXPECT_FALSE(file.Open(nullptr, "r") || file.Open(m_path.c_str(), static_cast<char const*>(nullptr)));
    EXPECT_EQ(ReadWholeFile(m_path), "kept");

    std::string value;
    auto const& calls = Platform::GetFileCalls();
    bool const hasMarks = calls.setAttribute(m_path.c_str(), "probe", "1", 1) == 0;
    ASSERT_TRUE(file.Open(m_path.c_str(), AccessMode::Create, File::ShareMode::DenyNone, File::VisibilityMode::Hidden));
    EXPECT_EQ(calls.getAttribute(m_path.c_str(), Platform::c_hiddenAttribute, value) == 0, hasMarks);
}

TEST_F(FileTest, FailuresOfAnOpenHaveTheirResultErrorAndText)
{
    struct Case
    {
        int error;
        int result;
        int translated;
    };
    FaultyFiles faults;
    WriteWholeFile(m_path, "");
    for (Case const& c :
         {Case{ENOENT, 2, 2}, Case{EEXIST, 3, 3}, Case{EACCES, 6, 5}, Case{EPERM, 6, 6}, Case{EAGAIN, 7, 7},
          Case{ETIMEDOUT, 8, 8}, Case{ECONNREFUSED, 9, 9}, Case{EROFS, 11, 11}, Case{ENOMEM, 12, 12},
          Case{EISDIR, 13, 13}, Case{ENFILE, 14, 14}, Case{EMFILE, 14, 14}, Case{EFBIG, 15, 15}, Case{ENOSPC, 16, 16},
          Case{ENODEV, 17, 17}, Case{ENOSYS, 17, 17}, Case{EIO, 18, 18}})
    {
        SCOPED_TRACE(c.error);
        faults.Plan({.call = FileCall::Open, .error = c.error});
        std::FILE* file = nullptr;
        String8 text;
        errno = 0;
        Result const result = File::OpenUnmanaged(m_path.c_str(), "r", File::ShareMode::DenyNone,
                                                  File::VisibilityMode::Normal, file, &text);
        EXPECT_EQ(errno, c.error);
        EXPECT_EQ(static_cast<int>(result), c.result);
        EXPECT_EQ(file, nullptr);
        EXPECT_FALSE(text.IsEmpty());
        EXPECT_EQ(static_cast<int>(File::TranslateError(c.error)), c.translated);
    }
    faults.Plan({.call = FileCall::Open, .error = EACCES});
    File file;
    EXPECT_EQ(file.OpenEx((m_folder / "missing").c_str(), "r"), Result::NotFound) << "nothing is to be seen there";
    EXPECT_EQ(file.OpenEx(m_folder.GetPath().c_str(), "r"), Result::IsDirectory);
    EXPECT_EQ(file.OpenEx(m_path.c_str(), "wxb"), Result::Exists);

    std::string const pipe = m_folder / "pipe";
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0); // Nothing is waited for.
    for (char const* const mode : {"r", "w", "a+"}) EXPECT_EQ(file.OpenEx(pipe.c_str(), mode), Result::Other) << mode;
    File second;
    ASSERT_TRUE(file.Open(m_path.c_str(), "wb", File::ShareMode::DenyWrite));
    EXPECT_EQ(second.OpenEx(m_path.c_str(), "r+b"), Result::NotPermitted);
    EXPECT_EQ(second.OpenEx(m_path.c_str(), "r"), Result::Opened) << "readers are never refused";
    EXPECT_EQ(file.OpenEx(m_path.c_str(), "r+b"), Result::Opened) << "the first handle was closed before";
}

TEST_F(FileTest, PositionsSizesAndOwnership)
{
    File file;
    EXPECT_EQ(file.GetSize(), -1);
    EXPECT_EQ(file.GetPosition(), -1);
    EXPECT_FALSE(file.Flush() || file.ForceFlush() || file.SetPosition(0) || file.IsOpen());
    EXPECT_TRUE(file.Close());

    ASSERT_TRUE(file.Open(m_path.c_str(), AccessMode::CreateRead));
    EXPECT_EQ(std::fwrite("0123456789", 1, 10, file), 10u);
    EXPECT_EQ(file.GetSize(), 10) << "with what the stream holds";
    EXPECT_EQ(file.GetPosition(), 10);
    EXPECT_TRUE(file.SetPosition(2) && file.SetPosition(3, File::Offset::Current));
    EXPECT_EQ(file.GetPosition(), 5);
    EXPECT_TRUE(file.SetPosition(-1, File::Offset::End));
    EXPECT_EQ(file.GetPosition(), 9);
    char text[8] = {};
    EXPECT_EQ(std::fread(text, 1, 8, file), 1u);
    EXPECT_EQ(text[0], '9');
    EXPECT_TRUE(std::feof(file));
    EXPECT_TRUE(file.SetPosition(4, static_cast<File::Offset>(7)));
    EXPECT_EQ(file.GetPosition(), 4);
    EXPECT_TRUE(file.ForceFlush());
    EXPECT_FALSE(file.UpdateModifiedTimestamp());

    std::FILE* const raw = file.Detach();
    EXPECT_FALSE(file.IsOpen());
    file.Attach(raw);
    EXPECT_EQ(file.GetHandle(), raw);
    file.Close();
    EXPECT_EQ(File::GetSize(m_path.c_str()), 10);
    EXPECT_EQ(File::GetSize((m_folder / "missing").c_str()), -1);
}

TEST_F(FileTest, AFailedWriteShowsWhenTheStreamIsFlushedOrClosed)
{
    FaultyFiles faults;
    for (bool const closing : {false, true}) {
        File file;
        ASSERT_TRUE(file.Open(m_path.c_str(), AccessMode::Create));
        EXPECT_EQ(std::fwrite("x", 1, 1, file), 1u);
        faults.Plan({.call = FileCall::Write, .forEver = true, .error = ENOSPC});
        EXPECT_FALSE(closing ? file.Close() : file.Flush());
        faults.Clear();
        faults.Plan({.call = FileCall::Close, .error = EIO});
        file.Close();
        faults.Clear();
    }
    EXPECT_EQ(faults.GetOpenHandles(), 0);
}

TEST_F(FileTest, TheFirstOpenRaisesTheLimitOfOpenFiles)
{
    File file;
    file.Open(m_path.c_str(), "w");
    ::rlimit limit;
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
    EXPECT_GE(limit.rlim_cur, std::min<rlim_t>(8192, limit.rlim_max));
}

} // namespace
} // namespace Kernel

#include "libkernel/platform/PlatformFile.h"

#include "libkernel/platform/Errors.h"
#include "support/TempFolder.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace Kernel;
using namespace Kernel::Platform;
using TestSupport::ReadWholeFile;
using TestSupport::TempFolder;
using TestSupport::WriteWholeFile;

FileCalls const& Calls()
{
    return GetFileCalls();
}

class OpenHandle
{
public:
    OpenHandle(std::string const& path, OpenFlags const& flags) : error(Calls().open(path.c_str(), flags, handle)) {}
    ~OpenHandle()
    {
        if (handle != c_noHandle) Calls().close(handle);
    }

    FileHandle handle = c_noHandle;
    int error;
};

// Root may read everything, so a test about permissions runs as somebody else, who owns the given paths.
class AsOrdinaryUser
{
public:
    explicit AsOrdinaryUser(std::vector<std::string> const& paths) : m_isRoot(::geteuid() == 0)
    {
        for (auto const& path : paths) EXPECT_TRUE(!m_isRoot || ::chown(path.c_str(), c_nobody, c_nobody) == 0);
        EXPECT_TRUE(!m_isRoot || ::seteuid(c_nobody) == 0);
    }
    ~AsOrdinaryUser() { EXPECT_TRUE(!m_isRoot || ::seteuid(0) == 0); }

private:
    static constexpr uid_t c_nobody = 65534;
    bool const m_isRoot;
};

constexpr OpenFlags c_read = {.read = true};
constexpr OpenFlags c_readWrite = {.read = true, .write = true};
constexpr OpenFlags c_create = {.read = true, .write = true, .create = true};

TEST(PlatformFile, OpeningNamesWhyItFailed)
{
    TempFolder const folder;
    WriteWholeFile(folder / "file", "text");
    ASSERT_EQ(0, ::mkfifo((folder / "pipe").c_str(), 0600));
    ASSERT_EQ(0, ::symlink("file", (folder / "link").c_str()));
    ASSERT_EQ(0, ::symlink("nowhere", (folder / "dangling").c_str()));
    ASSERT_EQ(0, ::mkdir((folder / "sub").c_str(), 0700));

    struct Case
    {
        char const* what;
        char const* name;
        OpenFlags flags;
        int error;
    };
    OpenFlags exclusive = c_create;
    exclusive.exclusive = true;
    Case const cases[] = {
        {"missing", "none", c_read, ENOENT},
        {"missing folder", "none/file", c_create, ENOENT},
        {"a file as a folder", "file/x", c_read, ENOTDIR},
        {"exclusive on a file", "file", exclusive, EEXIST},
        {"exclusive on a dangling link", "dangling", exclusive, EEXIST},
        {"folder for reading", "sub", c_read, EISDIR},
        {"folder for writing", "sub", c_readWrite, EISDIR},
        {"folder, any kind", "sub", {.read = true, .anyKind = true}, EISDIR},
        {"pipe for reading", "pipe", c_read, ENXIO},
        {"pipe for writing", "pipe", {.write = true}, ENXIO},
        {"link not followed", "link", {.read = true, .noFollow = true}, ELOOP},
        {"link followed", "link", c_read, 0},
        {"neither reading nor writing", "file", {}, EINVAL},
        {"created", "new", exclusive, 0},
    };
    for (Case const& c : cases) {
        SCOPED_TRACE(c.what);
        OpenHandle const file(folder / c.name, c.flags);
        EXPECT_EQ(c.error, file.error);
        EXPECT_EQ(c.error != 0, file.handle == c_noHandle);
    }
    FileHandle handle;
    EXPECT_EQ(EINVAL, Calls().open(nullptr, c_read, handle));
    EXPECT_EQ("", ReadWholeFile(folder / "nowhere")) << "an exclusive create went through a link";
}

TEST(PlatformFile, ShareModesRefuseWhomTheyName)
{
    TempFolder const folder;
    std::string const path = folder / "file";
    WriteWholeFile(path, "text");
    OpenFlags const openers[] = {
        c_read,
        {.read = true, .share = FileShare::DenyWrite},
        {.write = true},
        c_readWrite,
        {.read = true, .write = true, .share = FileShare::DenyWrite},
    };
    // Row: who holds the file. Column: who comes.
    bool const granted[5][5] = {
        {true, true, true, true, true},   {true, true, false, false, false},  {true, false, true, true, false},
        {true, false, true, true, false}, {true, false, false, false, false},
    };
    for (int i = 0; i < 5; ++i) {
        for (int k = 0; k < 5; ++k) {
            SCOPED_TRACE(std::to_string(i) + " / " + std::to_string(k));
            OpenHandle const first(path, openers[i]);
            ASSERT_EQ(0, first.error);
            OpenHandle const second(path, openers[k]);
            EXPECT_EQ(granted[i][k] ? 0 : EACCES, second.error);
        }
    }
    OpenHandle const after(path, openers[4]);
    EXPECT_EQ(0, after.error) << "a closed handle still denies";
}

TEST(PlatformFile, DenyWriteHoldsBetweenProcesses)
{
    TempFolder const folder;
    std::string const path = folder / "file";
    OpenFlags flags = c_create;
    flags.share = FileShare::DenyWrite;
    OpenHandle const mine(path, flags);
    ASSERT_EQ(0, mine.error);
    pid_t const child = ::fork();
    if (child == 0) {
        // The inherited descriptor shares our lock, but an opening of its own is another opener.
        OpenHandle const writer(path, c_readWrite);
        OpenHandle const reader(path, c_read);
        ::_exit(writer.error == EACCES && reader.error == 0 ? 0 : 1);
    }
    int status = 1;
    ASSERT_EQ(child, ::waitpid(child, &status, 0));
    EXPECT_EQ(0, status);
}

TEST(PlatformFile, WriteOnlyFileCanBeWritten)
{
    TempFolder const folder;
    WriteWholeFile(folder / "file", "text");
    ASSERT_EQ(0, Calls().setMode((folder / "file").c_str(), 0200));
    AsOrdinaryUser const user({folder.GetPath(), folder / "file"});
    OpenHandle const file(folder / "file", {.write = true});
    EXPECT_EQ(0, file.error);
    OpenHandle const denier(folder / "file", {.write = true, .share = FileShare::DenyWrite});
    EXPECT_EQ(0, denier.error);
    OpenHandle const late(folder / "file", {.write = true});
    EXPECT_EQ(EACCES, late.error);
}

TEST(PlatformFile, CountsStopAtTheEndAndOffsetsAreChecked)
{
    TempFolder const folder;
    OpenHandle const file(folder / "file", c_create);
    char data[16] = "0123456789";
    EXPECT_EQ(10u, Calls().write(file.handle, data, 10).count);

    IoResult result = Calls().readAt(file.handle, data, 16, 4);
    EXPECT_EQ(6u, result.count);
    EXPECT_EQ(0, result.error);
    result = Calls().readAt(file.handle, data, 16, 10);
    EXPECT_EQ(0u, result.count + static_cast<u64>(result.error));
    result = Calls().readAt(file.handle, data, 16, INT64_MAX - 2);
    EXPECT_EQ(0u, result.count);
    EXPECT_EQ(EINVAL, Calls().readAt(file.handle, data, 1, ~u64{0}).error);
    EXPECT_EQ(EFBIG, Calls().writeAt(file.handle, data, 16, INT64_MAX - 2).error);
    EXPECT_EQ(EFBIG, Calls().setSize(file.handle, ~u64{0}));

    u64 at = 7;
    EXPECT_EQ(EINVAL, Calls().seek(file.handle, -1, SeekFrom::Start, at));
    EXPECT_EQ(7u, at);
    EXPECT_EQ(0, Calls().seek(file.handle, 0, SeekFrom::Current, at));
    EXPECT_EQ(10u, at) << "reading at an offset moved the position";
    EXPECT_EQ(0, Calls().seek(file.handle, -3, SeekFrom::End, at));
    EXPECT_EQ(7u, at);
    EXPECT_EQ(EBADF, Calls().read(c_noHandle, data, 1).error);
    EXPECT_EQ(EBADF, Calls().flush(c_noHandle, FlushKind::Data));
}

TEST(PlatformFile, FolderOfAPathIsWhatItsNameLiesIn)
{
    constexpr char const* c_folders[][2] = {{"/a/b", "/a"}, {"/a", "/"}, {"a", "."}, {"a/b/", "a"},
                                            {"a//b", "a"},  {"/", "/"},  {"", "."},  {"//a", "/"}};
    for (auto const& [path, folder] : c_folders) EXPECT_EQ(folder, GetFolderOf(path)) << path;
    EXPECT_EQ(".", GetFolderOf(nullptr));
    TempFolder const folder;
    EXPECT_NE(0, Calls().unlink(folder.GetPath().c_str())) << "folders are left alone";
    EXPECT_EQ(ENOENT, Calls().flushFolder((folder / "none").c_str()));
}

} // namespace

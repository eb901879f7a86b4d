#include "libkernel/filesystem/FileSystem.h"

#include "libkernel/concurrency/TimeStamp.h"
#include "libkernel/platform/Errors.h"
#include "libkernel/platform/FileMarks.h"
#include "support/FaultyFiles.h"
#include "support/FileFixture.h"
#include "support/Rows.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

namespace Kernel {
namespace {

using namespace std::string_literals;
using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::S;

using FileSystemTest = TestSupport::FileFixture;

TEST_F(FileSystemTest, KindsOfEntriesAreToldApart)
{
    using Kind = FileSystem::PathResult;
    ASSERT_EQ(::mkfifo((m_folder / "pipe").c_str(), 0600), 0);
    EXPECT_FALSE(FileSystem::HasReadAccess(At("pipe"))) << "nor is it waited for";
    EXPECT_FALSE(FileSystem::CompareFileWithMemory(At("pipe"), "", 0));
    EXPECT_FALSE(FileSystem::CopyFile(At("pipe"), At("copy")));
    EXPECT_EQ(FileSystem::GetFileSize(At("pipe")), -1);
    std::string const zero = (m_folder / "file") + std::string(1, '\0') + "x";
    for (auto const& [path, kind, size] : Rows<String8, Kind, i64>{
             {Make("file", "12345"), Kind::File, 5},
             {MakeFolder("folder"), Kind::Directory, -1},
             {MakeLink("toFile", "file"), Kind::File, 5},
             {MakeLink("toFolder", "folder"), Kind::Directory, -1},
             {MakeLink("toNothing", "nothing"), Kind::Nothing, -1},
             {At("missing"), Kind::Nothing, -1},
             {"", Kind::Nothing, -1},
             {S(zero), Kind::Nothing, -1},
         })
    {
        SCOPED_TRACE(path.GetData());
        EXPECT_EQ(FileSystem::TestPath(path), kind);
        EXPECT_EQ(FileSystem::Exists(path), kind != Kind::Nothing);
        EXPECT_EQ(FileSystem::IsFile(path), kind == Kind::File);
        EXPECT_EQ(FileSystem::IsDirectory(path), kind == Kind::Directory);
        EXPECT_EQ(FileSystem::GetFileSize(path), size);
        EXPECT_EQ(FileSystem::HasReadAccess(path), kind == Kind::File);
    }
    EXPECT_EQ(FileSystem::ResolveLink(MakeLink("chain", "toFile")), At("toFile"));
    EXPECT_EQ(FileSystem::ResolveLink(At("toFile")), At("file"));
    EXPECT_EQ(FileSystem::ResolveLink(MakeLink("absolute", "/etc")), "/etc");
    EXPECT_EQ(FileSystem::ResolveLink(At("missing")), At("missing"));
    EXPECT_TRUE(FileSystem::IsDirectoryEmpty(At("folder")));
    EXPECT_FALSE(FileSystem::IsDirectoryEmpty(S(m_folder.GetPath())));
    EXPECT_FALSE(FileSystem::IsDirectoryEmpty(At("file")));
    EXPECT_TRUE(FileSystem::DeleteFilesFromFolder(S(m_folder.GetPath())));
    EXPECT_FALSE(FileSystem::Exists(At("file")) || FileSystem::DeleteFilesFromFolder(At("missing")));
    EXPECT_TRUE(FileSystem::IsDirectory(At("folder")));
}

TEST_F(FileSystemTest, FilenameIsTheLastPartAsTheFileSystemSpellsIt)
{
    Make("Name.TXT");
    EXPECT_EQ(FileSystem::GetFilename(At("Name.TXT")), "Name.TXT");
    EXPECT_EQ(FileSystem::GetFilename(At("missing.doc")), "missing.doc");
    EXPECT_EQ(FileSystem::GetFilename("a/b/"), "b");
    EXPECT_EQ(FileSystem::GetFilename("plain"), "plain");
    EXPECT_EQ(FileSystem::GetFilename(""), "");

    // A folder that ignores case: what is asked for is found, and listed in another spelling.
    static Platform::FileCalls s_calls;
    s_calls = Platform::GetSystemFileCalls();
    s_calls.stat = [](char const* path, bool follow, Platform::FileInfo& info) {
        std::string const asked = path;
        auto const at = asked.find("name.txt");
        return Platform::GetSystemFileCalls().stat(
            (at == asked.npos ? asked : asked.substr(0, at) + "Name.TXT").c_str(), follow, info);
    };
    Platform::SetFileCalls(&s_calls);
    EXPECT_EQ(FileSystem::GetFilename(At("name.txt")), "Name.TXT");
    Platform::SetFileCalls(nullptr);
}

TEST_F(FileSystemTest, RefusedFileIsAPermissionErrorOnlyWhereItStands)
{
    FaultyFiles faults;
    Make("file");
    for (auto const& [name, error, isPermission] : Rows<char const*, int, bool>{{"file", EACCES, true},
                                                                                {"file", EPERM, true},
                                                                                {"missing", EACCES, false},
                                                                                {"file", ENOENT, false},
                                                                                {"file", 0, false}})
    {
        faults.Clear();
        if (error) faults.Plan({.call = FileCall::Open, .forEver = true, .error = error});
        EXPECT_EQ(FileSystem::HasPermissionError(At(name)), isPermission) << name << error;
    }
    EXPECT_EQ(faults.GetOpenHandles(), 0);
}

TEST_F(FileSystemTest, SameFileIsToldByIdentityAndMissingOnesThrow)
{
    String8 const a = Make("a"), b = Make("b");
    std::filesystem::create_hard_link(m_folder / "a", m_folder / "hard");
    EXPECT_TRUE(FileSystem::IsSameFile(a, At("hard")));
    EXPECT_TRUE(FileSystem::IsSameFile(a, MakeLink("soft", "a")));
    EXPECT_TRUE(FileSystem::IsSameFile(At("none"), At("none")));
    EXPECT_FALSE(FileSystem::IsSameFile(a, b));
    auto const throws = testing::ThrowsMessage<std::filesystem::filesystem_error>(testing::HasSubstr("equivalent"));
    EXPECT_THAT([&] { FileSystem::IsSameFile(At("none"), a); }, throws);
    EXPECT_THAT([&] { FileSystem::IsSameFile(a, At("none")); }, throws);
}

TEST_F(FileSystemTest, MarksStayWithTheFileWhereTheFileSystemHasThem)
{
    String8 const path = Make("file");
    if (!FileSystem::SetFileHidden(path, true)) { // A folder on such a file system.
        EXPECT_EQ(FileSystem::GetFileHidden(path), std::make_pair(false, false));
        EXPECT_EQ(FileSystem::GetDropBoxIgnore(path), std::make_pair(false, false));
        EXPECT_FALSE(FileSystem::SetDropBoxIgnore(path, true));
        return;
    }
    EXPECT_EQ(FileSystem::GetFileHidden(path), std::make_pair(true, true));
    EXPECT_TRUE(FileSystem::SetFileHidden(path, false));
    EXPECT_TRUE(FileSystem::SetFileHidden(path, false));
    EXPECT_EQ(FileSystem::GetFileHidden(path), std::make_pair(true, false));

    EXPECT_EQ(FileSystem::GetDropBoxIgnore(path), std::make_pair(false, false));
    EXPECT_TRUE(FileSystem::SetDropBoxIgnore(path, true));
    EXPECT_EQ(FileSystem::GetDropBoxIgnore(path), std::make_pair(true, true));
    for (std::string const& value : {"\0\0\0\0"s, "\0\1\0\0"s, "1"s, "\0\0\0"s, ""s}) {
        auto const& calls = Platform::GetFileCalls();
        calls.setAttribute(path.GetData(), Platform::c_syncIgnoreAttribute, value.data(), value.size());
        EXPECT_EQ(FileSystem::GetDropBoxIgnore(path), std::make_pair(true, value != "\0\0\0\0"s));
    }
    EXPECT_TRUE(FileSystem::SetDropBoxIgnore(path, false));
    EXPECT_TRUE(FileSystem::SetDropBoxIgnore(path, false));
    EXPECT_EQ(FileSystem::GetDropBoxIgnore(path), std::make_pair(false, false));

    // A file system without marks could not say.
    FaultyFiles faults;
    faults.Plan({.call = FileCall::GetAttribute, .forEver = true, .error = EOPNOTSUPP});
    EXPECT_EQ(FileSystem::GetFileHidden(path), std::make_pair(false, false));
    EXPECT_EQ(FileSystem::GetDropBoxIgnore(path), std::make_pair(false, false));
    EXPECT_TRUE(FileSystem::CopyFileAttributes(path, Make("other")));
    faults.Plan({.call = FileCall::SetAttributes, .forEver = true, .error = EOPNOTSUPP});
    EXPECT_FALSE(FileSystem::SetFileHidden(path, true) || FileSystem::SetDropBoxIgnore(path, true));
}

TEST_F(FileSystemTest, AttributesAreCopiedByPathAndByDescriptor)
{
    String8 const from = Make("from"), to = Make("to");
    ::chmod(from.GetData(), 0440);
    bool const hasMarks = FileSystem::SetFileHidden(from, true);
    EXPECT_TRUE(FileSystem::FileIsReadOnly(from));
    EXPECT_FALSE(FileSystem::FileIsReadOnly(to));
    EXPECT_FALSE(FileSystem::FileIsReadOnly(At("missing")));

    EXPECT_TRUE(FileSystem::CopyFileAttributes(from, to));
    EXPECT_TRUE(FileSystem::FileIsReadOnly(to));
    EXPECT_EQ(FileSystem::GetFileHidden(to).second, hasMarks);

    String8 const plain = Make("plain");
    ::chmod(plain.GetData(), 0600);
    int const in = ::open(plain.GetData(), O_RDONLY), out = ::open(to.GetData(), O_RDONLY);
    EXPECT_TRUE(FileSystem::CopyFileAttributes(in, out));
    EXPECT_FALSE(FileSystem::CopyFileAttributes(in, -1));
    ::close(in);
    ::close(out);
    EXPECT_FALSE(FileSystem::FileIsReadOnly(to));
    EXPECT_FALSE(FileSystem::GetFileHidden(to).second);
    EXPECT_FALSE(FileSystem::CopyFileAttributes(At("missing"), to));
}

TEST_F(FileSystemTest, EachTimeIsSetWithoutTheOther)
{
    String8 const path = Make("file");
    EXPECT_TRUE(FileSystem::SetModifiedTime(path, TimeStamp(1'000'000'000)));
    EXPECT_TRUE(FileSystem::SetAccessTime(path, TimeStamp(-5)));
    TimeStamp modified, access;
    EXPECT_TRUE(FileSystem::GetModifiedTime(path, modified));
    EXPECT_TRUE(FileSystem::GetAccessTime(path, access));
    EXPECT_EQ(modified, TimeStamp(1'000'000'000));
    EXPECT_EQ(access, TimeStamp(-5));
    std::tm fields = {};
    EXPECT_TRUE(FileSystem::GetModifiedTime(path, fields, true));
    EXPECT_EQ(fields.tm_year, 101);
    EXPECT_EQ(fields.tm_hour, 1);
    EXPECT_FALSE(FileSystem::SetModifiedTime(path, TimeStamp(INT64_MAX)));
    EXPECT_FALSE(FileSystem::GetModifiedTime(At("missing"), modified));

    ::timespec const half[2] = {{-2, 500'000'000}, {-2, 500'000'000}};
    ASSERT_EQ(::utimensat(AT_FDCWD, path.GetData(), half, 0), 0);
    EXPECT_TRUE(FileSystem::GetModifiedTime(path, modified));
    EXPECT_EQ(modified, TimeStamp(-2));
}

TEST_F(FileSystemTest, ComparisonNeedsEqualLengthAndBytes)
{
    std::string big(3'000'000, 'x');
    String8 const a = Make("a", big), b = Make("b", big);
    std::string other = big;
    other.back() = 'y';
    String8 const differs = Make("differs", other), longer = Make("longer", big + "x"), empty = Make("empty", "");
    EXPECT_TRUE(FileSystem::CompareFileWithFile(a, b));
    EXPECT_FALSE(FileSystem::CompareFileWithFile(a, differs));
    EXPECT_FALSE(FileSystem::CompareFileWithFile(a, longer));
    EXPECT_FALSE(FileSystem::CompareFileWithFile(a, At("missing")));
    EXPECT_TRUE(FileSystem::CompareFileWithMemory(a, big.data(), big.size()));
    EXPECT_FALSE(FileSystem::CompareFileWithMemory(a, other.data(), other.size()));
    EXPECT_TRUE(FileSystem::CompareFileWithMemory(empty, nullptr, 0));
    EXPECT_FALSE(FileSystem::CompareFileWithMemory(At("missing"), "", 0));

    FaultyFiles faults;
    EXPECT_FALSE(FileSystem::CompareFileWithMemory(longer, big.data(), big.size()));
    EXPECT_EQ(faults.GetCount(FileCall::Read), 0);
    faults.Plan({.call = FileCall::Read, .n = 2, .error = EIO});
    EXPECT_FALSE(FileSystem::CompareFileWithFile(a, b));
    EXPECT_EQ(faults.GetOpenHandles(), 0);
}

TEST_F(FileSystemTest, DirectoriesAreMadeUpToTheFileName)
{
    Make("file");
    // A folder that must stand afterwards, and a name that may not.
    for (auto const& [path, directory, absent] :
         Rows<std::string, std::string, std::string>{{"a/b/c", "a/b/c", ""},
                                                     {"a/b/c", "a/b/c", ""},
                                                     {"d//e/doc.txt", "d/e", "d/e/doc.txt"},
                                                     {"f.g/", "f.g", ""},
                                                     {"file/x", "", "file/x"},
                                                     {"h/.i", "h", "h/.i"}})
    {
        SCOPED_TRACE(path);
        EXPECT_EQ(FileSystem::CreateDirectoryRecursive(At(path)), !directory.empty());
        EXPECT_TRUE(FileSystem::IsDirectory(At(directory)));
        EXPECT_FALSE(!absent.empty() && FileSystem::Exists(At(absent)));
    }
    EXPECT_FALSE(FileSystem::CreateDirectoryRecursive(""));
    EXPECT_TRUE(FileSystem::CreateDirectoryRecursive("/"));

    FaultyFiles faults;
    faults.Plan({.call = FileCall::MakeFolder, .n = 2, .error = ENOSPC});
    EXPECT_FALSE(FileSystem::CreateDirectoryRecursive(At("p/q/r")));
    EXPECT_TRUE(FileSystem::IsDirectory(At("p")));
    EXPECT_FALSE(FileSystem::Exists(At("p/q")));
}

TEST_F(FileSystemTest, PathOfAHundredThousandElementsIsRefusedWhole)
{
    std::string path = m_folder.GetPath();
    for (int i = 0; i < 100'000; ++i) path += "/a";
    EXPECT_FALSE(FileSystem::CreateDirectoryRecursive(S(path)));
    EXPECT_TRUE(FileSystem::IsDirectoryEmpty(S(m_folder.GetPath())));
    EXPECT_FALSE(FileSystem::Exists(S(path)));
    EXPECT_FALSE(FileSystem::Delete(S(path), 0) || FileSystem::DeleteFilesFromFolder(S(path)));
}

TEST_F(FileSystemTest, UniqueNamesMeetNothingAndTheTemporaryPlaceIsMade)
{
    String8 const folder = S(m_folder.GetPath());
    String8 const first = FileSystem::GetUniqueFilename(folder, "n%1.x");
    EXPECT_NE(first, FileSystem::GetUniqueFilename(folder, "n%1.x"));
    EXPECT_TRUE(first.BeginsWith(folder + "/n"));
    EXPECT_FALSE(FileSystem::Exists(first));
    EXPECT_EQ(FileSystem::GetUniqueFilename(folder, "same"), At("same"));
    MakeLink("same", "nowhere");
    EXPECT_EQ(FileSystem::GetUniqueFilename(folder, "same"), "");

    FileSystem::SetTemporaryDirectory(At("t/u"));
    EXPECT_TRUE(FileSystem::IsDirectory(At("t/u")));
    EXPECT_EQ(FileSystem::GetUniqueTemporaryFilename("f"), At("t/u/f"));
    FileSystem::SetTemporaryDirectory("");
    EXPECT_EQ(FileSystem::GetTemporaryDirectory(), "");
    EXPECT_EQ(FileSystem::GetFilename(FileSystem::GetExecutablePath()), "test_filesystem");
    for (String8 const& place : {FileSystem::GetExecutableDirectory(), FileSystem::GetCurrentDirectory()})
        EXPECT_TRUE(FileSystem::IsDirectory(place));
    EXPECT_FALSE(FileSystem::GetHomeDirectory().IsEmpty());
}

} // namespace
} // namespace Kernel

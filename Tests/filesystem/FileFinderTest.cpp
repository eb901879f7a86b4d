#include "libkernel/filesystem/FileFinder.h"

#include "libkernel/filesystem/FileEnumerator.h"
#include "support/FileFixture.h"

#include <vector>

namespace Kernel {
namespace {

namespace fs = std::filesystem;
using TestSupport::S;
using TestSupport::TempFolder;
using TestSupport::WriteWholeFile;

/// "kind name" of each entry, with an "l" before links.
std::vector<std::string> Describe(std::vector<FileEnumerator::PathRec> const& paths, size_t cut)
{
    std::vector<std::string> lines;
    for (auto const& p : paths)
        lines.push_back((p.isLink ? "l" : "") + std::to_string(int(p.kind)) + " " + (p.path.GetData() + cut));
    return lines;
}

using Lines = std::vector<std::string>;

TEST(FileEnumeratorTest, FolderIsListedWithKindsAndInOrder)
{
    TempFolder folder;
    fs::create_directory(folder / "dir");
    WriteWholeFile(folder / "b", "");
    WriteWholeFile(folder / ".a", "");
    WriteWholeFile(folder / "\xFF", "");
    fs::create_symlink("dir", folder / "toDir");
    fs::create_symlink("gone", folder / "toGone");
    Lines const expected = {"1 .a", "1 b", "2 dir", "l2 toDir", "l1 toGone", "1 \xFF"};
    auto const names = FileEnumerator::Create(S(folder.GetPath()), false);
    ASSERT_TRUE(names);
    EXPECT_EQ(Describe(names->GetPaths(), 0), expected);
    auto const paths = FileEnumerator::Create(S(folder.GetPath() + "/"), true);
    ASSERT_TRUE(paths);
    EXPECT_EQ(Describe(paths->GetPaths(), folder.GetPath().size() + 1), expected);

    EXPECT_FALSE(FileEnumerator::Create("", false));
    EXPECT_FALSE(FileEnumerator::Create(S(folder / "missing"), false));
    EXPECT_FALSE(FileEnumerator::Create(S(folder / "b"), false));
}

TEST(FileFinderTest, NameIsFoundInEveryFolderWithoutRegardToCase)
{
    TempFolder folder;
    fs::create_directories(folder / "b/deep/NAME.txt");
    fs::create_directories(folder / "c");
    WriteWholeFile(folder / "a", "");
    WriteWholeFile(folder / "name.TXT", "");
    WriteWholeFile(folder / "b/Name.txt", "");
    WriteWholeFile(folder / "b/deep/NAME.txt/name.txt", "");
    WriteWholeFile(folder / "c/name.txt2", "");
    WriteWholeFile(folder / "c/STRASSE", "");
    WriteWholeFile(folder / "c/stra\xC3\x9F\x65", "");
    fs::create_symlink("..", folder / "b/up"); // Circles are not entered.
    fs::create_symlink("self", folder / "b/self");
    auto const found = FileFinder::Create(S(folder.GetPath()), "Name.TXT");
    size_t const cut = folder.GetPath().size() + 1;
    EXPECT_EQ(Describe(found->GetPaths(), cut),
              (Lines{"1 b/Name.txt", "2 b/deep/NAME.txt", "1 b/deep/NAME.txt/name.txt", "1 name.TXT"}));
    EXPECT_EQ(found->GetErrorType(), FileFinder::ErrorType::None);

    auto const more = FileFinder::Create(found, S(folder / "c"), "stra\xC3\x9F\x65");
    EXPECT_EQ(more, found.Get());
    EXPECT_EQ(Describe(more->GetPaths(), cut).size(), 6u);
    EXPECT_TRUE(FileFinder::Create(S(folder / "missing"), "a")->GetPaths().empty());
}

} // namespace
} // namespace Kernel

#include "libkernel/filesystem/PathTraits.h"

#include "libkernel/core/Exception.h"
#include "libkernel/filesystem/Path.h"
#include "support/Rows.h"

#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace Kernel {
namespace {

/// A grammar in UTF-8 with strings for buffers. UTF-16 is the same code, and the fuzzer's inputs hold both against each
/// other.
template <class Traits>
struct Strings : Traits
{
    static std::string Canonicalize(std::string text)
    {
        text.resize(Traits::Canonicalize(text.data(), static_cast<int>(text.size())));
        return text;
    }
    static std::pair<bool, std::string> CanonicalizeSafe(std::string const& in)
    {
        std::string text(in.size() + 1, '#');
        int n = static_cast<int>(in.size());
        bool const isSafe = Traits::CanonicalizeSafe(text.data(), in.c_str(), n);
        text.resize(n);
        return {isSafe, text};
    }
    static std::string Combine(std::string const& x, std::string const& y, int capacity = 100)
    {
        std::string text(100, '#');
        int const xn = static_cast<int>(x.size()), yn = static_cast<int>(y.size());
        text.resize(Traits::Combine(text.data(), capacity, x.c_str(), xn, y.c_str(), yn));
        return text;
    }
    static std::string Append(std::string path, std::string const& tail, int capacity = 100)
    {
        int const n = static_cast<int>(path.size()), t = static_cast<int>(tail.size());
        path.resize(100);
        path.resize(Traits::Append(path.data(), tail.c_str(), capacity, n, t));
        return path;
    }
};

using Dos = Strings<PathTraitsDos>;
using Unix = Strings<PathTraitsUnix>;

TEST(PathTraitsTest, CanonicalPathIsTheShortestFormOfTheSamePlace)
{
    for (auto const& [in, dos, unix] : Rows<char const*, char const*, char const*>{
             {"", "", ""},
             {".", ".", "."},
             {"/a//b/./c/", "\\a\\b\\c", "/a/b/c"},
             {"a/../../b", "..\\b", "../b"},
             {"./", "", ""},
             {"a/..", "", ""},
             {"/", "\\", "/"},
             {"a/.b/..c", "a\\.b\\..c", "a/.b/..c"},
             {"~/x/../..", "", "~/"},
             {"a\\..\\..\\b", "..\\b", "a\\..\\..\\b"},
             {"c:\\..\\b", "c:\\b", "c:\\..\\b"},
             {"c:/", "c:\\", "c:"},
             {"c:a\\b\\..\\..\\..\\d", "c:d", "c:a\\b\\..\\..\\..\\d"},
             {"\\\\server/share/a\\..\\..", "\\\\server\\share", "\\\\server/share/a\\..\\.."},
             {"\\\\server\\share\\", "\\\\server\\share", "\\\\server\\share\\"},
             {"\\\\?\\c:\\..\\b", "\\\\?\\c:\\b", "\\\\?\\c:\\..\\b"},
             {"\\\\", "\\\\", "\\\\"}})
    {
        EXPECT_EQ(Dos::Canonicalize(in), dos) << in;
        EXPECT_EQ(Unix::Canonicalize(in), unix) << in;
    }
}

TEST(PathTraitsTest, ClimbingAboveTheRootIsToldOnlyForRootedPaths)
{
    using Pair = std::pair<bool, std::string>;
    EXPECT_EQ(Dos::CanonicalizeSafe("c:\\..\\b"), Pair(false, "c:\\b"));
    EXPECT_EQ(Dos::CanonicalizeSafe("\\\\s\\h\\a\\..\\.."), Pair(false, "\\\\s\\h"));
    EXPECT_EQ(Dos::CanonicalizeSafe("..\\..\\b"), Pair(true, "..\\..\\b"));
    EXPECT_EQ(Unix::CanonicalizeSafe("/a/../../b"), Pair(false, "/b"));
    EXPECT_EQ(Unix::CanonicalizeSafe("~/../b"), Pair(false, "~/b"));
    EXPECT_EQ(Unix::CanonicalizeSafe("/a/../b/"), Pair(true, "/b"));
}

TEST(PathTraitsTest, CombinedPathKeepsTheFirstRootAndAppendLeavesOneSeparator)
{
    using Operation = std::string (*)(std::string const&, std::string const&);
    Operation const dosCombine = [](auto const& x, auto const& y) { return Dos::Combine(x, y); };
    Operation const combine = [](auto const& x, auto const& y) { return Unix::Combine(x, y); };
    Operation const dosAppend = [](auto const& x, auto const& y) { return Dos::Append(x, y); };
    Operation const append = [](auto const& x, auto const& y) { return Unix::Append(x, y); };
    for (auto const& [operation, x, y, result] :
         Rows<Operation, char const*, char const*, char const*>{{dosCombine, "c:\\a", "d:\\b", "c:\\a"},
                                                                {dosCombine, "c:\\a\\", "b/c", "c:\\a\\b\\c"},
                                                                {dosCombine, "c:", "b", "c:\\b"},
                                                                {dosCombine, "c:\\a\\b", "..\\..\\..\\d", "c:\\d"},
                                                                {dosCombine, "\\\\s\\h\\x", "..\\..\\y", "\\\\s\\h\\y"},
                                                                {combine, "/a/./b", "../c//d/", "/a/c/d"},
                                                                {combine, "a", "../../b", "../b"},
                                                                {combine, "", "b", "b"},
                                                                {combine, "a/b", "/c", "a/b"},
                                                                {combine, "a/../b", "~/c", "b"},
                                                                {dosAppend, "a", "b", "a\\b"},
                                                                {dosAppend, "a/", "\\b", "a/b"},
                                                                {dosAppend, "a", "/b", "a/b"},
                                                                {append, "a/", "//b", "a/b"},
                                                                {append, "a\\", "b", "a\\/b"},
                                                                {append, "", "b", "b"}})
        EXPECT_EQ(operation(x, y), result) << x << " " << y;
    EXPECT_EQ(Unix::Combine("/abc", "de", 8), "/abc/de");
    EXPECT_EQ(Unix::Append("/", "b", 3), "/b");
    EXPECT_THROW(Unix::Combine("/abc", "de", 7), InvalidArgException);
    EXPECT_THROW(PathTraitsUnix::Combine(nullptr, 9, "a", 1, "b", 1), InvalidArgException);
    EXPECT_THROW(Unix::Append("/", "b", 2), InvalidArgException);
    EXPECT_THROW(Unix::Append("ab", "cd", 5), InvalidArgException);
    EXPECT_THROW(Unix::Append("a", ""), InvalidArgException);
    EXPECT_THROW(PathTraitsUnix::Append(nullptr, "a", 8, 1, 1), InvalidArgException);
}

TEST(PathTraitsTest, RootsAreToldByEachGrammar)
{
    for (auto const& [path, isDosRelative, isUnixRelative] : Rows<char const*, bool, bool>{
             {"", true, true},
             {"a", true, true},
             {"a/b", true, true},
             {"/a", false, false},
             {"\\a", false, true},
             {"c:", false, true},
             {"c:a", false, true},
             {"1:a", true, true},
             {"~", true, true},
             {"~/a", true, false},
             {"\\\\s", false, true},
             {"../a", true, true},
         })
    {
        SCOPED_TRACE(path);
        EXPECT_EQ(Dos::IsRelative(path), isDosRelative);
        EXPECT_EQ(Dos::IsRoot(path), !isDosRelative);
        EXPECT_EQ(Unix::IsRelative(path), isUnixRelative);
    }
    EXPECT_TRUE(PathTraitsDos::IsRelative(nullptr));
    EXPECT_FALSE(PathTraitsUnix::IsRoot(nullptr));

    EXPECT_TRUE(Dos::IsSameRoot("c:\\a", "C:b"));
    EXPECT_FALSE(Dos::IsSameRoot("c:\\a", "d:\\a"));
    EXPECT_FALSE(Dos::IsSameRoot("c:\\a", "\\a"));
    EXPECT_TRUE(Dos::IsSameRoot("/a", "\\b"));
    EXPECT_FALSE(Dos::IsSameRoot("a", "a"));
    EXPECT_TRUE(Unix::IsSameRoot("/a", "/b"));
    EXPECT_FALSE(PathTraitsDos::IsSameRoot("c:", nullptr));
}

TEST(PathTraitsTest, CommonPrefixEndsBehindASeparator)
{
    EXPECT_EQ(Dos::CommonPrefixLength("c:\\a\\b", "C:/A/c"), 5);
    EXPECT_EQ(Dos::CommonPrefixLength("c:x", "c:y"), 2);
    EXPECT_EQ(Dos::CommonPrefixLength("ab\\c", "ab/c"), 3);
    EXPECT_EQ(Unix::CommonPrefixLength("c:x", "c:y"), 0);
    EXPECT_EQ(Unix::CommonPrefixLength("/a/bc", "/A/bd"), 3);
    EXPECT_EQ(Unix::CommonPrefixLength("/a", "/a/b"), 1);
    EXPECT_EQ(Unix::CommonPrefixLength("a\\b", "a\\b"), 0);
    EXPECT_EQ(PathTraitsDos::CommonPrefixLength(nullptr, "a"), 0);
}

TEST(PathTraitsTest, DosPathWithForbiddenCharactersIsInvalid)
{
    for (char const* good : {"a", "c:\\a b\\c.d", "c:", "\\\\server\\share", "/a/b/", "\xC3\xA9\\\xC3\xB6"})
        EXPECT_TRUE(PathTraitsDos::IsValidPath(good)) << good;
    for (char const* bad : {"", "a*", "a?b", "<", "a>", "a|b", "\"a\"", "a\nb", "1:", "ab:c", "a\\\\b", "//a", "\\/a",
                            "/\\a", "\\\\\\a", "\\\\?\\c:\\a"})
        EXPECT_FALSE(Dos::IsValidPath(bad)) << bad;
    EXPECT_FALSE(PathTraitsDos::IsValidPath(nullptr));
    EXPECT_FALSE(Unix::IsValidPath(""));
    EXPECT_TRUE(Unix::IsValidPath("a*?:b"));
}

TEST(PathTraitsTest, LongPathIsBroughtDownWithoutRecursion)
{
    std::string path = "/";
    for (int i = 0; i < 100000; ++i) path += "a/";
    for (int i = 0; i < 99999; ++i) path += "../";
    EXPECT_EQ(Unix::Canonicalize(path), "/a");
}

TEST(PathTest, ElementsNamesAndFoldersFollowTheGrammar)
{
    EXPECT_EQ(PathUnix("a/./b/", true).GetString(), "a/b");
    EXPECT_EQ(PathUnix("a/./b/").GetString(), "a/./b/");
    EXPECT_EQ(PathUnix::Join({"", "usr", "lib"}).GetString(), "/usr/lib");
    EXPECT_EQ(PathUnix::Join({"a", "", "b"}).GetString(), "a/b");
    EXPECT_EQ(PathDos::Join({"", "", "server", "share"}).GetString(), "\\\\server\\share");

    PathUnix path("dir");
    EXPECT_TRUE(path.AppendName("name", "txt"));
    EXPECT_TRUE(path.AppendName("bare", ""));
    EXPECT_FALSE(path.AppendName("", ""));
    EXPECT_EQ(path.GetString(), "dir/name.txt/bare");
    EXPECT_EQ(path.GetLastElement(), "bare");
    path.Append(path.GetString());
    EXPECT_EQ(path.GetString(), "dir/name.txt/bare/dir/name.txt/bare");

    static constexpr char const* c_folders[][2] = {{"/a/b", "/a"}, {"/a", "/"}, {"a", ""}, {"~/a", "~/"}, {"a/", "a"}};
    for (auto const& c : c_folders) EXPECT_EQ(PathUnix(c[0]).GetFolder(), c[1]) << c[0];
    EXPECT_EQ(PathDos("c:\\a").GetFolder(), "c:\\");
    EXPECT_EQ(PathDos("c:\\a/b").GetFolder(), "c:\\a");
}

} // namespace
} // namespace Kernel

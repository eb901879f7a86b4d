#include "libkernel/filesystem/PathTraits.h"

#include "libkernel/core/Exception.h"
#include "libkernel/filesystem/Path.h"

#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace Kernel {
namespace {

/// Runs one grammar in both forms of text and asserts that they agree; gives the UTF-8 answer.
template <class Traits>
struct Both
{
    using Wide = typename Traits::Wide;

    static std::u16string Widen(std::string const& s) { return std::u16string(s.begin(), s.end()); }
    static std::string Narrow(std::u16string const& s) { return std::string(s.begin(), s.end()); }

    template <class T>
    static T Same(T a, T b)
    {
        EXPECT_EQ(a, b) << "UTF-8 and UTF-16 differ";
        return a;
    }

    static std::string Canonicalize(std::string const& in)
    {
        std::string a = in + '#';
        std::u16string b = Widen(a);
        int const n = Traits::Canonicalize(a.data(), static_cast<int>(in.size()));
        int const m = Wide::Canonicalize(b.data(), static_cast<int>(in.size()));
        EXPECT_EQ(a[n], 0);
        a.resize(n);
        b.resize(m);
        return Same(a, Narrow(b));
    }

    static std::pair<bool, std::string> CanonicalizeSafe(std::string const& in)
    {
        std::string a(in.size() + 1, '#');
        std::u16string b(in.size() + 1, u'#');
        int n = static_cast<int>(in.size()), m = n;
        bool const isSafe = Same(Traits::CanonicalizeSafe(a.data(), in.c_str(), n),
                                 Wide::CanonicalizeSafe(b.data(), Widen(in).c_str(), m));
        a.resize(n);
        b.resize(m);
        return {isSafe, Same(a, Narrow(b))};
    }

    static std::string Combine(std::string const& x, std::string const& y, int capacity = 100)
    {
        std::string a(100, '#');
        std::u16string b(100, u'#');
        int const xn = static_cast<int>(x.size()), yn = static_cast<int>(y.size());
        a.resize(Traits::Combine(a.data(), capacity, x.c_str(), xn, y.c_str(), yn));
        b.resize(Wide::Combine(b.data(), capacity, Widen(x).c_str(), xn, Widen(y).c_str(), yn));
        return Same(a, Narrow(b));
    }

    static std::string Append(std::string const& path, std::string const& tail, int capacity = 100)
    {
        std::string a = path;
        a.resize(100);
        std::u16string b = Widen(a);
        int const n = static_cast<int>(path.size()), t = static_cast<int>(tail.size());
        a.resize(Traits::Append(a.data(), tail.c_str(), capacity, n, t));
        b.resize(Wide::Append(b.data(), Widen(tail).c_str(), capacity, n, t));
        return Same(a, Narrow(b));
    }

    static bool IsRelative(std::string const& s)
    {
        EXPECT_NE(Traits::IsRelative(s.c_str()), Traits::IsRoot(s.c_str()));
        return Same(Traits::IsRelative(s.c_str()), Wide::IsRelative(Widen(s).c_str()));
    }
    static bool IsValid(std::string const& s)
    {
        return Same(Traits::IsValidPath(s.c_str()), Wide::IsValidPath(Widen(s).c_str()));
    }
    static bool IsSameRoot(std::string const& a, std::string const& b)
    {
        return Same(Traits::IsSameRoot(a.c_str(), b.c_str()), Wide::IsSameRoot(Widen(a).c_str(), Widen(b).c_str()));
    }
    static int Common(std::string const& a, std::string const& b)
    {
        return Same(Traits::CommonPrefixLength(a.c_str(), b.c_str()),
                    Wide::CommonPrefixLength(Widen(a).c_str(), Widen(b).c_str()));
    }
};

using Dos = Both<PathTraitsDos>;
using Unix = Both<PathTraitsUnix>;

TEST(PathTraitsTest, CanonicalPathIsTheShortestFormOfTheSamePlace)
{
    struct Case
    {
        char const* in;
        char const* dos;
        char const* unix;
    };
    static constexpr Case c_cases[] = {
        {"", "", ""},
        {".", ".", "."},
        {"..", "..", ".."},
        {"plain", "plain", "plain"},
        {"/a//b/./c/", "\\a\\b\\c", "/a/b/c"},
        {"a/../../b", "..\\b", "../b"},
        {"../../a/../..", "..\\..\\..", "../../.."},
        {"./", "", ""},
        {"../", "..", ".."},
        {"a/..", "", ""},
        {"a/b/..", "a", "a"},
        {"/", "\\", "/"},
        {"/..", "\\", "/"},
        {"//a/../..//b", "\\b", "/b"},
        {"a/...", "a\\...", "a/..."},
        {"a/.b/..c", "a\\.b\\..c", "a/.b/..c"},
        {"~/x/../..", "", "~/"},
        {"~a/..", "", ""},
        {"a\\..\\..\\b", "..\\b", "a\\..\\..\\b"},
        {"c:\\..\\b", "c:\\b", "c:\\..\\b"},
        {"c:/", "c:\\", "c:"},
        {"c:a\\b\\..\\..\\..\\d", "c:d", "c:a\\b\\..\\..\\..\\d"},
        {"C:/x\\./y", "C:\\x\\y", "C:/x\\./y"},
        {"\\\\server/share/a/../..\\..", "\\\\server\\share", ""},
        {"\\\\server\\share\\", "\\\\server\\share", "\\\\server\\share\\"},
        {"\\\\server\\", "\\\\server", "\\\\server\\"},
        {"\\\\?\\c:\\..\\b", "\\\\?\\c:\\b", "\\\\?\\c:\\..\\b"},
        {"\\\\", "\\\\", "\\\\"},
    };
    for (Case const& c : c_cases) {
        SCOPED_TRACE(c.in);
        EXPECT_EQ(Dos::Canonicalize(c.in), c.dos);
        EXPECT_EQ(Dos::Canonicalize(c.dos), c.dos) << "not stable";
        if (std::string(c.in) == "\\\\server/share/a/../..\\..") continue; // Backslashes are letters to Unix.
        EXPECT_EQ(Unix::Canonicalize(c.in), c.unix);
        EXPECT_EQ(Unix::Canonicalize(c.unix), c.unix) << "not stable";
    }
}

TEST(PathTraitsTest, ClimbingAboveTheRootIsToldOnlyForRootedPaths)
{
    EXPECT_EQ(Dos::CanonicalizeSafe("c:\\..\\b"), std::make_pair(false, std::string("c:\\b")));
    EXPECT_EQ(Dos::CanonicalizeSafe("\\\\s\\h\\a\\..\\.."), std::make_pair(false, std::string("\\\\s\\h")));
    EXPECT_EQ(Dos::CanonicalizeSafe("..\\..\\b"), std::make_pair(true, std::string("..\\..\\b")));
    EXPECT_EQ(Unix::CanonicalizeSafe("/a/../../b"), std::make_pair(false, std::string("/b")));
    EXPECT_EQ(Unix::CanonicalizeSafe("/a/../b/"), std::make_pair(true, std::string("/b")));
    EXPECT_EQ(Unix::CanonicalizeSafe("~/../b"), std::make_pair(false, std::string("~/b")));
    EXPECT_EQ(Unix::CanonicalizeSafe("name"), std::make_pair(true, std::string("name")));
}

TEST(PathTraitsTest, CombinedPathKeepsTheFirstRootAndIgnoresARootedSecond)
{
    EXPECT_EQ(Dos::Combine("c:\\a", "d:\\b"), "c:\\a");
    EXPECT_EQ(Dos::Combine("c:\\a\\", "b/c"), "c:\\a\\b\\c");
    EXPECT_EQ(Dos::Combine("c:", "b"), "c:\\b");
    EXPECT_EQ(Dos::Combine("c:\\a\\b", "..\\..\\..\\d"), "c:\\d");
    EXPECT_EQ(Dos::Combine("\\\\s\\h\\x", "..\\..\\y"), "\\\\s\\h\\y");
    EXPECT_EQ(Unix::Combine("/a/./b", "../c//d/"), "/a/c/d");
    EXPECT_EQ(Unix::Combine("a", "../../b"), "../b");
    EXPECT_EQ(Unix::Combine("", "b"), "b");
    EXPECT_EQ(Unix::Combine("a/b", "/c"), "a/b");
    EXPECT_EQ(Unix::Combine("a/../b", "~/c"), "b");
    EXPECT_EQ(Unix::Combine("/abc", "de", 8), "/abc/de");
    EXPECT_THROW(Unix::Combine("/abc", "de", 7), InvalidArgException);
    EXPECT_THROW(PathTraitsUnix::Combine(nullptr, 9, "a", 1, "b", 1), InvalidArgException);
}

TEST(PathTraitsTest, AppendLeavesExactlyOneSeparatorOrThrows)
{
    EXPECT_EQ(Dos::Append("a", "b"), "a\\b");
    EXPECT_EQ(Dos::Append("a/", "\\b"), "a/b");
    EXPECT_EQ(Dos::Append("a", "/b"), "a/b");
    EXPECT_EQ(Unix::Append("a", "b"), "a/b");
    EXPECT_EQ(Unix::Append("a/", "//b"), "a/b");
    EXPECT_EQ(Unix::Append("a\\", "b"), "a\\/b");
    EXPECT_EQ(Unix::Append("", "b"), "b");
    EXPECT_EQ(Unix::Append("/", "b", 3), "/b");
    EXPECT_THROW(Unix::Append("/", "b", 2), InvalidArgException);
    EXPECT_THROW(Unix::Append("ab", "cd", 5), InvalidArgException);
    EXPECT_THROW(Unix::Append("a", ""), InvalidArgException);
    char buffer[8] = "a";
    EXPECT_THROW(PathTraitsUnix::Append(buffer, nullptr, 8, 1, 1), InvalidArgException);
    EXPECT_THROW(PathTraitsUnix::Append(nullptr, "a", 8, 1, 1), InvalidArgException);
    EXPECT_STREQ(buffer, "a");
}

TEST(PathTraitsTest, RootsAreToldByEachGrammar)
{
    struct Case
    {
        char const* path;
        bool isDosRelative;
        bool isUnixRelative;
    };
    static constexpr Case c_cases[] = {
        {"", true, true},     {"a", true, true},    {"a/b", true, true},    {"/a", false, false},
        {"\\a", false, true}, {"c:", false, true},  {"c:a", false, true},   {"1:a", true, true},
        {"~", true, true},    {"~/a", true, false}, {"\\\\s", false, true}, {"../a", true, true},
    };
    for (Case const& c : c_cases) {
        SCOPED_TRACE(c.path);
        EXPECT_EQ(Dos::IsRelative(c.path), c.isDosRelative);
        EXPECT_EQ(Unix::IsRelative(c.path), c.isUnixRelative);
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
    EXPECT_EQ(Dos::Common("c:\\a\\b", "C:/A/c"), 5);
    EXPECT_EQ(Dos::Common("c:x", "c:y"), 2);
    EXPECT_EQ(Dos::Common("ab\\c", "ab/c"), 3);
    EXPECT_EQ(Unix::Common("c:x", "c:y"), 0);
    EXPECT_EQ(Unix::Common("/a/bc", "/A/bd"), 3);
    EXPECT_EQ(Unix::Common("/a", "/a/b"), 1);
    EXPECT_EQ(Unix::Common("a\\b", "a\\b"), 0);
    EXPECT_EQ(PathTraitsDos::CommonPrefixLength(nullptr, "a"), 0);
}

TEST(PathTraitsTest, DosPathWithForbiddenCharactersIsInvalid)
{
    for (char const* good : {"a", "c:\\a b\\c.d", "c:", "\\\\server\\share", "/a/b/", "\xC3\xA9\\\xC3\xB6"})
        EXPECT_TRUE(PathTraitsDos::IsValidPath(good)) << good;
    for (char const* bad : {"", "a*", "a?b", "<", "a>", "a|b", "\"a\"", "a\nb", "1:", "ab:c", "a\\\\b", "//a", "\\/a",
                            "/\\a", "\\\\\\a", "\\\\?\\c:\\a"})
        EXPECT_FALSE(Dos::IsValid(bad)) << bad;
    EXPECT_FALSE(PathTraitsDos::IsValidPath(nullptr));
    EXPECT_FALSE(Unix::IsValid(""));
    EXPECT_TRUE(Unix::IsValid("a*?:b"));
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

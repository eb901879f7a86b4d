#include "libkernel/core/String.h"

#include <gtest/gtest.h>
#include <new>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

namespace Kernel {
namespace {

TEST(StringTest, CapacityIsWhatTheBlockRoundsUpTo)
{
    using Row = std::tuple<int, int, int, int>;
    for (auto const& [units, utf8, utf16, utf32] :
         {Row{1, 3, 1, 2}, Row{3, 3, 5, 4}, Row{4, 11, 5, 4}, Row{100, 107, 101, 100}})
    {
        String8 a;
        String16 b;
        String32 c;
        a.Reserve(units);
        b.Reserve(units);
        c.Reserve(units);
        EXPECT_EQ(std::tuple(a.GetCapacity(), b.GetCapacity(), c.GetCapacity()), std::tuple(utf8, utf16, utf32));
    }
}

TEST(StringTest, AppendsThatFitStayInTheBlockAndMayTakeFromIt)
{
    String8 s("ab");
    s += s;
    EXPECT_EQ(s, "abab");
    s.Append(s.GetData() + 1, 2);
    EXPECT_EQ(s, "ababba");
    s.Reserve(1000);
    char const* const units = s.GetData();
    for (int i = 0; i < 100; ++i) (s += "x").Append(s.GetData(), 1);
    EXPECT_EQ(s.GetData(), units);
    EXPECT_EQ(s.GetLength(), 206);
    EXPECT_EQ(s[205], 'a');
    EXPECT_TRUE(s.GetSubstring(0).SharesBlockWith(s));
    EXPECT_EQ(s.GetSubstring(204, 100), "xa");
    EXPECT_TRUE(s.GetSubstring(206).IsEmpty());
}

TEST(StringTest, EmptyBlockIsNeverWritten)
{
    String8 s;
    *s.SetLength(0) = 0;
    s.SetLength(-5);
    s.Reserve(-1);
    EXPECT_TRUE(s.SharesBlockWith(String8()));
    EXPECT_TRUE(String8(nullptr, 5).IsEmpty());
    String8 own("abc");
    own.SetLength(-1);
    EXPECT_EQ(own.GetLength(), 0);
    EXPECT_EQ(own, "");
    EXPECT_EQ(String8().GetLength(), 0);
}

TEST(StringTest, WritingAndReservingNeverReachASharedBlock)
{
    String8 const original("abcdef");
    String8 copy(original);
    EXPECT_TRUE(copy.SharesBlockWith(original));
    copy.GetWritable()[0] = 'X';
    EXPECT_EQ(copy, "Xbcdef");
    EXPECT_EQ(original, "abcdef");
    copy = original;
    copy.Reserve(3);
    EXPECT_EQ(copy, "abc");
    copy = original;
    copy.Reserve(0);
    EXPECT_TRUE(copy.IsEmpty());
    EXPECT_EQ(original, "abcdef");
}

TEST(StringTest, ConcatBuildsExactlyBothParts)
{
    String8 out("12");
    ConcatString<TEncUtf8>(out, out.GetData(), 2, "34", 2);
    EXPECT_EQ(out, "1234");
    ConcatString<TEncUtf8>(out, nullptr, -3, out.GetData() + 1, 2);
    EXPECT_EQ(out, "23");
    ConcatString<TEncUtf8>(out, nullptr, 0, nullptr, 0);
    EXPECT_TRUE(out.IsEmpty());
    EXPECT_THROW(ConcatString<TEncUtf8>(out, "", INT32_MAX, "", 1), std::bad_alloc);
    EXPECT_EQ("a" + String8("b") + "c", "abc");
}

TEST(StringTest, FindTakesUnitsAndTexts)
{
    EXPECT_EQ(String8("abracadabra abcabcabd").Find("abcabd"), 15);
    EXPECT_EQ(String8("abracadabra abcabcabd").Find('c', 5), 14);
    EXPECT_EQ(String8("a\0b", 3).Find('\0'), 1);
    EXPECT_EQ(String16(u"xyzzy").Find(String16(u"zy")), 3);
}

TEST(StringTest, ThreadsMayChangeCopiesOfOneString)
{
    String8 const shared("shared text");
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([shared] {
            for (int i = 0; i < 5000; ++i) {
                String8 copy(shared);
                copy += "!";
                String8 const empty;
                EXPECT_EQ(copy.GetLength(), shared.GetLength() + 1);
            }
        });
    for (std::thread& t : threads) t.join();
    EXPECT_EQ(shared, "shared text");
}

} // namespace
} // namespace Kernel

#include "libkernel/core/Format.h"

#include <gtest/gtest.h>
#include <memory>
#include <tuple>
#include <vector>

namespace Kernel {
namespace {

TEST(FormatTest, PlaceholdersFollowTheRules)
{
    using Row = std::tuple<char const*, char const*>;
    for (auto const& [format, expected] :
         {Row{"%1%%%2", "a%b"}, Row{"%3", ""}, Row{"100%", "100"}, Row{"%2-%1-%2", "b-a-b"}, Row{"x%0y%xz", "xyz"},
          Row{"%12", ""}, Row{"%1.2", "a.2"}, Row{"", ""}, Row{"%", ""}, Row{"%%%", "%"}, Row{"%4294967297", ""},
          Row{"%18446744073709551617", ""}, Row{"%99999999999999999999999999999999991 %1", " a"}, Row{"%01", "1"},
          Row{"%\n%1", "a"}})
    {
        SCOPED_TRACE(format);
        String8 out("<");
        int const added = AppendFormat(out, format, "a", String8("b"));
        EXPECT_EQ(out, String8("<") + expected);
        EXPECT_EQ(added, static_cast<int>(strlen(expected)));
    }
}

TEST(FormatTest, ArgumentsOfAllKindsMeetInOneEncoding)
{
    EXPECT_EQ(
        Format("%1 %2 %3 %4", -5, u64{18446744073709551615u}, String16(u"\u00E9"), static_cast<char const*>(nullptr)),
        "-5 18446744073709551615 \xC3\xA9 ");
    EXPECT_EQ(Format("%1|%2|%3", 2.0, -0.1f, 1e20), "2.0|-0.1|100000000000000000000.0");
    EXPECT_EQ(Format("%1", -9223372036854774784.0), "-9223372036854774784.0");
    EXPECT_EQ(FormatT<String16>(u"%1 of %2", "\xE2\x82\xAC", INT64_MIN), u"\u20AC of -9223372036854775808");
}

TEST(FormatTest, NullFormatClearsTheTargetAndASharedOneBecomesPrivate)
{
    String8 const original("abc");
    String8 out(original);
    AppendFormat(out, "%1", 7);
    EXPECT_EQ(original, "abc");
    EXPECT_EQ(out, "abc7");
    EXPECT_EQ(AppendFormat(out, static_cast<char const*>(nullptr), 1), 0);
    EXPECT_TRUE(out.IsEmpty());
}

TEST(FormatTest, FormatAndArgumentsMayLieInTheTarget)
{
    for (int room : {0, 200}) {
        SCOPED_TRACE(room);
        String8 out("<%1|%2>");
        out.Reserve(room);
        AppendFormat(out, out, out, out.GetData() + 4);
        EXPECT_EQ(out, "<%1|%2><<%1|%2>|%2>>");
    }
}

TEST(FormatTest, FormatOfManyPiecesIsWrittenWhole)
{
    String8 format;
    String8 expected("<");
    for (int i = 0; i < 100; ++i) {
        format += "%1,%%%2";
        expected += "a,%7";
    }
    String8 out("<");
    EXPECT_EQ(AppendFormat(out, format, "a", 7), 400);
    EXPECT_EQ(out, expected);
    EXPECT_EQ(String8("<") + Format(format, "a", 7), expected);
}

TEST(FormatTest, TextBeyondTheLargestLengthLeavesTheTarget)
{
    String8 format;
    for (int i = 0; i < 4096; ++i) format += "%1";
    String8 big;
    std::memset(big.SetLength(1 << 20), 'x', 1 << 20);
    String8 out("abc");
    EXPECT_EQ(AppendFormat(out, format, big), 0);
    EXPECT_EQ(out, "abc");
    EXPECT_TRUE(Format(format, big).IsEmpty());
}

} // namespace
} // namespace Kernel

#include "libkernel/streams/Base85.h"

#include "support/CompressionFixture.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using Testing::ByteSink;

std::string Encode(std::string const& plain, int lineMode = Base85LineModeNone)
{
    Counted<ByteSink> sink = MakeCounted<ByteSink>();
    EncodeToBase85(*sink, plain.data(), static_cast<int>(plain.size()), lineMode);
    return sink->GetText();
}

TEST(Base85Test, GroupsAndTails)
{
    struct Case
    {
        std::string plain;
        char const* encoded;
    };
    std::string const zeros(4, '\0');
    for (Case const& c : {Case{"", ""}, Case{zeros, "z"}, Case{std::string("\0", 1), "!!"},
                          Case{std::string("\0\0\0", 3), "!!!!"}, Case{"Man ", "9jqo^"}, Case{"Man is d", "9jqo^BlbD-"},
                          Case{"sure", "F*2M7"}, Case{"sur", "F*2L"}, Case{"su", "F*."}, Case{"s", "Er"},
                          Case{"\xff\xff\xff\xff", "s8W-!"}, Case{zeros + "Man " + zeros, "z9jqo^z"}})
        EXPECT_EQ(Encode(c.plain), c.encoded);
}

TEST(Base85Test, LinesEndBehindTheGroupThatReachesColumn75)
{
    std::string line;
    for (int i = 0; i < 15; ++i) line += "9jqo^";
    std::string plain;
    for (int i = 0; i < 31; ++i) plain += "Man ";
    EXPECT_EQ(Encode(plain, Base85LineModeCRLF), line + "\r\n" + line + "\r\n9jqo^");
    EXPECT_EQ(Encode(plain, Base85LineModeLF), line + "\n" + line + "\n9jqo^");
    EXPECT_EQ(Encode(plain, Base85LineModeNone), line + line + "9jqo^");

    // Four groups of zeros let 14 more bring the column to 74, so the next group ends at 79; then 0 again.
    std::string longLine = "zzzz";
    for (int i = 0; i < 15; ++i) longLine += "9jqo^";
    std::string const zeros(16, '\0');
    EXPECT_EQ(Encode(zeros + plain.substr(0, 29 * 4) + zeros, Base85LineModeLF),
              longLine + "\n" + line.substr(5) + "zzzz");
    // A tail can end a line too.
    EXPECT_EQ(Encode(zeros + plain.substr(0, 56) + "s", Base85LineModeLF), longLine.substr(0, 74) + "Er\n");
}

TEST(Base85Test, TooSmallADestinationLeavesTheColumn)
{
    char room[16];
    int column = 70;
    EXPECT_EQ(EncodeToBase85(room, 6, "Man sure", 8, column, Base85LineModeLF), 0);
    EXPECT_EQ(EncodeToBase85(room, 10, "Man sure", 8, column, Base85LineModeLF), 0);
    EXPECT_EQ(column, 70);
    EXPECT_EQ(EncodeToBase85(room, 11, "Man sure", 8, column, Base85LineModeLF), 11);
    EXPECT_EQ(std::string(room, 11), "9jqo^\nF*2M7");
    EXPECT_EQ(column, 5);
}

} // namespace
} // namespace Kernel

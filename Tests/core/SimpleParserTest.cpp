#include "libkernel/core/SimpleParser.h"

#include <gtest/gtest.h>
#include <limits>
#include <random>
#include <string>
#include <tuple>

namespace Kernel {
namespace {

using Code = SimpleParser::ErrorCode;

// Items as "2:0 3.5 -": value, keyword, or nothing.
std::string Describe(SimpleParser const& parser)
{
    std::string all;
    for (auto const& item : parser.GetResults()) {
        char text[64];
        std::snprintf(text, sizeof text, item.keyword < 0 ? "%g " : "%g:%d ", item.value, item.keyword);
        all += item.isEmpty ? "- " : text;
    }
    return all;
}

SimpleParser MakeParser()
{
    return SimpleParser({"cm", "mm", "m_2", "\u00B5m", "\u5BF8", "cm"}, ',');
}

TEST(SimpleParserTest, ListsAreReadItemByItem)
{
    SimpleParser parser = MakeParser();
    for (auto const& [text, items] :
         std::initializer_list<std::pair<char const*, char const*>>{{"2 cm, 3.5 mm", "2:0 3.5:1 "},
                                                                    {"1,,2", "1 - 2 "},
                                                                    {",", "- - "},
                                                                    {"1,", "1 - "},
                                                                    {" \t7\tmm ", "7:1 "},
                                                                    {".5,5.,007", "0.5 5 7 "},
                                                                    {"2m_2,3\u00B5m,4\u5BF8", "2:2 3:3 4:4 "},
                                                                    {"  ,1", "- 1 "}})
    {
        EXPECT_TRUE(parser.Parse(text, false)) << text;
        EXPECT_EQ(Describe(parser), items) << text;
        EXPECT_EQ(parser.GetErrorCode(), Code::None);
    }
}

TEST(SimpleParserTest, ErrorsNameTheirPlace)
{
    SimpleParser parser = MakeParser();
    using Row = std::tuple<char const*, Code, int, int>;
    for (auto const& [text, code, pos, length] :
         {Row{"", Code::Empty, 0, 0}, Row{" \t ", Code::Empty, 0, 3}, Row{"1, 2.3.4", Code::BadNumber, 3, 3},
          Row{"1..", Code::BadNumber, 0, 2}, Row{".", Code::BadNumber, 0, 1}, Row{"2,. cm", Code::BadNumber, 2, 1},
          Row{"..", Code::BadNumber, 0, 1}, Row{"1,-2", Code::Unexpected, 2, 1}, Row{"1 2", Code::Unexpected, 2, 1},
          Row{"1 cm 2", Code::Unexpected, 5, 1}, Row{"cm", Code::Unexpected, 0, 1},
          Row{"1 cm mm", Code::Unexpected, 5, 1}, Row{"1,cm", Code::Unexpected, 2, 1},
          Row{"1\n", Code::Unexpected, 1, 1}, Row{"1 _x", Code::Unexpected, 2, 1},
          Row{"1, 2 inch, 3", Code::UnknownKeyword, 5, 4}, Row{"1 CM", Code::UnknownKeyword, 2, 2},
          Row{"1 c", Code::UnknownKeyword, 2, 1}, Row{"2e5", Code::UnknownKeyword, 1, 2}})
    {
        EXPECT_FALSE(parser.Parse(text, true)) << text;
        EXPECT_EQ(parser.GetErrorCode(), code) << text;
        EXPECT_EQ(parser.GetErrorPos(), pos) << text;
        EXPECT_EQ(parser.GetErrorLength(), length) << text;
        EXPECT_TRUE(parser.GetResults().empty());
    }
    EXPECT_TRUE(parser.Parse("1", true));
    EXPECT_EQ(parser.GetErrorPos() + parser.GetErrorLength(), 0);
    EXPECT_FALSE(SimpleParser(',').Parse("1 cm", true));
}

TEST(SimpleParserTest, IllFormedKeywordsAreRefusedAtTheirByte)
{
    SimpleParser parser = MakeParser();
    for (char const* bad : {"\x80", "\xC3", "\xC0\x80", "\xE2\x82", "\xE0\x80\x80", "\xED\xA0\x80", "\xF0\x9F\x98",
                            "\xF4\x90\x80\x80", "\xF8\x80\x80\x80\x80", "\xFF"})
        for (int at = 0; at < 3; ++at)
            for (char const* behind : {"", "z", ",1"}) {
                std::string const text = "1 " + std::string("\u00B5mm").substr(0, at ? static_cast<size_t>(at) + 1 : 0);
                EXPECT_FALSE(parser.Parse((text + bad + behind).c_str(), false));
                EXPECT_EQ(parser.GetErrorCode(), Code::BadEncoding) << at << behind;
                EXPECT_EQ(parser.GetErrorPos(), static_cast<int>(text.size()));
                EXPECT_EQ(parser.GetErrorLength(), 1);
            }
}

TEST(SimpleParserTest, DecimalsAreRoundedAsWritten)
{
    double const infinity = std::numeric_limits<double>::infinity();
    std::string const large(400, '9');
    std::string const small = "0." + std::string(400, '0') + "1";
    using Row = std::tuple<char const*, int, double>;
    for (auto const& [text, places, value] :
         {Row{"1.235", 2, 1.24}, Row{"1.234", 2, 1.23}, Row{"1.005", 2, 1.01}, Row{"9.996", 2, 10.0},
          Row{".95", 1, 1.0}, Row{"2.5", 0, 3.0}, Row{"2.4999", 0, 2.0}, Row{"1.235", -1, 1.235},
          Row{"1.235", 3, 1.235}, Row{"7.", 0, 7.0}, Row{large.c_str(), 2, infinity}, Row{small.c_str(), -1, 0.0},
          Row{"0.1", std::numeric_limits<int>::max(), 0.1}})
    {
        SimpleParser parser(',');
        parser.SetMaxDecimalPlaces(places);
        ASSERT_TRUE(parser.Parse(text, false)) << text;
        EXPECT_EQ(parser.GetResults()[0].value, value) << text;
    }
}

TEST(SimpleParserTest, RandomBytesEndInResultsOrInAnErrorInsideTheText)
{
    std::mt19937 random(4);
    std::string const likely = "12.,, cm\t\xC2\xB5m_2\xE5\xAF\xB8";
    for (int round = 0; round < 20000; ++round) {
        std::string text(random() % 24, ' ');
        for (char& c : text) c = random() % 8 ? likely[random() % likely.size()] : static_cast<char>(random());
        SimpleParser parser = MakeParser();
        bool const isFine = parser.Parse(String8(text), random() % 2);
        ASSERT_EQ(isFine, parser.GetErrorCode() == Code::None);
        ASSERT_EQ(isFine, !parser.GetResults().empty());
        ASSERT_LE(parser.GetErrorPos() + parser.GetErrorLength(), static_cast<int>(text.size()));
    }
}

} // namespace
} // namespace Kernel

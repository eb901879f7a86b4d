#include "libkernel/text/PasswordText.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

TEST(PasswordTextTest, PasswordsArePreparedAsTheProfileSays)
{
    // The examples of RFC 4013, section 3, and the rules they don't show.
    for (auto const& [in, out] : std::initializer_list<std::pair<char const*, char const*>>{
             {"I\u00ADX", "IX"},
             {"user", "user"},
             {"USER", "USER"},
             {"\u00AA", "a"},
             {"\u2168", "IX"},
             {"a\u00A0b", "a b"},
             {"", ""},
             {"\uFDFA",
              "\u0635\u0644\u0649 \u0627\u0644\u0644\u0647 \u0639\u0644\u064A\u0647 \u0648\u0633\u0644\u0645"},
             {"\u0627", "\u0627"}})
    {
        String8 prepared("before");
        EXPECT_TRUE(PreparePassword(prepared, in)) << in;
        EXPECT_EQ(prepared, out) << in;
    }
    String8 same("I\u00ADX");
    EXPECT_TRUE(PreparePassword(same, same));
    EXPECT_EQ(same, "IX");
}

TEST(PasswordTextTest, RefusedPasswordsLeaveTheTargetAlone)
{
    for (char const* refused : {"\u0007",
                                "\u0627"
                                "1",
                                "\uE000", "\uFFFD", "\u0221"})
    {
        String8 prepared("before");
        EXPECT_FALSE(PreparePassword(prepared, refused)) << refused;
        EXPECT_EQ(prepared, "before");
    }
    for (char const* bad : {"\x80", "\xC3", "\xC1\xA1", "\xE0\x81\xA1", "\xED\xA0\x80", "\xF0\x90\x90", "\xFF"})
        for (std::string const& text :
             {std::string(bad), bad + std::string("ab"), "a" + std::string(bad) + "b", "ab" + std::string(bad)})
        {
            String8 prepared("before");
            EXPECT_FALSE(PreparePassword(prepared, String8(text))) << testing::PrintToString(text);
            EXPECT_EQ(prepared, "before");
        }
}

} // namespace
} // namespace Kernel

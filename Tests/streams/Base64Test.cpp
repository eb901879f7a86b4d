#include "libkernel/streams/Base64.h"

#include "support/CompressionFixture.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using Testing::ByteSink;

struct Pair
{
    char const* plain;
    char const* encoded;
};

// RFC 4648, section 10, and two that reach the end of the alphabet.
constexpr Pair c_pairs[] = {{"", ""},
                            {"f", "Zg=="},
                            {"fo", "Zm8="},
                            {"foo", "Zm9v"},
                            {"foob", "Zm9vYg=="},
                            {"fooba", "Zm9vYmE="},
                            {"foobar", "Zm9vYmFy"},
                            {"abc", "YWJj"},
                            {"\xfb\xff\xbf", "+/+/"},
                            {"\xff\xff\xfe", "///+"}};

TEST(Base64Test, PublishedPairsBothWays)
{
    for (Pair const& p : c_pairs) {
        EXPECT_EQ(EncodeToBase64(String8(p.plain)), p.encoded);
        EXPECT_EQ(DecodeFromBase64(String8(p.encoded)), p.plain);
    }
}

TEST(Base64Test, DecodingSkipsWhatIsOutsideAndEndsAtPadding)
{
    struct Case
    {
        char const* what;
        char const* text;
        char const* plain;
    };
    for (Case const& c : {Case{"blanks and line ends", "YW Jj\n", "abc"}, Case{"high bytes", "Y\x80W\xffJj", "abc"},
                          Case{"text behind padding", "Zg==Zm9v", "f"}, Case{"padding first", "=YWJj", ""},
                          Case{"six bits alone", "YWJjZ===", "abc"}, Case{"padding cut off", "YWJjZA", ""}})
        EXPECT_EQ(DecodeFromBase64(String8(c.text)), c.plain) << c.what;
}

TEST(Base64Test, DestinationOneShortGivesNothing)
{
    char room[9] = "________";
    EXPECT_EQ(EncodeToBase64(room, 7, "fooba", 5), 0);
    EXPECT_EQ(std::string(room), "________");
    EXPECT_EQ(EncodeToBase64(room, 8, "fooba", 5), 8);
    EXPECT_EQ(DecodeFromBase64(room, 4, "Zm9vYmE=", 8), 0);
    EXPECT_EQ(DecodeFromBase64(room, 5, "Zm9vYmE=", 8), 5);
    EXPECT_EQ(EncodeToBase64(room, 8, "x", 0), 0);
    EXPECT_EQ(EncodeToBase64(room, 8, "x", -1), 0);
}

TEST(Base64Test, StreamFormsAgreeWithTheWholeAtEverySliceBorder)
{
    for (int size : {0, 1, 767, 768, 769, 1535, 1536, 5000}) {
        SCOPED_TRACE(size);
        Testing::Bytes const data = Testing::MakePixels(static_cast<u64>(size), 3);
        char const* const plain = reinterpret_cast<char const*>(data.data());
        String8 const whole = EncodeToBase64(String8(plain, size));
        Counted<ByteSink> encoded = MakeCounted<ByteSink>(), decoded = MakeCounted<ByteSink>();
        EncodeToBase64(*encoded, plain, size);
        EXPECT_EQ(encoded->GetText(), std::string(whole.GetView()));
        DecodeFromBase64(*decoded, whole.GetData(), whole.GetLength());
        EXPECT_EQ(decoded->bytes, data);
    }
}

} // namespace
} // namespace Kernel

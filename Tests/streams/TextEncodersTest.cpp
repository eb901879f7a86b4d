#include "libkernel/streams/Base64.h"
#include "libkernel/streams/Base85.h"
#include "support/CompressionFixture.h"

#include <functional>
#include <gtest/gtest.h>

namespace Kernel {
namespace {

using namespace std::string_literals;
using Test::PlainTarget;
using Testing::Bytes;

TEST(Base64Test, TextsEncodeAsPublishedAndDecodingSkipsWhatIsOutside)
{
    struct Case
    {
        char const* plain;
        char const* encoded;
        bool bothWays = true;
    };
    // RFC 4648, section 10, two that reach the end of the alphabet, and what no encoder writes.
    for (Case const& c : {Case{"", ""},
                          {"f", "Zg=="},
                          {"fo", "Zm8="},
                          {"foo", "Zm9v"},
                          {"foob", "Zm9vYg=="},
                          {"foobar", "Zm9vYmFy"},
                          {"\xfb\xff\xbf", "+/+/"},
                          {"\xff\xff\xfe", "///+"},
                          {"abc", "YW Jj\n", false},
                          {"abc", "Y\x80W\xffJj", false},
                          {"f", "Zg==Zm9v", false},
                          {"", "=YWJj", false},
                          {"abc", "YWJjZ===", false},
                          {"", "YWJjZA", false}})
    {
        EXPECT_EQ(DecodeFromBase64(String8(c.encoded)), c.plain) << c.encoded;
        EXPECT_TRUE(!c.bothWays || EncodeToBase64(String8(c.plain)) == c.encoded) << c.plain;
    }
}

TEST(Base64Test, DestinationOneShortGivesNothing)
{
    char room[9] = "________";
    EXPECT_EQ(EncodeToBase64(room, 7, "fooba", 5), 0);
    EXPECT_EQ(std::string(room), "________");
    EXPECT_EQ(EncodeToBase64(room, 8, "fooba", 5), 8);
    EXPECT_EQ(DecodeFromBase64(room, 4, "Zm9vYmE=", 8), 0);
    EXPECT_EQ(DecodeFromBase64(room, 5, "Zm9vYmE=", 8), 5);
    EXPECT_EQ(EncodeToBase64(room, 8, "x", -1), 0);
}

TEST(Base64Test, StreamFormsAgreeWithTheWholeAtEverySliceBorder)
{
    for (int size : {0, 1, 767, 768, 769, 1535, 1536, 5000}) {
        Bytes const data = Testing::MakePixels(static_cast<u64>(size), 3);
        char const* const plain = reinterpret_cast<char const*>(data.data());
        String8 const whole = EncodeToBase64(String8(plain, size));
        Counted<PlainTarget> encoded = MakeCounted<PlainTarget>(), decoded = MakeCounted<PlainTarget>();
        EncodeToBase64(*encoded, plain, size);
        EXPECT_EQ(encoded->bytes, std::string(whole.GetView())) << size;
        DecodeFromBase64(*decoded, whole.GetData(), whole.GetLength());
        EXPECT_EQ(decoded->bytes, std::string(data.begin(), data.end())) << size;
    }
}

std::string Repeat(std::string const& text, int count)
{
    std::string result;
    while (count-- > 0) result += text;
    return result;
}

TEST(Base85Test, GroupsTailsAndLines)
{
    std::string const zeros(4, '\0');
    std::string const line = Repeat("9jqo^", 15), longLine = "zzzz" + line;
    struct Case
    {
        std::string plain, encoded;
        int lineMode = Base85LineModeNone;
    };
    for (Case const& c :
         {Case{"", ""},
          {zeros, "z"},
          {"\0"s, "!!"},
          {"\0\0\0"s, "!!!!"},
          {"Man is d", "9jqo^BlbD-"},
          {"sur", "F*2L"},
          {"su", "F*."},
          {"s", "Er"},
          {"\xff\xff\xff\xff", "s8W-!"},
          {zeros + "Man " + zeros, "z9jqo^z"},
          {Repeat("Man ", 31), line + "\r\n" + line + "\r\n9jqo^", Base85LineModeCRLF},
          {Repeat("Man ", 31), line + "\n" + line + "\n9jqo^", Base85LineModeLF},
          {Repeat("Man ", 31), line + line + "9jqo^"},
          // Four groups of zeros let 14 more bring the column to 74, so the next group ends at 79; then
          // 0 again. A tail can end a line too.
          {Repeat(zeros, 4) + Repeat("Man ", 29) + Repeat(zeros, 4), longLine + "\n" + line.substr(5) + "zzzz",
           Base85LineModeLF},
          {Repeat(zeros, 4) + Repeat("Man ", 14) + "s", longLine.substr(0, 74) + "Er\n", Base85LineModeLF}})
    {
        Counted<PlainTarget> sink = MakeCounted<PlainTarget>();
        EncodeToBase85(*sink, c.plain.data(), static_cast<int>(c.plain.size()), c.lineMode);
        EXPECT_EQ(sink->bytes, c.encoded);
    }
}

TEST(Base85Test, TooSmallADestinationLeavesTheColumn)
{
    char room[16];
    int column = 70;
    for (int const size : {6, 10}) EXPECT_EQ(EncodeToBase85(room, size, "Man sure", 8, column, Base85LineModeLF), 0);
    EXPECT_EQ(column, 70);
    EXPECT_EQ(EncodeToBase85(room, 11, "Man sure", 8, column, Base85LineModeLF), 11);
    EXPECT_EQ(std::string(room, 11), "9jqo^\nF*2M7");
    EXPECT_EQ(column, 5);
}

struct Encoder
{
    char const* what;
    u64 block;
    std::function<Counted<GatheringOutStream>(Counted<OutStream>)> make;
    std::function<void(OutStream&, char const*, int)> encodeWhole;
};

std::vector<Encoder> MakeEncoders()
{
    std::vector<Encoder> encoders{{"Base64", Base64OutStream::c_rawBlockSize,
                                   [](Counted<OutStream> target) { return MakeCounted<Base64OutStream>(target); },
                                   [](OutStream& out, char const* p, int n) { EncodeToBase64(out, p, n); }}};
    for (int lineMode : {0, 1, 2})
        encoders.push_back({"Base85", Base85OutStream::c_rawBlockSize,
                            [=](Counted<OutStream> target) { return MakeCounted<Base85OutStream>(target, lineMode); },
                            [=](OutStream& out, char const* p, int n) { EncodeToBase85(out, p, n, lineMode); }});
    return encoders;
}

TEST(GatheringOutStreamTest, TailGoesOutWhenTheStreamDiesAndAFullTargetFailsItForGood)
{
    for (Encoder const& encoder : MakeEncoders()) {
        u64 const block = encoder.block;
        for (u64 size : {u64(0), u64(3), u64(1201), block - 1, block, block + 1, 3 * block - 2}) {
            SCOPED_TRACE(testing::Message() << encoder.what << " " << size);
            Bytes data = Testing::MakePixels(size, 5);
            std::fill_n(data.begin(), size / 3, u8(0)); // Runs of 'z' put the lines out of step with the blocks.
            Counted<PlainTarget> const sink = MakeCounted<PlainTarget>(), whole = MakeCounted<PlainTarget>();
            auto stream = encoder.make(sink);
            for (u64 at = 0; at < size; at += 701) {
                u64 const part = std::min<u64>(701, size - at);
                ASSERT_EQ(stream->WriteBlock(data.data() + at, part), part);
            }
            EXPECT_TRUE(stream->Flush());
            EXPECT_EQ(sink->bytes.empty(), size < block);
            EXPECT_EQ(stream->Tell(), size);
            stream.Reset();
            encoder.encodeWhole(*whole, reinterpret_cast<char const*>(data.data()), static_cast<int>(size));
            EXPECT_EQ(sink->bytes, whole->bytes);
        }
        Counted<PlainTarget> const full = MakeCounted<PlainTarget>(block * 3 / 2);
        auto stream = encoder.make(full);
        Bytes const data = Testing::MakePixels(3 * block, 6);
        EXPECT_EQ(stream->WriteBlock(data.data(), data.size()), 0u);
        u64 const writes = full->writes.size();
        EXPECT_EQ(stream->WriteBlock(data.data(), 1), 0u);
        stream.Reset();
        EXPECT_EQ(full->writes.size(), writes);
    }
}

} // namespace
} // namespace Kernel

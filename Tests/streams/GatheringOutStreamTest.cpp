#include "libkernel/streams/Base64.h"
#include "libkernel/streams/Base85.h"
#include "support/CompressionFixture.h"

#include <functional>
#include <gtest/gtest.h>

namespace Kernel {
namespace {

using Testing::Bytes;
using Testing::ByteSink;

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

TEST(GatheringOutStreamTest, TailGoesOutOnlyWhenTheStreamDiesAndTheTextIsThatOfTheWhole)
{
    for (Encoder const& encoder : MakeEncoders())
        for (u64 size :
             {u64(0), u64(3), u64(1201), encoder.block - 1, encoder.block, encoder.block + 1, 3 * encoder.block - 2}) {
            SCOPED_TRACE(testing::Message() << encoder.what << " " << size);
            Bytes data = Testing::MakePixels(size, 5);
            std::fill_n(data.begin(), size / 3, u8(0)); // Runs of 'z' put the lines out of step with the blocks.
            Counted<ByteSink> const sink = MakeCounted<ByteSink>(), whole = MakeCounted<ByteSink>();
            auto stream = encoder.make(sink);
            for (u64 at = 0; at < size;) {
                u64 const part = std::min<u64>(701, size - at);
                ASSERT_EQ(stream->WriteBlock(data.data() + at, part), part);
                at += part;
            }
            EXPECT_TRUE(stream->Flush());
            EXPECT_EQ(sink->bytes.empty(), size < encoder.block);
            EXPECT_EQ(stream->Tell(), size);
            stream.Reset();
            encoder.encodeWhole(*whole, reinterpret_cast<char const*>(data.data()), static_cast<int>(size));
            EXPECT_EQ(sink->bytes, whole->bytes);
        }
}

TEST(GatheringOutStreamTest, FullTargetFailsTheStreamForGood)
{
    for (Encoder const& encoder : MakeEncoders()) {
        Bytes const data = Testing::MakePixels(3 * encoder.block, 6);
        Counted<ByteSink> const sink = MakeCounted<ByteSink>(encoder.block * 3 / 2);
        auto stream = encoder.make(sink);
        EXPECT_EQ(stream->WriteBlock(data.data(), data.size()), 0u);
        int const writes = sink->writes;
        EXPECT_EQ(stream->WriteBlock(data.data(), 1), 0u);
        stream.Reset();
        EXPECT_EQ(sink->writes, writes);
    }
}

} // namespace
} // namespace Kernel

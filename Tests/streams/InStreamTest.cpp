#include "libkernel/streams/InStream.h"

#include "StreamTestSupport.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using namespace Test;

constexpr u64 c_piece = 1 << 20;

TEST(InStreamTest, NumbersAreLittleEndianAndOneTransferEach)
{
    auto out = MakeCounted<PlainTarget>();
    *out << static_cast<signed char>(-2) << static_cast<unsigned char>(0xFE) << static_cast<short>(-2)
         << static_cast<unsigned short>(0x1234) << -3 << 0x12345678u << i64{-4} << u64{0x123456789ABCDEF0};
    EXPECT_EQ(out->writes, (std::vector<u64>{1, 1, 2, 2, 4, 4, 8, 8}));
    EXPECT_EQ(out->bytes, std::string("\xFE\xFE\xFE\xFF\x34\x12\xFD\xFF\xFF\xFF\x78\x56\x34\x12"
                                      "\xFC\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xF0\xDE\xBC\x9A\x78\x56\x34\x12",
                                      30));

    auto in = MakeCounted<PlainSource>(out->bytes);
    signed char a;
    unsigned char b;
    short c;
    unsigned short d;
    int e;
    unsigned int f;
    i64 g;
    u64 h;
    *in >> a >> b >> c >> d >> e >> f >> g >> h;
    EXPECT_EQ(in->reads, out->writes);
    EXPECT_EQ(std::make_tuple(a, b, c, d, e, f, g, h),
              std::make_tuple(-2, 0xFE, -2, 0x1234, -3, 0x12345678u, i64{-4}, u64{0x123456789ABCDEF0}));

    EXPECT_THROW(*MakeCounted<PlainSource>("abc") >> e, InStream::ReadException);
    EXPECT_EQ(e, -3) << "one that comes up short changes nothing";
    out->room = out->bytes.size() + 3;
    EXPECT_THROW(*out << e, OutStream::WriteException);
}

TEST(InStreamTest, TheGeneralCopyGoesInMebibytesAndReportsEach)
{
    std::string const text = Pattern(2 * c_piece + 5);
    for (bool const fromTarget : {false, true}) {
        SCOPED_TRACE(fromTarget);
        auto in = MakeCounted<PlainSource>(text);
        auto out = MakeCounted<PlainTarget>();
        char first;
        in->ReadBlock(&first, 1);
        ProgressLog log;
        EXPECT_TRUE(fromTarget ? out->CopyFromStream(*in, &log) : in->CopyToStream(*out, &log));
        EXPECT_EQ(out->bytes, text.substr(1));
        EXPECT_EQ(out->writes, (std::vector<u64>{c_piece, c_piece, 4}));
        u64 const total = text.size() - 1;
        EXPECT_EQ(log.reports, (Reports{{0, total}, {c_piece, total}, {2 * c_piece, total}, {total, total}}));
    }
}

TEST(InStreamTest, TheGeneralCopyFailsWhereASideStopsEarly)
{
    auto in = MakeCounted<PlainSource>(Pattern(100));
    in->silentFrom = 60;
    auto out = MakeCounted<PlainTarget>();
    EXPECT_FALSE(in->CopyToStream(*out));
    EXPECT_EQ(out->bytes, Pattern(100).substr(0, 60)) << "what came must have been written";

    auto narrow = MakeCounted<PlainTarget>();
    narrow->room = 99;
    ProgressLog log;
    EXPECT_FALSE(narrow->CopyFromStream(*MakeCounted<PlainSource>(Pattern(100)), &log));
    EXPECT_EQ(log.reports, (Reports{{0, 100}}));

    auto endless = MakeCounted<PlainSource>(Pattern(5000));
    endless->sized = false;
    auto memory = MakeCounted<MemoryInOutStream>();
    EXPECT_TRUE(memory->CopyFromStream(*endless)) << "a source that knows no size is copied whole";
    EXPECT_EQ(Content(*memory), Pattern(5000));
}

} // namespace
} // namespace Kernel

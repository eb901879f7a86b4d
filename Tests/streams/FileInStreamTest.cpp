#include "libkernel/streams/FileInStream.h"

#include "StreamTestSupport.h"
#include "libkernel/streams/FastFileInStream.h"
#include "support/FaultyFiles.h"
#include "support/FileFixture.h"

#include <random>

namespace Kernel {
namespace {

using namespace Test;
using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::WriteWholeFile;

class FileInStreamTest : public TestSupport::FileFixture
{
protected:
    FileInStreamTest() { WriteWholeFile(m_path, m_text); }

    static std::string Read(InStream& in, u64 count)
    {
        std::string text(count, '\0');
        text.resize(in.ReadBlock(text.data(), count));
        return text;
    }

    FaultyFiles m_calls;
    std::string const m_text = Pattern(20'000);
};

TEST_F(FileInStreamTest, TheEndShowsOnlyAfterAReadHasTriedToPassIt)
{
    for (auto const& [unbuffered, reads] : {std::pair{false, 5}, {true, 21}}) {
        SCOPED_TRACE(unbuffered);
        Counted<FileInStream> in = FileInStream::Open(m_path.c_str(), unbuffered);
        m_calls.ResetCounts();
        EXPECT_TRUE(ReadAll(*in, 1000) == m_text);
        EXPECT_GE(m_calls.GetCount(FileCall::Read), reads);
        EXPECT_LE(m_calls.GetCount(FileCall::Read), reads + 2);
        EXPECT_TRUE(in->Rewind());
        EXPECT_TRUE(Read(*in, m_text.size()) == m_text);
        EXPECT_FALSE(in->EOS());
        EXPECT_EQ(Read(*in, 1), "");
        EXPECT_TRUE(in->EOS());
        EXPECT_FALSE(in->IsBroken());
        EXPECT_TRUE(in->Seek(SeekMethod::End, 5)) << "a file may be sought past its end";
        EXPECT_FALSE(in->EOS());
        EXPECT_EQ(Read(*in, 1), "");
        EXPECT_EQ(in->Tell(), m_text.size() + 5);
    }
}

TEST_F(FileInStreamTest, APlainStreamCannotBeSoughtBelowItsStart)
{
    Counted<FileInStream> in = FileInStream::Open(m_path.c_str());
    EXPECT_TRUE(in->Seek(7));
    EXPECT_FALSE(in->Seek(SeekMethod::Current, -8));
    EXPECT_FALSE(in->Seek(SeekMethod::End, -20'001));
    EXPECT_FALSE(in->Seek(SeekMethod::Current, INT64_MAX));
    EXPECT_FALSE(in->Seek(static_cast<SeekMethod>(3), 0));
    EXPECT_FALSE(in->SkipBlock(~u64{0}));
    EXPECT_EQ(in->Tell(), 7u);
    EXPECT_FALSE(in->IsBroken());
}

TEST_F(FileInStreamTest, AnySequenceOfReadsAndSeeksGivesTheFilesBytes)
{
    for (char const* const kind : {"buffered", "unbuffered", "fast"}) {
        SCOPED_TRACE(kind);
        Counted<FileInStream> plain = FileInStream::Open(m_path.c_str(), *kind == 'u');
        Counted<FastFileInStream> fast = FastFileInStream::Open(m_path.c_str(), 2000);
        InStreamSeekable& in = *kind == 'f' ? static_cast<InStreamSeekable&>(*fast) : *plain;
        std::mt19937 random(7);
        u64 position = 0;
        for (int step = 0; step < 2000; ++step) {
            u64 const n = random() % (random() % 4 ? 600 : 6000);
            switch (random() % 5) {
            case 0:
                position = random() % m_text.size();
                ASSERT_TRUE(in.Seek(static_cast<i64>(position)));
                break;
            case 1: {
                i64 const offset = std::max(static_cast<i64>(n) - 1500, -static_cast<i64>(position));
                ASSERT_TRUE(in.Seek(SeekMethod::Current, offset));
                position += static_cast<u64>(offset);
                break;
            }
            default: {
                std::string const expected = position < m_text.size() ? m_text.substr(position, n) : std::string();
                ASSERT_TRUE(Read(in, n) == expected);
                position += expected.size();
            }
            }
            ASSERT_EQ(in.Tell(), position);
        }
    }
}

TEST_F(FileInStreamTest, AFastStreamReadsWholeBuffersAndLargeReadsPastThem)
{
    EXPECT_EQ(FastFileInStream::Open(m_path.c_str(), 100)->GetBufferSize(), 1024u);
    EXPECT_FALSE(FastFileInStream::Open(m_path.c_str(), ~u64{0})) << "no memory for the buffer";

    Counted<FastFileInStream> in = FastFileInStream::Open(m_path.c_str(), 1024);
    m_calls.ResetCounts();
    Read(*in, 100);
    Read(*in, 900);
    EXPECT_EQ(m_calls.GetCount(FileCall::Read), 1);
    EXPECT_TRUE(Read(*in, 5000) == m_text.substr(1000, 5000));
    EXPECT_EQ(m_calls.GetCount(FileCall::Read), 2) << "what was held, then the rest in one piece";
    Read(*in, 1);
    EXPECT_EQ(m_calls.GetCount(FileCall::Read), 3);
}

TEST_F(FileInStreamTest, AFastSeekInsideTheBufferTouchesNoFile)
{
    Counted<FastFileInStream> in = FastFileInStream::Open(m_path.c_str(), 1024);
    Read(*in, 500);
    m_calls.ResetCounts();
    for (i64 const target : {499, 1023, 0, 700}) {
        EXPECT_TRUE(in->Seek(target));
        EXPECT_EQ(Read(*in, 1), m_text.substr(static_cast<size_t>(target), 1));
    }
    EXPECT_TRUE(in->SkipBlock(100));
    EXPECT_EQ(Read(*in, 200), m_text.substr(801, 200));
    EXPECT_EQ(m_calls.GetCount(FileCall::Read) + m_calls.GetCount(FileCall::Seek), 0);
    EXPECT_TRUE(in->Seek(SeekMethod::Current, -5000)) << "clamped to the start";
    EXPECT_EQ(in->Tell(), 0u);

    WriteWholeFile(m_path, "0123456789");
    in = FastFileInStream::Open(m_path.c_str(), 1024);
    Read(*in, 9);
    EXPECT_FALSE(in->EOS()) << "the file is at its end, the buffer isn't";
    Read(*in, 1);
    EXPECT_TRUE(in->EOS());
    EXPECT_TRUE(in->Seek(5));
    EXPECT_FALSE(in->EOS());
}

} // namespace
} // namespace Kernel

#include "libkernel/streams/BufferedInStream.h"

#include "StreamTestSupport.h"

#include <gtest/gtest.h>
#include <new>

namespace Kernel {
namespace {

using namespace Test;

constexpr u64 c_buffer = BufferedInStream::c_smallestBuffer;

class BufferedInStreamTest : public testing::Test
{
protected:
    void Open(u64 size, u64 bufferSize = 1)
    {
        m_text = Pattern(size);
        m_source = MakeCounted<PlainSource>(m_text);
        m_source->SkipBlock(10);
        m_text.erase(0, 10);
        m_in = BufferedInStream::Create(Counted<InStream>(m_source), bufferSize);
    }
    std::string Read(u64 count)
    {
        std::string text(count, '\0');
        text.resize(m_in->ReadBlock(text.data(), count));
        return text;
    }

    std::string m_text;
    Counted<PlainSource> m_source;
    Counted<BufferedInStream> m_in;
};

TEST_F(BufferedInStreamTest, SmallReadsShareOneReadOfTheSourceAndLargeOnesGoPastTheBuffer)
{
    Open(200'000);
    EXPECT_EQ(m_in->GetSize(), m_text.size());
    EXPECT_TRUE(ReadAll(*m_in, 999) == m_text);
    EXPECT_EQ(m_source->reads, (std::vector<u64>{c_buffer, c_buffer, c_buffer, c_buffer, c_buffer, c_buffer}))
        << "four to get there, one short, one that finds the end";
    EXPECT_TRUE(m_in->EOS());

    Open(300'000);
    EXPECT_EQ(Read(c_buffer).size(), c_buffer);
    EXPECT_EQ(m_source->Tell(), 10 + c_buffer) << "nothing was read ahead";
    EXPECT_EQ(Read(10), m_text.substr(c_buffer, 10));
    EXPECT_TRUE(Read(2 * c_buffer) == m_text.substr(c_buffer + 10, 2 * c_buffer));
    EXPECT_EQ(m_source->reads, (std::vector<u64>{c_buffer, c_buffer, c_buffer + 10}));
}

TEST_F(BufferedInStreamTest, NothingBehindTheLimitIsTakenFromTheSourceOrTheBuffer)
{
    Open(200'000);
    m_in->SetLimit(c_buffer + 100);
    EXPECT_EQ(m_in->GetSize(), c_buffer + 100);
    EXPECT_TRUE(ReadAll(*m_in, 1000) == m_text.substr(0, c_buffer + 100));
    EXPECT_TRUE(m_in->EOS());
    EXPECT_TRUE(m_in->SkipBlock(5));
    EXPECT_EQ(m_source->Tell(), 10 + c_buffer + 100);

    m_in->SetLimit(0);
    EXPECT_FALSE(m_in->EOS());
    EXPECT_EQ(Read(5), m_text.substr(c_buffer + 100, 5));
    m_in->SetLimit(c_buffer + 107);
    EXPECT_EQ(Read(100), m_text.substr(c_buffer + 105, 2)) << "more is in the buffer";
    m_in->SetLimit(0);
    EXPECT_EQ(Read(5), m_text.substr(c_buffer + 107, 5));
}

TEST_F(BufferedInStreamTest, SkipsUseTheBufferFirst)
{
    Open(100'000);
    Read(1);
    EXPECT_TRUE(m_in->SkipBlock(99));
    EXPECT_EQ(Read(1), m_text.substr(100, 1));
    EXPECT_TRUE(m_in->SkipBlock(c_buffer));
    EXPECT_EQ(Read(1), m_text.substr(c_buffer + 101, 1));
    EXPECT_FALSE(m_in->SkipBlock(1'000'000));
    EXPECT_EQ(m_in->Tell(), m_text.size()) << "the buffer is gone all the same";
    EXPECT_THROW(Open(100, ~u64{0}), std::bad_alloc);
    EXPECT_FALSE(BufferedInStream::Create(nullptr, 1));
}

} // namespace
} // namespace Kernel

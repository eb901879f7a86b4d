#include "libkernel/streams/FileOutStream.h"

#include "StreamTestSupport.h"
#include "libkernel/streams/FastFileOutStream.h"
#include "libkernel/streams/FileInOutStream.h"
#include "support/FaultyFiles.h"
#include "support/FileFixture.h"

#include <random>

namespace Kernel {
namespace {

using namespace Test;
using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::ReadWholeFile;
using TestSupport::WriteWholeFile;
using Result = File::OpenUnmanagedResult;

using FileOutStreamTest = TestSupport::FileFixture;

// Both kinds of seekable file stream against a memory stream. The seeks stay inside, since a file seek alone does not
// lengthen a file.
TEST_F(FileOutStreamTest, AnySequenceOfWritesSeeksAndCutsGivesTheSameFile)
{
    for (bool const buffered : {true, false})
        for (unsigned seed = 0; seed < 10; ++seed) {
            SCOPED_TRACE(seed);
            Counted<FileOutStream> plain = FileOutStream::Create(m_path.c_str());
            Counted<FileInOutStream> both = FileInOutStream::Create((m_folder / "both").c_str());
            OutStreamSeekable& out = buffered ? static_cast<OutStreamSeekable&>(*plain) : *both;
            auto memory = MakeCounted<MemoryInOutStream>();
            std::mt19937 random(seed);
            for (int step = 0; step < 200; ++step) {
                std::string const text = Pattern(random() % (random() % 4 ? 300 : 10'000), random());
                u64 const position = memory->GetSize() ? random() % memory->GetSize() : 0;
                switch (random() % 8) {
                case 0:
                    out.Seek(static_cast<i64>(position));
                    memory->Seek(static_cast<i64>(position));
                    break;
                case 1:
                    EXPECT_TRUE(out.WriteBlockAtPos(position, text.data(), text.size()));
                    memory->WriteBlockAtPos(position, text.data(), text.size());
                    break;
                case 2:
                    out.Truncate(position * 2);
                    memory->Truncate(position * 2);
                    break;
                default: EXPECT_EQ(Write(out, text), text.size()); Write(*memory, text);
                }
                ASSERT_EQ(out.OutStream::Tell(), memory->Tell());
                ASSERT_EQ(out.OutStream::GetSize(), memory->GetSize());
            }
            EXPECT_TRUE(plain->Close() && both->Close());
            EXPECT_TRUE(ReadWholeFile(buffered ? m_path : m_folder / "both") == Content(*memory));
        }
}

TEST_F(FileOutStreamTest, AppendedBytesGoToTheEndWhoeverElseAppends)
{
    WriteWholeFile(m_path, "old ");
    Counted<FileOutStream> first = FileOutStream::Append(m_path.c_str());
    Counted<FastFileOutStream> second = FastFileOutStream::Append(m_path.c_str(), 0);
    EXPECT_EQ(first->Tell(), 4u);
    Write(*first, "one ");
    EXPECT_EQ(first->Tell(), 8u);
    EXPECT_EQ(first->GetSize(), 8u) << "with what is held";
    first->Flush();
    Write(*second, "two ");
    second->Flush();
    EXPECT_EQ(second->Tell(), 12u);
    EXPECT_TRUE(first->Seek(0));
    Write(*first, "three");
    EXPECT_TRUE(first->Close());
    EXPECT_EQ(ReadWholeFile(m_path), "old one two three");
}

TEST_F(FileOutStreamTest, SmallWritesShareACallAndLargeOnesGoPastTheBuffer)
{
    FaultyFiles calls;
    for (bool const fast : {false, true}) {
        SCOPED_TRACE(fast);
        Counted<FileOutStream> plain = fast ? nullptr : FileOutStream::Create(m_path.c_str());
        Counted<FastFileOutStream> quick = fast ? FastFileOutStream::Create(m_path.c_str(), 4096) : nullptr;
        OutStream& out = fast ? static_cast<OutStream&>(*quick) : *plain;
        calls.ResetCounts();
        std::string text;
        auto put = [&](u64 count, int expectedCalls) {
            std::string const piece = Pattern(count, static_cast<unsigned>(text.size()));
            EXPECT_EQ(Write(out, piece), count);
            EXPECT_EQ(calls.GetCount(FileCall::Write), expectedCalls);
            text += piece;
        };
        for (int i = 0; i < 8; ++i) put(512, 0);
        put(1, 1);
        put(100'000, 3); // The buffer filled up and written, then the rest in one piece.
        put(4096, 3);
        put(8192, 5);
        EXPECT_EQ(out.Tell(), text.size());
        EXPECT_TRUE(out.Flush());
        EXPECT_TRUE(ReadWholeFile(m_path) == text);
    }
    EXPECT_EQ(FastFileOutStream::Create(m_path.c_str(), 100)->GetBufferSize(), 1024u);
}

TEST_F(FileOutStreamTest, AFileIsNotEmptiedForAStreamThatCannotBe)
{
    WriteWholeFile(m_path, "kept");
    EXPECT_FALSE(FastFileOutStream::Create(m_path.c_str(), ~u64{0}));
    Counted<FileInOutStream> holder;
    Result result{};
    holder = FileInOutStream::Open(m_path.c_str(), File::ShareMode::DenyWrite, result);
    String8 text;
    EXPECT_FALSE(FileOutStream::Create(m_path.c_str(), File::ShareMode::DenyNone, result, &text));
    EXPECT_EQ(result, Result::NotPermitted);
    EXPECT_EQ(text, "EACCES : Permission denied");
    EXPECT_EQ(ReadWholeFile(m_path), "kept");
    EXPECT_FALSE(FileOutStream::Create(nullptr));
    EXPECT_FALSE(FileOutStream::Append(nullptr));
    EXPECT_FALSE(FastFileOutStream::Append(nullptr, 0));
}

std::vector<Platform::FlushKind> g_flushes;

TEST_F(FileOutStreamTest, ADeviceFlushIsTheFullOneAfterALengthWasSet)
{
    Platform::FileCalls calls = Platform::GetSystemFileCalls();
    calls.flush = [](Platform::FileHandle handle, Platform::FlushKind kind) {
        g_flushes.push_back(kind);
        return Platform::GetSystemFileCalls().flush(handle, kind);
    };
    Platform::SetFileCalls(&calls);
    constexpr auto full = Platform::FlushKind::Full;
    constexpr auto data = Platform::FlushKind::Data;
    Counted<FileOutStream> plain = FileOutStream::Create(m_path.c_str());
    Counted<FileInOutStream> both = FileInOutStream::Create((m_folder / "both").c_str());
    for (OutStreamSeekable* out :
         {static_cast<OutStreamSeekable*>(plain.Get()), static_cast<OutStreamSeekable*>(both.Get())})
    {
        g_flushes.clear();
        Write(*out, "abcdef");
        EXPECT_TRUE(out->ForceFlush());
        out->Seek(2);
        Write(*out, "XYZ");
        EXPECT_TRUE(out->ForceFlush());
        Write(*out, "longer");
        EXPECT_TRUE(out->ForceFlush());
        out->Truncate(3);
        EXPECT_TRUE(out->ForceFlush());
        EXPECT_EQ(g_flushes, (std::vector{full, data, data, full}));
    }
    both = FileInOutStream::Open(m_path.c_str());
    g_flushes.clear();
    EXPECT_TRUE(both->WriteAt(0, "x", 1) == 1 && both->ForceFlush());
    EXPECT_EQ(g_flushes, (std::vector{data}));
    Platform::SetFileCalls(nullptr);
}

} // namespace
} // namespace Kernel

#include "libkernel/streams/FileInOutStream.h"

#include "StreamTestSupport.h"
#include "libkernel/platform/Errors.h"
#include "support/FaultyFiles.h"
#include "support/FileFixture.h"

#include <thread>

namespace Kernel {
namespace {

using namespace Test;
using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::ReadWholeFile;
using TestSupport::WriteWholeFile;
using Result = File::OpenUnmanagedResult;
using ShareMode = File::ShareMode;

using FileInOutStreamTest = TestSupport::FileFixture;

TEST_F(FileInOutStreamTest, EachFormOpensOrMakesTheFile)
{
    Result result{};
    EXPECT_FALSE(FileInOutStream::Open(m_path.c_str(), ShareMode::DenyNone, result));
    EXPECT_EQ(result, Result::NotFound);
    EXPECT_FALSE(FileInOutStream::OpenReadOnly(m_path.c_str()));
    EXPECT_TRUE(FileInOutStream::OpenOrCreate(m_path.c_str()));
    EXPECT_FALSE(FileInOutStream::Create(m_path.c_str(), true));
    EXPECT_FALSE(FileInOutStream::Create(m_path.c_str(), ShareMode::DenyNone, result, nullptr, true));
    EXPECT_EQ(result, Result::Exists);

    WriteWholeFile(m_path, "old");
    EXPECT_EQ(ReadAll(*FileInOutStream::OpenOrCreate(m_path.c_str())), "old");
    EXPECT_EQ(FileInOutStream::Create(m_path.c_str())->GetSize(), 0u);
    EXPECT_TRUE(FileInOutStream::Create((m_folder / "new").c_str(), true));
    Counted<FileInOutStream> first = FileInOutStream::Create(m_path.c_str(), ShareMode::DenyWrite, result);
    String8 text;
    EXPECT_FALSE(FileInOutStream::Open(m_path.c_str(), ShareMode::DenyWrite, result, &text));
    EXPECT_EQ(result, Result::NotPermitted);
    EXPECT_FALSE(text.IsEmpty() || FileInOutStream::OpenOrCreate(m_path.c_str()));
    EXPECT_TRUE(FileInOutStream::OpenReadOnly(m_path.c_str()));
    first.Reset();
    // A failure that passes empties no file.
    WriteWholeFile(m_path, "kept");
    FaultyFiles faults;
    faults.Plan({.call = FileCall::Open, .error = EMFILE});
    EXPECT_EQ(ReadAll(*FileInOutStream::OpenOrCreate(m_path.c_str())), "kept");
    EXPECT_FALSE(FileInOutStream::Open(nullptr) || FileInOutStream::OpenOrCreate(nullptr) ||
                 FileInOutStream::OpenReadOnly(nullptr) || FileInOutStream::Create(nullptr));
}

TEST_F(FileInOutStreamTest, EachCallReachesTheSystemInOnePiece)
{
    FaultyFiles calls;
    Counted<FileInOutStream> stream = FileInOutStream::Create(m_path.c_str());
    calls.ResetCounts();
    *stream << 1u << u64{2};
    EXPECT_EQ(ReadWholeFile(m_path).size(), 12u) << "nothing is held back";
    Write(*stream, Pattern(3'000'000));
    stream->Rewind();
    stream->SkipBlock(12);
    std::string text(3'000'000, '\0');
    EXPECT_EQ(stream->ReadBlock(text.data(), text.size()), text.size());
    EXPECT_TRUE(text == Pattern(3'000'000));
    EXPECT_EQ(calls.GetCount(FileCall::Write), 3);
    EXPECT_EQ(calls.GetCount(FileCall::Read), 1);
    EXPECT_EQ(calls.GetCount(FileCall::Seek), 0) << "seeks are the stream's own";
}

TEST_F(FileInOutStreamTest, ReadsAndWritesShareOnePosition)
{
    Counted<FileInOutStream> stream = FileInOutStream::Create(m_path.c_str());
    Write(*stream, "0123456789");
    EXPECT_TRUE(stream->Seek(SeekMethod::End, -4));
    char two[2];
    EXPECT_EQ(stream->ReadBlock(two, 2), 2u);
    Write(*stream, "X");
    EXPECT_EQ(ReadAll(*stream), "9");
    EXPECT_TRUE(stream->EOS());
    EXPECT_TRUE(stream->SeekOutStream(SeekMethod::Current, 3));
    EXPECT_FALSE(stream->EOS());
    Write(*stream, "Y");
    EXPECT_EQ(ReadWholeFile(m_path), std::string("01234567X9\0\0\0Y", 14));
    EXPECT_FALSE(stream->Seek(SeekMethod::Current, -15));
    EXPECT_EQ(stream->Tell(), 14u);
    EXPECT_TRUE(stream->Recreate());
    EXPECT_EQ(stream->Tell(), 0u);
    Write(*stream, "new");
    EXPECT_EQ(ReadWholeFile(m_path), "new");
}

TEST_F(FileInOutStreamTest, AReadOnlyStreamWritesNothing)
{
    WriteWholeFile(m_path, "abc");
    Counted<FileInOutStream> stream = FileInOutStream::OpenReadOnly(m_path.c_str());
    EXPECT_TRUE(stream->IsReadOnly());
    EXPECT_EQ(stream->WriteBlock("x", 1), 0u);
    EXPECT_EQ(stream->WriteAt(0, "x", 1), 0u);
    EXPECT_FALSE(stream->WriteBlockAtPos(0, "x", 1) || stream->Truncate(0) || stream->Recreate() ||
                 stream->UpdateTimestamps());
    EXPECT_FALSE(stream->IsBroken());
    EXPECT_EQ(ReadAll(*stream), "abc");
}

TEST_F(FileInOutStreamTest, ManyThreadsReadByPositionBesideAWriter)
{
    std::string const text = Pattern(200'000);
    WriteWholeFile(m_path, text);
    Counted<FileInOutStream> stream = FileInOutStream::Open(m_path.c_str());
    stream->Seek(SeekMethod::End, 0);
    std::vector<std::thread> threads;
    std::atomic<int> wrong = 0;
    for (unsigned t = 0; t < 4; ++t)
        threads.emplace_back([&, t] {
            std::string piece(1000, '\0');
            for (u64 at = t * 100; at + 1000 <= text.size(); at += 1700)
                wrong += stream->ReadAt(at, piece.data(), 1000) != 1000 || piece != text.substr(at, 1000);
        });
    for (int i = 0; i < 50; ++i) Write(*stream, "tail");
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(wrong, 0);
    EXPECT_EQ(stream->Tell(), text.size() + 200);

    char bytes[10];
    FaultyFiles faults;
    faults.Plan({.call = FileCall::Read, .error = EIO});
    EXPECT_THROW(stream->ReadAt(0, bytes, 3), FileIOException);
    EXPECT_FALSE(stream->IsBroken()) << "it is its reader's failure alone";
    EXPECT_EQ(stream->ReadAt(text.size() + 195, bytes, 10), 5u);
    EXPECT_EQ(stream->ReadAt(~u64{0}, bytes, 10), 0u);
    EXPECT_FALSE(stream->EOS()) << "not a matter of the position";
    EXPECT_THROW(stream->WriteAt(~u64{0} - 3, bytes, 10), FileIOException);
    EXPECT_TRUE(stream->IsBroken());
}

TEST_F(FileInOutStreamTest, AttributesAndTimesCanBeCarriedOver)
{
    namespace fs = std::filesystem;
    std::string const other = Make("other").GetData();
    fs::permissions(Make("file").GetData(), fs::perms(0640));
    Counted<FileInOutStream> to = FileInOutStream::Open(other.c_str());
    EXPECT_TRUE(to->CopyFileAttributes(*FileInOutStream::OpenReadOnly(m_path.c_str())));
    EXPECT_EQ(fs::status(other).permissions(), fs::perms(0640));
    Platform::GetFileCalls().setTimes(other.c_str(), 0, 0);
    auto const before = fs::last_write_time(other);
    EXPECT_TRUE(to->UpdateTimestamps());
    EXPECT_GT(fs::last_write_time(other), before);
}

} // namespace
} // namespace Kernel

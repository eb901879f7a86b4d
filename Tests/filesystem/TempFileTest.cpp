#include "libkernel/filesystem/TempFile.h"

#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/platform/Errors.h"
#include "libkernel/streams/FileInOutStream.h"
#include "libkernel/streams/FileOutStream.h"
#include "support/FaultyFiles.h"
#include "support/FileFixture.h"
#include "support/Rows.h"

#include <chrono>
#include <future>
#include <set>
#include <thread>
#include <utility>
#include <vector>

namespace Kernel {
namespace {

using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::ReadWholeFile;
using TestSupport::S;
using TestSupport::TempFolder;
using TestSupport::WriteWholeFile;

/// The first bytes of an archive with the given version and flags.
std::string Header(int version, int flags)
{
    return {'\0', '\xFF', 'K', 'A', char(version), '\0', char(flags), '\0', 'd', 'n', 'i', 'k'};
}

class TempFileTest : public testing::Test
{
protected:
    TempFileTest()
    {
        std::vector<String8> rescued;
        TempFile::SetTempPath(S(m_first.GetPath()), S(m_second.GetPath()), rescued);
    }
    ~TempFileTest() override { TempFile::SetTempPath(""); }

    /// The counter of a generated path.
    static u64 CounterOf(String8 const& path)
    {
        return std::stoull(FileSystem::GetFilename(path).GetData(), nullptr, 16);
    }
    TempFolder m_first, m_second;
};

TEST_F(TempFileTest, NothingIsMadeWithoutTheFolderAskedFor)
{
    String8 out = "untouched";
    std::vector<String8> rescued;
    EXPECT_TRUE(TempFile::HaveTempPath());
    TempFile::SetTempPath(S(m_first.GetPath()), "", rescued);
    EXPECT_TRUE(TempFile::GenerateTempInOutFile(out, "x"));
    out = "untouched";
    EXPECT_FALSE(TempFile::GenerateTempFilePath(out, "", TempFile::c_second));
    EXPECT_FALSE(TempFile::GenerateTempInOutFile(out, "", TempFile::c_second));
    TempFile::SetTempPath("", S(m_second.GetPath()), rescued);
    EXPECT_FALSE(TempFile::HaveTempPath());
    EXPECT_FALSE(TempFile::GenerateTempOutFile(out, ""));
    EXPECT_FALSE(TempFile::GenerateTempOutFile(out, "", TempFile::c_second));
    EXPECT_EQ(out, "untouched");
}

TEST_F(TempFileTest, NamesCountUpInHexadecimalAndMadeFilesAreOpen)
{
    String8 a, b, c, d, e;
    ASSERT_TRUE(TempFile::GenerateTempFilePath(a, ""));
    Counted<FileInOutStream> const stream = TempFile::GenerateTempInOutFile(b, "tmp");
    Counted<FileOutStream> const writer = TempFile::GenerateTempOutFile(c, ".tmp");
    ASSERT_TRUE(stream && writer && TempFile::GenerateTempFilePath(d, "", TempFile::c_second));
    EXPECT_TRUE(a.BeginsWith(S(m_first.GetPath() + "/")));
    EXPECT_TRUE(d.BeginsWith(S(m_second.GetPath() + "/")));
    EXPECT_EQ(CounterOf(b), CounterOf(a) + 1);
    EXPECT_EQ(CounterOf(d), CounterOf(a) + 3);
    for (String8 const& path : {b, c}) {
        std::string const name = FileSystem::GetFilename(path).GetData();
        EXPECT_EQ(name.find(".tmp"), name.size() - 4);
        EXPECT_EQ(name.find_first_not_of("0123456789abcdef"), name.size() - 4);
        EXPECT_EQ(FileSystem::GetFileSize(path), 0);
    }
    EXPECT_FALSE(FileSystem::Exists(a));
    char text[3] = {};
    EXPECT_EQ(stream->WriteBlock("abc", 3), 3u);
    EXPECT_TRUE(stream->SeekInStream(SeekMethod::Beginning, 0));
    EXPECT_EQ(stream->ReadBlock(text, 3), 3u);
    EXPECT_TRUE(writer->WriteBlock("abc", 3) == 3 && writer->Close());
    EXPECT_EQ(ReadWholeFile(c.GetData()), "abc");
}

TEST_F(TempFileTest, TakenNamesArePassedOverAndLeftAlone)
{
    // Of the next names one is a file, one a link to a document, one a link that leads nowhere, one a folder.
    TempFolder elsewhere;
    WriteWholeFile(elsewhere / "document", "precious");
    using Maker = bool (*)(String8&);
    static constexpr auto write = [](auto const& stream) { return stream && stream->WriteBlock("x", 1) == 1; };
    static constexpr Maker c_makers[] = {
        [](String8& path) { return TempFile::GenerateTempFilePath(path, ""); },
        [](String8& path) { return write(TempFile::GenerateTempInOutFile(path, "")); },
        [](String8& path) { return write(TempFile::GenerateTempOutFile(path, "")); },
    };
    for (Maker const maker : c_makers) {
        String8 last;
        ASSERT_TRUE(TempFile::GenerateTempFilePath(last, ""));
        u64 const next = CounterOf(last) + 1;
        auto const at = [&](u64 i) {
            char text[17];
            std::snprintf(text, sizeof text, "%llx", static_cast<unsigned long long>(next + i));
            return m_first / text;
        };
        WriteWholeFile(at(0), "file");
        std::filesystem::create_symlink(elsewhere / "document", at(1));
        std::filesystem::create_symlink(elsewhere / "nothing", at(2));
        std::filesystem::create_directory(at(3));
        ASSERT_TRUE(maker(last));
        EXPECT_EQ(last, S(at(4)));
        EXPECT_EQ(ReadWholeFile(at(0)), "file");
        EXPECT_EQ(ReadWholeFile(elsewhere / "document"), "precious");
        EXPECT_FALSE(FileSystem::Exists(S(elsewhere / "nothing")));
    }
}

TEST_F(TempFileTest, FullDiskAndTooManyFilesEndTheSearchAtOnce)
{
    FaultyFiles faults;
    String8 out;
    for (int error : {EMFILE, ENFILE, ENOSPC}) {
        faults.Clear();
        faults.ResetCounts();
        faults.Plan({.call = FileCall::Open, .forEver = true, .error = error});
        EXPECT_FALSE(TempFile::GenerateTempInOutFile(out, ""));
        EXPECT_FALSE(TempFile::GenerateTempOutFile(out, ""));
        EXPECT_EQ(faults.GetCount(FileCall::Open), 2);
    }
    faults.Clear();
    faults.Plan({.call = FileCall::Open, .n = 1, .error = EACCES});
    EXPECT_TRUE(TempFile::GenerateTempInOutFile(out, ""));
    faults.Clear();
    faults.Plan({.call = FileCall::Open, .forEver = true, .error = EROFS});
    EXPECT_FALSE(TempFile::GenerateTempInOutFile(out, ""));
    EXPECT_FALSE(TempFile::GenerateTempOutFile(out, ""));
    EXPECT_EQ(faults.GetOpenHandles(), 0);
}

TEST_F(TempFileTest, FileThatIsSlowToMakeKeepsNobodyFromNames)
{
    FaultyFiles faults;
    String8 slow, other;
    bool isFirst = true;
    std::future<bool> made; // Outlives the call, so that a name that is kept waiting fails the test and hangs nothing.
    faults.SetObserver([&](FileCall call, std::string const&) {
        if (call != FileCall::Open || !std::exchange(isFirst, false)) return;
        made = std::async(std::launch::async, [&] { return TempFile::GenerateTempFilePath(other, ""); });
        EXPECT_EQ(made.wait_for(std::chrono::seconds(5)), std::future_status::ready);
    });
    EXPECT_TRUE(TempFile::GenerateTempInOutFile(slow, ""));
    faults.SetObserver(nullptr);
    EXPECT_EQ(CounterOf(other), CounterOf(slow) + 1);
}

TEST_F(TempFileTest, ThreadsNeverGetOneName)
{
    constexpr int c_threads = 4, c_names = 200;
    std::vector<std::vector<String8>> names(c_threads);
    std::vector<std::thread> threads;
    for (auto& mine : names)
        threads.emplace_back([&mine] {
            for (int i = 0; i < c_names; ++i) {
                String8 path;
                if (i % 2 == 0)
                    TempFile::GenerateTempFilePath(path, "n");
                else
                    TempFile::GenerateTempOutFile(path, "n");
                mine.push_back(path);
            }
        });
    for (auto& thread : threads) thread.join();
    std::set<String8> all;
    for (auto const& mine : names) all.insert(mine.begin(), mine.end());
    EXPECT_EQ(all.size(), size_t(c_threads * c_names));
}

TEST_F(TempFileTest, StartEmptiesTheFoldersButKeepsMidStreamlineFiles)
{
    WriteWholeFile(m_first / "left", Header(11, 4));
    TempFolder elsewhere;
    WriteWholeFile(elsewhere / "document", "precious");
    std::filesystem::create_symlink(elsewhere / "document", m_first / "link");
    for (TempFolder const* folder : {&m_first, &m_second}) std::filesystem::create_directory(*folder / "folder");
    WriteWholeFile(m_second / "junk", "junk");
    WriteWholeFile(m_second / "rescue", Header(11, 5) + "more");
    std::vector<String8> rescued = {"before"};
    TempFile::SetTempPath(S(m_first.GetPath()), S(m_second.GetPath()), rescued);
    EXPECT_EQ(rescued, (std::vector<String8>{"before", S(m_second / "rescue")}));
    for (std::string const& gone : {m_first / "left", m_first / "link", m_second / "junk"})
        EXPECT_FALSE(std::filesystem::is_symlink(gone) || std::filesystem::exists(gone)) << gone;
    for (std::string const& kept :
         {m_first / "folder", m_second / "folder", m_second / "rescue", elsewhere / "document"})
        EXPECT_TRUE(std::filesystem::exists(kept)) << kept;

    // One that cannot be asked for its mark stays.
    FaultyFiles faults;
    for (auto const& [call, error, stays] : Rows<FileCall, int, bool>{
             {FileCall::Open, EMFILE, true}, {FileCall::Read, EIO, true}, {FileCall::Open, ENOENT, false}})
    {
        WriteWholeFile(m_second / "rescue", Header(11, 4));
        faults.Clear();
        faults.Plan({.call = call, .error = error, .path = "rescue"});
        rescued.clear();
        TempFile::SetTempPath(S(m_first.GetPath()), S(m_second.GetPath()), rescued);
        EXPECT_TRUE(rescued.empty());
        EXPECT_EQ(FileSystem::Exists(S(m_second / "rescue")), stays) << error;
    }
}

TEST_F(TempFileTest, MidStreamlineMarkIsReadFromAWholeHeaderOnly)
{
    for (auto const& [content, isMarked] : Rows<std::string, bool>{{Header(11, 4), true},
                                                                   {Header(7, 4 | 1), true},
                                                                   {Header(11, 1 | 2 | 8), false},
                                                                   {Header(6, 4), false},
                                                                   {Header(12, 4), false},
                                                                   {"x" + Header(11, 4).substr(1), false},
                                                                   {Header(11, 4).substr(0, 11), false},
                                                                   {"", false}})
    {
        WriteWholeFile(m_first / "file", content);
        EXPECT_EQ(TempFile::IsMidStreamlineFile(S(m_first / "file")), isMarked) << testing::PrintToString(content);
    }
    EXPECT_FALSE(TempFile::IsMidStreamlineFile(S(m_first / "missing")));
    EXPECT_FALSE(TempFile::IsMidStreamlineFile(S(m_first.GetPath())));
}

} // namespace
} // namespace Kernel

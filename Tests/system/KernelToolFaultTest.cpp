#include "support/ArchiveFixture.h"
#include "support/KernelTool.h"
#include "support/TempFolder.h"

#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <random>
#include <sys/mount.h>
#include <thread>
#include <unistd.h>

// What a stopped, killed or starved program leaves behind.

namespace KernelTest {
namespace {

namespace fs = std::filesystem;

std::string MakeNoise(size_t size, u32 seed)
{
    std::mt19937 random(seed);
    std::string noise(size, 0);
    for (char& c : noise) c = static_cast<char>(random());
    return noise;
}

class KernelToolFaultTest : public testing::Test
{
protected:
    using Items = std::map<std::string, std::string>;

    /// Two trees with the same names, and a document that holds the first.
    void MakeTrees(size_t count, size_t size)
    {
        for (u32 i = 0; i < count; ++i) {
            std::string const name = "item" + std::to_string(i);
            m_old[name] = MakeNoise(size, i);
            m_new[name] = MakeNoise(size, i + 1000);
        }
        m_new["added"] = "new item";
        for (auto const& [folder, items] : {std::pair("old", &m_old), std::pair("new", &m_new)}) {
            fs::create_directories(m_folder / folder);
            for (auto const& [name, bytes] : *items) WriteWhole(m_folder / folder + "/" + name, bytes);
        }
        ASSERT_EQ(Run({"archive", "create", m_pristine}).status, 0);
        ASSERT_EQ(Run({"archive", "put", m_pristine, "--tree", m_folder / "old", "--level", "store"}).status, 0);
    }
    ToolResult Run(std::vector<std::string> const& words) { return RunKernelTool(words, m_folder.GetPath()); }
    std::vector<std::string> PutNew(std::string const& doc) const
    {
        return {"archive", "put", doc, "--tree", m_folder / "new", "--level", "store"};
    }

    TestSupport::TempFolder m_folder;
    std::string const m_pristine = m_folder / "pristine";
    std::string const m_doc = m_folder / "doc";
    Items m_old, m_new;
};

TEST_F(KernelToolFaultTest, TwoHundredKillsLeaveTheOldOrTheNewState)
{
    MakeTrees(12, 100'000);
    fs::copy_file(m_pristine, m_doc);
    auto const start = std::chrono::steady_clock::now();
    ASSERT_EQ(Run(PutNew(m_doc)).status, 0);
    auto const whole = std::chrono::duration_cast<std::chrono::microseconds>(std::chrono::steady_clock::now() - start);

    std::mt19937 random(7);
    std::uniform_int_distribution<i64> moments(0, whole.count() * 5 / 4);
    int oldStates = 0;
    for (int i = 0; i < 200; ++i) {
        SCOPED_TRACE(i);
        fs::copy_file(m_pristine, m_doc, fs::copy_options::overwrite_existing);
        ToolProcess put(PutNew(m_doc), m_folder.GetPath());
        std::this_thread::sleep_for(std::chrono::microseconds(moments(random)));
        put.Kill(SIGKILL);
        put.Wait();
        ASSERT_EQ(Run({"archive", "verify", m_doc}).status, 0);
        auto const archive = OpenDocument(m_doc);
        ASSERT_TRUE(archive);
        Items const found = GetAll(*archive);
        ASSERT_TRUE(found == m_old || found == m_new);
        if (found == m_old) ++oldStates;
    }
    // Otherwise the moments missed the save, and nothing was shown.
    EXPECT_GT(oldStates, 10);
    ASSERT_EQ(Run(PutNew(m_doc)).status, 0);
    EXPECT_EQ(Run({"archive", "verify", m_doc}).status, 0);
}

TEST_F(KernelToolFaultTest, InterruptStopsTheSaveAndKeepsTheLastState)
{
    MakeTrees(2, 1000);
    fs::copy_file(m_pristine, m_doc);
    // A save that can't end by itself: its source is a pipe that nobody closes.
    std::string const pipe = m_folder / "pipe";
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    ToolProcess put({"archive", "put", m_doc, "item0=" + pipe}, m_folder.GetPath());
    std::ofstream feed(pipe); // Opens once the program has.
    put.Kill(SIGINT);
    // The flag is looked at between pieces, so pieces have to come.
    std::string const piece(1 << 20, 'x');
    std::signal(SIGPIPE, SIG_IGN);
    for (int i = 0; i < 200 && feed; ++i) feed << piece << std::flush;
    EXPECT_EQ(put.Wait(), 130);
    auto const archive = OpenDocument(m_doc);
    ASSERT_TRUE(archive);
    EXPECT_EQ(GetAll(*archive), m_old);
}

TEST_F(KernelToolFaultTest, FullDiskGivesItsResultAndKeepsTheLastState)
{
    MakeTrees(2, 100'000);
    std::string const mountPoint = m_folder / "small";
    fs::create_directory(mountPoint);
    if (::mount("tmpfs", mountPoint.c_str(), "tmpfs", 0, "size=512k") != 0)
        GTEST_SKIP() << "a file system of limited size can be mounted by root alone";
    struct Unmount
    {
        std::string const path;
        ~Unmount() { ::umount2(path.c_str(), MNT_DETACH); }
    } const unmount{mountPoint};
    std::string const doc = mountPoint + "/doc";
    fs::copy_file(m_pristine, doc);
    WriteWhole(m_folder / "big", MakeNoise(2'000'000, 5));

    ToolResult const put = Run({"archive", "put", doc, "big=" + m_folder / "big", "--level", "store"});
    EXPECT_EQ(put.status, 1);
    EXPECT_THAT(put.err, testing::HasSubstr("failed: OutOfSpace (1)\n"));
    EXPECT_EQ(Run({"archive", "verify", doc}).status, 0);
    {
        auto const archive = OpenDocument(doc);
        ASSERT_TRUE(archive);
        EXPECT_EQ(GetAll(*archive), m_old);
    }
    // What the save left behind the end is used again.
    EXPECT_EQ(Run({"archive", "put", doc, "small=" + m_folder / "new/added"}).status, 0);
    ToolResult const create = Run({"archive", "create", mountPoint + "/second"});
    EXPECT_EQ(create.status == 0, fs::exists(mountPoint + "/second")) << create.err;
}

} // namespace
} // namespace KernelTest

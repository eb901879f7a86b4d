#include "libkernel/streams/MemoryStreams.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"
#include "support/FakeClock.h"
#include "support/MemoryDisk.h"

#include <gtest/gtest.h>
#include <set>

// All damage of one byte that there is, and all truncations, of a document with something of everything.

namespace KernelTest {
namespace {

using namespace Kernel;
using Items = std::map<std::string, std::string>;
using R = Archive::OpenResult;
using Opener = Counted<Archive> (*)(String8 const&, Archive::OpenMode, IDTag, Archive::OpenResult&);

constexpr u64 c_infoPos = 12;
constexpr u64 c_guardEnd = 72;

struct View
{
    R result = R::OpenNotFound;
    Items items; // Only those that read.
    bool hasThumbnails = false;
};

class ArchiveDamageTest : public testing::Test
{
protected:
    ArchiveDamageTest()
    {
        using B = TestSupport::ArchiveBuilder;
        B builder;
        B::Table table;
        table.records = {{1, 0, "a", builder.AddBlock("first")},
                         {2, 0, "p", builder.AddBlock(std::string(60, 'p'), 0x01)}};
        builder.AddTable(table);
        m_firstEnd = builder.GetEnd();
        table = {};
        table.records = {{1, 1, "", builder.AddBlock("second")}, {2, 2}, {3, 0, "c", builder.AddBlock("third")}};
        table.pathCounts = {{"x", "y", 7}};
        table.userData = "user";
        m_secondTable = builder.AddTable(table);
        m_secondEnd = builder.GetEnd();
        builder.AddThumbnails({{29, 2}}, "tt");
        m_bytes = builder.Build();
    }

    View Look(Opener open, std::string const& bytes, bool saves = false)
    {
        m_disk.Load({{c_path, std::make_shared<std::string const>(bytes)}});
        View view;
        if (Counted<Archive> const archive = open(Str(c_path), Archive::OpenModeReadWrite, c_documentTag, view.result))
        {
            EXPECT_EQ(view.result, R::OpenOk);
            view.items = GetAll(*archive);
            std::erase_if(view.items, [](auto const& item) { return item.second == "(unreadable)"; });
            view.hasThumbnails = static_cast<bool>(archive->LoadThumbnails());
            if (!saves) return view;
            EXPECT_TRUE(Save(*archive, {{"saved", "after"}}));
        }
        if (saves && view.result == R::OpenOk) {
            Items after = GetAll(*OpenDocument(c_path));
            EXPECT_EQ(after["saved"], "after");
            for (auto const& [path, bytes] : view.items) EXPECT_EQ(after[path], bytes);
        }
        return view;
    }
    static R Test(std::string const& bytes)
    {
        auto const in = MakeCounted<MemoryInStream>(bytes.data(), bytes.size(), false);
        return Archive::TestArchive(*in, c_documentTag, nullptr, nullptr);
    }
    // A CRC finds every change of one byte, so what reads is what was once written.
    static bool IsWhole(View const& view)
    {
        static std::set<std::string> const s_written = {"first", "second", "third", std::string(60, 'p')};
        for (auto const& [path, bytes] : view.items)
            if (!s_written.count(bytes)) return false;
        return view.result == R::OpenOk || s_refusals.count(view.result) != 0;
    }

    static constexpr char const* c_path = "/ram/doc";
    static inline std::set<R> const s_refusals = {R::OpenLinkedNotFound, R::OpenLinkMismatch, R::OpenNotArchive,
                                                  R::OpenTooOld,         R::OpenTooNew,       R::OpenWrongType,
                                                  R::OpenCorrupt,        R::OpenBadInfo,      R::OpenTruncated};
    Items const m_old = {{"a", "first"}, {"p", std::string(60, 'p')}};
    Items const m_new = {{"a", "second"}, {"c", "third"}};
    TestSupport::FakeClock const m_clock;
    TestSupport::MemoryDisk m_disk;
    std::string m_bytes;
    u64 m_firstEnd = 0; // Of the first table, where the older state is whole; and of the second one.
    u64 m_secondTable = 0;
    u64 m_secondEnd = 0;
};

TEST_F(ArchiveDamageTest, EveryOtherValueOfEveryByteIsRefusedOrReads)
{
    u64 opened = 0;
    u64 recovered = 0;
    for (u64 at = 0; at < m_bytes.size() && !HasFailure(); ++at) {
        for (int change = 1; change < 256 && !HasFailure(); ++change) {
            std::string bytes = m_bytes;
            bytes[at] = static_cast<char>(bytes[at] ^ change);
            SCOPED_TRACE(testing::Message() << "byte " << at << " xor " << change);
            bool const isBit = (change & (change - 1)) == 0;
            View const found = Look(Archive::Open, bytes, isBit);
            ASSERT_TRUE(IsWhole(found)) << found.result;
            View const searched = Look(Archive::RecoverArchive, bytes);
            ASSERT_TRUE(IsWhole(searched)) << searched.result;
            if (found.result == R::OpenOk) {
                ++opened;
                ASSERT_EQ(Test(bytes), R::OpenOk);
                ASSERT_EQ(searched.result, R::OpenOk);
                ASSERT_EQ(searched.items, found.items);
            } else if (searched.result == R::OpenOk)
                ++recovered;
            // Whatever became of the fields that a save rewrites, the search finds a whole state.
            if (at >= c_infoPos && at < c_guardEnd - 8) {
                ASSERT_TRUE(searched.items == m_new || searched.items == m_old) << searched.result;
            }
            // And damage of the newest table costs that one alone.
            if (at >= m_secondTable && at < m_secondTable + 4) {
                ASSERT_EQ(found.result == R::OpenTooNew ? m_old : searched.items, m_old) << searched.result;
            }
        }
    }
    EXPECT_GT(opened, 30'000u);
    EXPECT_GT(recovered, 5'000u);
}

TEST_F(ArchiveDamageTest, EveryTruncationLeavesTheStateThatItHolds)
{
    for (u64 size = 0; size <= m_bytes.size(); ++size) {
        SCOPED_TRACE(size);
        R const expected = size < 12                   ? R::OpenNotArchive
                           : size < c_guardEnd         ? R::OpenBadInfo
                           : size < m_secondTable + 59 ? R::OpenTruncated
                           : size < m_secondEnd        ? R::OpenCorrupt
                                                       : R::OpenOk;
        std::string const bytes = m_bytes.substr(0, size);
        View const found = Look(Archive::Open, bytes);
        View const searched = Look(Archive::RecoverArchive, bytes);
        ASSERT_EQ(found.result, expected);
        // The headers alone are there when only the newest body is cut.
        ASSERT_EQ(Test(bytes), expected == R::OpenCorrupt ? R::OpenOk : expected);
        ASSERT_EQ(found.hasThumbnails, size == m_bytes.size());
        ASSERT_TRUE(IsWhole(searched));
        EXPECT_EQ(found.items, size >= m_secondEnd ? m_new : Items());
        EXPECT_EQ(searched.items, size >= m_secondEnd ? m_new : size >= m_firstEnd ? m_old : Items());
    }
    // In front of the first table: link and reference path.
    TestSupport::ArchiveBuilder builder;
    builder.link = {0, 1, "/nowhere"};
    builder.reference = "reference";
    for (u64 size = c_guardEnd; size < builder.GetFrontSize(); ++size)
        EXPECT_EQ(Look(Archive::Open, builder.Build().substr(0, size)).result, R::OpenTruncated) << size;
}

} // namespace
} // namespace KernelTest

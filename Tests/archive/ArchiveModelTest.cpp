#include "support/ArchiveFixture.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <random>
#include <set>

// Random saves against a plain model: what each revision holds, and the figures that a file keeps about itself.

namespace KernelTest {
namespace {

using namespace Kernel;

struct Model
{
    struct Item
    {
        std::string bytes;
        u32 uid = 0;
    };
    std::map<std::string, Item> master; // What the master alone holds.
    std::map<std::string, Item> head;   // What the pair holds.
    std::map<std::string, u32> uids;    // Every path that has a number, in whichever file.
    std::map<std::string, u32> masterUids;
    u32 nextUID = 1;
    u64 masterTotal = 0, masterDead = 0, scratchTotal = 0, scratchDead = 0;
    u32 masterSaves = 1, scratchSaves = 1;
    size_t masterRevisions = 0, scratchRevisions = 0;
};

class ArchiveModelTest : public DocumentTest, public testing::WithParamInterface<u32>
{
protected:
    void Compare()
    {
        std::map<std::string, std::string> expected;
        for (auto const& [path, item] : m_model.head) expected[path] = item.bytes;
        ASSERT_EQ(GetAll(*m_archive), expected);
        for (auto const& [path, item] : m_model.head)
            ASSERT_EQ(m_archive->GetFileInfo(Str(path))->GetUID(), item.uid) << path;

        Archive::FileState const master = StateOf(*m_archive, Archive::ChoiceMaster);
        ASSERT_EQ(master.totalBytes, m_model.masterTotal);
        ASSERT_EQ(master.deadBytes, m_model.masterDead);
        ASSERT_EQ(master.saveCount, m_model.masterSaves);
        if (m_archive->HasScratchFile()) {
            Archive::FileState const scratch = StateOf(*m_archive, Archive::ChoiceScratch);
            ASSERT_EQ(scratch.totalBytes, m_model.scratchTotal);
            ASSERT_EQ(scratch.deadBytes, m_model.scratchDead);
            ASSERT_EQ(scratch.saveCount, m_model.scratchSaves);
            ASSERT_EQ(scratch.linkSaveCount, master.saveCount);
            ASSERT_EQ(scratch.linkSaveTimeStamp, master.saveTimeStamp);
        }
        ASSERT_EQ(RevisionsOf(*m_archive).size(), m_model.masterRevisions + m_model.scratchRevisions);
    }

    Changes MakeChanges()
    {
        Changes changes;
        int const count = static_cast<int>(m_random() % 4);
        for (int i = 0; i < count; ++i) {
            std::string const path = "f" + std::to_string(m_random() % 12);
            if (m_random() % 4 == 0)
                changes[path] = std::nullopt;
            else
                changes[path] = std::string(m_random() % 3000, static_cast<char>('a' + m_random() % 26));
        }
        return changes;
    }

    static u64 SizeIn(std::map<std::string, Model::Item> const& items, std::string const& path)
    {
        auto const it = items.find(path);
        return it == items.end() ? 0 : it->second.bytes.size();
    }

    void ApplyWrites(Changes const& changes, u64& total, u64& dead, std::map<std::string, Model::Item> const& earlier,
                     bool& any)
    {
        // Files are offered in the order of their paths, and new ones are numbered as they come.
        for (auto const& [path, bytes] : changes) {
            bool const existed = earlier.count(path) != 0;
            if (!bytes) {
                if (!existed) continue;
                dead += SizeIn(earlier, path);
                m_model.head.erase(path);
            } else {
                if (!m_model.uids.count(path)) m_model.uids[path] = m_model.nextUID++;
                total += bytes->size();
                dead += SizeIn(earlier, path);
                m_model.head[path] = {*bytes, m_model.uids[path]};
            }
            any = true;
        }
    }

    void SaveScratch(Archive::SessionType type)
    {
        Changes const changes = MakeChanges();
        ASSERT_TRUE(Save(*m_archive, changes, true, type));
        bool any = false;
        std::map<std::string, Model::Item> const earlier = m_model.head;
        ApplyWrites(changes, m_model.scratchTotal, m_model.scratchDead, earlier, any);
        if (!any) return;
        ++m_model.scratchSaves;
        ++m_model.scratchRevisions;
    }

    void SaveMaster(Archive::SessionType type)
    {
        Changes changes = MakeChanges();
        ASSERT_TRUE(Save(*m_archive, changes, false, type));
        bool any = m_model.scratchRevisions != 0;
        // What the scratch file holds goes into the master, unless this save wrote the path itself.
        Changes all = changes;
        for (auto const& [path, item] : m_model.head) {
            auto const in = m_model.master.find(path);
            bool const differs = in == m_model.master.end() || m_scratchTouched.count(path);
            if (differs && m_scratchTouched.count(path)) all.emplace(path, item.bytes);
        }
        for (std::string const& path : m_scratchTouched)
            if (!m_model.head.count(path)) all.emplace(path, std::nullopt);
        ApplyWrites(all, m_model.masterTotal, m_model.masterDead, m_model.master, any);
        for (auto const& [path, bytes] : all)
            if (!bytes) m_model.head.erase(path);
        // A path that only the scratch file knew and that is gone gives its number up.
        for (auto it = m_model.uids.begin(); it != m_model.uids.end();) {
            bool const known = m_model.masterUids.count(it->first) || m_model.head.count(it->first);
            it = known ? std::next(it) : m_model.uids.erase(it);
        }
        if (!any) return;
        m_model.master = m_model.head;
        for (auto const& [path, item] : m_model.master) m_model.masterUids[path] = item.uid;
        ++m_model.masterSaves;
        ++m_model.masterRevisions;
        m_model.scratchRevisions = 0;
        m_model.scratchSaves = m_model.masterSaves;
        m_model.scratchTotal = m_model.masterTotal;
        m_model.scratchDead = m_model.masterDead;
        m_scratchTouched.clear();
    }

    std::mt19937 m_random{GetParam()};
    Model m_model;
    std::set<std::string> m_scratchTouched;
};

TEST_P(ArchiveModelTest, RandomSavesMatchThePlainModel)
{
    m_archive = CreateDocument(m_path);
    ASSERT_TRUE(m_archive);
    for (int step = 0; step < 150; ++step) {
        SCOPED_TRACE(step);
        Archive::SessionType const type = m_random() % 2 ? Archive::SessionTypeFull : Archive::SessionTypeIncremental;
        if (step == 20) {
            AddScratch();
            m_model.scratchTotal = m_model.masterTotal;
            m_model.scratchDead = m_model.masterDead;
            m_model.scratchSaves = 1;
        }
        bool const scratch = step >= 20 && m_random() % 3 != 0;
        if (scratch) {
            std::map<std::string, Model::Item> const before = m_model.head;
            ASSERT_NO_FATAL_FAILURE(SaveScratch(type));
            for (auto const& [p, item] : m_model.head) {
                auto const it = before.find(p);
                if (it == before.end() || it->second.bytes != item.bytes) m_scratchTouched.insert(p);
            }
            for (auto const& [p, item] : before)
                if (!m_model.head.count(p)) m_scratchTouched.insert(p);
        } else {
            ASSERT_NO_FATAL_FAILURE(SaveMaster(type));
        }
        ASSERT_NO_FATAL_FAILURE(Compare());
        if (m_random() % 4 != 0) continue;
        Reopen(step >= 20 ? m_scratchPath : m_path);
        ASSERT_NO_FATAL_FAILURE(Compare());
    }
}

// Items that live on through the saves: which are written, in which state they are then and after reopening, and the
// counters behind generated paths.
TEST_P(ArchiveModelTest, RandomSavesKeepStatesAndPathCounts)
{
    struct Known
    {
        Counted<BytesItem> item;
        int state = FileStoreStateObject::DirtyStateFull;
        int tag = 0;            // Of the newest revision that has it.
        bool inScratch = false; // And that one lies in the scratch file.
    };
    FileStoreOut::IndexedPathParts const parts[2] = {{Str("a/"), Str("")}, {Str("b/"), Str(".x")}};
    m_archive = CreateDocument(m_path);
    AddScratch();
    std::map<std::string, Known> items;
    for (int i = 0; i < 8; ++i) items["i" + std::to_string(i)].item = MakeCounted<BytesItem>(std::to_string(i));
    u64 counters[2] = {};
    bool scratchHasRevisions = false;

    for (int step = 0; step < 120; ++step) {
        SCOPED_TRACE(step);
        for (auto& [name, known] : items) {
            if (m_random() % 5 != 0) continue;
            known.item->bytes += '+';
            known.item->MarkAsDirty();
            known.state = FileStoreStateObject::DirtyStateFull;
        }
        bool const scratch = m_random() % 2 == 0;
        bool const incremental = m_random() % 2 == 0;
        Archive::SessionType const type = incremental ? Archive::SessionTypeIncremental : Archive::SessionTypeFull;
        ArchiveSessionHandle handle;
        ASSERT_TRUE(scratch ? m_archive->CreateScratchSession(handle, type, nullptr)
                            : m_archive->CreateSession(handle, type, nullptr));
        u64 next[2] = {counters[0], counters[1]};
        size_t const pair = m_random() % 2;
        String8 generated;
        ASSERT_TRUE(handle->GenerateIndexedPath(parts[pair], items["i0"].item.Get(), nullptr, generated));
        std::string digits;
        for (u64 n = ++next[pair]; n != 0; n /= 16) digits += "0123456789abcdef"[n % 16];
        ASSERT_EQ(generated, parts[pair].prefix + Str(digits) + parts[pair].suffix);
        // It stays the object's for the session.
        ASSERT_TRUE(handle->GenerateIndexedPath(parts[pair], items["i0"].item.Get(), nullptr, generated));
        ASSERT_EQ(generated, parts[pair].prefix + Str(digits) + parts[pair].suffix);
        ASSERT_FALSE(handle->GenerateIndexedPath(parts[pair], nullptr, nullptr, generated));

        bool committed = !scratch && scratchHasRevisions;
        std::set<std::string> written;
        for (auto& [name, known] : items) {
            handle->CreateFile(Str(name), known.item);
            bool const wanted = incremental ? known.state == FileStoreStateObject::DirtyStateFull
                                            : known.state != FileStoreStateObject::DirtyStateClean;
            ASSERT_EQ(handle->GetAddedPaths().count(Str(name)) != 0, wanted) << name;
            if (wanted) written.insert(name);
        }
        committed = committed || !written.empty();
        m_archive->CloseSession(handle, false);
        if (committed) {
            std::copy(next, next + 2, counters);
            scratchHasRevisions = scratch;
        }
        for (auto& [name, known] : items) {
            bool const isWritten = written.count(name) != 0;
            if (isWritten)
                known.state =
                    incremental ? FileStoreStateObject::DirtyStateIncremental : FileStoreStateObject::DirtyStateClean;
            bool const rolledDown = !scratch && known.inScratch;
            if (isWritten || rolledDown) known.tag = incremental ? 1 : 0;
            if (isWritten || rolledDown) known.inScratch = scratch;
            FileStoreStateObject::DirtyState state{};
            bool const has = known.item->GetDirtyStateForFileStore(*m_archive, state);
            ASSERT_TRUE(!has || static_cast<int>(state) == known.state) << name;
        }
        if (m_random() % 5 != 0) continue;
        Reopen(m_scratchPath);
        for (auto& [name, known] : items) {
            bool const saved = m_archive->HasFile(Str(name));
            known.item = MakeCounted<BytesItem>(known.item->bytes);
            known.state = FileStoreStateObject::DirtyStateFull;
            if (!saved) continue;
            ASSERT_TRUE(m_archive->LoadFile(Str(name), *known.item));
            FileStoreStateObject::DirtyState state{};
            ASSERT_TRUE(known.item->GetDirtyStateForFileStore(*m_archive, state));
            known.state =
                known.tag == 1 ? FileStoreStateObject::DirtyStateIncremental : FileStoreStateObject::DirtyStateClean;
            ASSERT_EQ(static_cast<int>(state), known.state) << name;
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, ArchiveModelTest, testing::Values(1u, 2u, 3u, 4u));

} // namespace
} // namespace KernelTest

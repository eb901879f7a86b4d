#pragma once

#include "libkernel/archive/ArchiveStreamline.h"
#include "support/ArchiveFixture.h"

#include <set>

namespace KernelTest {

using Items = std::map<std::string, std::string>;

constexpr Kernel::u16 c_midStreamline = 4;
constexpr Kernel::u16 c_streamlined = 8;

/// Offers one item under a generated path, so that the document has a path count.
inline std::string SaveGenerated(Kernel::Archive& archive, std::string const& bytes)
{
    std::string path;
    EXPECT_TRUE(InSession(archive, [&](auto& session) { path = CreateGenerated(session, "gen/", ".x", bytes); }));
    return path;
}

class ArchiveStreamlineTest : public DocumentTest
{
protected:
    /// Four revisions with dead bytes of each kind; gives what is alive in the end.
    Items Fill(Kernel::Archive& archive)
    {
        EXPECT_TRUE(Save(archive, {{"a", "first"}, {"b", std::string(300'000, 'b')}, {"gone", "x"}}));
        EXPECT_TRUE(Save(archive, {{"a", "second"}, {"gone", std::nullopt}}));
        EXPECT_TRUE(Save(archive, {{"packed", std::string(2'500'000, 'p')}, {"empty", ""}}, false,
                         Kernel::Archive::SessionTypeFull, true));
        SaveGenerated(archive, "generated");
        return GetAll(archive);
    }
    Items Make()
    {
        m_archive = CreateDocument(m_path);
        return Fill(*m_archive);
    }
    /// Every file in the folder of the document and in those of temporaries.
    std::string Listing() const
    {
        std::set<std::string> names;
        for (std::string const& folder : {m_folder.GetPath(), m_temporaries, m_second})
            for (auto const& entry : std::filesystem::directory_iterator(folder))
                if (entry.is_regular_file()) names.insert(entry.path().filename());
        std::string all;
        for (std::string const& name : names) all += name + " ";
        return all;
    }
    void ExpectCompact(Kernel::Archive& archive, Items const& items, Kernel::u16 flags)
    {
        EXPECT_EQ(GetAll(archive), items);
        auto const revisions = RevisionsOf(archive);
        ASSERT_EQ(revisions.size(), 1u);
        EXPECT_EQ(revisions[0]->GetTag(), Kernel::Archive::RevisionTagStreamlined);
        EXPECT_EQ(revisions[0]->GetNextFAT(), 0u);
        Kernel::Archive::FileState const state = StateOf(archive);
        EXPECT_EQ(state.fileVersion, 11);
        EXPECT_EQ(state.flags, flags);
        EXPECT_EQ(state.deadBytes, 0u);
        Kernel::u64 stored = 0;
        for (Kernel::Archive::FileRevision const& entry : revisions[0]->GetEntries()) {
            stored += entry.fileCompressedSize;
            EXPECT_TRUE(entry.added);
            EXPECT_EQ(archive.CheckStoredBlock(*revisions[0], entry), Kernel::Archive::BlockCheck::Ok);
        }
        EXPECT_EQ(state.totalBytes, stored);
        EXPECT_FALSE(archive.RequiresStreamlining());
    }
};

} // namespace KernelTest

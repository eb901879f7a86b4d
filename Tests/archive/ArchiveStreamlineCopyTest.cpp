#include "archive/ArchiveStreamlineFixture.h"
#include "libkernel/streams/MemoryStreams.h"
#include "support/ArchiveBuilder.h"

// Compact copies elsewhere: to a stream, to memory, to a file in which the archive goes on.

namespace KernelTest {
namespace {

using namespace Kernel;
using ArchiveStreamlineCopyTest = ArchiveStreamlineTest;

std::string TextOf(MemoryInOutStream const& out)
{
    return std::string(static_cast<char const*>(out.GetBuffer()), out.GetSizeOutStream());
}

TEST_F(ArchiveStreamlineCopyTest, CopiesToStreamsAndMemoryOpenLikeTheDocument)
{
    Items const items = Make();
    auto const out = MakeCounted<MemoryInOutStream>();
    ASSERT_EQ(m_archive->StreamlineToOutStream(*out), Archive::StreamlineDone);
    Counted<FragmentedRawData> const counted = MakeCounted<FragmentedRawData>(0);
    FragmentedRawData& data = *counted;
    ASSERT_EQ(m_archive->StreamlineToFragmentedRawData(data), Archive::StreamlineDone);
    std::string fromMemory(data.GetSize(), 0);
    data.GetData(0, fromMemory.data(), fromMemory.size());
    for (std::string const& bytes : {TextOf(*out), fromMemory}) {
        WriteWhole(m_folder / "copy", bytes);
        Counted<Archive> const copy = OpenDocument(m_folder / "copy");
        ExpectCompact(*copy, items, 0);
        EXPECT_EQ(StateOf(*copy).saveCount, 1u);
        EXPECT_EQ(StateOf(*copy).writeCounter, StateOf(*m_archive).writeCounter + 1);
    }
    Archive::OpenResult opened{};
    EXPECT_EQ(GetAll(*Archive::OpenAsThrowaway(data, c_documentTag, opened)), items);
    EXPECT_EQ(RevisionsOf(*m_archive).size(), 4u);

    // One that needs no rewriting goes out byte for byte, without what lies behind its end.
    ASSERT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    ASSERT_TRUE(Save(*m_archive, {{"added", "1"}}));
    auto const plain = MakeCounted<MemoryInOutStream>();
    ASSERT_EQ(m_archive->StreamlineToOutStream(*plain), Archive::StreamlineDone);
    std::string const bytes = TextOf(*plain);
    EXPECT_EQ(bytes, ReadWhole(m_path).substr(0, StateOf(*m_archive).fileEnd));
    Counted<RawData> const extracted = m_archive->ExtractToRawData();
    ASSERT_TRUE(extracted);
    EXPECT_EQ(std::string(static_cast<char const*>(extracted->GetData()), extracted->GetSize()), bytes);

    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    EXPECT_FALSE(m_archive->ExtractToRawData());
    handle.Release();
    AddScratch();
    EXPECT_FALSE(m_archive->ExtractToRawData());
}

// A file is copied as it stands only if a reader of the copy finds in it what the archive shows.
TEST_F(ArchiveStreamlineCopyTest, FileThatSaysOtherwiseThanTheArchiveIsNotCopiedAsItStands)
{
    struct Case
    {
        char const* what;
        std::string info; ///< Over the info block's beginning.
        bool hasOtherWriter;
    };
    for (Case const& c :
         {Case{"no info block", "xxxx", false}, Case{"torn info block", "#Inf" + TestSupport::Little(80, 8), false},
          Case{"saved by another", "#Inf", true}})
    {
        SCOPED_TRACE(c.what);
        ASSERT_TRUE(Save(*CreateDocument(m_path), {{"a", "1"}, {"b", "2"}}));
        WriteWhole(m_path, ReadWhole(m_path).replace(12, c.info.size(), c.info));
        Archive::OpenResult result{};
        m_archive = Archive::RecoverArchive(Str(m_path), Archive::OpenModeReadWrite, c_documentTag, result);
        ASSERT_TRUE(m_archive);
        m_archive->SetKeepOpen(false);
        if (c.hasOtherWriter) {
            ASSERT_TRUE(Save(*OpenDocument(m_path), {{"c", "3"}}));
        }
        auto const out = MakeCounted<MemoryInOutStream>();
        ASSERT_EQ(m_archive->StreamlineToOutStream(*out), Archive::StreamlineDone);
        WriteWhole(m_folder / "copy", TextOf(*out));
        EXPECT_EQ(GetAll(*OpenDocument(m_folder / "copy")), (Items{{"a", "1"}, {"b", "2"}}));
        EXPECT_EQ(static_cast<bool>(m_archive->ExtractToRawData()), !c.hasOtherWriter);
        m_archive = nullptr;
        std::filesystem::remove(m_path);
    }
}

TEST_F(ArchiveStreamlineCopyTest, TargetThatFillsUpIsToldApart)
{
    class Full : public OutStream
    {
    public:
        u64 WriteBlock(void const*, u64) override { return 0; }
        u64 GetSizeOutStream() const override { return 0; }
        u64 TellOutStream() const override { return 0; }
    };
    Make();
    EXPECT_EQ(m_archive->StreamlineToOutStream(*MakeCounted<Full>()), Archive::StreamlineNoAccess);
    EXPECT_EQ(m_archive->StreamlineToNew(String8()), Archive::StreamlineFailed);
    EXPECT_EQ(m_archive->StreamlineToNew(Str(m_folder / "no/such/folder")), Archive::StreamlineNotCreated);
    EXPECT_EQ(m_archive->StreamlineAndSwitch(Str(m_folder / "no/such/folder")), Archive::StreamlineNotCreated);
    std::string const before = ReadWhole(m_path);
    // Nor may a copy destroy what it is made from, under whatever name.
    std::filesystem::create_symlink(m_path, m_folder / "alias");
    Reopen(m_path, Archive::OpenModeReadOnly);
    EXPECT_EQ(m_archive->StreamlineToNew(Str(m_folder / "alias")), Archive::StreamlineNotCreated);
    EXPECT_EQ(m_archive->StreamlineAndSwitch(Str(m_path)), Archive::StreamlineNotCreated);
    EXPECT_EQ(ReadWhole(m_path), before);
}

TEST_F(ArchiveStreamlineCopyTest, SwitchingGoesOnInTheNewFile)
{
    struct Case
    {
        char const* what;
        bool asScratch;
        bool hasScratch;
        bool readOnly;
    };
    for (Case const& c : {Case{"plain", false, false, false}, Case{"with a scratch file", false, true, false},
                          Case{"from a read-only one", false, false, true}, Case{"as scratch", true, false, false},
                          Case{"as scratch, with one", true, true, false}})
    {
        SCOPED_TRACE(c.what);
        std::string const newPath = m_folder / "new";
        Make();
        Archive::CreateResult created;
        if (c.hasScratch) {
            ASSERT_TRUE(m_archive->AddScratchFile(Str(m_scratchPath), created));
            ASSERT_TRUE(Save(*m_archive, {{"scratched", "1"}, {"a", "in scratch"}}, true));
        }
        if (c.readOnly) {
            Reopen(m_path, Archive::OpenModeReadOnly);
        }
        Items items = GetAll(*m_archive);
        std::string const before = ReadWhole(m_path);
        Counted<DelayLoadHolder> const holder = HolderOf(*m_archive, "b");
        auto const history = RevisionsOf(*m_archive);
        ASSERT_EQ(c.asScratch ? m_archive->StreamlineAndSwitchAsScratch(Str(newPath))
                              : m_archive->StreamlineAndSwitch(Str(newPath)),
                  Archive::StreamlineDone);
        EXPECT_EQ(ReadWhole(m_path), before);
        // The old files are free, whoever still looks at what they held.
        EXPECT_EQ(ResultOfOpening(c.asScratch && c.hasScratch ? m_scratchPath : m_path), Archive::OpenOk);
        EXPECT_TRUE(holder->IsBackedBy(*m_archive));
        EXPECT_EQ(GetAll(*m_archive), items);
        EXPECT_EQ(m_archive->IsJustScratchFile(), c.asScratch);
        EXPECT_EQ(c.asScratch ? m_archive->GetScratchPath() : m_archive->GetArchivePath(), Str(newPath));
        EXPECT_EQ(RevisionsOf(*m_archive).size(), 1u);
        ASSERT_TRUE(Save(*m_archive, {{"a", "later"}}, c.asScratch || c.hasScratch));
        items["a"] = "later";
        m_archive = nullptr;
        std::string const where = c.hasScratch && !c.asScratch ? m_scratchPath : newPath;
        EXPECT_EQ(GetAll(*OpenDocument(where)), items);
        for (std::string const& name : {m_path, m_scratchPath, newPath}) std::filesystem::remove(name);
    }
}

TEST_F(ArchiveStreamlineCopyTest, ThrowAwayLeavesTheOldFilesAndTakesItsOwnWithIt)
{
    Make();
    AddScratch();
    ASSERT_TRUE(Save(*m_archive, {{"scratched", "1"}}, true));
    Items const items = GetAll(*m_archive);
    std::string const before = ReadWhole(m_path);
    auto const history = RevisionsOf(*m_archive);
    ASSERT_EQ(m_archive->ConvertToThrowAway(), Archive::ConvertDone);
    EXPECT_EQ(ResultOfOpening(m_scratchPath), Archive::OpenOk);
    EXPECT_TRUE(m_archive->IsThrowAway());
    EXPECT_FALSE(m_archive->HasScratchFile());
    ExpectCompact(*m_archive, items, 0);
    EXPECT_EQ(m_archive->ConvertToThrowAway(), Archive::ConvertDone);
    ASSERT_TRUE(Save(*m_archive, {{"a", "thrown away"}}));
    for (bool overwrite : {false, true}) {
        m_archive->SetAlwaysStreamlineOverwrite(overwrite);
        ASSERT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
        EXPECT_TRUE(m_archive->IsThrowAway());
        ASSERT_TRUE(Save(*m_archive, {{"a", "again"}}));
        EXPECT_EQ(Get(*m_archive, "a"), "again");
    }
    m_archive = nullptr;
    EXPECT_EQ(Listing(), "doc scratch ");
    EXPECT_EQ(ReadWhole(m_path), before);

    m_archive = OpenDocument(m_path);
    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    EXPECT_EQ(m_archive->ConvertToThrowAway(), Archive::ConvertFailed);
    handle.Release();
    TempFile::SetTempPath(String8());
    EXPECT_EQ(m_archive->ConvertToThrowAway(), Archive::ConvertFailed);
    EXPECT_FALSE(m_archive->IsThrowAway());
}

} // namespace
} // namespace KernelTest

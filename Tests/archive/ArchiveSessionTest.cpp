#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/streams/FileInOutStream.h"
#include "libkernel/streams/OutStream.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"

#include <fstream>
#include <gtest/gtest.h>
#include <thread>

namespace KernelTest {
namespace {

using namespace Kernel;

class ArchiveSessionTest : public DocumentTest
{
protected:
    void SetUp() override
    {
        m_archive = CreateDocument(m_path);
        ASSERT_TRUE(m_archive);
    }
};

TEST_F(ArchiveSessionTest, ClosingWithoutChangesWritesNothing)
{
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    std::string before = ReadWhole(m_path);
    Archive::FileState const state = StateOf(*m_archive);
    ASSERT_TRUE(Save(*m_archive, {}));
    ASSERT_TRUE(Save(*m_archive, {{"never there", std::nullopt}}));
    EXPECT_EQ(StateOf(*m_archive).saveCount, state.saveCount);
    EXPECT_EQ(StateOf(*m_archive).fileEnd, state.fileEnd);
    std::string after = ReadWhole(m_path);
    before.replace(68, 4, "????");
    after.replace(68, 4, "????");
    EXPECT_EQ(before, after);
}

TEST_F(ArchiveSessionTest, WhatWasSavedReadsBackAfterReopening)
{
    std::string const large(3'000'000, 'x');
    std::string noise(2'500'000, 0);
    u32 seed = 1;
    for (char& c : noise) c = static_cast<char>((seed = seed * 1664525 + 1013904223) >> 24);
    Changes const items = {{"small", "1"}, {"deep/er", "2"}, {"large", large}, {"noise", noise}, {"empty", ""}};
    ASSERT_TRUE(Save(*m_archive, items));
    ASSERT_TRUE(Save(*m_archive, {{"packed", large}, {"packed noise", noise}}, false, Archive::SessionTypeFull, true));
    Reopen(m_path);
    for (auto const& [path, bytes] : items) EXPECT_EQ(Get(*m_archive, path), bytes) << path;
    EXPECT_EQ(Get(*m_archive, "packed"), large);
    EXPECT_EQ(Get(*m_archive, "packed noise"), noise);
    EXPECT_LT(StateOf(*m_archive).totalBytes, 2 * noise.size() + large.size() + 10000);
}

TEST_F(ArchiveSessionTest, WrittenDeletedAndWrittenAgainLeavesTheLastAndCountsTheFirstAsDead)
{
    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->CreateFile(Str("a"), MakeCounted<BytesItem>("first"));
    handle->DeleteFile(Str("a"));
    handle->CreateFile(Str("a"), MakeCounted<BytesItem>("second!"));
    m_archive->CloseSession(handle, false);
    EXPECT_EQ(Get(*m_archive, "a"), "second!");
    EXPECT_EQ(StateOf(*m_archive).totalBytes, 12u);
    EXPECT_EQ(StateOf(*m_archive).deadBytes, 5u);
}

TEST_F(ArchiveSessionTest, AbortedSessionCommitsNothingThoughTheFlagIsTakenBack)
{
    bool abort = false;
    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, &abort));
    handle->CreateFile(Str("half"), MakeCounted<BytesItem>("1"));
    auto item = MakeCounted<BytesItem>("2");
    item->onSave = [&](FileStoreOut&) { abort = true; };
    EXPECT_THROW(handle->CreateFile(Str("a"), item), AbortException);
    EXPECT_THROW(handle->CreateFile(Str("b"), MakeCounted<BytesItem>("3")), AbortException);
    abort = false;
    m_archive->CloseSession(handle, false);
    EXPECT_FALSE(handle.IsValid());
    EXPECT_EQ(StateOf(*m_archive).saveCount, 1u);
    Reopen(m_path);
    EXPECT_TRUE(m_archive->IsEmpty());
}

TEST_F(ArchiveSessionTest, DroppedSessionIsOverwrittenByTheNext)
{
    {
        ArchiveSessionHandle handle;
        ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
        handle->CreateFile(Str("lost"), MakeCounted<BytesItem>(std::string(5000, 'l')));
    }
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    Reopen(m_path);
    EXPECT_EQ(GetAll(*m_archive), (std::map<std::string, std::string>{{"a", "1"}}));
    EXPECT_EQ(StateOf(*m_archive).firstFAT, 72u + 9);
}

TEST_F(ArchiveSessionTest, MasterSaveRecordsWhatTheScratchFileDeletedAndEmptiesIt)
{
    ASSERT_TRUE(Save(*m_archive, {{"kept", "k"}, {"deleted", "d"}}));
    AddScratch();
    ASSERT_TRUE(Save(*m_archive, {{"passing", "p"}}, true));
    ASSERT_TRUE(Save(*m_archive, {{"new", "n"}, {"deleted", std::nullopt}, {"passing", std::nullopt}}, true));
    ASSERT_TRUE(Save(*m_archive, {{"extra", "e"}}));
    EXPECT_EQ(StateOf(*m_archive, Archive::ChoiceScratch).fileEnd, 86 + m_path.size());
    EXPECT_EQ(StateOf(*m_archive, Archive::ChoiceScratch).firstFAT, 0u);
    auto const revisions = RevisionsOf(*m_archive);
    ASSERT_EQ(revisions.size(), 2u);
    auto const info = m_archive->GetFileInfo(Str("deleted"));
    ASSERT_TRUE(info && revisions[1]->Find(*info));
    EXPECT_TRUE(revisions[1]->Find(*info)->IsDeletion());
    EXPECT_FALSE(m_archive->GetFileInfo(Str("passing")));
    for (std::string const& path : {m_scratchPath, m_path}) {
        Reopen(path);
        EXPECT_EQ(GetAll(*m_archive),
                  (std::map<std::string, std::string>{{"kept", "k"}, {"new", "n"}, {"extra", "e"}}));
    }
}

TEST_F(ArchiveSessionTest, ScratchFileOfAMasterThatMovedOnIsRefused)
{
    AddScratch();
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}, true));
    m_archive = nullptr;
    EXPECT_TRUE(Archive::VerifyLinks(Str(m_scratchPath)));
    ASSERT_TRUE(Save(*OpenDocument(m_path), {{"b", "1"}}));
    EXPECT_EQ(ResultOfOpening(m_scratchPath), Archive::OpenLinkMismatch);
    EXPECT_FALSE(Archive::VerifyLinks(Str(m_scratchPath)));
    std::rename(m_path.c_str(), (m_path + "away").c_str());
    EXPECT_EQ(ResultOfOpening(m_scratchPath), Archive::OpenLinkedNotFound);
}

TEST_F(ArchiveSessionTest, SecondWriterIsSeenBeforeAnythingIsWritten)
{
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->CreateFile(Str("a"), MakeCounted<BytesItem>("2"));
    std::string bytes = ReadWhole(m_path);
    ++bytes[68];
    std::fstream(m_path, std::ios::in | std::ios::out | std::ios::binary).seekp(68).put(bytes[68]);
    try {
        m_archive->CloseSession(handle, false);
        FAIL() << "the foreign writer went unseen";
    } catch (ArchiveFileException const& e) {
        EXPECT_EQ(e.GetReason(), ArchiveFileException::Reason::OtherWriter);
        EXPECT_EQ(e.GetWhatFile(), ArchiveFileException::WhatFile::Master);
    }
    EXPECT_EQ(ReadWhole(m_path), bytes);
    EXPECT_EQ(SessionResult(*m_archive), Archive::SessionFileUnusable);
    EXPECT_EQ(m_archive->GetLastRestoreResult(), Archive::RestoreNotTheFile);
}

TEST_F(ArchiveSessionTest, RefusalsComeInTheirOrder)
{
    ArchiveSessionHandle handle;
    EXPECT_FALSE(m_archive->CreateScratchSession(handle, Archive::SessionTypeFull, nullptr));
    EXPECT_EQ(m_archive->CreateSessionAdv(handle, static_cast<Archive::SessionType>(4), nullptr, false),
              Archive::SessionNoMemory);
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    EXPECT_EQ(m_archive->CreateSessionAdv(handle, Archive::SessionTypeFull, nullptr, false),
              Archive::SessionHandleInUse);
    EXPECT_EQ(SessionResult(*m_archive), Archive::SessionActive);
    handle.Release();
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    m_archive->RewindWorkingRevision();
    EXPECT_EQ(SessionResult(*m_archive), Archive::SessionNotAtHead);
    EXPECT_THROW(m_archive->CloseSession(handle, false), OutStream::WriteException);
}

TEST_F(ArchiveSessionTest, PathOf65535BytesIsSavedAndStreamlinedAndOneMoreIsRefused)
{
    std::string const longest(65535, 'p');
    ASSERT_TRUE(Save(*m_archive, {{longest, "1"}}));
    EXPECT_THROW(Save(*m_archive, {{longest + "p", "1"}}), OutStream::WriteException);
    ASSERT_TRUE(Save(*m_archive, {{longest, "2"}}));
    EXPECT_EQ(m_archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
    Reopen(m_path);
    EXPECT_EQ(Get(*m_archive, longest), "2");
}

TEST_F(ArchiveSessionTest, ItemThatIsNotNestableMayNotNameFiles)
{
    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    auto item = MakeCounted<BytesItem>("1");
    item->onSave = [&](FileStoreOut& out) { out.CreateFile(Str("inner"), MakeCounted<BytesItem>("2")); };
    EXPECT_THROW(handle->CreateFile(Str("a"), item), NestedException);
    EXPECT_THROW(m_archive->CloseSession(handle, false), OutStream::WriteException);
    EXPECT_FALSE(handle.IsValid());
    EXPECT_EQ(StateOf(*m_archive).saveCount, 1u);
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
}

TEST_F(ArchiveSessionTest, ExportTellsNoObjectAndRewriteWritesTheCleanOnes)
{
    auto const item = MakeCounted<BytesItem>("1");
    auto const save = [&](Archive::SessionType type) {
        ArchiveSessionHandle handle;
        m_archive->CreateSession(handle, type, nullptr);
        handle->CreateFile(Str("a"), item);
        m_archive->CloseSession(handle, false);
        return StateOf(*m_archive).saveCount;
    };
    EXPECT_EQ(save(Archive::SessionTypeExport), 2u);
    EXPECT_FALSE(item->IsLinkedToFileStore(*m_archive));
    EXPECT_EQ(save(Archive::SessionTypeFull), 3u);
    EXPECT_EQ(save(Archive::SessionTypeFull), 3u);
    EXPECT_EQ(save(Archive::SessionTypeRewrite), 4u);
}

TEST_F(ArchiveSessionTest, StoredFilesMoveBetweenArchivesWithoutBeingUnpacked)
{
    std::string const bytes(200'000, 'q');
    ASSERT_TRUE(Save(*m_archive, {{"img", bytes}}, false, Archive::SessionTypeFull, true));
    Counted<DelayLoadHolder> const holder = HolderOf(*m_archive, "img");
    ASSERT_TRUE(holder);
    std::string const otherPath = m_folder / "other";
    Counted<Archive> other = CreateDocument(otherPath);
    ArchiveSessionHandle handle;
    ASSERT_TRUE(other->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    handle->AddSourceArchive(m_archive);
    handle->AssignDelayLoadHolderPath(holder, Str("moved"));
    handle->CreateFile(holder);
    other->CloseSession(handle, false);
    EXPECT_FALSE(holder->IsLoaded());
    EXPECT_TRUE(holder->IsBackedBy(*other));
    EXPECT_EQ(Get(*other, "moved"), bytes);
    EXPECT_EQ(StateOf(*other).totalBytes, StateOf(*m_archive).totalBytes);
    // And nothing has to be written once it is there.
    ASSERT_TRUE(other->CreateSession(handle, Archive::SessionTypeIncremental, nullptr));
    handle->CreateFile(holder);
    EXPECT_FALSE(handle->HasChanges());
}

TEST_F(ArchiveSessionTest, HoldersOfScratchVersionsKeepTheirBytesThroughARollDownAndAFrontThatGrows)
{
    AddScratch();
    ASSERT_TRUE(Save(*m_archive, {{"img", "old bytes"}, {"head", "head bytes"}}, true));
    std::map<std::string, Counted<DelayLoadHolder>> holders;
    for (char const* path : {"img", "head"}) holders[path] = HolderOf(*m_archive, path);
    ASSERT_TRUE(Save(*m_archive, {{"img", "new bytes"}}, true));
    m_archive->SetReferenceInfo(MakeCounted<ArchiveReferenceInfo>(Str(std::string(100, 'r'))));
    ASSERT_TRUE(Save(*m_archive, {{"other", "1"}}));
    EXPECT_FALSE(m_archive->IsBroken());
    EXPECT_FALSE(holders["head"]->GetBackData()); // Its bytes have moved with it.
    for (auto const& [path, bytes] : {std::pair("img", "old bytes"), std::pair("head", "head bytes")}) {
        EXPECT_EQ(BytesOf(*holders[path]), bytes);
    }
    EXPECT_EQ(Get(*m_archive, "img"), "new bytes");
    Reopen(m_scratchPath);
}

TEST_F(ArchiveSessionTest, ScratchEntryIsRolledDownIfAPathLeadsToIt)
{
    ASSERT_TRUE(Save(*m_archive, {{"a", "1"}}));
    Archive::FileState const state = StateOf(*m_archive);
    m_archive = nullptr;
    TestSupport::ArchiveBuilder scratch;
    scratch.link = {state.saveTimeStamp.GetValue(), state.saveCount, m_path};
    scratch.AddTable({.records = {{77, 1, "", scratch.AddBlock("nameless")},
                                  {78, 0, "", scratch.AddBlock("empty path")},
                                  {79, 0, "twice", scratch.AddBlock("old")}}});
    scratch.AddTable({.records = {{80, 0, "twice", scratch.AddBlock("new")}}});
    WriteWhole(m_scratchPath, scratch.Build());
    Reopen(m_scratchPath);
    ASSERT_TRUE(Save(*m_archive, {{"b", "2"}}));
    Reopen(m_path);
    EXPECT_EQ(GetAll(*m_archive),
              (std::map<std::string, std::string>{{"", "empty path"}, {"a", "1"}, {"b", "2"}, {"twice", "new"}}));
}

TEST_F(ArchiveSessionTest, ManyThreadsMayOfferFiles)
{
    constexpr int threads = 4;
    constexpr int each = 50;
    ArchiveSessionHandle handle;
    ASSERT_TRUE(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr));
    std::vector<std::thread> workers;
    for (int t = 0; t < threads; ++t)
        workers.emplace_back([&, t] {
            for (int i = 0; i < each; ++i) {
                std::string const name = std::to_string(t) + "/" + std::to_string(i);
                handle->CreateFile(Str(name), MakeCounted<BytesItem>(name + std::string(1000, 'b')));
            }
        });
    for (std::thread& worker : workers) worker.join();
    m_archive->CloseSession(handle, false);
    std::map<std::string, std::string> const all = GetAll(*m_archive);
    ASSERT_EQ(all.size(), static_cast<size_t>(threads * each));
    for (auto const& [name, bytes] : all) EXPECT_EQ(bytes, name + std::string(1000, 'b'));
}

} // namespace
} // namespace KernelTest

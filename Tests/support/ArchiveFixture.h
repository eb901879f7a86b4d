#pragma once

#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/archive/ArchiveSession.h"
#include "libkernel/archive/ArchiveThumbnails.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filesystem/TempFile.h"
#include "support/BytesItem.h"
#include "support/TempFolder.h"

#include <algorithm>
#include <filesystem>
#include <gtest/gtest.h>
#include <map>
#include <new>
#include <optional>
#include <string>

namespace KernelTest {

using namespace Kernel;

constexpr IDTag c_documentTag("Docu");

inline constexpr auto& ReadWhole = TestSupport::ReadWholeFile;
inline constexpr auto& WriteWhole = TestSupport::WriteWholeFile;

inline String8 Str(std::string const& s)
{
    return String8(s.c_str());
}

inline Counted<Archive> CreateDocument(std::string const& path)
{
    Archive::CreateResult result;
    return Archive::Create(Str(path), c_documentTag, result);
}

inline Counted<Archive> OpenDocument(std::string const& path, Archive::OpenMode mode = Archive::OpenModeReadWrite)
{
    Archive::OpenResult result{};
    Counted<Archive> archive = Archive::Open(Str(path), mode, c_documentTag, result);
    EXPECT_EQ(result, Archive::OpenOk) << path;
    return archive;
}

inline Archive::OpenResult ResultOfOpening(std::string const& path, Archive::OpenMode mode = Archive::OpenModeReadWrite,
                                           IDTag tag = c_documentTag)
{
    Archive::OpenResult result{};
    bool const opened = static_cast<bool>(Archive::Open(Str(path), mode, tag, result));
    EXPECT_EQ(opened, result == Archive::OpenOk);
    return result;
}

/// The bytes of an item, or none.
inline std::optional<std::string> Get(Archive& archive, std::string const& path)
{
    RawDataBlock data;
    if (!archive.ReadFile(Str(path), data)) return std::nullopt;
    return std::string(static_cast<char const*>(data.GetData()), data.GetSize());
}

/// All items with their bytes, each read whole.
inline std::map<std::string, std::string> GetAll(Archive& archive)
{
    std::map<std::string, std::string> all;
    std::vector<String8> paths;
    archive.GetFileList(paths);
    for (String8 const& path : paths) all[path.GetData()] = Get(archive, path.GetData()).value_or("(unreadable)");
    return all;
}

using Changes = std::map<std::string, std::optional<std::string>>;

/// One session in which @p work is done; false if it could not be had.
template <class Work>
bool InSession(Archive& archive, Work&& work, bool scratch = false,
               Archive::SessionType type = Archive::SessionTypeFull)
{
    ArchiveSessionHandle handle;
    if (!(scratch ? archive.CreateScratchSession(handle, type, nullptr) : archive.CreateSession(handle, type, nullptr)))
        return false;
    work(*handle);
    archive.CloseSession(handle, false);
    return true;
}

/// One session that writes and deletes.
inline bool Save(Archive& archive, Changes const& changes, bool scratch = false,
                 Archive::SessionType type = Archive::SessionTypeFull, bool compress = false)
{
    auto const work = [&](ArchiveSession& session) {
        for (auto const& [path, bytes] : changes) {
            if (!bytes)
                session.DeleteFile(Str(path));
            else
                session.CreateFile(Str(path), MakeCounted<BytesItem>(*bytes), compress ? Compressed() : nullptr);
        }
    };
    return InSession(archive, work, scratch, type);
}

/// Adds an item under a path that the session makes up, and gives that path.
inline std::string CreateGenerated(ArchiveSession& session, char const* prefix, char const* suffix,
                                   std::string const& bytes)
{
    auto const item = MakeCounted<BytesItem>(bytes);
    String8 path;
    EXPECT_TRUE(session.GenerateIndexedPath({String8(prefix), String8(suffix)}, item, nullptr, path));
    session.CreateFile(path, item);
    return path.GetData();
}

/// One record that holds these bytes.
inline Counted<ArchiveThumbnails> MakeThumbnails(std::string const& picture)
{
    auto thumbnails = MakeCounted<ArchiveThumbnails>();
    auto const data = MakeCounted<RawData>(picture.size());
    if (!data->GetBytes()) throw std::bad_alloc();
    std::copy(picture.begin(), picture.end(), data->GetBytes());
    thumbnails->AddFile(ArchiveThumbnails::FileType::Picture, data);
    return thumbnails;
}

/// What a session that is asked for now would get.
inline Archive::CreateSessionResult SessionResult(Archive& archive)
{
    ArchiveSessionHandle handle;
    return archive.CreateSessionAdv(handle, Archive::SessionTypeFull, nullptr, false);
}

inline Counted<DelayLoadHolder> HolderOf(Archive& archive, std::string const& path)
{
    return archive.CreateDelayLoadHolderDirect(Str(path), &BytesItem::c_type, nullptr);
}

inline std::string BytesOf(DelayLoadHolder& holder)
{
    JailCounted<FileStoreItem> item;
    return holder.GetItemBase(item) && item ? dynamic_cast<BytesItem&>(*item).bytes : "(nothing)";
}

inline std::vector<Counted<Archive::Revision const>> RevisionsOf(Archive& archive)
{
    std::vector<Counted<Archive::Revision const>> revisions;
    archive.GetRevisions(revisions);
    return revisions;
}

inline Archive::FileState StateOf(Archive& archive, Archive::ArchiveChoice which = Archive::ChoiceMaster)
{
    Archive::FileState state;
    archive.GetFileState(which, state);
    return state;
}

inline bool AddScratchFile(Archive& archive, std::string const& path)
{
    Archive::CreateResult result;
    return archive.AddScratchFile(Str(path), result);
}

/// A folder for one document with its scratch file, and folders for temporaries within it.
class DocumentTest : public testing::Test
{
protected:
    DocumentTest()
    {
        std::filesystem::create_directory(m_temporaries);
        std::filesystem::create_directory(m_second);
        std::vector<String8> rescued;
        TempFile::SetTempPath(Str(m_temporaries), Str(m_second), rescued);
    }
    ~DocumentTest() override
    {
        m_archive = nullptr;
        Archive::PostShutdown(); // Copies of bytes that the process shares lie in the folder that goes.
        TempFile::SetTempPath(String8());
    }
    /// Lets go of the archive first.
    void Reopen(std::string const& path, Archive::OpenMode mode = Archive::OpenModeReadWrite)
    {
        m_archive = nullptr;
        m_archive = OpenDocument(path, mode);
        ASSERT_TRUE(m_archive);
    }
    void AddScratch() { ASSERT_TRUE(AddScratchFile(*m_archive, m_scratchPath)); }

    TestSupport::TempFolder const m_folder;
    std::string const m_temporaries = m_folder / "temporaries";
    std::string const m_second = m_folder / "second"; ///< For what overwrites a master.
    std::string const m_path = m_folder / "doc";
    std::string const m_scratchPath = m_folder / "scratch";
    Counted<Archive> m_archive;
};

/// The document has one item, "a".
class OneItemTest : public DocumentTest
{
protected:
    void MakeDocument(std::string const& bytes = "1") const
    {
        ASSERT_TRUE(Save(*CreateDocument(m_path), {{"a", bytes}}));
    }
    /// With a scratch file that has one more.
    Counted<Archive> MakePair() const
    {
        MakeDocument();
        Counted<Archive> archive = OpenDocument(m_path);
        EXPECT_TRUE(AddScratchFile(*archive, m_scratchPath));
        EXPECT_TRUE(Save(*archive, {{"s", "scratch"}}, true));
        return archive;
    }
};

} // namespace KernelTest

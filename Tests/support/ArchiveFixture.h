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
#include <optional>
#include <string>

namespace KernelTest {

constexpr Kernel::IDTag c_documentTag("Docu");

inline constexpr auto& ReadWhole = TestSupport::ReadWholeFile;
inline constexpr auto& WriteWhole = TestSupport::WriteWholeFile;

inline Kernel::String8 Str(std::string const& s)
{
    return Kernel::String8(s.c_str());
}

inline Kernel::Counted<Kernel::Archive> CreateDocument(std::string const& path)
{
    Kernel::Archive::CreateResult result;
    return Kernel::Archive::Create(Str(path), c_documentTag, result);
}

inline Kernel::Counted<Kernel::Archive>
OpenDocument(std::string const& path, Kernel::Archive::OpenMode mode = Kernel::Archive::OpenModeReadWrite)
{
    Kernel::Archive::OpenResult result{};
    Kernel::Counted<Kernel::Archive> archive = Kernel::Archive::Open(Str(path), mode, c_documentTag, result);
    EXPECT_EQ(result, Kernel::Archive::OpenOk) << path;
    return archive;
}

inline Kernel::Archive::OpenResult ResultOfOpening(std::string const& path,
                                                   Kernel::Archive::OpenMode mode = Kernel::Archive::OpenModeReadWrite,
                                                   Kernel::IDTag tag = c_documentTag)
{
    Kernel::Archive::OpenResult result{};
    bool const opened = static_cast<bool>(Kernel::Archive::Open(Str(path), mode, tag, result));
    EXPECT_EQ(opened, result == Kernel::Archive::OpenOk);
    return result;
}

/// The bytes of an item, or none.
inline std::optional<std::string> Get(Kernel::Archive& archive, std::string const& path)
{
    Kernel::RawDataBlock data;
    if (!archive.ReadFile(Str(path), data)) return std::nullopt;
    return std::string(static_cast<char const*>(data.GetData()), data.GetSize());
}

/// All items with their bytes, each read whole.
inline std::map<std::string, std::string> GetAll(Kernel::Archive& archive)
{
    std::map<std::string, std::string> all;
    std::vector<Kernel::String8> paths;
    archive.GetFileList(paths);
    for (Kernel::String8 const& path : paths)
        all[path.GetData()] = Get(archive, path.GetData()).value_or("(unreadable)");
    return all;
}

using Changes = std::map<std::string, std::optional<std::string>>;

/// One session in which @p work is done; false if it could not be had.
template <class Work>
bool InSession(Kernel::Archive& archive, Work&& work, bool scratch = false,
               Kernel::Archive::SessionType type = Kernel::Archive::SessionTypeFull)
{
    Kernel::ArchiveSessionHandle handle;
    if (!(scratch ? archive.CreateScratchSession(handle, type, nullptr) : archive.CreateSession(handle, type, nullptr)))
        return false;
    work(*handle);
    archive.CloseSession(handle, false);
    return true;
}

/// One session that writes and deletes.
inline bool Save(Kernel::Archive& archive, Changes const& changes, bool scratch = false,
                 Kernel::Archive::SessionType type = Kernel::Archive::SessionTypeFull, bool compress = false)
{
    auto const work = [&](Kernel::ArchiveSession& session) {
        for (auto const& [path, bytes] : changes) {
            if (!bytes)
                session.DeleteFile(Str(path));
            else
                session.CreateFile(Str(path), Kernel::MakeCounted<BytesItem>(*bytes),
                                   compress ? Compressed() : nullptr);
        }
    };
    return InSession(archive, work, scratch, type);
}

/// Adds an item under a path that the session makes up, and gives that path.
inline std::string CreateGenerated(Kernel::ArchiveSession& session, char const* prefix, char const* suffix,
                                   std::string const& bytes)
{
    auto const item = Kernel::MakeCounted<BytesItem>(bytes);
    Kernel::String8 path;
    EXPECT_TRUE(session.GenerateIndexedPath({Kernel::String8(prefix), Kernel::String8(suffix)}, item, nullptr, path));
    session.CreateFile(path, item);
    return path.GetData();
}

/// One record that holds these bytes.
inline Kernel::Counted<Kernel::ArchiveThumbnails> MakeThumbnails(std::string const& picture)
{
    auto thumbnails = Kernel::MakeCounted<Kernel::ArchiveThumbnails>();
    auto const data = Kernel::MakeCounted<Kernel::RawData>(picture.size());
    std::copy(picture.begin(), picture.end(), data->GetBytes());
    thumbnails->AddFile(Kernel::ArchiveThumbnails::FileType::Picture, data);
    return thumbnails;
}

/// What a session that is asked for now would get.
inline Kernel::Archive::CreateSessionResult SessionResult(Kernel::Archive& archive)
{
    Kernel::ArchiveSessionHandle handle;
    return archive.CreateSessionAdv(handle, Kernel::Archive::SessionTypeFull, nullptr, false);
}

inline Kernel::Counted<Kernel::DelayLoadHolder> HolderOf(Kernel::Archive& archive, std::string const& path)
{
    return archive.CreateDelayLoadHolderDirect(Str(path), &BytesItem::c_type, nullptr);
}

inline std::string BytesOf(Kernel::DelayLoadHolder& holder)
{
    Kernel::JailCounted<Kernel::FileStoreItem> item;
    return holder.GetItemBase(item) && item ? dynamic_cast<BytesItem&>(*item).bytes : "(nothing)";
}

inline std::vector<Kernel::Counted<Kernel::Archive::Revision const>> RevisionsOf(Kernel::Archive& archive)
{
    std::vector<Kernel::Counted<Kernel::Archive::Revision const>> revisions;
    archive.GetRevisions(revisions);
    return revisions;
}

inline Kernel::Archive::FileState StateOf(Kernel::Archive& archive,
                                          Kernel::Archive::ArchiveChoice which = Kernel::Archive::ChoiceMaster)
{
    Kernel::Archive::FileState state;
    archive.GetFileState(which, state);
    return state;
}

/// A folder for one document with its scratch file, and folders for temporaries within it.
class DocumentTest : public testing::Test
{
protected:
    DocumentTest()
    {
        std::filesystem::create_directory(m_temporaries);
        std::filesystem::create_directory(m_second);
        std::vector<Kernel::String8> rescued;
        Kernel::TempFile::SetTempPath(Str(m_temporaries), Str(m_second), rescued);
    }
    ~DocumentTest() override
    {
        m_archive = nullptr;
        Kernel::Archive::PostShutdown(); // Copies of bytes that the process shares lie in the folder that goes.
        Kernel::TempFile::SetTempPath(Kernel::String8());
    }
    /// Lets go of the archive first.
    void Reopen(std::string const& path, Kernel::Archive::OpenMode mode = Kernel::Archive::OpenModeReadWrite)
    {
        m_archive = nullptr;
        m_archive = OpenDocument(path, mode);
        ASSERT_TRUE(m_archive);
    }
    void AddScratch()
    {
        Kernel::Archive::CreateResult result;
        ASSERT_TRUE(m_archive->AddScratchFile(Str(m_scratchPath), result));
    }

    TestSupport::TempFolder const m_folder;
    std::string const m_temporaries = m_folder / "temporaries";
    std::string const m_second = m_folder / "second"; ///< For what overwrites a master.
    std::string const m_path = m_folder / "doc";
    std::string const m_scratchPath = m_folder / "scratch";
    Kernel::Counted<Kernel::Archive> m_archive;
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
    Kernel::Counted<Kernel::Archive> MakePair() const
    {
        MakeDocument();
        Kernel::Counted<Kernel::Archive> archive = OpenDocument(m_path);
        Kernel::Archive::CreateResult result;
        EXPECT_TRUE(archive->AddScratchFile(Str(m_scratchPath), result));
        EXPECT_TRUE(Save(*archive, {{"s", "scratch"}}, true));
        return archive;
    }
};

} // namespace KernelTest

#pragma once

#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/archive/ArchiveSession.h"
#include "support/BytesItem.h"
#include "support/TempFolder.h"

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

inline Kernel::Archive::OpenResult ResultOfOpening(std::string const& path)
{
    Kernel::Archive::OpenResult result{};
    Kernel::Archive::Open(Str(path), Kernel::Archive::OpenModeReadWrite, Kernel::IDTag(), result);
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

/// One session that writes and deletes; false if it could not be had.
inline bool Save(Kernel::Archive& archive, Changes const& changes, bool scratch = false,
                 Kernel::Archive::SessionType type = Kernel::Archive::SessionTypeFull, bool compress = false)
{
    Kernel::ArchiveSessionHandle handle;
    if (!(scratch ? archive.CreateScratchSession(handle, type, nullptr) : archive.CreateSession(handle, type, nullptr)))
        return false;
    for (auto const& [path, bytes] : changes) {
        if (!bytes)
            handle->DeleteFile(Str(path));
        else
            handle->CreateFile(Str(path), Kernel::MakeCounted<BytesItem>(*bytes), compress ? Compressed() : nullptr);
    }
    archive.CloseSession(handle, false);
    return true;
}

inline Kernel::Archive::FileState StateOf(Kernel::Archive& archive,
                                          Kernel::Archive::ArchiveChoice which = Kernel::Archive::ChoiceMaster)
{
    Kernel::Archive::FileState state;
    archive.GetFileState(which, state);
    return state;
}

} // namespace KernelTest

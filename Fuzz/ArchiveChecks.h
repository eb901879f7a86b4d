#pragma once

#include "FuzzTarget.h"
#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/archive/ArchiveSession.h"
#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/archive/ArchiveThumbnails.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/CRC32.h"
#include "libkernel/streams/CompressionInStream.h"
#include "libkernel/streams/MemoryStreams.h"
#include "support/BytesItem.h"
#include "support/FakeClock.h"
#include "support/MemoryDisk.h"

#include <algorithm>
#include <cerrno>
#include <map>
#include <optional>
#include <string>

namespace Kernel::Fuzz {

using TestSupport::MemoryDisk;
using Items = std::map<std::string, std::string>;
using Changes = std::map<std::string, std::optional<std::string>>;
using Open = Archive::OpenResult;
using Opener = Counted<Archive> (*)(String8 const&, Archive::OpenMode, IDTag, Archive::OpenResult&);

inline std::string const c_masterPath = "/ram/doc";
inline std::string const c_scratchPath = "/ram/scratch";
inline std::string const c_unreadable = "(unreadable)";

/// The only disk there is while one lives: a path in a damaged file reaches no real file, and no pause takes time.
class LonelyDisk
{
public:
    LonelyDisk() = default;
    MemoryDisk* operator->() { return &m_disk; }

private:
    class Nothing
    {
    public:
        Nothing() : m_previous(&Platform::GetFileCalls())
        {
            static Platform::FileCalls const s_calls = [] {
                Platform::FileCalls calls = Platform::GetSystemFileCalls();
                calls.open = [](char const*, Platform::OpenFlags const&, Platform::FileHandle& out) {
                    out = Platform::c_noHandle;
                    return ENOENT;
                };
                calls.stat = [](char const*, bool, Platform::FileInfo& info) {
                    info = {};
                    return ENOENT;
                };
                calls.access = [](char const*, Platform::Access) { return ENOENT; };
                calls.rename = [](char const*, char const*) { return ENOENT; };
                calls.unlink = [](char const*) { return ENOENT; };
                calls.makeFolder = [](char const*) { return ENOENT; };
                calls.removeFolder = [](char const*) { return ENOENT; };
                calls.makeLink = [](char const*, char const*) { return ENOENT; };
                calls.readLink = [](char const*, std::string&) { return ENOENT; };
                calls.listFolder = [](char const*, std::vector<Platform::FolderEntry>&) { return ENOENT; };
                calls.flushFolder = [](char const*) { return ENOENT; };
                return calls;
            }();
            Platform::SetFileCalls(&s_calls);
        }
        ~Nothing() { Platform::SetFileCalls(m_previous); }

    private:
        Platform::FileCalls const* const m_previous;
    };
    TestSupport::FakeClock m_clock;
    Nothing m_nothing;
    MemoryDisk m_disk;
};

inline String8 Str(std::string const& text)
{
    return String8(text.data(), static_cast<int>(text.size()));
}

inline std::shared_ptr<std::string const> Content(u8 const* data, u64 size)
{
    return std::make_shared<std::string const>(reinterpret_cast<char const*>(data), size);
}

inline Counted<Archive> OpenBy(Opener opener, std::string const& path, Open& result)
{
    Counted<Archive> archive = opener(Str(path), Archive::OpenModeReadWrite, IDTag(), result);
    Require(result >= Archive::OpenOk && result <= Archive::OpenUnknownError, "a result is one of those there are");
    Require(static_cast<bool>(archive) == (result == Archive::OpenOk), "an archive comes with the result for it");
    return archive;
}

inline Open TestBytes(std::string const& bytes)
{
    Counted<InStreamSeekable> const in(new MemoryInStream(bytes.data(), bytes.size(), false));
    return Archive::TestArchive(*in, IDTag(), nullptr, nullptr);
}

constexpr u64 c_largestRead = 4u << 20; ///< What unpacks to more is read only so far.

/// One item as the table of its revision describes it and as it reads.
inline std::string ReadItem(Archive& archive, String8 const& path)
{
    Archive::FileRevision entry;
    Counted<Archive::Revision const> revision;
    Require(archive.GetFileRevision(path, entry, revision), "what is listed has an entry");
    bool const isLarge = entry.fileSize > c_largestRead;
    std::string streamed;
    bool isWhole = false;
    try {
        Counted<InStream> const in = archive.OpenFileInStream(path);
        char piece[3001];
        for (u64 left = in ? std::min(in->GetSize(), c_largestRead) : 0; left != 0;) {
            u64 const got = in->ReadBlock(piece, std::min<u64>(left, sizeof(piece)));
            if (got == 0) break;
            streamed.append(piece, got);
            left -= got;
        }
        isWhole = in && streamed.size() == entry.fileSize;
    } catch (ArchiveException const&) {
    } catch (CompressionInStream::DecompressException const&) {
    }
    if (isLarge) return c_unreadable;
    Archive::BlockCheck const check = archive.CheckStoredBlock(*revision, entry);
    RawDataBlock data;
    if (!archive.ReadFile(path, data)) {
        Require(check != Archive::BlockCheck::Ok, "a sound block can be read");
        return c_unreadable;
    }
    std::string const bytes(static_cast<char const*>(data.GetData()), data.GetSize());
    u32 crc = 0;
    CRC32::DataCRC32(bytes.data(), bytes.size(), crc);
    Require(bytes.size() == entry.fileSize && crc == entry.crcUncompressed, "what reads has its size and its CRC");
    Require(isWhole && streamed == bytes, "both ways of reading give the same");
    // Behind its end a file holds what was given up. A block that a record finds there lasts until the next save.
    Archive::FileState state;
    archive.GetFileState(revision->IsScratch() ? Archive::ChoiceScratch : Archive::ChoiceMaster, state);
    bool const lasts = entry.filePos + entry.fileCompressedSize + 8 <= state.fileEnd;
    return lasts ? bytes : c_unreadable;
}

inline Items ReadAll(Archive& archive)
{
    Items items;
    std::vector<String8> paths;
    archive.GetFileList(paths);
    for (String8 const& path : paths) items[std::string(path.GetView())] = ReadItem(archive, path);
    return items;
}

/// Looks at everything else that there is to read.
inline void LookAround(Archive& archive)
{
    std::vector<Counted<Archive::Revision const>> revisions;
    archive.GetRevisions(revisions);
    for (auto const& revision : revisions)
        for (Archive::FileRevision const& entry : revision->GetEntries())
            if (!entry.IsDeletion() && entry.fileSize <= c_largestRead) archive.CheckStoredBlock(*revision, entry);
    archive.LoadThumbnails();
    for (int steps = 0; steps < 20 && archive.RewindWorkingRevision(); ++steps) {
        std::vector<String8> paths;
        archive.GetFileList(paths);
        for (size_t i = 0; i < std::min<size_t>(paths.size(), 20); ++i) archive.HasFile(paths[i]);
    }
    archive.ResetWorkingRevisionToHead();
}

enum class SaveOutcome
{
    Saved,
    NoSession,
    Failed
};

/// One session that writes and deletes, checked against the files before it ends, unless the one of them that is not
/// written to is known to be damaged.
inline SaveOutcome Save(Archive& archive, Changes const& changes, bool scratch = false,
                        Archive::SessionType type = Archive::SessionTypeFull, bool compress = false,
                        bool otherIsSound = true)
{
    // What stands in the place of the guard in a file that has none need not be its counter; and a file whose link has
    // no path is saved as if it had none.
    Archive::FileState state;
    bool const isPlain =
        !archive.GetFileState(Archive::ChoiceMaster, state) || (state.fileVersion > 7 && !state.hasLink);
    ArchiveSessionHandle handle;
    if (!(scratch ? archive.CreateScratchSession(handle, type, nullptr) : archive.CreateSession(handle, type, nullptr)))
        return SaveOutcome::NoSession;
    try {
        for (auto const& [path, bytes] : changes) {
            if (!bytes)
                handle->DeleteFile(Str(path));
            else
                handle->CreateFile(Str(path), MakeCounted<KernelTest::BytesItem>(*bytes),
                                   compress ? KernelTest::Compressed() : nullptr);
        }
        String8 report;
        Archive::VerifyResult const verified = archive.CloseSessionAndVerifyFileState(handle, report, false);
        Require(verified == Archive::VerifyMatch || !isPlain || !otherIsSound,
                "what was saved is what the archive holds");
    } catch (OutStream::WriteException const&) {
        return SaveOutcome::Failed;
    } catch (ArchiveException const&) {
        return SaveOutcome::Failed;
    }
    return SaveOutcome::Saved;
}

/// Applies a save to what was there. What could not be read stays unread.
inline Items Applied(Items items, Changes const& changes)
{
    for (auto const& [path, bytes] : changes) {
        if (bytes)
            items[path] = *bytes;
        else
            items.erase(path);
    }
    return items;
}

inline bool AreSame(Items const& found, Items const& expected)
{
    auto const isSame = [](auto const& a, auto const& b) {
        // A block behind the end of the file may lie before it once something follows.
        return a.first == b.first && (a.second == b.second || b.second == c_unreadable);
    };
    return found.size() == expected.size() && std::equal(found.begin(), found.end(), expected.begin(), isSame);
}

/// Reads an archive whole, saves into it, opens it again and compares; then shrinks it and compares once more.
inline void CheckArchive(Counted<Archive> archive, std::string const& path)
{
    Items items = ReadAll(*archive);
    LookAround(*archive);
    Require(ReadAll(*archive) == items, "reading changes nothing");
    Changes const changes = {{"saved", "after"}};
    Archive::FileState state;
    if (archive->GetFileState(Archive::ChoiceMaster, state) && state.fileVersion == 7) {
        // Takes one save only, and what stands in the place of the guard then has to be a block.
        Save(*archive, changes);
        return;
    }
    if (Save(*archive, changes) == SaveOutcome::Saved) items = Applied(items, changes);
    archive = nullptr;
    Open result{};
    archive = OpenBy(Archive::Open, path, result);
    // A file whose state only recovery can find may be opened by it alone, unless a save went well.
    if (!archive) {
        Require(!items.count("saved"), "what was saved into can be opened");
        return;
    }
    if (items.count("saved")) Require(AreSame(ReadAll(*archive), items), "what was saved and opened again is equal");
    items = ReadAll(*archive);
    if (archive->Streamline(nullptr, nullptr, nullptr) != Archive::StreamlineDone) return;
    archive = nullptr;
    archive = OpenBy(Archive::Open, path, result);
    Require(static_cast<bool>(archive), "what was streamlined can be opened");
    Require(AreSame(ReadAll(*archive), items), "what was streamlined is equal");
}

} // namespace Kernel::Fuzz

#include "libkernel/archive/internal/ArchiveCompactWriter.h"
#include "libkernel/archive/internal/ArchiveVerifier.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/Trace.h"
#include "libkernel/streams/FileIOException.h"

#include <algorithm>
#include <iterator>
#include <new>

// After a save: what the files say is read into fresh tables and compared with those in memory, field by field, in the
// order of the messages below. The first difference ends the check. It reads the tables and no block.

namespace Kernel {

using namespace ArchiveFormat;
using Result = Archive::VerifyResult;

namespace {

// clang-format off
/// Every message, in the order of the checks: those after a save, then those after a streamline. %1 is what is held, %2
/// what was read, %3 a path.
constexpr char const* c_messages[] = {
    "E001: Failed to load scratch file\n",
    "E002: Scartch file link does not point to main file\n",
    "E003: Scartch file does not have a link to main file\n",
    "E004: Failed to load main file\n",
    "E005: Main file had unexpected link\n",
    "E006: NextFreeUID mismatch (%1 : %2)\n",
    "E007: Scratch FirstFAT mismatch (%1 : %2)\n",
    "E008: Scratch FileEnd mismatch (%1 : %2)\n",
    "E009: Scratch TotalBytes mismatch (%1 : %2)\n",
    "E010: Scratch DeadBytes mismatch (%1 : %2)\n",
    "E011: Scratch SaveTimeStamp mismatch (%1 : %2)\n",
    "E012: Scratch ThumbnailsPos mismatch (%1 : %2)\n",
    "E013: Scratch SaveCount mismatch (%1 : %2)\n",
    "E014: Scratch WriteCounter mismatch (%1 : %2)\n",
    "E015: Scratch FileVersion mismatch (%1 : %2)\n",
    "E016: Master FirstFAT mismatch (%1 : %2)\n",
    "E017: Master FileEnd mismatch (%1 : %2)\n",
    "E018: Master TotalBytes mismatch (%1 : %2)\n",
    "E019: Master DeadBytes mismatch (%1 : %2)\n",
    "E020: Master SaveTimeStamp mismatch (%1 : %2)\n",
    "E021: Master ThumbnailsPos mismatch (%1 : %2)\n",
    "E022: Master SaveCount mismatch (%1 : %2)\n",
    "E023: Master WriteCounter mismatch (%1 : %2)\n",
    "E024: Master FileVersion mismatch (%1 : %2)\n",
    "E025: New file has fewer FilePaths\n",
    "E026: New file has extra FilePaths\n",
    "E027: FilePaths sequences do not match\n",
    "E028: FilePath UIDs do not match\n",
    "E029: New file has fewer PathCounts\n",
    "E030: New file has extra PathCounts\n",
    "E031: PathCount dirty state does not match\n",
    "E032: PathCount sequences do not match\n",
    "E033: PathCount counters do not match\n",
    "E034: Revision counts do not match\n",
    "E035: New files has fewer Revisions\n",
    "E036: New files has extra Revisions\n",
    "E037: Revision scratch flags do not match\n",
    "E038: Revision TimeStamps do not match\n",
    "E039: Revision RevisionTags do not match\n",
    "E040: Revision NextFAT values do not match\n",
    "E041: Revision FileEnd values do not match\n",
    "E042: Revision TotalBytes values do not match\n",
    "E043: Revision DeadBytes values do not match\n",
    "E044: Revision FileRevision counts do not match\n",
    "E045: Missing FilePath in new file\n",
    "E046: Missing file revision in new file revision\n",
    "E047: FileRevision FilePos values do not match\n",
    "E048: FileRevision FileSize values do not match\n",
    "E049: FileRevision FileCompressedSize values do not match\n",
    "E050: FileRevision CRC uncompressed values do not match\n",
    "E051: FileRevision CompressionCode values do not match\n",
    "E052: FileRevision Added flag values do not match\n",
    "E053: FileRevision CRC compressed values do not match\n",
    "E101: Failed to load streamlined file\n",
    "E102: Streamlined file had unexpected link\n",
    "E103: Streamline NextFreeUID mismatch (%1 : %2)\n",
    "E104: Streamline FirstFAT mismatch (%1 : %2)\n",
    "E105: Streamline FileEnd mismatch (%1 : %2)\n",
    "E106: Streamline TotalBytes mismatch (%1 : %2)\n",
    "E107: Streamline DeadBytes mismatch (%1 : %2)\n",
    "E108: Streamline SaveTimeStamp mismatch (%1 : %2)\n",
    "E109: Streamline ThumbnailsPos mismatch (%1 : %2)\n",
    "E110: Streamline SaveCount mismatch (%1 : %2)\n",
    "E111: Streamline WriteCounter mismatch (%1 : %2)\n",
    "E112: Streamline FileVersion mismatch (%1 : %2)\n",
    "E113: Streamline has fewer FilePaths\n",
    "E114: Streamline has extra FilePaths\n",
    "E115: Streamline FilePaths mismatch\n",
    "E116: Streamline FilePath UIDs mismatch\n",
    "E117: Streamline has fewer PathCounts\n",
    "E118: Streamline has extra PathCounts\n",
    "E119: Streamline PathCount dirty flag mismatch\n",
    "E120: Streamline PathCount value mismatch\n",
    "E121: Streamline PathCount counter mismatch\n",
    "E122: Streamline Revision count mismatch\n",
    "E123: Streamline has fewer Revisions\n",
    "E124: Streamline has extra Revisions\n",
    "E125: Streamline Revision does not point back to archive\n",
    "E126: Streamline Revision TimeStamp mismatch (%1 : %2)\n",
    "E127: Streamline Revision RevisionTag mismatch (%1 : %2)\n",
    "E128: Streamline Revision NextFAT mismatch (%1 : %2)\n",
    "E129: Streamline Revision FileEnd mismatch (%1 : %2)\n",
    "E130: Streamline Revision TotalBytes mismatch (%1 : %2)\n",
    "E131: Streamline Revision DeadBytes mismatch (%1 : %2)\n",
    "E132: Streamline Revision FileRevision count mismatch",
    "E133: Streamline FilePath not found in new file",
    "E134: Streamline FileRevision not found in Revision",
    "E135: Streamline FileRevision FilePos mismatch (%1 : %2)\n",
    "E136: Streamline FileRevision FileSize mismatch (%1 : %2)\n",
    "E137: Streamline FileRevision FileCompressedSize mismatch (%1 : %2)\n",
    "E138: Streamline FileRevision CRC uncompressed mismatch (%1 : %2)\n",
    "E139: Streamline FileRevision CompressionCode mismatch (%1 : %2)\n",
    "E140: Streamline FileRevision Added flag mismatch\n",
    "E141: Streamline FileRevision CRC compressed mismatch (%1 : %2)\n",
    "E141: Deleted file found in Streamline: %1\n",
    "E142: File missing from Streamline: %1\n",
    "E143: File marked as deleted in: %1\n",
    "E144: Expected file to be marked as added: %1\n",
    "E145: Streamline FileRevision FileSize mismatch (%1 : %2): %3\n",
    "E146: Streamline FileRevision FileCompressedSize mismatch (%1 : %2): %3\n",
    "E147: Streamline FileRevision CRC uncompressed mismatch (%1 : %2): %3\n",
    "E148: Streamline FileRevision CompressionCode mismatch (%1 : %2): %3\n",
    "E149: Streamline FileRevision not found: %1\n",
    "E150: Streamline has additional FileRevision: %1\n",
    "E151: Streamline FileRevision CRC compressed mismatch (%1 : %2): %3\n",
};
// clang-format on

/// A message by its number. Two have the number 141.
constexpr int c_lastSaveCheck = 53;
constexpr int c_firstStreamlineCheck = 101;
constexpr int c_twice = 141;
constexpr int c_deletedFileFound = 1141; ///< The second 141.

constexpr int IndexOf(int check)
{
    if (check <= c_lastSaveCheck) return check - 1;
    int const index = c_lastSaveCheck + (check == c_deletedFileFound ? c_twice : check) - c_firstStreamlineCheck;
    return check > c_twice ? index + 1 : index;
}

constexpr bool HasNumber(char const* text, int number)
{
    return text[0] == 'E' && text[1] == '0' + number / 100 && text[2] == '0' + number / 10 % 10 &&
           text[3] == '0' + number % 10 && text[4] == ':';
}

constexpr bool MessagesAreInOrder()
{
    for (int i = 1; i <= c_lastSaveCheck; ++i)
        if (!HasNumber(c_messages[IndexOf(i)], i)) return false;
    for (int i = c_firstStreamlineCheck; i <= 151; ++i)
        if (!HasNumber(c_messages[IndexOf(i)], i)) return false;
    return HasNumber(c_messages[IndexOf(c_deletedFileFound)], c_twice);
}
static_assert(std::size(c_messages) == 105 && MessagesAreInOrder());

/// The first check of each group. The groups of a streamline run parallel to those of a save.
struct Groups
{
    int link;    // Only a streamline's; a save's two files have checks of their own.
    int nextUID; // One check.
    int paths;   // Four, and so on.
    int counts;
    int revisions;
    int entries;
};
constexpr Groups c_saveGroups = {5, 6, 25, 29, 34, 45};
constexpr Groups c_streamlineGroups = {102, 103, 113, 117, 122, 133};
constexpr int c_scratchFields = 7;
constexpr int c_masterFields = 16;
constexpr int c_streamlineFields = 104;

/// The fields of a file, in the order of their checks.
struct FileField
{
    u64 (*get)(Archive::ArchiveFile const& file);
};
constexpr FileField c_fileFields[] = {
    {[](Archive::ArchiveFile const& f) { return f.m_firstFAT; }},
    {[](Archive::ArchiveFile const& f) { return f.m_fileEnd; }},
    {[](Archive::ArchiveFile const& f) { return f.m_totalBytes; }},
    {[](Archive::ArchiveFile const& f) { return f.m_deadBytes; }},
    {[](Archive::ArchiveFile const& f) { return static_cast<u64>(f.m_saveTimeStamp.GetValue()); }},
    {[](Archive::ArchiveFile const& f) { return f.m_thumbnailsPos.load(); }},
    {[](Archive::ArchiveFile const& f) { return u64{f.m_saveCount}; }},
    {[](Archive::ArchiveFile const& f) { return u64{f.m_writeCounter}; }},
    {[](Archive::ArchiveFile const& f) { return u64{f.m_fileVersion}; }},
};
constexpr size_t c_thumbnailsField = 5;
constexpr size_t c_writeCounterField = 7;

} // namespace

/// Gathers the first difference.
class ArchiveComparison
{
public:
    /// Each gives true for a difference; then there is a message.
    bool Fields(int first, Archive::ArchiveFile const& held, Archive::ArchiveFile const& read, bool skipNoThumbnails);
    bool Paths(int first, ArchivePathMap const& held, ArchivePathMap const& read);
    bool PathCounts(int first, ArchivePathCounts const& held, ArchivePathCounts const& read);
    bool Revisions(Groups const& groups, std::vector<Counted<Archive::Revision>> const& held,
                   ArchiveLoadData const& read, ArchivePathMap const& heldPaths, Archive::ArchiveFile const* only);
    /// The file at @p path: alive in the archive, and its entry in the new file or null.
    bool Survivor(Archive::FileRevision const& held, String8 const& path, bool hasPath,
                  Archive::FileRevision const* read);

    template <class... Args>
    bool Fail(int check, Args const&... args)
    {
        m_message = Format(c_messages[IndexOf(check)], args...);
        return true;
    }
    template <class T>
    bool Differ(int check, T const& held, T const& read)
    {
        return held != read && Fail(check, held, read);
    }
    bool HasDifference() const { return !m_message.IsEmpty(); }
    String8 const& GetMessage() const { return m_message; }

private:
    bool Entries(int first, Archive::Revision const& held, Archive::Revision const& read, ArchiveLoadData const& data,
                 ArchivePathMap const& heldPaths);

    String8 m_message;
};

namespace {

/// A version 7 file has a block where others have their guard, and goes on having it after its first save.
bool HasGuard(Archive::ArchiveFile const& file)
{
    u8 tag[4];
    return file.m_stream->ReadAt(c_guardPos, tag, sizeof(tag)) == sizeof(tag) &&
           LoadLittleEndian<u32>(tag) == c_tagGuard;
}

std::vector<Archive::FileInfo const*> InOrder(ArchivePathMap const& map)
{
    std::vector<Archive::FileInfo const*> sorted;
    sorted.reserve(map.size());
    for (auto const& [path, info] : map) sorted.push_back(info.Get());
    std::sort(sorted.begin(), sorted.end(), [](auto const* a, auto const* b) { return a->GetPath() < b->GetPath(); });
    return sorted;
}

} // namespace

bool ArchiveComparison::Fields(int first, Archive::ArchiveFile const& held, Archive::ArchiveFile const& read,
                               bool skipNoThumbnails)
{
    for (size_t i = 0; i < std::size(c_fileFields); ++i) {
        u64 const ours = c_fileFields[i].get(held);
        u64 const theirs = c_fileFields[i].get(read);
        if (ours == theirs) continue;
        if (i == c_thumbnailsField && skipNoThumbnails && (ours == 0 || theirs == 0)) continue;
        if (i == c_writeCounterField && !HasGuard(read)) continue;
        return Fail(first + static_cast<int>(i), ours, theirs);
    }
    return false;
}

bool ArchiveComparison::Paths(int first, ArchivePathMap const& held, ArchivePathMap const& read)
{
    auto const ours = InOrder(held);
    auto const theirs = InOrder(read);
    for (size_t i = 0; i < std::max(ours.size(), theirs.size()); ++i) {
        if (i == theirs.size()) return Fail(first);
        if (i == ours.size()) return Fail(first + 1);
        if (ours[i]->GetPath() != theirs[i]->GetPath()) return Fail(first + 2);
        if (ours[i]->GetUID() != theirs[i]->GetUID()) return Fail(first + 3);
    }
    return false;
}

bool ArchiveComparison::PathCounts(int first, ArchivePathCounts const& held, ArchivePathCounts const& read)
{
    auto ours = held.begin();
    auto theirs = read.begin();
    for (; ours != held.end() || theirs != read.end(); ++ours, ++theirs) {
        if (theirs == read.end()) return Fail(first);
        if (ours == held.end()) return Fail(first + 1);
        if (ours->second.dirty != theirs->second.dirty) return Fail(first + 2);
        if (ours->first != theirs->first) return Fail(first + 3);
        if (ours->second.counter != theirs->second.counter) return Fail(first + 4);
    }
    return false;
}

bool ArchiveComparison::Revisions(Groups const& groups, std::vector<Counted<Archive::Revision>> const& held,
                                  ArchiveLoadData const& read, ArchivePathMap const& heldPaths,
                                  Archive::ArchiveFile const* only)
{
    int const first = groups.revisions;
    if (held.size() != read.revisions.size()) return Fail(first);
    for (size_t i = 0; i < std::max(held.size(), read.revisions.size()); ++i) {
        if (i >= read.revisions.size()) return Fail(first + 1);
        if (i >= held.size()) return Fail(first + 2);
        Archive::Revision const& a = *held[i];
        Archive::Revision const& b = *read.revisions[i];
        bool const sameFile = only ? ArchiveVerifier::FileOf(a) == only : a.IsScratch() == b.IsScratch();
        if (!sameFile) return Fail(first + 3);
        if (Differ(first + 4, a.GetTimeStamp().GetValue(), b.GetTimeStamp().GetValue()) ||
            Differ(first + 5, int{a.GetTag()}, int{b.GetTag()}) || Differ(first + 6, a.GetNextFAT(), b.GetNextFAT()) ||
            Differ(first + 7, a.GetFileEnd(), b.GetFileEnd()) ||
            Differ(first + 8, a.GetTotalBytes(), b.GetTotalBytes()) ||
            Differ(first + 9, a.GetDeadBytes(), b.GetDeadBytes()) ||
            Differ(first + 10, u64{a.GetEntries().size()}, u64{b.GetEntries().size()}))
            return true;
    }
    for (size_t i = 0; i < held.size(); ++i)
        if (Entries(groups.entries, *held[i], *read.revisions[i], read, heldPaths)) return true;
    return false;
}

bool ArchiveComparison::Entries(int first, Archive::Revision const& held, Archive::Revision const& read,
                                ArchiveLoadData const& data, ArchivePathMap const& heldPaths)
{
    for (Archive::FileRevision const& a : held.GetEntries()) {
        String8 const& path = a.info->GetPath();
        auto const found = data.paths.find(path);
        auto const known = heldPaths.find(path);
        // Where two files claim one path the map has the newer; the other one is known by its UID alone.
        bool const shadowed = known == heldPaths.end() || known->second.Get() != a.info.Get();
        Archive::FileInfo const* info = found == data.paths.end() ? nullptr : found->second.Get();
        if (shadowed) {
            auto const byUID = data.files.find(a.info->GetUID());
            info = byUID == data.files.end() ? nullptr : byUID->second.Get();
        }
        if (!info) return Fail(first);
        Archive::FileRevision const* const b = read.Find(*info);
        if (!b) return Fail(first + 1);
        if (Differ(first + 2, a.filePos, b->filePos) || Differ(first + 3, a.fileSize, b->fileSize) ||
            Differ(first + 4, a.fileCompressedSize, b->fileCompressedSize) ||
            Differ(first + 5, a.crcUncompressed, b->crcUncompressed) ||
            Differ(first + 6, int{a.compressionCode}, int{b->compressionCode}) ||
            Differ(first + 7, int{a.added}, int{b->added}) || Differ(first + 8, a.crcCompressed, b->crcCompressed))
            return true;
    }
    return false;
}

bool ArchiveComparison::Survivor(Archive::FileRevision const& held, String8 const& path, bool hasPath,
                                 Archive::FileRevision const* read)
{
    if (!hasPath) return Fail(142, path);
    if (!read) return Fail(149, path);
    if (read->IsDeletion()) return Fail(143, path);
    if (!read->added) return Fail(144, path);
    if (held.fileSize != read->fileSize) return Fail(145, held.fileSize, read->fileSize, path);
    if (held.fileCompressedSize != read->fileCompressedSize)
        return Fail(146, held.fileCompressedSize, read->fileCompressedSize, path);
    if (held.crcUncompressed != read->crcUncompressed)
        return Fail(147, held.crcUncompressed, read->crcUncompressed, path);
    if (held.compressionCode != read->compressionCode)
        return Fail(148, int{held.compressionCode}, int{read->compressionCode}, path);
    // One that was not known has been filled in by the copy.
    bool const known = held.crcCompressed != 0;
    return known && held.crcCompressed != read->crcCompressed &&
           Fail(151, held.crcCompressed, read->crcCompressed, path);
}

namespace {

/// A private file object over the held one's stream.
Counted<Archive::ArchiveFile> Share(Archive::ArchiveFile const& file)
{
    auto copy = MakeCounted<Archive::ArchiveFile>(file.m_mode, file.m_archiveUID);
    if (file.m_isScratch) copy->BecomeScratch();
    copy->m_stream = file.m_stream;
    copy->m_path = file.m_path;
    return copy;
}

/// Reads the tables through the held file's stream; false if they cannot be read.
bool LoadFresh(Archive::ArchiveFile const& held, IDTag tag, ArchiveLoadData& data, Counted<Archive::ArchiveFile>& fresh)
{
    CriticalSectionScope const lock(held.m_lock);
    fresh = Share(held);
    if (!fresh->m_stream) return false;
    data.testLink = false;
    try {
        return ArchiveLoader::LoadArchiveFile(*fresh, tag, data) == Archive::OpenOk;
    } catch (FileIOException const&) {
        return false;
    }
}

/// What belongs to a file's history but not into a compact file is left out, and all that is in it is clean.
ArchivePathCounts AsStreamlined(ArchivePathCounts const& counts)
{
    ArchivePathCounts result;
    for (auto const& [parts, count] : counts)
        if (count.counter != 0) result[parts].counter = count.counter;
    return result;
}

} // namespace

Archive::ArchiveFile const* ArchiveVerifier::FileOf(Archive::Revision const& revision)
{
    return revision.m_file.Get();
}

// No other thread changes the tables: the caller holds the session lock.
Result ArchiveVerifier::VerifyFileState(ArchiveImpl& impl, String8& report)
{
    bool suspended = false;
    ArchiveAccessScope const access(impl, suspended);
    if (!access.IsOpen()) return Archive::VerifyNotRun;
    try {
        ArchiveComparison comparison;
        CompareFileState(impl, comparison);
        if (!comparison.HasDifference()) return Archive::VerifyMatch;
        Trace(comparison.GetMessage());
        ShuntDeadFiles(impl, comparison.GetMessage(), report);
        return Archive::VerifyMismatch;
    } catch (FileIOException const&) {
        return Archive::VerifyNotRun;
    } catch (std::bad_alloc const&) {
        return Archive::VerifyNotRun;
    }
}

void ArchiveVerifier::CompareFileState(ArchiveImpl& impl, ArchiveComparison& comparison)
{
    ArchiveLoadData data;
    Counted<Archive::ArchiveFile> const master = impl.m_master;
    Counted<Archive::ArchiveFile> const scratch = impl.m_scratch;
    Counted<Archive::ArchiveFile> freshMaster;
    Counted<Archive::ArchiveFile> freshScratch;
    bool failed = false;
    if (scratch) {
        failed = !LoadFresh(*scratch, impl.m_archiveUID, data, freshScratch) && comparison.Fail(1);
        if (!failed && !master) failed = data.hasLink && comparison.Fail(3);
        if (!failed && master) {
            String8 const& path = master->m_finalPath.IsEmpty() ? master->m_path : master->m_finalPath;
            // A file that was opened as the scratch file of a reference has that for its link.
            bool const byReference = !scratch->m_hasLink && scratch->m_referenceInfo && !data.hasLink;
            failed = !byReference && data.linkPath != path && comparison.Fail(2);
        }
    }
    if (!failed && master) {
        failed = !LoadFresh(*master, impl.m_archiveUID, data, freshMaster) && comparison.Fail(4);
        failed = failed || (data.hasLink && comparison.Fail(c_saveGroups.link));
    }
    if (failed || comparison.Differ(c_saveGroups.nextUID, impl.m_nextFreeUID, data.nextFreeUID)) return;
    if (scratch && comparison.Fields(c_scratchFields, *scratch, *freshScratch, false)) return;
    if (master && comparison.Fields(c_masterFields, *master, *freshMaster, true)) return;
    if (comparison.Paths(c_saveGroups.paths, impl.m_paths, data.paths)) return;
    if (comparison.PathCounts(c_saveGroups.counts, impl.m_pathCounts, data.pathCounts)) return;
    comparison.Revisions(c_saveGroups, impl.m_revisions, data, impl.m_paths, nullptr);
}

Result ArchiveVerifier::VerifyStreamlinedFileState(ArchiveImpl& impl, Archive::ArchiveFile& file, String8 const& path,
                                                   Archive::StreamlineData const& data, String8& report)
{
    try {
        ArchiveComparison comparison;
        CompareStreamlined(impl, file, data, comparison);
        if (!comparison.HasDifference()) return Archive::VerifyMatch;
        Trace(comparison.GetMessage());
        ShuntDeadStreamlineFiles(impl, path, comparison.GetMessage(), report);
        return Archive::VerifyMismatch;
    } catch (FileIOException const&) {
        return Archive::VerifyNotRun;
    } catch (std::bad_alloc const&) {
        return Archive::VerifyNotRun;
    }
}

void ArchiveVerifier::CompareStreamlined(ArchiveImpl& impl, Archive::ArchiveFile& file,
                                         Archive::StreamlineData const& data, ArchiveComparison& comparison)
{
    ArchiveLoadData read;
    Counted<Archive::ArchiveFile> fresh;
    Groups const& groups = c_streamlineGroups;
    if (!LoadFresh(file, impl.m_archiveUID, read, fresh)) {
        comparison.Fail(c_firstStreamlineCheck);
        return;
    }
    if (read.hasLink) {
        comparison.Fail(groups.link);
        return;
    }
    if (comparison.Differ(groups.nextUID, impl.m_nextFreeUID, read.nextFreeUID)) return;
    if (comparison.Fields(c_streamlineFields, file, *fresh, false)) return;
    if (comparison.Paths(groups.paths, data.paths, read.paths)) return;
    if (comparison.PathCounts(groups.counts, AsStreamlined(impl.m_pathCounts), read.pathCounts)) return;
    if (comparison.Revisions(groups, data.revisions, read, data.paths, &file)) return;
    CompareWithHead(impl, read, comparison);
}

// The compact file as it was written has been found in the new file. What is left to ask is whether it is what the
// archive shows.
void ArchiveVerifier::CompareWithHead(ArchiveImpl& impl, ArchiveLoadData const& read, ArchiveComparison& comparison)
{
    Archive::Revision const& compact = *read.revisions.back();
    CriticalSectionScope const lock(impl.m_stateLock);
    Archive::Revision* const working = impl.GetWorkingRevisionCS();
    u64 alive = 0;
    for (auto const& [path, info] : impl.m_paths) {
        Archive::FileRevision const* const held = working ? impl.FindEntryCS(*info, *working) : nullptr;
        auto const found = read.paths.find(path);
        bool const hasPath = found != read.paths.end();
        Archive::FileRevision const* const there = hasPath ? compact.Find(*found->second) : nullptr;
        if (held && held->IsDeletion()) {
            if (there && comparison.Fail(c_deletedFileFound, path)) return;
            continue;
        }
        if (!held) continue;
        if (comparison.Survivor(*held, path, hasPath, there)) return;
        ++alive;
    }
    if (alive == compact.GetEntries().size()) return;
    for (Archive::FileRevision const& entry : compact.GetEntries()) {
        String8 const& path = entry.info->GetPath();
        Archive::FileInfo const* const info = impl.FindFileInfoCS(path);
        if ((!info || !working || !impl.FindEntryCS(*info, *working)) && comparison.Fail(150, path)) return;
    }
}

Result Archive::CloseSessionAndVerifyFileState(ArchiveSessionHandle& handle, String8& report, bool updateTimestamps)
{
    // To the end: a suspension that waits for the session would begin before the check.
    ArchiveAccessCountScope const access(*m);
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    CloseSession(handle, updateTimestamps);
    return ArchiveVerifier::VerifyFileState(*m, report);
}

} // namespace Kernel

#include "Diagnostics.h"
#include "OpenedArchive.h"
#include "Output.h"
#include "Verbs.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/platform/PlatformFile.h"

#include <algorithm>
#include <iterator>
#include <map>

// Verbs that look into a document and change nothing.

namespace KernelTool {

using namespace Kernel;

namespace {

char const* MethodName(Archive::FileRevision::Method method)
{
    static constexpr char const* c_names[] = {"direct", "zlib", "zstd"};
    return c_names[static_cast<int>(method)];
}

bool IsReadOnly(Archive const& archive, String8 const& path)
{
    String8 const document = archive.MainFileHasPath() ? archive.GetArchivePath() : path;
    return FileSystem::FileIsReadOnly(document) ||
           Platform::GetFileCalls().access(document.GetData(), Platform::Access::Write) != 0;
}

Json DescribeFile(Archive const& archive, Archive::ArchiveChoice which)
{
    Archive::FileState state;
    if (!archive.GetFileState(which, state)) return nullptr;
    Json link = nullptr;
    if (state.hasLink)
        link = {{"path", ToStd(state.linkPath)},
                {"saveTimeStamp", state.linkSaveTimeStamp.GetValue()},
                {"saveCount", state.linkSaveCount}};
    Json reference = nullptr;
    if (state.hasReferencePath) reference = ToStd(state.referencePath);
    return {{"path", ToStd(state.path)},
            {"fileVersion", state.fileVersion},
            {"flags", state.flags},
            {"firstFAT", state.firstFAT},
            {"fileEnd", state.fileEnd},
            {"totalBytes", state.totalBytes},
            {"deadBytes", state.deadBytes},
            {"saveTimeStamp", state.saveTimeStamp.GetValue()},
            {"saveCount", state.saveCount},
            {"nextFreeUID", state.nextFreeUID},
            {"writeCounter", state.writeCounter},
            {"thumbnailsPos", state.thumbnailsPos},
            {"link", link},
            {"referencePath", reference}};
}

void ShowFile(Json const& file, char const* name)
{
    if (file.is_null()) return;
    Print(std::string("\n") + name + " " + Printable(file["path"].get<std::string>()) + "\n");
    Table table("ll");
    auto const number = [&](char const* key) { return std::to_string(file[key].get<u64>()); };
    table.Add({"  version", number("fileVersion") + ", flags " + number("flags")});
    table.Add({"  saved", FormatTime(TimeStamp(file["saveTimeStamp"].get<i64>())) + ", save " + number("saveCount") +
                              ", write counter " + number("writeCounter")});
    table.Add({"  size", FormatSize(file["fileEnd"].get<u64>()) +
                             (number("firstFAT") == "0" ? ", no table" : ", newest table at " + number("firstFAT"))});
    table.Add({"  stored",
               FormatSize(file["totalBytes"].get<u64>()) + ", of it dead " + FormatSize(file["deadBytes"].get<u64>())});
    table.Add({"  next UID", number("nextFreeUID")});
    table.Add({"  thumbnails", number("thumbnailsPos") == "0" ? "none" : "at " + number("thumbnailsPos")});
    if (!file["link"].is_null())
        table.Add({"  master", file["link"]["path"].get<std::string>() + ", save " +
                                   std::to_string(file["link"]["saveCount"].get<u64>())});
    if (!file["referencePath"].is_null()) table.Add({"  stands for", file["referencePath"].get<std::string>()});
    table.Show();
}

} // namespace

int RunList(Arguments const& arguments)
{
    Counted<Archive> const archive = OpenForReading(arguments);
    std::map<Archive::Revision const*, size_t> indices;
    auto const revisions = GetRevisions(*archive);
    for (size_t i = 0; i < revisions.size(); ++i) indices[revisions[i].Get()] = i;

    std::vector<String8> paths;
    archive->GetFileList(paths);
    Json list = Json::array();
    Table table("rrrlrl");
    table.Add({"UID", "SIZE", "STORED", "METHOD", "REVISION", "ITEM"});
    for (String8 const& path : paths) {
        Archive::FileRevision entry;
        Counted<Archive::Revision const> revision;
        if (!archive->GetFileRevision(path, entry, revision)) continue;
        size_t const index = indices[revision.Get()];
        char const* const method = MethodName(entry.GetMethod());
        if (arguments.Has(Option::Json))
            list.push_back({{"path", ToStd(path)},
                            {"uid", entry.info->GetUID()},
                            {"size", entry.fileSize},
                            {"storedSize", entry.fileCompressedSize},
                            {"method", method},
                            {"predictor", static_cast<u32>(entry.GetPredictor())},
                            {"striping", static_cast<u32>(entry.GetStriping())},
                            {"crc", FormatCRC(entry.crcUncompressed)},
                            {"storedCrc", FormatCRC(entry.crcCompressed)},
                            {"buildIndex", entry.codeBaseIndex},
                            {"revision", index},
                            {"in", PlaceOf(*revision)}});
        else
            table.Add({std::to_string(entry.info->GetUID()), FormatSize(entry.fileSize),
                       FormatSize(entry.fileCompressedSize), method,
                       std::to_string(index) + (revision->IsScratch() ? "s" : ""), ToStd(path)});
    }
    if (arguments.Has(Option::Json))
        PrintJson(list);
    else
        table.Show();
    return ExitDone;
}

int RunCat(Arguments const& arguments)
{
    Counted<Archive> const archive = OpenForReading(arguments);
    RequireItems(*archive, {arguments.positional[1]});
    ReadItem(*archive, arguments.At(1), [](void const* bytes, u64 count) {
        Print(std::string(static_cast<char const*>(bytes), count));
        FinishOutput();
    });
    return ExitDone;
}

int RunInfo(Arguments const& arguments)
{
    Counted<Archive> const archive = OpenForReading(arguments);
    Json const master = DescribeFile(*archive, Archive::ChoiceMaster);
    Json const scratch = DescribeFile(*archive, Archive::ChoiceScratch);
    u32 nextFreeUID = 0;
    for (Json const* file : {&master, &scratch})
        if (!file->is_null()) nextFreeUID = std::max(nextFreeUID, (*file)["nextFreeUID"].get<u32>());
    std::vector<String8> paths;
    archive->GetFileList(paths);
    Json const info = {{"archiveUID", FormatTag(archive->GetArchiveIDTag())},
                       {"readOnly", IsReadOnly(*archive, arguments.At(0))},
                       {"revisions", GetRevisions(*archive).size()},
                       {"items", paths.size()},
                       {"nextFreeUID", nextFreeUID},
                       {"master", master},
                       {"scratch", scratch}};
    if (arguments.Has(Option::Json)) {
        PrintJson(info);
        return ExitDone;
    }
    Print("kind " + Printable(info["archiveUID"].get<std::string>()) +
          (info["readOnly"].get<bool>() ? ", read-only, " : ", ") + std::to_string(paths.size()) + " items, " +
          std::to_string(info["revisions"].get<u64>()) + " revisions\n");
    ShowFile(master, "master");
    ShowFile(scratch, "scratch");
    return ExitDone;
}

int RunHistory(Arguments const& arguments)
{
    Counted<Archive> const archive = OpenForReading(arguments);
    static constexpr char const* c_tags[] = {"full", "incremental", "streamlined"};
    Json history = Json::array();
    auto const revisions = GetRevisions(*archive);
    for (size_t i = 0; i < revisions.size(); ++i) {
        Archive::Revision const& revision = *revisions[i];
        std::vector<Archive::FileRevision const*> entries;
        for (Archive::FileRevision const& entry : revision.GetEntries()) entries.push_back(&entry);
        std::sort(entries.begin(), entries.end(),
                  [](auto* a, auto* b) { return a->info->GetPath() < b->info->GetPath(); });
        Json list = Json::array();
        Table table("lrrl");
        table.Add({"   CHANGE", "SIZE", "STORED", "ITEM"});
        for (Archive::FileRevision const* entry : entries) {
            char const* const kind = entry->IsDeletion() ? "deleted" : entry->added ? "added" : "changed";
            Json row = {{"path", ToStd(entry->info->GetPath())}, {"uid", entry->info->GetUID()}, {"kind", kind}};
            if (!entry->IsDeletion()) {
                row["filePos"] = entry->filePos;
                row["size"] = entry->fileSize;
                row["storedSize"] = entry->fileCompressedSize;
            }
            list.push_back(std::move(row));
            bool const gone = entry->IsDeletion();
            table.Add({std::string("   ") + kind, gone ? "" : FormatSize(entry->fileSize),
                       gone ? "" : FormatSize(entry->fileCompressedSize), ToStd(entry->info->GetPath())});
        }
        u64 const userDataSize = revision.GetUserData() ? revision.GetUserData()->GetSize() : 0;
        history.push_back({{"index", i},
                           {"in", PlaceOf(revision)},
                           {"timeStamp", revision.GetTimeStamp().GetValue()},
                           {"tag", static_cast<int>(revision.GetTag())},
                           {"nextFAT", revision.GetNextFAT()},
                           {"fileEnd", revision.GetFileEnd()},
                           {"totalBytes", revision.GetTotalBytes()},
                           {"deadBytes", revision.GetDeadBytes()},
                           {"userDataSize", userDataSize},
                           {"entries", std::move(list)}});
        if (arguments.Has(Option::Json)) continue;
        size_t const tag = revision.GetTag();
        Print((i ? "\n" : "") + std::string("revision ") + std::to_string(i) + "  " +
              FormatTime(revision.GetTimeStamp()) + "  " + PlaceOf(revision) + ", " +
              (tag < std::size(c_tags) ? c_tags[tag] : "tag " + std::to_string(tag)) + ", file end " +
              FormatSize(revision.GetFileEnd()) + (userDataSize ? ", user data " + FormatSize(userDataSize) : "") +
              "\n");
        table.Show();
    }
    if (arguments.Has(Option::Json)) PrintJson(history);
    return ExitDone;
}

int RunVerify(Arguments const& arguments)
{
    Counted<Archive> const archive = OpenForReading(arguments);
    u64 checked = 0;
    Json const damaged = CheckAllBlocks(*archive, arguments, checked);
    if (arguments.Has(Option::Json))
        PrintJson({{"checked", checked}, {"damaged", damaged}});
    else
        PrintDamage(damaged, checked);
    return damaged.empty() ? ExitDone : ExitDamaged;
}

int RunTest(Arguments const& arguments)
{
    String8 const path = arguments.At(0);
    // Opening reads every header and table, and no block.
    Archive::OpenResult result = Archive::OpenIOError;
    Archive::Open(path, Archive::OpenModeReadOnly, IDTag(), result);
    if (arguments.Has(Option::Json))
        PrintJson({{"result", static_cast<int>(result)}, {"name", GetName(result)}});
    else
        Print(std::string(GetName(result)) + " (" + std::to_string(static_cast<int>(result)) + ")\n");
    if (result == Archive::OpenOk) return ExitDone;
    PrintFailure(MakeFailure("testing '" + ToStd(path) + "'", result));
    bool const damaged =
        result == Archive::OpenCorrupt || result == Archive::OpenBadInfo || result == Archive::OpenTruncated;
    return damaged ? ExitDamaged : ExitFailed;
}

} // namespace KernelTool

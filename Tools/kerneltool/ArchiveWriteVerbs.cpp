#include "Diagnostics.h"
#include "OpenedArchive.h"
#include "ProgressBar.h"
#include "Reservation.h"
#include "SourceItem.h"
#include "Verbs.h"
#include "WriteSession.h"
#include "libkernel/archive/ArchiveReferenceInfo.h"
#include "libkernel/filesystem/FileEnumerator.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/Path.h"
#include "libkernel/platform/PlatformFile.h"

#include <set>

// Verbs that change a document.

namespace KernelTool {

using namespace Kernel;

namespace {

String8 MakeAbsolute(String8 const& path)
{
    Path result(path);
    if (!result.IsRelative()) return path;
    Path absolute{String8(std::string_view(Platform::GetCurrentFolder()))};
    absolute.Append(path);
    absolute.Canonicalize();
    return absolute.GetString();
}

IDTag ParseUid(std::string const& text)
{
    if (text.size() != 4) throw UsageProblem{"--uid takes four characters"};
    u32 value = 0;
    for (char const c : text) {
        auto const byte = static_cast<u8>(c);
        if (byte < 0x20 || byte > 0x7E) throw UsageProblem{"--uid takes four characters of ASCII"};
        value = value << 8 | byte;
    }
    return IDTag(value);
}

/// What put has to write.
struct NamedSource
{
    std::string item;
    Source source;
};

bool IsDocumentItself(Archive const& archive, String8 const& path)
{
    for (String8 const& own : {archive.GetArchivePath(), archive.GetScratchPath()}) {
        try {
            if (!own.IsEmpty() && FileSystem::IsSameFile(own, path)) return true;
        } catch (std::exception const&) {
            // What can't be asked can't be the file that is open.
        }
    }
    return false;
}

/// Every regular file below @p root; links are none. The document's own files are left out.
void AddTree(Archive const& archive, String8 const& root, std::string const& prefix, std::vector<NamedSource>& sources)
{
    std::vector<std::pair<String8, std::string>> folders = {{root, prefix}};
    while (!folders.empty()) {
        auto const [folder, base] = folders.back();
        folders.pop_back();
        Counted<FileEnumerator> const entries = FileEnumerator::Create(folder, false);
        if (!entries) {
            auto const result = FileSystem::Exists(folder) ? File::OpenUnmanagedResult::AccessDenied
                                                           : File::OpenUnmanagedResult::NotFound;
            throw MakeFailure("listing '" + ToStd(folder) + "'", result);
        }
        for (FileEnumerator::PathRec const& entry : entries->GetPaths()) {
            if (entry.isLink) continue;
            Path path(folder);
            path.Append(entry.path);
            std::string const item = base + ToStd(entry.path);
            if (entry.kind == FileEnumerator::Kind::Directory) {
                folders.emplace_back(path.GetString(), item + "/");
                continue;
            }
            Platform::FileInfo info;
            int const error = Platform::GetFileCalls().stat(path.GetData(), false, info);
            bool const regular = error == 0 && info.kind == Platform::FileKind::File;
            if (!regular || IsDocumentItself(archive, path.GetString())) continue;
            sources.push_back({item, Source::FromPath(path.GetString())});
        }
    }
}

/// The "ITEM=SOURCE" words in two.
std::vector<std::pair<std::string, std::string>> ParsePairs(Arguments const& arguments)
{
    std::vector<std::pair<std::string, std::string>> pairs;
    bool standardInput = false;
    for (size_t i = 1; i < arguments.positional.size(); ++i) {
        std::string const& word = arguments.positional[i];
        size_t const equals = word.find('=');
        if (equals == std::string::npos || equals == 0 || equals + 1 == word.size())
            throw UsageProblem{"'" + Printable(word) + "' is not ITEM=SOURCE"};
        pairs.emplace_back(word.substr(0, equals), word.substr(equals + 1));
        if (pairs.back().second != "-") continue;
        if (standardInput) throw UsageProblem{"standard input can be read once"};
        standardInput = true;
    }
    if (pairs.empty() && !arguments.Has(Option::Tree)) throw UsageProblem{"nothing to put"};
    if (arguments.Has(Option::Prefix) && !arguments.Has(Option::Tree)) throw UsageProblem{"--prefix goes with --tree"};
    return pairs;
}

std::vector<NamedSource> CollectSources(Archive const& archive, Arguments const& arguments,
                                        std::vector<std::pair<std::string, std::string>> const& pairs)
{
    std::vector<NamedSource> sources;
    for (auto const& [item, name] : pairs) {
        if (name == "-") {
            sources.push_back({item, Source::FromStandardInput()});
            continue;
        }
        String8 const path{std::string_view(name)};
        if (IsDocumentItself(archive, path))
            throw MakeFailure("reading '" + name + "'", File::OpenUnmanagedResult::InUse);
        sources.push_back({item, Source::FromPath(path)});
    }
    if (arguments.Has(Option::Tree)) {
        std::string prefix = arguments.Get(Option::Prefix);
        if (!prefix.empty() && prefix.back() != '/') prefix += '/';
        AddTree(archive, arguments.GetString(Option::Tree), prefix, sources);
    }
    std::set<std::string> items;
    for (NamedSource const& source : sources)
        if (!items.insert(source.item).second) throw UsageProblem{"'" + Printable(source.item) + "' is named twice"};
    return sources;
}

/// Verifies if that was asked for, prints the report and gives the exit status.
int Report(Archive& archive, Arguments const& arguments, bool verify, Json report, std::string const& text)
{
    Json damaged = Json::array();
    u64 checked = 0;
    if (verify) {
        damaged = CheckAllBlocks(archive, arguments, checked);
        report["checked"] = checked;
        report["damaged"] = damaged;
    }
    if (arguments.Has(Option::Json)) {
        PrintJson(report);
    } else {
        Print(text);
        if (verify) PrintDamage(damaged, checked);
    }
    return damaged.empty() ? ExitDone : ExitDamaged;
}

void SetUserData(WriteSession const& session, WriteOptions const& options)
{
    if (options.userData.empty()) return;
    if (!session->SetUserData(options.userData.data(), options.userData.size()))
        throw MakeFailure("setting the user data", Archive::SessionNoMemory);
}

} // namespace

int RunCreate(Arguments const& arguments)
{
    String8 const path = arguments.At(0);
    IDTag const uid = ParseUid(arguments.Get(Option::Uid, "Docu"));
    Archive::CreateResult result;
    if (path.IsEmpty()) {
        result.Set(Archive::CreateResult::Code::BadPath);
        throw MakeFailure("creating a document", result);
    }
    Reservation reservation(path);
    Counted<Archive> archive;
    if (arguments.Has(Option::Reference))
        archive = Archive::CreateAsScratch(
            path, uid, MakeCounted<ArchiveReferenceInfo>(arguments.GetString(Option::Reference)), result);
    else
        archive = Archive::Create(path, uid, result);
    if (!archive) throw MakeFailure("creating '" + ToStd(path) + "'", result);
    reservation.Use();
    if (arguments.Has(Option::Json))
        PrintJson({{"path", ToStd(path)}, {"archiveUID", FormatTag(uid)}});
    else
        Print("created " + Printable(ToStd(path)) + "\n");
    return ExitDone;
}

int RunPut(Arguments const& arguments)
{
    auto const pairs = ParsePairs(arguments);
    WriteOptions const options(arguments);
    Counted<Archive> const archive = OpenForWriting(arguments.At(0));
    std::vector<NamedSource> const sources = CollectSources(*archive, arguments, pairs);

    Json written = Json::array();
    Json unchanged = Json::array();
    std::vector<NamedSource const*> wanted;
    u64 total = 0;
    {
        u64 all = 0;
        for (NamedSource const& source : sources) all += source.source.GetSize();
        LongWork work("Comparing", all, arguments);
        for (NamedSource const& source : sources) {
            bool const keep = options.type != Archive::SessionTypeRewrite &&
                              HasSameBytes(*archive, String8(std::string_view(source.item)), source.source, work);
            (keep ? unchanged : written).push_back(source.item);
            if (keep) continue;
            wanted.push_back(&source);
            total += source.source.GetSize();
        }
    }
    if (!wanted.empty()) {
        LongWork work("Writing", total, arguments);
        WriteSession session(*archive, options.type, options.scratch);
        SetUserData(session, options);
        for (NamedSource const* source : wanted)
            session->CreateFile(String8(std::string_view(source->item)), MakeCounted<SourceItem>(source->source, work),
                                options.hint);
        session.Commit(options.verify);
    }
    std::string const text = std::to_string(written.size()) + " items written (" + FormatSize(total) + "), " +
                             std::to_string(unchanged.size()) + " unchanged\n";
    u64 const revisions = GetRevisions(*archive).size();
    return Report(*archive, arguments, options.verify,
                  {{"written", written}, {"unchanged", unchanged}, {"revisions", revisions}}, text);
}

int RunRemove(Arguments const& arguments)
{
    WriteOptions const options(arguments);
    Counted<Archive> const archive = OpenForWriting(arguments.At(0));
    std::set<std::string> const items(arguments.positional.begin() + 1, arguments.positional.end());
    RequireItems(*archive, {items.begin(), items.end()});
    WriteSession session(*archive, options.type, options.scratch);
    SetUserData(session, options);
    for (std::string const& item : items) session->DeleteFile(String8(std::string_view(item)));
    session.Commit(options.verify);
    u64 const revisions = GetRevisions(*archive).size();
    return Report(*archive, arguments, options.verify, {{"deleted", items}, {"revisions", revisions}},
                  std::to_string(items.size()) + " items deleted\n");
}

int RunScratch(Arguments const& arguments)
{
    String8 const path = arguments.At(1);
    // The link that the scratch file keeps must hold from every folder.
    Counted<Archive> const archive = OpenForWriting(MakeAbsolute(arguments.At(0)));
    Archive::CreateResult result;
    if (archive->HasScratchFile()) result.Set(Archive::CreateResult::Code::HasScratchFile);
    if (path.IsEmpty()) result.Set(Archive::CreateResult::Code::BadPath);
    std::string const what = "adding scratch file '" + ToStd(path) + "'";
    if (result.GetCode() != Archive::CreateResult::Code::Ok) throw MakeFailure(what, result);
    Reservation reservation(path);
    if (!archive->AddScratchFile(path, result)) throw MakeFailure(what, result);
    reservation.Use();
    if (arguments.Has(Option::Json))
        PrintJson({{"path", ToStd(path)}, {"master", ToStd(archive->GetArchivePath())}});
    else
        Print("added scratch file " + Printable(ToStd(path)) + "\n");
    return ExitDone;
}

} // namespace KernelTool

#include "OpenedArchive.h"

#include "Diagnostics.h"
#include "Interrupt.h"
#include "ProgressBar.h"
#include "Verbs.h"
#include "libkernel/streams/InStream.h"

#include <algorithm>
#include <charconv>

namespace KernelTool {

using namespace Kernel;

namespace {

constexpr u64 c_pieceSize = 1 << 20;

u64 ParseSteps(Arguments const& arguments)
{
    std::string const text = arguments.Get(Option::At, "0");
    u64 steps = 0;
    auto const [end, error] = std::from_chars(text.data(), text.data() + text.size(), steps);
    if (error != std::errc() || end != text.data() + text.size()) throw UsageProblem{"--at takes a number"};
    return steps;
}

Counted<Archive> Open(String8 const& path, Archive::OpenMode mode)
{
    Archive::OpenResult result{};
    Counted<Archive> archive = Archive::Open(path, mode, IDTag(), result);
    if (!archive) throw MakeFailure("opening '" + ToStd(path) + "'", result);
    return archive;
}

} // namespace

Counted<Archive> OpenForReading(Arguments const& arguments)
{
    u64 const steps = ParseSteps(arguments);
    Counted<Archive> archive = Open(arguments.At(0), Archive::OpenModeReadOnly);
    std::vector<Counted<Archive::Revision const>> all;
    archive->GetRevisions(all);
    if (steps > all.size()) {
        Failure failure = MakeFailure("stepping back " + std::to_string(steps) + " revisions", Archive::OpenNotFound);
        failure.advice = "The document has " + std::to_string(all.size()) + " revisions.";
        throw failure;
    }
    for (u64 i = 0; i < steps; ++i) archive->RewindWorkingRevision();
    return archive;
}

Counted<Archive> OpenForWriting(String8 const& path)
{
    return Open(path, Archive::OpenModeReadWrite);
}

std::vector<Counted<Archive::Revision const>> GetRevisions(Archive const& archive)
{
    std::vector<Counted<Archive::Revision const>> revisions;
    archive.GetRevisions(revisions);
    revisions.resize(revisions.size() - std::min<size_t>(revisions.size(), archive.GetRewindCount()));
    return revisions;
}

char const* PlaceOf(Archive::Revision const& revision)
{
    return revision.IsScratch() ? "scratch" : "master";
}

void RequireItems(Archive const& archive, std::vector<std::string> const& items)
{
    for (std::string const& item : items) {
        if (archive.HasFile(String8(std::string_view(item)))) continue;
        Failure failure = MakeFailure("finding item '" + item + "'", Archive::OpenNotFound);
        failure.advice = "'kerneltool archive ls' lists the items.";
        throw failure;
    }
}

void ReadItem(Archive& archive, String8 const& path, std::function<void(void const* bytes, u64 count)> const& take)
{
    std::string const what = "reading item '" + ToStd(path) + "'";
    try {
        Archive::FileRevision entry;
        Counted<Archive::Revision const> revision;
        if (!archive.GetFileRevision(path, entry, revision)) throw MakeFailure(what, Archive::OpenNotFound);
        Counted<InStream> const stream = archive.OpenFileInStream(path);
        if (!stream) throw MakeFailure(what, Archive::OpenIOError);
        std::vector<u8> piece(std::min(c_pieceSize, std::max<u64>(entry.fileSize, 1)));
        u64 done = 0;
        while (done < entry.fileSize) {
            StopIfInterrupted();
            u64 const wanted = std::min<u64>(piece.size(), entry.fileSize - done);
            if (stream->ReadBlock(piece.data(), wanted) != wanted) throw MakeFailure(what, Archive::OpenCorrupt);
            take(piece.data(), wanted);
            done += wanted;
        }
        // Also for an empty item: what stands behind the last byte is the check.
        if (stream->ReadBlock(piece.data(), 1) != 0) throw MakeFailure(what, Archive::OpenCorrupt);
    } catch (...) {
        throw DescribeCurrentException(what);
    }
}

char const* ProblemText(Archive::BlockCheck check)
{
    static constexpr char const* c_texts[] = {
        "sound",
        "the file cannot be read there",
        "no block lies there, or its end is missing",
        "the stored bytes are not those that were written (stored CRC)",
        "the stored bytes do not unpack to the recorded size",
        "the bytes are not those that were written (CRC)",
    };
    return c_texts[static_cast<int>(check)];
}

Json CheckAllBlocks(Archive& archive, Arguments const& arguments, u64& checked)
{
    auto const revisions = GetRevisions(archive);
    u64 total = 0;
    for (auto const& revision : revisions)
        for (Archive::FileRevision const& entry : revision->GetEntries()) total += entry.fileCompressedSize;
    LongWork work("Verifying", total, arguments);
    Json damaged = Json::array();
    checked = 0;
    for (size_t i = 0; i < revisions.size(); ++i) {
        for (Archive::FileRevision const& entry : revisions[i]->GetEntries()) {
            if (entry.IsDeletion()) continue;
            Archive::BlockCheck const check = archive.CheckStoredBlock(*revisions[i], entry);
            ++checked;
            if (check != Archive::BlockCheck::Ok)
                damaged.push_back(
                    {{"path", ToStd(entry.info->GetPath())}, {"revision", i}, {"problem", ProblemText(check)}});
            work.Advance(entry.fileCompressedSize);
        }
    }
    return damaged;
}

void PrintDamage(Json const& damaged, u64 checked)
{
    if (damaged.empty()) {
        Print(std::to_string(checked) + " stored blocks checked, all sound\n");
        return;
    }
    Print(std::to_string(checked) + " stored blocks checked, " + std::to_string(damaged.size()) + " damaged:\n");
    Table table("lrl");
    table.Add({"ITEM", "REVISION", "PROBLEM"});
    for (Json const& row : damaged)
        table.Add({row["path"].get<std::string>(), std::to_string(row["revision"].get<u64>()),
                   row["problem"].get<std::string>()});
    table.Show();
}

} // namespace KernelTool

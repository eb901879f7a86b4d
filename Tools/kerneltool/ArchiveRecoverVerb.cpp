#include "Diagnostics.h"
#include "OpenedArchive.h"
#include "Reservation.h"
#include "Verbs.h"

// The verb that opens a damaged document by search.

namespace KernelTool {

using namespace Kernel;

int RunRecover(Arguments const& arguments)
{
    String8 const path = arguments.At(0);
    String8 const to = arguments.GetString(Option::To);
    if (arguments.Has(Option::To) && to.IsEmpty()) throw UsageProblem{"--to takes the path of a new file"};
    Archive::OpenResult opened{};
    Archive::Open(path, Archive::OpenModeReadOnly, IDTag(), opened);
    Archive::OpenResult result{};
    Counted<Archive> const archive = Archive::RecoverArchive(path, Archive::OpenModeReadOnly, IDTag(), result);
    if (!archive) {
        Failure failure = MakeFailure("recovering '" + ToStd(path) + "'", result);
        Archive::LinkInfo link;
        bool const isLinked = Archive::TestForScratchLinkAndReferenceInfo(path, false, link) == Archive::OpenOk &&
                              !link.linkPath.IsEmpty();
        if (result == Archive::OpenCorrupt && isLinked)
            failure.advice = "Recover the master by its own path: a scratch file needs it in its exact state.";
        throw failure;
    }

    Json damaged = Json::array();
    Json lost = Json::array();
    u64 checked = 0;
    if (!to.IsEmpty()) {
        Reservation reservation(to);
        std::vector<Archive::LostFile> left;
        Archive::StreamlineResult const written = archive->SalvageToNew(to, left);
        if (written != Archive::StreamlineDone) throw MakeFailure("writing '" + ToStd(to) + "'", written);
        reservation.Use();
        for (Archive::LostFile const& file : left) {
            Failure failure = MakeFailure("saving '" + ToStd(file.path) + "'", file.problem);
            if (&file == &left.back()) failure.advice = "The copy has all other items; look for an older document.";
            PrintFailure(failure);
            lost.push_back({{"path", ToStd(file.path)}, {"problem", ProblemText(file.problem)}});
        }
        Counted<Archive> const copy = Archive::Open(to, Archive::OpenModeReadOnly, IDTag(), result);
        if (!copy) throw MakeFailure("opening '" + ToStd(to) + "'", result);
        damaged = CheckAllBlocks(*copy, arguments, checked);
    } else {
        damaged = CheckAllBlocks(*archive, arguments, checked);
    }

    std::vector<String8> items;
    archive->GetFileList(items);
    size_t const revisions = GetRevisions(*archive).size();
    if (arguments.Has(Option::Json)) {
        Json const target = to.IsEmpty() ? Json(nullptr) : Json(ToStd(to));
        PrintJson({{"recovered", true},
                   {"path", ToStd(path)},
                   {"openResult", static_cast<int>(opened)},
                   {"revisions", revisions},
                   {"items", items.size()},
                   {"to", target},
                   {"lost", lost},
                   {"checked", checked},
                   {"damaged", damaged}});
    } else {
        std::string text =
            opened == Archive::OpenOk && damaged.empty() && lost.empty() ? "the document is sound: " : "found: ";
        text += std::to_string(revisions) + " revisions, " + std::to_string(items.size()) + " items\n";
        if (!to.IsEmpty()) text += "compact copy written to " + Printable(ToStd(to)) + "\n";
        if (!lost.empty()) text += std::to_string(lost.size()) + " of the items damaged and not in the copy\n";
        if (to.IsEmpty() && opened != Archive::OpenOk) text += "nothing was written; --to NEW writes a sound copy\n";
        Print(text);
        if (!damaged.empty()) PrintDamage(damaged, checked);
    }
    return damaged.empty() && lost.empty() ? ExitDone : ExitDamaged;
}

} // namespace KernelTool

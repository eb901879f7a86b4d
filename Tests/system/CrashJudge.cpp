#include "CrashJudge.h"

#include "support/ArchiveFixture.h"

#include <algorithm>
#include <cstring>

namespace KernelTest {

using namespace Kernel;
using TestSupport::MemoryDisk;
using Image = MemoryDisk::Image;
using Kind = CrashOperation::Kind;

namespace {

constexpr u64 c_infoPos = 12;
constexpr u64 c_infoSize = 52;
char const* const c_unreadable = "(unreadable)";

std::string InfoOf(Image const& image, std::string const& path)
{
    auto const found = image.find(path);
    bool const isShort = found == image.end() || found->second->size() < c_infoPos + c_infoSize;
    return isShort ? std::string() : found->second->substr(c_infoPos, c_infoSize);
}

// What a table tells of @p state, found without an info block. Of what the operation was writing, items may have been
// lost, as long as they say so.
bool IsStateOrSaysSo(View const& found, View const& state, View const& old)
{
    if (!found.IsOpen() || found.revisions != state.revisions || found.items.size() != state.items.size()) return false;
    return std::all_of(found.items.begin(), found.items.end(), [&](auto const& item) {
        auto const expected = state.items.find(item.first);
        if (expected == state.items.end()) return false;
        auto const before = old.items.find(item.first);
        bool const wasWritten = before == old.items.end() || before->second != expected->second;
        return item.second == expected->second || (wasWritten && item.second == c_unreadable);
    });
}

std::string CheckSaveTrace(MemoryDisk::Recording const& recording, std::string const& path)
{
    auto const name = recording.names.find(path);
    if (name == recording.names.end()) return "no such file";
    u64 const file = name->second;
    std::string const& before = *recording.contents.at(file);
    u64 fileEnd = 0; // A number of 8 bytes at 24; what lies before it is live.
    std::memcpy(&fileEnd, before.data() + 24, sizeof(fileEnd));
    bool pending = false; // Blocks or a table behind the last flush.
    bool infoPending = false;
    u64 infos = 0;
    for (MemoryDisk::Step const& step : recording.steps) {
        std::string const where = TestSupport::Describe(step);
        if (step.kind == MemoryDisk::Kind::Flush && step.file == file) {
            pending = infoPending = false;
        } else if (step.kind != MemoryDisk::Kind::Write || step.file != file) {
            if (infoPending) return "another file is touched before the info block is safe: " + where;
        } else if (step.offset >= fileEnd) {
            pending = true;
        } else if (step.offset == c_infoPos && step.data.size() == c_infoSize) {
            if (pending) return "the info block goes out before what it names: " + where;
            infoPending = true;
            ++infos;
        } else if (!(step.offset == 0 && step.data.size() == 12) && !(step.offset == 64 && step.data.size() == 8)) {
            return "live bytes are written: " + where;
        }
    }
    if (infoPending || pending) return "the save returned before it was flushed";
    return infos == 1 ? "" : "the info block was written " + std::to_string(infos) + " times";
}

// Nothing goes before what replaces it is safe, and a master that is written over says so first.
std::string CheckStreamlineTrace(MemoryDisk::Recording const& recording, bool overwrite)
{
    u64 const master = recording.names.at(c_crashMaster);
    std::set<u64> pending;           // Files with bytes behind their last flush.
    std::set<std::string> unsettled; // Folders with names behind their last flush.
    bool isMarked = false;
    bool isMarkSafe = false;
    for (MemoryDisk::Step const& step : recording.steps) {
        std::string const where = TestSupport::Describe(step);
        bool const isAlone = std::all_of(pending.begin(), pending.end(), [&](u64 file) { return file == step.file; });
        switch (step.kind) {
        case MemoryDisk::Kind::Flush:
            pending.erase(step.file);
            isMarkSafe |= isMarked && step.file == master;
            break;
        case MemoryDisk::Kind::FlushFolder: unsettled.erase(step.name); break;
        case MemoryDisk::Kind::Create: unsettled.insert(step.name.substr(0, step.name.rfind('/'))); break;
        case MemoryDisk::Kind::Write:
        case MemoryDisk::Kind::SetSize:
            if (recording.contents.count(step.file) != 0 && !(isAlone && unsettled.empty()))
                return "a document changes before what replaces it is safe: " + where;
            if (overwrite && step.file == master) {
                bool const isMark = step.offset == 0 && step.data.size() == 12;
                if (!isMarkSafe && (isMarked || !isMark)) return "written over before it says so: " + where;
                isMarked = true;
            }
            pending.insert(step.file);
            break;
        case MemoryDisk::Kind::Rename:
            if (!pending.empty()) return "renamed before it was flushed: " + where;
            break;
        case MemoryDisk::Kind::Unlink:
            if (!isAlone) return "deleted before what replaces it is safe: " + where;
            pending.erase(step.file);
            break;
        }
    }
    return pending.empty() ? "" : "it returned before everything was flushed";
}

} // namespace

std::string CheckCrashTrace(MemoryDisk::Recording const& recording, Kind kind)
{
    if (kind == Kind::Save || kind == Kind::ScratchSave)
        return CheckSaveTrace(recording, kind == Kind::Save ? c_crashMaster : c_crashScratch);
    return CheckStreamlineTrace(recording, kind == Kind::Overwrite);
}

CrashJudge::CrashJudge(Disk& disk, CrashFigures& figures, Kind kind, Image const& before, Image const& after,
                       bool hasScratch)
    : m_disk(disk), m_figures(figures), m_kind(kind), m_hasScratch(hasScratch)
{
    m_old = LookAt(before);
    m_new = LookAt(after);
    for (std::string const& path : {c_crashMaster, c_crashScratch})
        for (Image const* image : {&before, &after}) m_infos[path].insert(InfoOf(*image, path));
    m_masterChanges = !m_old.master.IsSameSave(m_new.master);
}

void CrashJudge::Run(Disk::Recording const& recording, TestSupport::CrashPlan const& plan, u64 secondCuts, u64 smashes)
{
    m_secondCuts = secondCuts;
    if (!FindCommit(recording)) {
        m_fault = "the save returned before it was safe";
        return;
    }
    u64 count = 0;
    TestSupport::ForEachCrashImage(recording, plan, [&](Image const& image, u64 steps) {
        bool const committed = steps >= m_commit;
        if (!m_fault.empty() || !m_seen.insert(TestSupport::HashImage(image) * 2 + committed).second) return;
        ++m_figures.images;
        Check(image, committed);
        if (m_fault.empty() && !IsStreamline() && smashes != 0 && ++count % smashes == 0) Smash(image, committed);
        if (m_fault.empty()) return;
        m_fault += "; cut behind step " + std::to_string(steps) + " of:";
        for (u64 i = 0; i < recording.steps.size(); ++i)
            m_fault += "\n" + std::to_string(i) + ": " + TestSupport::Describe(recording.steps[i]);
    });
}

bool CrashJudge::IsStreamline() const
{
    return m_kind == Kind::Streamline || m_kind == Kind::Overwrite;
}

// Neither the info block from before the operation nor the one it wrote.
bool CrashJudge::IsTorn(Image const& image, std::string const& path) const
{
    return m_infos.at(path).count(InfoOf(image, path)) == 0;
}

CrashJudge::Pair CrashJudge::LookAt(Image const& image)
{
    m_disk.Load(image);
    return {LookOrRecover(c_crashMaster, m_recover), m_hasScratch ? LookOrRecover(c_crashScratch, m_recover) : View()};
}

// When the new master, or in a save that leaves it alone the new scratch state, is on the device. Streamlining changes
// no content, so there only its return counts.
bool CrashJudge::FindCommit(Disk::Recording const& recording)
{
    m_commit = recording.steps.size();
    if (IsStreamline()) return true;
    for (u64 i = 0; i < recording.steps.size(); ++i) {
        auto const kind = recording.steps[i].kind;
        if (kind != Disk::Kind::Flush && kind != Disk::Kind::FlushFolder) continue;
        Pair const found = LookAt(TestSupport::MakeDurableImage(recording, i + 1));
        m_commit = i + 1;
        if (m_masterChanges ? found.master.IsSameSave(m_new.master) : found.scratch.IsSame(m_new.scratch)) return true;
    }
    return false;
}

void CrashJudge::Fail(std::string const& what, Pair const& found)
{
    m_fault = what + " " + Describe(found.master) + " | " + Describe(found.scratch) + "; old " +
              Describe(m_old.master) + " | " + Describe(m_old.scratch) + "; new " + Describe(m_new.master) + " | " +
              Describe(m_new.scratch);
}

void CrashJudge::Check(Image const& image, bool committed)
{
    Pair const found = LookAt(image);
    Verdict const verdict =
        IsStreamline() ? IsAllowedInStreamline(found, image, committed) : IsAllowed(found, image, committed);
    if (verdict == Verdict::Wrong) Fail("found", found);
    if (verdict == Verdict::Whole) SaveAgain(found);
}

CrashJudge::Verdict CrashJudge::IsAllowed(Pair const& found, Image const& image, bool committed)
{
    using R = Archive::OpenResult;
    auto const verdict = [](bool isAllowed) { return isAllowed ? Verdict::Whole : Verdict::Wrong; };
    View const& master = found.master;
    // Only an info block of which some bytes are new and the rest old can name no table.
    m_figures.recovered += master.wasRecovered;
    if (master.wasRecovered && (committed || !IsTorn(image, c_crashMaster))) return Verdict::Wrong;
    if (!IsWholeThumbnail(master)) return Verdict::Wrong;
    bool const isOld = master.IsSame(m_old.master);
    bool const isNew = master.IsSame(m_new.master);
    if (!isOld && !isNew) return Verdict::Wrong;
    if (!m_hasScratch) {
        ++(isNew ? m_figures.fresh : m_figures.old);
        return verdict(isNew || !committed);
    }
    View const& scratch = found.scratch;
    if (!m_masterChanges) { // A save into the scratch file.
        bool const isNewScratch = scratch.IsSame(m_new.scratch);
        ++(isNewScratch ? m_figures.fresh : m_figures.old);
        m_figures.recovered += scratch.wasRecovered;
        if (scratch.wasRecovered && (committed || !IsTorn(image, c_crashScratch))) return Verdict::Wrong;
        return verdict(isNewScratch || (!committed && scratch.IsSame(m_old.scratch)));
    }
    ++(isNew ? m_figures.fresh : m_figures.old);
    if (!isNew) {
        if (committed) return Verdict::Wrong;
        if (scratch.IsSame(m_old.scratch)) return Verdict::Whole;
        // A torn info block can hide to which of two saves of one second the scratch file belongs, or show the count of
        // a first save that did not come about; a torn position of the table leaves the scratch file unread.
        bool const isRefused = scratch.result == R::OpenLinkMismatch || scratch.wasRecovered;
        m_figures.unread += isRefused;
        return verdict(isRefused && IsTorn(image, c_crashMaster));
    }
    static std::set<R> const refusals = {R::OpenLinkMismatch, R::OpenNotArchive, R::OpenCorrupt, R::OpenBadInfo,
                                         R::OpenTruncated};
    return verdict(scratch.IsSame(m_new.scratch) || refusals.count(scratch.result) != 0);
}

// Either a whole document is at its path, or none, or one that says of itself that it may have been written over in
// part; and then a whole one lies elsewhere. What took the name of its master goes on saying so.
CrashJudge::Verdict CrashJudge::IsAllowedInStreamline(Pair const& found, Image const& image, bool returned)
{
    View const& content = m_hasScratch && m_old.scratch.IsOpen() ? m_old.scratch : m_old.master;
    View const& master = found.master;
    bool const isWholeFile = !master.wasRecovered && IsWholeThumbnail(master);
    bool const isOld = isWholeFile && !returned && master.IsSame(m_old.master);
    bool const isNew = isWholeFile && master.IsSame(m_new.master);
    if (isOld || isNew) {
        ++(isNew ? m_figures.fresh : m_figures.old);
        if (!m_hasScratch || found.scratch.items == content.items) return Verdict::Whole;
        return found.scratch.IsOpen() || !isNew ? Verdict::Wrong : Verdict::Whole;
    }
    ++m_figures.elsewhere;
    bool const saysSo = m_kind == Kind::Overwrite && Archive::IsMidStreamlineFile(Str(c_crashMaster));
    if (returned || !(saysSo || master.result == Archive::OpenNotFound)) return Verdict::Wrong;
    bool const isWhole = std::any_of(image.begin(), image.end(), [&](auto const& file) {
        return file.first != c_crashMaster && file.first != c_crashScratch && Look(file.first).items == content.items;
    });
    return isWhole ? Verdict::Elsewhere : Verdict::Wrong;
}

// Old ones, none, or the new ones; never a mixture.
bool CrashJudge::IsWholeThumbnail(View const& view) const
{
    return view.thumbnail.empty() || view.thumbnail == m_old.master.thumbnail ||
           view.thumbnail == m_new.master.thumbnail;
}

// A document that opens but breaks at its next save has not survived.
void CrashJudge::SaveAgain(Pair const& pair)
{
    bool const throughScratch = m_hasScratch && pair.scratch.IsOpen();
    std::string const& path = throughScratch ? c_crashScratch : c_crashMaster;
    View const& found = throughScratch ? pair.scratch : pair.master;
    bool const cutsAgain = m_secondCuts > 0 && ++m_saves % m_secondCuts == 0;
    if (cutsAgain) m_disk.StartRecording();
    bool saved = false;
    {
        Archive::OpenResult result{};
        Opener const open = found.wasRecovered ? m_recover : static_cast<Opener>(Archive::Open);
        Counted<Archive> const archive = open(Str(path), Archive::OpenModeReadWrite, c_documentTag, result);
        saved = archive && Save(*archive, {{"after", "the crash"}});
    }
    Disk::Recording const recording = cutsAgain ? m_disk.StopRecording() : Disk::Recording();
    Items expected = found.items;
    expected["after"] = "the crash";
    View const again = Look(path);
    if (!saved || again.items != expected) {
        m_fault = "the next save came to " + Describe(again) + " from " + Describe(found);
        return;
    }
    u64 const steps = recording.steps.size();
    for (u64 cut = 0; cutsAgain && cut < c_pointsOfSecondCut && m_fault.empty(); ++cut) {
        Image const image =
            TestSupport::MakeCrashImage(recording, steps * cut / c_pointsOfSecondCut, m_saves * 31 + cut);
        if (!m_seen.insert(TestSupport::HashImage(image) * 2).second) continue;
        ++m_figures.images;
        Pair const second = LookAt(image);
        View const& seen = throughScratch && second.scratch.IsOpen() ? second.scratch : second.master;
        bool const isMasterAlone = throughScratch && !second.scratch.IsOpen() && seen.items == pair.master.items;
        // Recovery commits nothing: the bytes of three info blocks together may name the table before.
        bool const isBefore = found.wasRecovered && seen.items == (throughScratch ? m_old.scratch : m_old.master).items;
        if (seen.items != found.items && seen.items != expected && !isMasterAlone && !isBefore)
            m_fault = "a second cut left " + Describe(seen) + " from " + Describe(found);
    }
}

// The same cut, and then nothing is left of the info block either. The newest table that can be reached gives the old
// state or the new one, and what did not arrive of the new one fails its check.
void CrashJudge::Smash(Image const& image, bool committed)
{
    std::string const& path = m_masterChanges ? c_crashMaster : c_crashScratch;
    View const& old = m_masterChanges ? m_old.master : m_old.scratch;
    View const& fresh = m_masterChanges ? m_new.master : m_new.scratch;
    std::string content = *image.at(path);
    content.replace(c_infoPos, c_infoSize, c_infoSize, '\xFF');
    Image smashed = image;
    smashed[path] = std::make_shared<std::string const>(std::move(content));
    m_disk.Load(smashed);
    View const found = LookWith(m_recover, path);
    ++m_figures.smashed;
    // A scratch file without a table of its own has nothing to find.
    bool const isEmpty = !m_masterChanges && !old.scratchRevisions && found.result == Archive::OpenCorrupt;
    bool const isOld = !committed && (isEmpty || IsStateOrSaysSo(found, old, old));
    bool const isNew = IsStateOrSaysSo(found, fresh, committed ? fresh : old);
    if (!isOld && !isNew) Fail("recovered without an info block", {found, {}});
}

} // namespace KernelTest

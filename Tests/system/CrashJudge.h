#pragma once

#include "CrashOperations.h"
#include "support/CrashImages.h"

#include <set>
#include <unordered_set>

namespace KernelTest {

struct CrashFigures
{
    Kernel::u64 recordings = 0;
    Kernel::u64 images = 0; ///< Distinct ones, those of the second cut among them.
    Kernel::u64 old = 0;
    Kernel::u64 fresh = 0;
    Kernel::u64 recovered = 0;
    Kernel::u64 smashed = 0;   ///< Recovered although nothing was left of the info block.
    Kernel::u64 unread = 0;    ///< Scratch files of a master whose info block was torn.
    Kernel::u64 elsewhere = 0; ///< The whole document lies in the temporary or the backup.
};

/// Judges the images that a power cut during one recorded operation could leave: each is opened, compared item by item
/// with the states that may be found there, saved into, cut short again and reopened.
class CrashJudge
{
public:
    using Disk = TestSupport::MemoryDisk;
    using Image = Disk::Image;

    /// @p before and @p after are the disk's images around the operation.
    CrashJudge(Disk& disk, CrashFigures& figures, CrashOperation::Kind kind, Image const& before, Image const& after,
               bool hasScratch);

    /// What opens a document whose tables cannot be walked.
    void SetRecovery(Opener recover) { m_recover = recover; }

    /// Judges all images of @p plan. One in @p secondCuts is cut again in the next save, none if that is 0; one in
    /// @p smashes is recovered with its info block overwritten as well.
    void Run(Disk::Recording const& recording, TestSupport::CrashPlan const& plan, Kernel::u64 secondCuts,
             Kernel::u64 smashes);

    /// The first fault found, or empty.
    std::string const& GetFault() const { return m_fault; }

private:
    struct Pair
    {
        View master;
        View scratch; // Through the scratch file's path.
    };
    enum class Verdict
    {
        Wrong,
        Elsewhere, // Allowed, but there is nothing to save into.
        Whole
    };

    bool IsStreamline() const;
    bool IsTorn(Image const& image, std::string const& path) const;
    Pair LookAt(Image const& image);
    bool FindCommit(Disk::Recording const& recording);
    void Check(Image const& image, bool committed);
    Verdict IsAllowed(Pair const& found, Image const& image, bool committed);
    Verdict IsAllowedInStreamline(Pair const& found, Image const& image, bool returned);
    bool IsWholeThumbnail(View const& view) const;
    void SaveAgain(Pair const& pair);
    void Smash(Image const& image, bool committed);
    void Fail(std::string const& what, Pair const& found);

    static constexpr Kernel::u64 c_pointsOfSecondCut = 20;

    Disk& m_disk;
    CrashFigures& m_figures;
    CrashOperation::Kind const m_kind;
    bool const m_hasScratch;
    Opener m_recover = Kernel::Archive::RecoverArchive;
    Pair m_old;
    Pair m_new;
    std::map<std::string, std::set<std::string>> m_infos; // The info blocks of each file before and after.
    bool m_masterChanges;
    Kernel::u64 m_commit = 0; // Behind so many steps the new state is on the device.
    Kernel::u64 m_saves = 0;
    Kernel::u64 m_secondCuts = 1;
    std::unordered_set<Kernel::u64> m_seen;
    std::string m_fault;
};

/// The order of writes that every operation keeps to, whatever a cut at that moment happens to show. Empty, or what is
/// wrong.
std::string CheckCrashTrace(TestSupport::MemoryDisk::Recording const& recording, CrashOperation::Kind kind);

} // namespace KernelTest

#pragma once

#include "libkernel/archive/Archive.h"
#include "support/MemoryDisk.h"

#include <functional>
#include <map>
#include <string>
#include <vector>

// What histories of a document on the MemoryDisk are made of, and what a person finds in a document afterwards.

namespace KernelTest {

inline std::string const c_crashMaster = "/ram/doc";
inline std::string const c_crashScratch = "/ram/scratch";

using Items = std::map<std::string, std::string>;

/// What a person finds when he opens a path.
struct View
{
    Kernel::Archive::OpenResult result = Kernel::Archive::OpenNotFound;
    Items items;
    Kernel::u32 saveCount = 0;
    Kernel::u64 revisions = 0;
    bool scratchRevisions = false;
    std::string thumbnail;
    bool wasRecovered = false;

    bool IsOpen() const { return result == Kernel::Archive::OpenOk; }
    /// The same document. Thumbnails are compared apart, since a crash may take them; the count of saves may be the
    /// other state's where the info block was torn.
    bool IsSame(View const& o) const
    {
        return IsOpen() && o.IsOpen() && items == o.items && revisions == o.revisions &&
               scratchRevisions == o.scratchRevisions;
    }
    bool IsSameSave(View const& o) const { return IsSame(o) && saveCount == o.saveCount; }
};

std::string Describe(View const& view);

using Opener = Kernel::Counted<Kernel::Archive> (*)(Kernel::String8 const& path, Kernel::Archive::OpenMode mode,
                                                    Kernel::IDTag tag, Kernel::Archive::OpenResult& result);

View LookWith(Opener open, std::string const& path);
View Look(std::string const& path);
/// A chain that cannot be walked is what recovery is for.
View LookOrRecover(std::string const& path, Opener recover = Kernel::Archive::RecoverArchive);

/// An operation that a history is made of. Each opens the document, works, and closes it. @p n differs for each step of
/// a history, so that every save changes something.
struct CrashOperation
{
    enum class Kind
    {
        Save,
        ScratchSave,
        Streamline, ///< The compact file takes the master's name.
        Overwrite   ///< Its bytes go over the master's.
    };

    char const* name;
    Kind kind;
    std::function<void(int n)> run;
    bool needsScratchFile = false;
    std::function<void(int n)> prepare = [](int) {}; ///< Done before recording begins.

    bool IsStreamline() const { return kind == Kind::Streamline || kind == Kind::Overwrite; }
};

std::vector<CrashOperation> const& GetCrashOperations();
CrashOperation const& FindCrashOperation(std::string const& name);

/// A document with some items and perhaps a scratch file, alone on the disk.
TestSupport::MemoryDisk::Image MakeCrashDocument(TestSupport::MemoryDisk& disk, bool withScratch);

/// The ways to write a document elsewhere and let it take the place of another one.
struct CrashReplacement
{
    char const* name;
    bool hasOld; ///< There is a document to replace.
    std::function<Kernel::Counted<Kernel::Archive>(Kernel::Archive::CreateResult&)> create;
};

std::vector<CrashReplacement> const& GetCrashReplacements();

/// Saves what every save of a history saves.
bool SaveStep(Kernel::Archive& archive, int n);

} // namespace KernelTest

#pragma once

#include "CommandLine.h"
#include "Output.h"
#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveRevision.h"

#include <functional>
#include <vector>

namespace KernelTool {

/// Opens a master or a scratch file for reading and steps back as --at says. Throws Failure.
Kernel::Counted<Kernel::Archive> OpenForReading(Arguments const& arguments);
/// Opens for writing. Throws Failure.
Kernel::Counted<Kernel::Archive> OpenForWriting(Kernel::String8 const& path);

/// The revisions up to the working one, oldest first.
std::vector<Kernel::Counted<Kernel::Archive::Revision const>> GetRevisions(Kernel::Archive const& archive);

/// "master" or "scratch".
char const* PlaceOf(Kernel::Archive::Revision const& revision);

/// Throws Failure for the first of these items that the working revision does not have.
void RequireItems(Kernel::Archive const& archive, std::vector<std::string> const& items);

/// Gives an item's bytes to @p take, piece by piece, checked; throws Failure or what the archive throws.
void ReadItem(Kernel::Archive& archive, Kernel::String8 const& path,
              std::function<void(void const* bytes, Kernel::u64 count)> const& take);

/// A person's words for what is wrong with a block.
char const* ProblemText(Kernel::Archive::BlockCheck check);

/// Reads every stored block of the revisions up to the working one; the entries that are damaged, as verify lists them.
Json CheckAllBlocks(Kernel::Archive& archive, Arguments const& arguments, Kernel::u64& checked);
void PrintDamage(Json const& damaged, Kernel::u64 checked);

} // namespace KernelTool

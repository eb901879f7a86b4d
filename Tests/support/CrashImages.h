#pragma once

#include "support/MemoryDisk.h"

#include <functional>

namespace TestSupport {

/// How many of the states that a power cut could leave are made. All of them are when few changes are pending.
struct CrashPlan
{
    unsigned seededSubsets = 60; ///< Where more than 12 changes are pending, beside the regular choices.
    unsigned mixes = 40;   ///< Random byte mixes of old and new of each small record in the fixed part, for 64 bytes.
    unsigned borders = 24; ///< Places at which one longer write is torn, spread over it.
};

/// Calls @p visit with the images that a power cut during the recording could leave, each with the number of steps that
/// were done before the cut. Images of one number may repeat.
///
/// The model: a write or change of size behind the last device flush of its file may be lost or kept, each by itself,
/// in program order; a kept write may stop at any byte if it is up to 64 bytes long, else at a border of 512 bytes in
/// the file. A name made, renamed or removed behind the last flush of its folder may be lost or kept; a rename is never
/// half done. What may survive of the changes that are pending before a flush covers every earlier cut since the one
/// before it, so images are made before each flush and at the end.
void ForEachCrashImage(MemoryDisk::Recording const& recording, CrashPlan const& plan,
                       std::function<void(MemoryDisk::Image const&, Kernel::u64 steps)> const& visit);

/// The image after a cut behind the first @p steps steps, with what survives chosen by the seed.
MemoryDisk::Image MakeCrashImage(MemoryDisk::Recording const& recording, Kernel::u64 steps, Kernel::u64 seed);

/// The image after the first @p steps steps if nothing is kept that was not flushed.
MemoryDisk::Image MakeDurableImage(MemoryDisk::Recording const& recording, Kernel::u64 steps);

/// 64 bits that tell images apart.
Kernel::u64 HashImage(MemoryDisk::Image const& image);

} // namespace TestSupport

#pragma once

#include "libkernel/archive/internal/ArchiveFile.h"

namespace Kernel {

class OutStream;

/// Copies the thumbnail block of @p file to @p out through @p buffer of @p size bytes. False if there is none, or after
/// a fault, which ends the copy half way.
bool CopyThumbnails(OutStream& out, Archive::ArchiveFile& file, void* buffer, u64 size);

} // namespace Kernel

#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

#include <vector>

namespace Kernel {

class FileInOutStream;
class FileOutStream;

/// Names and files for temporary data, unique across the process. Whoever gets a file deletes it.
///
/// A name is a counter in hexadecimal, which begins at the time of the first use. Names may be asked for from any
/// thread; SetTempPath belongs to the start of the program, before the first name is asked for. Nothing that stands in
/// a folder already is ever opened or followed: a name that is taken, if only by a link that leads nowhere, is passed
/// over.
class KERNEL_API TempFile
{
public:
    /// Which folder a temporary goes into. Second is for a temporary whose bytes are going to overwrite a document in
    /// place: after a crash it is the only whole copy, and the next start looks for it there.
    static constexpr bool c_primary = false;
    static constexpr bool c_second = true;

    /// Sets the folder for temporaries and deletes every file in it: what an earlier run left behind.
    static void SetTempPath(String8 const& path);

    /// The same, and sets the second folder, which must be another one. Of the files there, those with the
    /// mid-streamline mark are added to @p rescued, as full paths, and stay; the others are deleted, except what could
    /// not be opened or read for the moment: it may be somebody's only copy.
    static void SetTempPath(String8 const& path, String8 const& secondPath, std::vector<String8>& rescued);

    static bool HaveTempPath();

    /// A path in the folder at which nothing stands; no file is made. @p extension, with or without its dot, may be
    /// empty. False, with @p out unchanged, when the temporary path is empty, or the second one with @p second.
    static bool GenerateTempFilePath(String8& out, String8 const& extension, bool second = c_primary);

    /// Makes a new empty file, open for reading and writing, with its path in @p out. Null when a folder that is asked
    /// for isn't set, when there are too many open files, when the disk is full, and after a thousand failures in a
    /// row.
    static Counted<FileInOutStream> GenerateTempInOutFile(String8& out, String8 const& extension,
                                                          bool second = c_primary);

    /// The same, open for writing only.
    static Counted<FileOutStream> GenerateTempOutFile(String8& out, String8 const& extension, bool second = c_primary);

    /// True if the file begins with an archive header whose flags have the mid-streamline bit: it is the temporary of
    /// a streamline, or was being overwritten by one when the program ended. Reads 12 bytes.
    static bool IsMidStreamlineFile(String8 const& path);

    TempFile() = delete;
};

} // namespace Kernel

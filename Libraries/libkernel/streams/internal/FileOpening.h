#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/File.h"

namespace Kernel {

/// How a file is to be opened: the meaning of a C mode string.
struct OpenMode
{
    Platform::OpenFlags flags;
    bool sequential = false;
};

/// Reads a mode such as "r+b", "w+xb" or "a+bS". False if it isn't one.
bool ParseOpenMode(char const* text, OpenMode& mode);

/// Opens a file and hides it if that is asked for. On failure `errno` is set and @p errorText, if given, gets its name.
/// @p handle is then c_noHandle.
File::OpenUnmanagedResult OpenPlatformFile(char const* path, OpenMode const& mode, File::ShareMode share,
                                           File::VisibilityMode visibility, Platform::FileHandle& handle,
                                           String8* errorText);
File::OpenUnmanagedResult OpenPlatformFile(char const* path, char const* mode, File::ShareMode share,
                                           Platform::FileHandle& handle, String8* errorText);

/// Gives the stream that @p make makes of an open handle. The handle is closed when there is no memory for one; the
/// stream's constructor, which owns it, may not throw.
template <class Stream, class Make>
Counted<Stream> MakeStreamOf(Platform::FileHandle handle, Make const& make)
{
    try {
        return make();
    } catch (...) {
        Platform::GetFileCalls().close(handle);
        throw;
    }
}

/// Notes an error as an open does: in `errno` and in @p errorText, if given. Gives the result for it.
File::OpenUnmanagedResult FailOpen(char const* path, int error, String8* errorText);

} // namespace Kernel

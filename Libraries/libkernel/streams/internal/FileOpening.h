#pragma once

#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/File.h"

namespace Kernel {

/// Opens a handle with the library's share mode. @p text, if not null, gets the platform's text for a failure.
File::OpenUnmanagedResult OpenPlatformFile(char const* path, Platform::OpenFlags flags, File::ShareMode share,
                                           Platform::FileHandle& handle, String8* text);

/// Sets the hidden attribute, where it is asked for and the file system has one.
void HidePlatformFile(char const* path, File::VisibilityMode visibility);

} // namespace Kernel

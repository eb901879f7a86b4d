#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/streams/OutStream.h"

#include <functional>

namespace Kernel {

/// Writes a whole file of kind @p tag and version @p version: @p save gets the serialiser and the tag `Item`, under
/// which it saves the root. False for a null stream and for anything that is thrown on the way; what the stream took
/// stays written. The reference to the stream is let go of before the return.
KERNEL_API bool SerialiseToStream(Counted<OutStream> stream, IDTag tag, unsigned short version,
                                  std::function<void(OutSerialiser&, IDTag)> save);

/// The same into the file at @p path, in UTF-8, zlib-compressed at @p level unless that is 0. The file is replaced
/// whole and lasts, or it is left as it was: the data goes to the path with "~temp" behind it, on to the device, and is
/// then moved. False for a null or empty path and for any failure, after which there is no temporary file.
KERNEL_API bool SerialiseToFile(char const* path, IDTag tag, unsigned short version,
                                std::function<void(OutSerialiser&, IDTag)> save, int level);

} // namespace Kernel

#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"

#include <functional>

namespace Kernel {

class InSerialiser;
class InStream;

/// Reads a whole file of kind @p fileTag and of version @p maxVersion or older, and hands the root list to @p load with
/// the tag Item, under which the root was saved. Gives what @p load gives.
///
/// False, without a call of @p load, for a null stream, a stream that can't be parsed, another kind or a later version.
/// Whatever is thrown on the way, by @p load too, is caught and gives false.
KERNEL_API bool SerialiseFromStream(Counted<InStream> in, IDTag fileTag, unsigned short maxVersion,
                                    std::function<bool(InSerialiser&, IDTag)> load);

/// The same from the file at @p path, UTF-8; @p compressed says that it was saved with a compression level. False too
/// for a file that can't be opened.
KERNEL_API bool SerialiseFromFile(char const* path, IDTag fileTag, unsigned short maxVersion,
                                  std::function<bool(InSerialiser&, IDTag)> load, bool compressed);

} // namespace Kernel

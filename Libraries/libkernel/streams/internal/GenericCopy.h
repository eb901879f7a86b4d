#pragma once

namespace Kernel {

class InStream;
class OutStream;
class StreamCopyProgress;

/// The copy that any two streams can do, and that both sides fall back to: pieces of 1 MiB through a buffer of its own.
/// True if the source was read to its end and the target took all of it. MemoryException without memory for the buffer.
bool GenericCopy(InStream& in, OutStream& out, StreamCopyProgress* progress);

/// The copies of a file stream: a peer that is not a file gets the work, since it may know a shorter way; two files
/// copy by the general loop.
bool CopyFromFile(InStream& file, OutStream& out, StreamCopyProgress* progress);
bool CopyToFile(InStream& in, OutStream& file, StreamCopyProgress* progress);

} // namespace Kernel

#include "libkernel/streams/FastFileOutStream.h"

#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/GenericCopy.h"
#include "libkernel/streams/internal/MakeBuffer.h"

#include <algorithm>

namespace Kernel {

FastFileOutStream::FastFileOutStream(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize,
                                     Placement placement, u64 size)
    : FileWriterBase(handle, std::move(buffer), bufferSize, placement, size)
{
}

FastFileOutStream::~FastFileOutStream() = default;

Counted<FastFileOutStream> FastFileOutStream::OpenI(char const* path, char const* mode, u64 bufferSize,
                                                    Placement placement)
{
    // The buffer first: without memory for it the file must not be emptied.
    bufferSize = std::max(bufferSize, c_minBufferSize);
    std::unique_ptr<u8[]> buffer = MakeBuffer(bufferSize);
    if (!buffer) return nullptr;
    Platform::FileHandle handle;
    if (!File::IsOpened(OpenPlatformFile(path, mode, File::ShareMode::DenyNone, handle, nullptr))) return nullptr;
    u64 size = 0;
    if (placement == Placement::Append) Platform::GetFileCalls().getSize(handle, size);
    return MakeStreamOf<FastFileOutStream>(
        handle, [&] { return new FastFileOutStream(handle, std::move(buffer), bufferSize, placement, size); });
}

Counted<FastFileOutStream> FastFileOutStream::Create(char const* path, u64 bufferSize)
{
    return OpenI(path, "wbS", bufferSize, Placement::AtPosition);
}

Counted<FastFileOutStream> FastFileOutStream::Append(char const* path, u64 bufferSize)
{
    return OpenI(path, "a+bS", bufferSize, Placement::Append);
}

u64 FastFileOutStream::WriteBlock(void const* from, u64 count)
{
    return WriteI(from, count);
}

bool FastFileOutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    return CopyToFile(in, *this, progress);
}

} // namespace Kernel

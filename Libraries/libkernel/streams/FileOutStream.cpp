#include "libkernel/streams/FileOutStream.h"

#include "libkernel/platform/Errors.h"
#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/GenericCopy.h"
#include "libkernel/streams/internal/MakeBuffer.h"

namespace Kernel {

FileOutStream::FileOutStream(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, Placement placement, u64 size)
    : FileWriterBase(handle, std::move(buffer), c_bufferSize, placement, size)
{
}

FileOutStream::~FileOutStream() = default;

Counted<FileOutStream> FileOutStream::OpenI(char const* path, char const* mode, File::ShareMode share,
                                            Placement placement, File::OpenUnmanagedResult& result, String8* errorText)
{
    std::unique_ptr<u8[]> buffer = MakeBuffer(c_bufferSize);
    if (!buffer) {
        result = FailOpen(path, ENOMEM, errorText);
        return nullptr;
    }
    Platform::FileHandle handle;
    result = OpenPlatformFile(path, mode, share, handle, errorText);
    if (!File::IsOpened(result)) return nullptr;
    u64 size = 0;
    if (placement == Placement::Append) Platform::GetFileCalls().getSize(handle, size);
    return MakeStreamOf<FileOutStream>(handle,
                                       [&] { return new FileOutStream(handle, std::move(buffer), placement, size); });
}

Counted<FileOutStream> FileOutStream::Create(char const* path)
{
    File::OpenUnmanagedResult result;
    return Create(path, File::ShareMode::DenyNone, result);
}

Counted<FileOutStream> FileOutStream::Create(char const* path, File::ShareMode share, File::OpenUnmanagedResult& result,
                                             String8* errorText)
{
    return OpenI(path, "wb", share, Placement::AtPosition, result, errorText);
}

Counted<FileOutStream> FileOutStream::Append(char const* path)
{
    File::OpenUnmanagedResult result;
    return Append(path, File::ShareMode::DenyNone, result);
}

Counted<FileOutStream> FileOutStream::Append(char const* path, File::ShareMode share, File::OpenUnmanagedResult& result,
                                             String8* errorText)
{
    return OpenI(path, "a+b", share, Placement::Append, result, errorText);
}

u64 FileOutStream::WriteBlock(void const* from, u64 count)
{
    return WriteI(from, count);
}

bool FileOutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    return CopyToFile(in, *this, progress);
}

bool FileOutStream::WriteBlockAtPos(u64 position, void const* from, u64 count)
{
    return WriteAtI(position, from, count);
}

} // namespace Kernel

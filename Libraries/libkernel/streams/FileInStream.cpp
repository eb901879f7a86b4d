#include "libkernel/streams/FileInStream.h"

#include "libkernel/platform/Errors.h"
#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/GenericCopy.h"
#include "libkernel/streams/internal/MakeBuffer.h"
#include "libkernel/streams/internal/SeekTarget.h"

namespace Kernel {

FileInStream::FileInStream(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize, String8 path)
    : FileReaderBase(handle, std::move(buffer), bufferSize), m_path(std::move(path))
{
}

FileInStream::~FileInStream() = default;

Counted<FileInStream> FileInStream::Open(char const* path, bool unbuffered)
{
    File::OpenUnmanagedResult result;
    return OpenEx(path, result, unbuffered);
}

Counted<FileInStream> FileInStream::OpenEx(char const* path, File::OpenUnmanagedResult& result, bool unbuffered)
{
    u64 const bufferSize = unbuffered ? 0 : c_bufferSize;
    std::unique_ptr<u8[]> buffer = MakeBuffer(bufferSize);
    if (!buffer) {
        result = FailOpen(path, ENOMEM, nullptr);
        return nullptr;
    }
    Platform::FileHandle handle;
    result = OpenPlatformFile(path, "rb", File::ShareMode::DenyNone, handle, nullptr);
    if (!File::IsOpened(result)) return nullptr;
    return MakeStreamOf<FileInStream>(handle, [&] {
        String8 name(path);
        return new FileInStream(handle, std::move(buffer), bufferSize, std::move(name));
    });
}

u64 FileInStream::ReadBlock(void* to, u64 count)
{
    u64 const read = ReadI(to, count);
    if (read < count && to && IsUsable()) m_passedEnd = FileHitEnd();
    return read;
}

bool FileInStream::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    return CopyFromFile(*this, out, progress);
}

u64 FileInStream::GetSizeInStream() const
{
    bool ok;
    return QuerySize(ok);
}

bool FileInStream::SeekInStream(SeekMethod method, i64 offset)
{
    bool ok = true;
    u64 const size = method == SeekMethod::End ? QuerySize(ok) : 0;
    u64 target;
    if (!ok || !ResolveSeekStrictly(method, offset, GetPosition(), size, target) || !MoveTo(target)) return false;
    m_passedEnd = false;
    return true;
}

} // namespace Kernel

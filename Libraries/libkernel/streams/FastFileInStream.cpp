#include "libkernel/streams/FastFileInStream.h"

#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/GenericCopy.h"
#include "libkernel/streams/internal/MakeBuffer.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>

namespace Kernel {

FastFileInStream::FastFileInStream(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize)
    : FileReaderBase(handle, std::move(buffer), bufferSize)
{
}

FastFileInStream::~FastFileInStream() = default;

Counted<FastFileInStream> FastFileInStream::Open(char const* path, u64 bufferSize)
{
    bufferSize = std::max(bufferSize, c_minBufferSize);
    std::unique_ptr<u8[]> buffer = MakeBuffer(bufferSize);
    if (!buffer) return nullptr;
    Platform::FileHandle handle;
    if (!File::IsOpened(OpenPlatformFile(path, "rb", File::ShareMode::DenyNone, handle, nullptr))) return nullptr;
    return MakeStreamOf<FastFileInStream>(handle,
                                          [&] { return new FastFileInStream(handle, std::move(buffer), bufferSize); });
}

u64 FastFileInStream::ReadBlock(void* to, u64 count)
{
    return ReadI(to, count);
}

bool FastFileInStream::SkipBlock(u64 count)
{
    u64 target;
    return CheckedAdd(GetPosition(), count, target) && MoveTo(target);
}

bool FastFileInStream::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    return CopyFromFile(*this, out, progress);
}

u64 FastFileInStream::GetSizeInStream() const
{
    bool ok;
    return QuerySize(ok);
}

bool FastFileInStream::SeekInStream(SeekMethod method, i64 offset)
{
    bool ok = true;
    u64 const size = method == SeekMethod::End ? QuerySize(ok) : 0;
    u64 target;
    return ok && ResolveSeek(method, offset, GetPosition(), size, target) && MoveTo(target);
}

} // namespace Kernel

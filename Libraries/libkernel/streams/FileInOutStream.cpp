#include "libkernel/streams/FileInOutStream.h"

#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/platform/Errors.h"
#include "libkernel/platform/Time.h"
#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/GenericCopy.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>
#include <limits>

namespace Kernel {

namespace {

constexpr u64 c_highestPosition = static_cast<u64>(std::numeric_limits<i64>::max());

} // namespace

FileInOutStream::FileInOutStream(Platform::FileHandle handle, bool readOnly, bool isNew)
    : FileStreamBase(handle), m_readOnly(readOnly), m_needsFullFlush(isNew)
{
}

FileInOutStream::~FileInOutStream() = default;

Counted<FileInOutStream> FileInOutStream::AdoptI(Platform::FileHandle handle, bool readOnly, bool isNew)
{
    return MakeStreamOf<FileInOutStream>(handle, [&] { return new FileInOutStream(handle, readOnly, isNew); });
}

Counted<FileInOutStream> FileInOutStream::OpenI(char const* path, char const* mode, File::ShareMode share,
                                                File::OpenUnmanagedResult& result, String8* errorText)
{
    Platform::FileHandle handle;
    result = OpenPlatformFile(path, mode, share, handle, errorText);
    if (!File::IsOpened(result)) return nullptr;
    OpenMode parsed;
    ParseOpenMode(mode, parsed);
    return AdoptI(handle, !parsed.flags.write, parsed.flags.create);
}

Counted<FileInOutStream> FileInOutStream::Open(char const* path)
{
    File::OpenUnmanagedResult result;
    return Open(path, File::ShareMode::DenyNone, result);
}

Counted<FileInOutStream> FileInOutStream::Open(char const* path, File::ShareMode share,
                                               File::OpenUnmanagedResult& result, String8* errorText)
{
    return OpenI(path, "r+b", share, result, errorText);
}

Counted<FileInOutStream> FileInOutStream::OpenReadOnly(char const* path)
{
    File::OpenUnmanagedResult result;
    return OpenReadOnly(path, File::ShareMode::DenyNone, result);
}

Counted<FileInOutStream> FileInOutStream::OpenReadOnly(char const* path, File::ShareMode share,
                                                       File::OpenUnmanagedResult& result, String8* errorText)
{
    return OpenI(path, "rb", share, result, errorText);
}

Counted<FileInOutStream> FileInOutStream::OpenOrCreate(char const* path)
{
    File::OpenUnmanagedResult result;
    return OpenOrCreate(path, File::ShareMode::DenyNone, result);
}

Counted<FileInOutStream> FileInOutStream::OpenOrCreate(char const* path, File::ShareMode share,
                                                       File::OpenUnmanagedResult& result, String8* errorText)
{
    if (Counted<FileInOutStream> stream = OpenI(path, "r+b", share, result, errorText)) return stream;
    // Not "w+b": if the first open failed for a passing reason, the second one would empty the file.
    OpenMode mode;
    mode.flags.read = mode.flags.write = mode.flags.create = true;
    Platform::FileHandle handle;
    result = OpenPlatformFile(path, mode, share, File::VisibilityMode::Normal, handle, errorText);
    return File::IsOpened(result) ? AdoptI(handle, false, true) : nullptr;
}

Counted<FileInOutStream> FileInOutStream::Create(char const* path, bool mustBeNew)
{
    File::OpenUnmanagedResult result;
    return Create(path, File::ShareMode::DenyNone, result, nullptr, mustBeNew);
}

Counted<FileInOutStream> FileInOutStream::Create(char const* path, File::ShareMode share,
                                                 File::OpenUnmanagedResult& result, String8* errorText, bool mustBeNew)
{
    return OpenI(path, mustBeNew ? "w+xb" : "w+b", share, result, errorText);
}

bool FileInOutStream::SetSizeI(u64 size)
{
    if (int const error = Platform::GetFileCalls().setSize(GetHandle(), size)) {
        OnErrorI(error);
        return false;
    }
    m_needsFullFlush = true;
    return true;
}

bool FileInOutStream::Recreate()
{
    if (!CanWrite() || !SetSizeI(0)) return false;
    m_position = 0;
    m_passedEnd = false;
    return true;
}

bool FileInOutStream::CopyFileAttributes(FileInOutStream const& from)
{
    return !IsClosed() && !from.IsClosed() && FileSystem::CopyFileAttributes(from.GetHandle(), GetHandle());
}

bool FileInOutStream::UpdateTimestamps()
{
    if (!CanWrite()) return false;
    // A time that can't be set is no loss: the next write sets it.
    Platform::GetFileCalls().setTimesHandle(GetHandle(), Platform::c_keepTime, Platform::GetSystemTime());
    return true;
}

Platform::IoResult FileInOutStream::ReadAtI(u64 position, void* to, u64 count) const
{
    if (!IsUsable() || !to || count == 0 || position > c_highestPosition) return {};
    return Platform::GetFileCalls().readAt(GetHandle(), to, std::min(count, c_highestPosition - position), position);
}

u64 FileInOutStream::ReadAt(u64 position, void* to, u64 count) const
{
    Platform::IoResult const result = ReadAtI(position, to, count);
    if (result.count < count && result.error != 0) throw FileIOException(FileIOException::FromError(result.error));
    return result.count;
}

u64 FileInOutStream::WriteAt(u64 position, void const* from, u64 count)
{
    if (!CanWrite() || !from || count == 0) return 0;
    Platform::IoResult result;
    if (RangeFits(position, count, c_highestPosition))
        result = Platform::GetFileCalls().writeAt(GetHandle(), from, count, position);
    else
        result.error = EFBIG;

    if (result.error != 0) OnErrorI(result.error);
    return result.count;
}

void FileInOutStream::StartWriteBack(u64 offset, u64 size) const
{
    if (CanWrite()) Platform::GetFileCalls().startWriteBack(GetHandle(), offset, size);
}

void FileInOutStream::DropCache(u64 offset, u64 size) const
{
    if (IsUsable()) Platform::GetFileCalls().advise(GetHandle(), offset, size, Platform::ReadAdvice::DontNeed);
}

u64 FileInOutStream::ReadBlock(void* to, u64 count)
{
    if (!IsUsable() || !to || count == 0) return 0;
    Platform::IoResult const result = ReadAtI(m_position, to, count);
    m_position += result.count;
    m_passedEnd = result.count < count && result.error == 0;
    if (result.count < count && result.error != 0) OnErrorI(result.error);
    return result.count;
}

bool FileInOutStream::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    return CopyFromFile(*this, out, progress);
}

u64 FileInOutStream::GetSizeInStream() const
{
    bool ok;
    return QuerySize(ok);
}

bool FileInOutStream::SeekInStream(SeekMethod method, i64 offset)
{
    if (!IsUsable()) return false;
    bool ok = true;
    u64 const size = method == SeekMethod::End ? QuerySize(ok) : 0;
    u64 target;
    if (!ok || !ResolveSeekStrictly(method, offset, m_position, size, target)) return false;
    m_position = target;
    m_passedEnd = false;
    return true;
}

u64 FileInOutStream::WriteBlock(void const* from, u64 count)
{
    u64 const written = WriteAt(m_position, from, count);
    m_position += written;
    return written;
}

bool FileInOutStream::ForceFlush()
{
    if (!IsUsable()) return true;
    // Taken first: a length that another thread sets meanwhile is for the next flush.
    bool const full = m_needsFullFlush.exchange(false);
    int const error =
        Platform::GetFileCalls().flush(GetHandle(), full ? Platform::FlushKind::Full : Platform::FlushKind::Data);
    if (error != 0) OnErrorI(error);
    return error == 0;
}

bool FileInOutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    return CopyToFile(in, *this, progress);
}

bool FileInOutStream::WriteBlockAtPos(u64 position, void const* from, u64 count)
{
    return CanWrite() && (count == 0 || WriteAt(position, from, count) == count);
}

bool FileInOutStream::Truncate(u64 size)
{
    if (!CanWrite()) return false;
    bool ok;
    u64 const end = QuerySize(ok);
    if (!ok || (size < end && !SetSizeI(size))) return false;
    m_position = std::min(size, end);
    m_passedEnd = false;
    return true;
}

bool FileInOutStream::SeekOutStream(SeekMethod method, i64 offset)
{
    return SeekInStream(method, offset);
}

} // namespace Kernel

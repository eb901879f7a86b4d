#include "libkernel/streams/FileInOutStream.h"

#include "libkernel/platform/Time.h"
#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/FileStreamCore.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>

namespace Kernel {

namespace {

/// Null path: no stream, and a result that says nothing in particular.
Platform::FileHandle OpenHandle(char const* path, Platform::OpenFlags const& flags, File::ShareMode share,
                                File::OpenUnmanagedResult& result, String8* text)
{
    Platform::FileHandle handle = Platform::c_noHandle;
    result = path ? OpenPlatformFile(path, flags, share, handle, text) : File::OpenUnmanagedResult::Other;
    return handle;
}

Platform::OpenFlags ReadWriteFlags()
{
    Platform::OpenFlags flags;
    flags.read = true;
    flags.write = true;
    return flags;
}

} // namespace

FileInOutStream::FileInOutStream(int handle, bool readOnly)
    : m_core(std::make_unique<FileStreamCore>(handle)), m_readOnly(readOnly)
{
}

FileInOutStream::~FileInOutStream() = default;

Counted<FileInOutStream> FileInOutStream::Open(char const* path)
{
    Result result{};
    return Open(path, File::ShareMode::DenyNone, result, nullptr);
}

Counted<FileInOutStream> FileInOutStream::Open(char const* path, File::ShareMode share, Result& result, String8* text)
{
    Platform::FileHandle const handle = OpenHandle(path, ReadWriteFlags(), share, result, text);
    return handle == Platform::c_noHandle ? nullptr : Counted<FileInOutStream>(new FileInOutStream(handle, false));
}

Counted<FileInOutStream> FileInOutStream::OpenReadOnly(char const* path)
{
    Result result{};
    return OpenReadOnly(path, File::ShareMode::DenyNone, result, nullptr);
}

Counted<FileInOutStream> FileInOutStream::OpenReadOnly(char const* path, File::ShareMode share, Result& result,
                                                       String8* text)
{
    Platform::OpenFlags flags;
    flags.read = true;
    Platform::FileHandle const handle = OpenHandle(path, flags, share, result, text);
    return handle == Platform::c_noHandle ? nullptr : Counted<FileInOutStream>(new FileInOutStream(handle, true));
}

Counted<FileInOutStream> FileInOutStream::OpenOrCreate(char const* path)
{
    Result result{};
    return OpenOrCreate(path, File::ShareMode::DenyNone, result, nullptr);
}

Counted<FileInOutStream> FileInOutStream::OpenOrCreate(char const* path, File::ShareMode share, Result& result,
                                                       String8* text)
{
    Counted<FileInOutStream> stream = Open(path, share, result, text);
    // Only where nothing stands: a file that may not be opened must not be emptied instead.
    if (!stream && result == Result::NotFound) stream = Create(path, share, result, text, true);
    return stream;
}

Counted<FileInOutStream> FileInOutStream::Create(char const* path, bool exclusive)
{
    Result result{};
    return Create(path, File::ShareMode::DenyNone, result, nullptr, exclusive);
}

Counted<FileInOutStream> FileInOutStream::Create(char const* path, File::ShareMode share, Result& result, String8* text,
                                                 bool exclusive)
{
    Platform::OpenFlags flags = ReadWriteFlags();
    flags.create = true;
    flags.exclusive = exclusive;
    flags.truncate = !exclusive;
    Platform::FileHandle const handle = OpenHandle(path, flags, share, result, text);
    return handle == Platform::c_noHandle ? nullptr : Counted<FileInOutStream>(new FileInOutStream(handle, false));
}

u64 FileInOutStream::ReadBlock(void* to, u64 count)
{
    if (!m_core->IsUsable() || !to || count == 0) return 0;
    u64 const got = m_core->Read(to, count);
    m_position += got;
    m_hitEnd = got != count;
    return got;
}

u64 FileInOutStream::WriteBlock(void const* from, u64 count)
{
    if (m_readOnly) return 0;
    u64 const put = m_core->Write(from, count);
    m_position += put;
    return put;
}

u64 FileInOutStream::ReadAt(u64 position, void* to, u64 count) const
{
    return m_core->ReadAt(position, to, count);
}

u64 FileInOutStream::WriteAt(u64 position, void const* from, u64 count)
{
    return m_readOnly ? 0 : m_core->WriteAt(position, from, count);
}

void FileInOutStream::StartWriteBack(u64 position, u64 count)
{
    if (m_core->IsUsable()) Platform::GetFileCalls().startWriteBack(m_core->GetHandle(), position, count);
}

void FileInOutStream::DropCache(u64 position, u64 count)
{
    if (m_core->IsUsable())
        Platform::GetFileCalls().advise(m_core->GetHandle(), position, count, Platform::ReadAdvice::DontNeed);
}

bool FileInOutStream::ForceFlush()
{
    return m_readOnly || m_core->FlushToDevice();
}

bool FileInOutStream::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    return out.WillDelegateCopyFromStream() ? InStream::CopyToStream(out, progress)
                                            : out.CopyFromStream(*this, progress);
}

bool FileInOutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    return in.WillDelegateCopyToStream() ? OutStream::CopyFromStream(in, progress) : in.CopyToStream(*this, progress);
}

u64 FileInOutStream::GetSizeInStream() const
{
    return m_core->GetSize();
}

bool FileInOutStream::SeekInStream(SeekMethod method, i64 offset)
{
    if (!m_core->IsUsable()) return false;
    Platform::SeekFrom from{};
    if (!ToSeekFrom(static_cast<int>(method), from)) return false;
    u64 reached = 0;
    if (!m_core->Seek(offset, from, reached)) return false;
    m_position = reached;
    m_hitEnd = false;
    return true;
}

bool FileInOutStream::Truncate(u64 size)
{
    if (m_readOnly || !m_core->IsUsable()) return false;
    u64 const end = m_core->GetSize();
    if (size < end && !m_core->SetSize(size)) return false;
    return SeekInStream(SeekMethod::Beginning, static_cast<i64>(std::min(size, end)));
}

bool FileInOutStream::Recreate()
{
    if (m_readOnly || !m_core->IsUsable() || !m_core->SetSize(0)) return false;
    return SeekInStream(SeekMethod::Beginning, 0);
}

bool FileInOutStream::CopyFileAttributes(FileInOutStream const& from)
{
    Platform::FileCalls const& calls = Platform::GetFileCalls();
    Platform::FileInfo info;
    return m_core->IsUsable() && from.m_core->IsUsable() && calls.statHandle(from.m_core->GetHandle(), info) == 0 &&
           calls.setModeHandle(m_core->GetHandle(), info.mode) == 0;
}

bool FileInOutStream::UpdateTimestamps()
{
    if (m_readOnly || IsClosed()) return false;
    i64 const now = Platform::GetSystemTime();
    Platform::GetFileCalls().setTimesHandle(m_core->GetHandle(), now, now);
    return true;
}

void FileInOutStream::SetErrorHandler(Counted<FileStreamErrorHandler> const& handler)
{
    m_core->SetErrorHandler(handler);
}

bool FileInOutStream::Close()
{
    return m_core->Close();
}

bool FileInOutStream::IsClosed() const
{
    return m_core->IsClosed();
}

bool FileInOutStream::IsBroken() const
{
    return m_core->IsBroken();
}

FileIOException::Reason FileInOutStream::GetReason() const
{
    return m_core->GetReason();
}

} // namespace Kernel

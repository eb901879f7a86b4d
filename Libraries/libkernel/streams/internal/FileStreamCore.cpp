#include "libkernel/streams/internal/FileStreamCore.h"

namespace Kernel {

FileStreamErrorHandler::~FileStreamErrorHandler() = default;

FileStreamCore::~FileStreamCore()
{
    if (!IsClosed()) Platform::GetFileCalls().close(m_handle);
}

void FileStreamCore::OnError(int error, bool force, bool fatal)
{
    if (m_broken) return;
    m_broken = true;
    m_reason = FileIOException::FromError(error);
    if (error == 0 && !force) return;
    // Held during the call, so that the handler can take itself off.
    Counted<FileStreamErrorHandler> const handler = m_handler;
    if (handler)
        handler->OnError(m_reason, fatal);
    else if (fatal)
        throw FileIOException(m_reason);
}

bool FileStreamCore::Check(int error)
{
    if (error != 0) OnError(error);
    return error == 0;
}

u64 FileStreamCore::Read(void* to, u64 count)
{
    if (!IsUsable() || !to || count == 0) return 0;
    Platform::IoResult const result = Platform::GetFileCalls().read(m_handle, to, count);
    if (result.count != count) Check(result.error);
    return result.count;
}

u64 FileStreamCore::Write(void const* from, u64 count)
{
    if (!IsUsable() || !from || count == 0) return 0;
    Platform::IoResult const result = Platform::GetFileCalls().write(m_handle, from, count);
    Check(result.error);
    return result.count;
}

u64 FileStreamCore::ReadAt(u64 position, void* to, u64 count)
{
    if (!IsUsable() || !to || count == 0) return 0;
    Platform::IoResult const result = Platform::GetFileCalls().readAt(m_handle, to, count, position);
    // A failed positional read leaves the stream's own state alone: several threads may be reading.
    if (result.count != count && result.error != 0) throw FileIOException(FileIOException::FromError(result.error));
    return result.count;
}

u64 FileStreamCore::WriteAt(u64 position, void const* from, u64 count)
{
    if (!IsUsable() || !from || count == 0) return 0;
    Platform::IoResult const result = Platform::GetFileCalls().writeAt(m_handle, from, count, position);
    Check(result.error);
    return result.count;
}

bool FileStreamCore::FlushToDevice()
{
    if (m_broken || IsClosed()) return true;
    // The data, and the length where it changed: times and rights may wait.
    return Check(Platform::GetFileCalls().flush(m_handle, Platform::FlushKind::Data));
}

bool FileStreamCore::Close()
{
    if (IsClosed()) return true;
    Platform::FileHandle const handle = m_handle;
    m_handle = Platform::c_noHandle;
    return Check(Platform::GetFileCalls().close(handle));
}

bool FileStreamCore::Seek(i64 offset, Platform::SeekFrom from, u64& position)
{
    return IsUsable() && Platform::GetFileCalls().seek(m_handle, offset, from, position) == 0;
}

u64 FileStreamCore::GetSize() const
{
    u64 size = 0;
    if (IsUsable() && Platform::GetFileCalls().getSize(m_handle, size) == 0) return size;
    return 0;
}

bool FileStreamCore::SetSize(u64 size)
{
    return IsUsable() && Check(Platform::GetFileCalls().setSize(m_handle, size));
}

bool ToSeekFrom(int method, Platform::SeekFrom& from)
{
    switch (method) {
    case 0: from = Platform::SeekFrom::Current; return true;
    case 1: from = Platform::SeekFrom::Start; return true;
    case 2: from = Platform::SeekFrom::End; return true;
    default: return false;
    }
}

} // namespace Kernel

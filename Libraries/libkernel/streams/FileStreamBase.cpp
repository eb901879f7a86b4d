#include "libkernel/streams/FileStreamBase.h"

#include <utility>

namespace Kernel {

FileStreamErrorHandler::~FileStreamErrorHandler() = default;

FileStreamBase::~FileStreamBase()
{
    CloseHandle();
}

int FileStreamBase::CloseHandle()
{
    Platform::FileHandle const handle = std::exchange(m_handle, Platform::c_noHandle);
    return handle != Platform::c_noHandle ? Platform::GetFileCalls().close(handle) : 0;
}

bool FileStreamBase::CloseI()
{
    int const error = CloseHandle();
    if (error == 0) return true;
    OnErrorI(error);
    return false;
}

void FileStreamBase::OnErrorI(int error, bool force) const
{
    if (m_broken.exchange(true, std::memory_order_acq_rel)) return;
    FileIOException::Reason const reason = FileIOException::FromError(error);
    m_reason.store(reason, std::memory_order_release);
    if (error == 0 && !force) return;

    // A reference of our own, since the handler may take itself off the stream.
    Counted<FileStreamErrorHandler> const handler = m_handler;
    if (!handler) throw FileIOException(reason);
    handler->OnError(reason, true);
}

u64 FileStreamBase::QuerySize(bool& ok) const
{
    ok = false;
    if (!IsUsable()) return 0;
    u64 size = 0;
    if (int const error = Platform::GetFileCalls().getSize(m_handle, size)) {
        OnErrorI(error);
        return 0;
    }
    ok = true;
    return size;
}

} // namespace Kernel

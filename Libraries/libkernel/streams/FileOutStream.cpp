#include "libkernel/streams/FileOutStream.h"

#include "libkernel/streams/InStream.h"
#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/FileStreamCore.h"

#include <algorithm>
#include <cstring>

namespace Kernel {

FileOutStream::FileOutStream(int handle, bool append)
    : m_core(std::make_unique<FileStreamCore>(handle)), m_buffer(std::make_unique<u8[]>(c_bufferSize)), m_append(append)
{
    if (append) m_position = m_core->GetSize();
}

FileOutStream::~FileOutStream()
{
    // The end reports nothing: who wants to know calls Close.
    m_core->SetErrorHandler(nullptr);
    try {
        Close();
    } catch (FileIOException const&) {
    }
}

Counted<FileOutStream> FileOutStream::Create(char const* path)
{
    Result result{};
    return Create(path, File::ShareMode::DenyNone, result, nullptr);
}

Counted<FileOutStream> FileOutStream::Create(char const* path, File::ShareMode share, Result& result, String8* text)
{
    result = Result::Other;
    if (!path) return nullptr;
    Platform::OpenFlags flags;
    flags.write = flags.create = flags.truncate = true;
    Platform::FileHandle handle = Platform::c_noHandle;
    result = OpenPlatformFile(path, flags, share, handle, text);
    return handle == Platform::c_noHandle ? nullptr : Counted<FileOutStream>(new FileOutStream(handle, false));
}

Counted<FileOutStream> FileOutStream::Append(char const* path)
{
    Result result{};
    return Append(path, File::ShareMode::DenyNone, result, nullptr);
}

Counted<FileOutStream> FileOutStream::Append(char const* path, File::ShareMode share, Result& result, String8* text)
{
    result = Result::Other;
    if (!path) return nullptr;
    Platform::OpenFlags flags;
    flags.read = flags.write = flags.create = flags.append = true;
    Platform::FileHandle handle = Platform::c_noHandle;
    result = OpenPlatformFile(path, flags, share, handle, text);
    return handle == Platform::c_noHandle ? nullptr : Counted<FileOutStream>(new FileOutStream(handle, true));
}

bool FileOutStream::WriteOut()
{
    u64 const held = m_held;
    m_held = 0;
    if (held == 0) return true;
    u64 const put = m_core->Write(m_buffer.get(), held);
    m_position += put;
    return put == held;
}

u64 FileOutStream::WriteBlock(void const* from, u64 count)
{
    if (!m_core->IsUsable() || !from || count == 0) return 0;
    if (count > c_bufferSize - m_held && !WriteOut()) return 0;
    if (count < c_bufferSize) {
        std::memcpy(m_buffer.get() + m_held, from, count);
        m_held += count;
        return count;
    }
    u64 const put = m_core->Write(from, count);
    m_position += put;
    return put;
}

bool FileOutStream::Flush()
{
    return !m_core->IsUsable() || WriteOut();
}

bool FileOutStream::ForceFlush()
{
    return Flush() && m_core->FlushToDevice();
}

bool FileOutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    return in.WillDelegateCopyToStream() ? OutStream::CopyFromStream(in, progress) : in.CopyToStream(*this, progress);
}

u64 FileOutStream::GetSizeOutStream() const
{
    u64 const end = m_core->GetSize();
    if (m_held == 0) return end;
    return m_append ? end + m_held : std::max(end, m_position + m_held);
}

u64 FileOutStream::TellOutStream() const
{
    return m_position + m_held;
}

bool FileOutStream::SeekOutStream(SeekMethod method, i64 offset)
{
    if (!m_core->IsUsable() || !WriteOut()) return false;
    Platform::SeekFrom from{};
    if (!ToSeekFrom(static_cast<int>(method), from)) return false;
    u64 reached = 0;
    if (!m_core->Seek(offset, from, reached)) return false;
    m_position = reached;
    return true;
}

bool FileOutStream::Truncate(u64 size)
{
    if (!m_core->IsUsable() || !WriteOut()) return false;
    u64 const end = m_core->GetSize();
    if (size < end && !m_core->SetSize(size)) return false;
    return SeekOutStream(SeekMethod::Beginning, static_cast<i64>(std::min(size, end)));
}

void FileOutStream::SetErrorHandler(Counted<FileStreamErrorHandler> const& handler)
{
    m_core->SetErrorHandler(handler);
}

bool FileOutStream::Close()
{
    bool const flushed = Flush();
    return m_core->Close() && flushed;
}

bool FileOutStream::IsClosed() const
{
    return m_core->IsClosed();
}

bool FileOutStream::IsBroken() const
{
    return m_core->IsBroken();
}

FileIOException::Reason FileOutStream::GetReason() const
{
    return m_core->GetReason();
}

} // namespace Kernel

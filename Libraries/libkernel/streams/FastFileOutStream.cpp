#include "libkernel/streams/FastFileOutStream.h"

#include "libkernel/streams/InStream.h"
#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/FileStreamCore.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace Kernel {

FastFileOutStream::FastFileOutStream(int handle, std::unique_ptr<u8[]> buffer, u64 bufferSize)
    : m_core(std::make_unique<FileStreamCore>(handle)), m_buffer(std::move(buffer)), m_bufferSize(bufferSize)
{
    m_position = m_core->GetSize();
    Platform::GetFileCalls().advise(handle, 0, 0, Platform::ReadAdvice::Sequential);
}

FastFileOutStream::~FastFileOutStream()
{
    m_core->SetErrorHandler(nullptr);
    try {
        Close();
    } catch (FileIOException const&) {
    }
}

Counted<FastFileOutStream> FastFileOutStream::OpenI(char const* path, u64 bufferSize, bool append)
{
    if (!path) return nullptr;
    bufferSize = std::max(bufferSize, c_minBufferSize);
    std::unique_ptr<u8[]> buffer(new (std::nothrow) u8[bufferSize]);
    if (!buffer) return nullptr;
    Platform::OpenFlags flags;
    flags.write = flags.create = true;
    flags.read = flags.append = append;
    flags.truncate = !append;
    Platform::FileHandle handle = Platform::c_noHandle;
    OpenPlatformFile(path, flags, File::ShareMode::DenyNone, handle, nullptr);
    if (handle == Platform::c_noHandle) return nullptr;
    return Counted<FastFileOutStream>(new FastFileOutStream(handle, std::move(buffer), bufferSize));
}

Counted<FastFileOutStream> FastFileOutStream::Create(char const* path, u64 bufferSize)
{
    return OpenI(path, bufferSize, false);
}

Counted<FastFileOutStream> FastFileOutStream::Append(char const* path, u64 bufferSize)
{
    return OpenI(path, bufferSize, true);
}

u64 FastFileOutStream::WriteBlock(void const* from, u64 count)
{
    if (!m_core->IsUsable() || !from || count == 0) return 0;
    u8 const* in = static_cast<u8 const*>(from);
    u64 const fits = std::min(count, m_bufferSize - m_held);
    std::memcpy(m_buffer.get() + m_held, in, fits);
    m_held += fits;
    m_position += fits;
    u64 const rest = count - fits;
    if (rest == 0) return count;
    if (!DumpStream()) return 0;
    if (rest >= m_bufferSize) {
        u64 const put = m_core->Write(in + fits, rest);
        m_position += put;
        return fits + put;
    }
    std::memcpy(m_buffer.get(), in + fits, rest);
    m_held = rest;
    m_position += rest;
    return count;
}

bool FastFileOutStream::DumpStream()
{
    if (m_held == 0) return true;
    u64 const held = m_held;
    if (m_core->Write(m_buffer.get(), held) != held) return false;
    m_held = 0;
    return true;
}

bool FastFileOutStream::Flush()
{
    return !m_core->IsUsable() || DumpStream();
}

bool FastFileOutStream::ForceFlush()
{
    return Flush() && m_core->FlushToDevice();
}

bool FastFileOutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    return in.WillDelegateCopyToStream() ? OutStream::CopyFromStream(in, progress) : in.CopyToStream(*this, progress);
}

u64 FastFileOutStream::GetSizeOutStream() const
{
    return m_core->GetSize() + m_held;
}

void FastFileOutStream::SetErrorHandler(Counted<FileStreamErrorHandler> const& handler)
{
    m_core->SetErrorHandler(handler);
}

bool FastFileOutStream::Close()
{
    bool const flushed = Flush();
    m_held = 0;
    return m_core->Close() && flushed;
}

bool FastFileOutStream::IsClosed() const
{
    return m_core->IsClosed();
}

bool FastFileOutStream::IsBroken() const
{
    return m_core->IsBroken();
}

FileIOException::Reason FastFileOutStream::GetReason() const
{
    return m_core->GetReason();
}

} // namespace Kernel

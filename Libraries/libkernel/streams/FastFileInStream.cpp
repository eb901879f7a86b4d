#include "libkernel/streams/FastFileInStream.h"

#include "libkernel/streams/OutStream.h"
#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/FileStreamCore.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace Kernel {

FastFileInStream::FastFileInStream(int handle, std::unique_ptr<u8[]> buffer, u64 bufferSize)
    : m_core(std::make_unique<FileStreamCore>(handle)), m_buffer(std::move(buffer)), m_bufferSize(bufferSize)
{
}

FastFileInStream::~FastFileInStream() = default;

Counted<FastFileInStream> FastFileInStream::Open(char const* path, u64 bufferSize)
{
    if (!path) return nullptr;
    bufferSize = std::max(bufferSize, c_minBufferSize);
    std::unique_ptr<u8[]> buffer(new (std::nothrow) u8[bufferSize]);
    if (!buffer) return nullptr;
    Platform::OpenFlags flags;
    flags.read = true;
    Platform::FileHandle handle = Platform::c_noHandle;
    OpenPlatformFile(path, flags, File::ShareMode::DenyNone, handle, nullptr);
    if (handle == Platform::c_noHandle) return nullptr;
    return Counted<FastFileInStream>(new FastFileInStream(handle, std::move(buffer), bufferSize));
}

u64 FastFileInStream::ReadBlock(void* to, u64 count)
{
    if (!m_core->IsUsable() || !to || count == 0) return 0;
    u8* const out = static_cast<u8*>(to);
    u64 done = std::min(count, m_left);
    std::memcpy(out, m_buffer.get() + m_held - m_left, done);
    m_left -= done;
    m_position += done;
    u64 const rest = count - done;
    if (rest == 0) return done;

    u64 got = 0;
    if (rest >= m_bufferSize) {
        got = m_core->Read(out + done, rest);
        m_held = m_left = 0;
        m_hitEnd = got != rest;
    } else {
        m_held = m_core->Read(m_buffer.get(), m_bufferSize);
        m_hitEnd = m_held != m_bufferSize;
        got = std::min(rest, m_held);
        std::memcpy(out + done, m_buffer.get(), got);
        m_left = m_held - got;
    }
    m_position += got;
    return done + got;
}

bool FastFileInStream::SkipBlock(u64 count)
{
    if (count > static_cast<u64>(INT64_MAX)) return false;
    return SeekInStream(SeekMethod::Current, static_cast<i64>(count));
}

bool FastFileInStream::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    return out.WillDelegateCopyFromStream() ? InStream::CopyToStream(out, progress)
                                            : out.CopyFromStream(*this, progress);
}

u64 FastFileInStream::GetSizeInStream() const
{
    return m_core->GetSize();
}

bool FastFileInStream::SeekInStream(SeekMethod method, i64 offset)
{
    if (!m_core->IsUsable()) return false;
    u64 target = 0;
    u64 const size = method == SeekMethod::End ? m_core->GetSize() : 0;
    if (!ResolveSeek(method, offset, m_position, size, target)) return false;
    if (target == m_position) return true;
    u64 const bufferStart = m_position - (m_held - m_left);
    if (m_held != 0 && target >= bufferStart && target <= bufferStart + m_held) {
        m_left = bufferStart + m_held - target;
        m_position = target;
        return true;
    }
    u64 reached = 0;
    if (target > static_cast<u64>(INT64_MAX) ||
        !m_core->Seek(static_cast<i64>(target), Platform::SeekFrom::Start, reached))
        return false;
    m_held = m_left = 0;
    m_position = reached;
    m_hitEnd = false;
    return true;
}

void FastFileInStream::SetErrorHandler(Counted<FileStreamErrorHandler> const& handler)
{
    m_core->SetErrorHandler(handler);
}

bool FastFileInStream::Close()
{
    m_held = m_left = 0;
    return m_core->Close();
}

bool FastFileInStream::IsClosed() const
{
    return m_core->IsClosed();
}

bool FastFileInStream::IsBroken() const
{
    return m_core->IsBroken();
}

FileIOException::Reason FastFileInStream::GetReason() const
{
    return m_core->GetReason();
}

} // namespace Kernel

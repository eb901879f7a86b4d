#include "libkernel/streams/FileInStream.h"

#include "libkernel/streams/OutStream.h"
#include "libkernel/streams/internal/FileOpening.h"
#include "libkernel/streams/internal/FileStreamCore.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>
#include <cstring>

namespace Kernel {

FileInStream::FileInStream(int handle, String8 const& path, bool unbuffered)
    : m_core(std::make_unique<FileStreamCore>(handle)), m_path(path),
      m_buffer(unbuffered ? nullptr : std::make_unique<u8[]>(c_bufferSize))
{
}

FileInStream::~FileInStream() = default;

Counted<FileInStream> FileInStream::Open(char const* path, bool unbuffered)
{
    File::OpenUnmanagedResult result{};
    return OpenEx(path, result, unbuffered);
}

Counted<FileInStream> FileInStream::OpenEx(char const* path, File::OpenUnmanagedResult& result, bool unbuffered)
{
    result = File::OpenUnmanagedResult::Other;
    if (!path) return nullptr;
    Platform::OpenFlags flags;
    flags.read = true;
    Platform::FileHandle handle = Platform::c_noHandle;
    result = OpenPlatformFile(path, flags, File::ShareMode::DenyNone, handle, nullptr);
    if (handle == Platform::c_noHandle) return nullptr;
    return Counted<FileInStream>(new FileInStream(handle, String8(path), unbuffered));
}

u64 FileInStream::ReadBlock(void* to, u64 count)
{
    if (!m_core->IsUsable() || !to || count == 0) return 0;
    u8* out = static_cast<u8*>(to);
    u64 done = 0;
    while (done < count) {
        if (m_left != 0) {
            u64 const piece = std::min(m_left, count - done);
            std::memcpy(out + done, m_read, piece);
            m_read += piece;
            m_left -= piece;
            done += piece;
            continue;
        }
        u64 const rest = count - done;
        if (!m_buffer || rest >= c_bufferSize) {
            u64 const got = m_core->Read(out + done, rest);
            done += got;
            if (got != rest) break;
            continue;
        }
        m_left = m_core->Read(m_buffer.get(), c_bufferSize);
        m_read = m_buffer.get();
        if (m_left == 0) break;
    }
    m_position += done;
    if (done != count) m_hitEnd = true;
    return done;
}

bool FileInStream::SkipBlock(u64 count)
{
    if (count > static_cast<u64>(INT64_MAX)) return false;
    return SeekInStream(SeekMethod::Current, static_cast<i64>(count));
}

bool FileInStream::EOS() const
{
    return m_hitEnd;
}

bool FileInStream::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    // Two file streams would hand the copy to each other for ever.
    return out.WillDelegateCopyFromStream() ? InStream::CopyToStream(out, progress)
                                            : out.CopyFromStream(*this, progress);
}

u64 FileInStream::GetSizeInStream() const
{
    return m_core->GetSize();
}

bool FileInStream::SeekInStream(SeekMethod method, i64 offset)
{
    u64 target = 0;
    if (!m_core->IsUsable()) return false;
    if (method != SeekMethod::End && offset < 0 && method != SeekMethod::Current) return false;
    if (!ResolveSeek(method, offset, m_position, method == SeekMethod::End ? GetSizeInStream() : 0, target))
        return false;
    u64 reached = 0;
    if (target > static_cast<u64>(INT64_MAX) ||
        !m_core->Seek(static_cast<i64>(target), Platform::SeekFrom::Start, reached))
        return false;
    DropBuffer();
    m_position = reached;
    m_hitEnd = false;
    return true;
}

void FileInStream::SetErrorHandler(Counted<FileStreamErrorHandler> const& handler)
{
    m_core->SetErrorHandler(handler);
}

bool FileInStream::Close()
{
    DropBuffer();
    return m_core->Close();
}

bool FileInStream::IsClosed() const
{
    return m_core->IsClosed();
}

bool FileInStream::IsBroken() const
{
    return m_core->IsBroken();
}

FileIOException::Reason FileInStream::GetReason() const
{
    return m_core->GetReason();
}

} // namespace Kernel

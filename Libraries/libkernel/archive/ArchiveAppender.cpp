#include "libkernel/archive/internal/ArchiveAppender.h"

#include "libkernel/core/Limits.h"
#include "libkernel/streams/FileIOException.h"
#include "libkernel/streams/OutStream.h"

#include <cstdlib>
#include <cstring>
#include <new>

namespace Kernel {

namespace {

/// Buffers that are not in use. A few are kept: one save and a copy or two at a time.
struct BufferPool
{
    static constexpr size_t c_kept = 4;

    ~BufferPool()
    {
        while (count != 0) std::free(buffers[--count]);
    }

    CriticalSectionSpin lock;
    u8* buffers[c_kept] = {}; // Guarded by lock, as is the count.
    size_t count = 0;
};

BufferPool& GetPool()
{
    static BufferPool s_pool;
    return s_pool;
}

} // namespace

ArchiveCopyBuffer::ArchiveCopyBuffer() : m_data(nullptr)
{
    BufferPool& pool = GetPool();
    {
        CriticalSectionSpinScope const lock(pool.lock);
        if (pool.count != 0) m_data = pool.buffers[--pool.count];
    }
    if (!m_data) m_data = static_cast<u8*>(std::malloc(c_copyBufferSize));
    if (!m_data) throw std::bad_alloc();
}

ArchiveCopyBuffer::~ArchiveCopyBuffer()
{
    BufferPool& pool = GetPool();
    {
        CriticalSectionSpinScope const lock(pool.lock);
        if (pool.count < BufferPool::c_kept) {
            pool.buffers[pool.count++] = m_data;
            return;
        }
    }
    std::free(m_data);
}

ArchiveAppender::ArchiveAppender(ArchiveImpl& impl, Counted<Archive::ArchiveFile> file, u64 end)
    : m_impl(impl), m_file(std::move(file)), m_written(end)
{
}

void ArchiveAppender::Append(void const* data, u64 size)
{
    if (size == 0) return; // The data may be null then.
    u8 const* bytes = static_cast<u8 const*>(data);
    if (m_held + size < c_copyBufferSize) {
        std::memcpy(m_buffer.GetData() + m_held, bytes, size);
        m_held += size;
        return;
    }
    if (m_held != 0) {
        // Fill up first: full buffers keep the writes large.
        u64 const room = c_copyBufferSize - m_held;
        std::memcpy(m_buffer.GetData() + m_held, bytes, room);
        m_held += room;
        bytes += room;
        size -= room;
        Flush();
    }
    if (u64 const whole = size / c_copyBufferSize * c_copyBufferSize) {
        Write(bytes, whole);
        bytes += whole;
        size -= whole;
    }
    std::memcpy(m_buffer.GetData(), bytes, size);
    m_held = size;
}

u8* ArchiveAppender::GetSpace(u64 size)
{
    if (m_held + size > c_copyBufferSize) Flush();
    return m_buffer.GetData() + m_held;
}

void ArchiveAppender::Flush()
{
    if (m_held == 0) return;
    u64 const held = m_held;
    Write(m_buffer.GetData(), held);
    m_held = 0;
}

void ArchiveAppender::Write(void const* data, u64 size)
{
    CriticalSectionScope const lock(m_file->m_lock);
    if (!m_file->m_stream) m_impl.ThrowFileException(*m_file, ArchiveFileException::Reason::FileError);
    try {
        if (!m_file->m_isScratch && m_file->m_fileVersion >= ArchiveFormat::c_guardVersion) {
            switch (m_impl.PassWriteGuard(*m_file, false)) {
            case ArchiveImpl::GuardResult::Ok: break;
            case ArchiveImpl::GuardResult::WrongCounter:
                m_impl.ThrowFileException(*m_file, ArchiveFileException::Reason::OtherWriter);
            default: m_impl.ThrowFileException(*m_file, ArchiveFileException::Reason::GuardUnreadable);
            }
        }
        if (m_file->m_thumbnailsPos != 0) DropOldThumbnails();
        if (m_file->m_stream->WriteAt(m_written, data, size) != size) throw OutStream::WriteException();
        // The device starts now, so that the flush at the end finds little left to do.
        m_file->m_stream->StartWriteBack(m_written, size);
        m_written += size;
    } catch (FileIOException const& e) {
        m_impl.ThrowFileException(*m_file, ArchiveFileException::FromFileIOReason(static_cast<int>(e.GetReason())));
    }
}

// The old thumbnails lie where the new blocks go. After a power cut any of the sectors below may be old or new, and an
// old header over new data would show rubbish: the header is made void, and lastingly so, before anything follows.
void ArchiveAppender::DropOldThumbnails()
{
    u8 const zeros[8] = {};
    u64 const position = m_file->m_thumbnailsPos;
    m_file->m_thumbnailsPos = 0;
    m_file->m_thumbnails = nullptr;
    if (m_file->m_stream->WriteAt(position, zeros, sizeof(zeros)) != sizeof(zeros)) throw OutStream::WriteException();
    if (!m_file->m_stream->ForceFlush()) throw OutStream::WriteException();
}

} // namespace Kernel

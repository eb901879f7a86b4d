#include "libkernel/streams/FileWriterBase.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/platform/Errors.h"
#include "libkernel/streams/internal/SeekTarget.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <utility>

namespace Kernel {

namespace {

constexpr u64 c_highestPosition = static_cast<u64>(std::numeric_limits<i64>::max());

} // namespace

FileWriterBase::FileWriterBase(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize,
                               Placement placement, u64 size)
    : FileStreamBase(handle), m_buffer(std::move(buffer)), m_bufferSize(bufferSize),
      m_start(placement == Placement::Append ? size : 0), m_fileSize(size), m_placement(placement),
      m_lengthWasSet(placement == Placement::AtPosition) // The file was emptied when it was opened.
{
}

FileWriterBase::~FileWriterBase()
{
    if (IsUsable() && m_held != 0) WriteOut(m_buffer.get(), m_held);
}

Platform::IoResult FileWriterBase::WriteOut(void const* from, u64 count)
{
    Platform::FileCalls const& calls = Platform::GetFileCalls();
    Platform::IoResult result;
    if (m_placement == Placement::Append) {
        result = calls.write(GetHandle(), from, count);
        u64 end;
        // Somebody else may have appended meanwhile: the system knows where our bytes went.
        m_start = calls.seek(GetHandle(), 0, Platform::SeekFrom::Current, end) == 0 ? end : m_start + result.count;
    } else if (!RangeFits(m_start, count, c_highestPosition))
        result.error = EFBIG;
    else {
        result = calls.writeAt(GetHandle(), from, count, m_start);
        m_start += result.count;
    }
    m_fileSize = std::max(m_fileSize, m_start);
    return result;
}

// The bytes held were promised to their writer, so losing some is reported even if the system names no error.
bool FileWriterBase::DumpStream()
{
    if (m_held == 0) return true;
    u64 const count = std::exchange(m_held, 0);
    Platform::IoResult const result = WriteOut(m_buffer.get(), count);
    if (result.count == count && result.error == 0) return true;
    OnErrorI(result.error, true);
    return false;
}

u64 FileWriterBase::WriteI(void const* from, u64 count)
{
    if (!IsUsable() || !from || count == 0) return 0;
    u8 const* bytes = static_cast<u8 const*>(from);
    u64 const room = m_bufferSize - m_held;
    if (count <= room && m_bufferSize != 0) {
        std::memcpy(m_buffer.get() + m_held, bytes, count);
        m_held += count;
        return count;
    }
    u64 taken = 0;
    if (m_held != 0) {
        std::memcpy(m_buffer.get() + m_held, bytes, room);
        m_held += room;
        taken = room;
        if (!DumpStream()) return 0;
    }
    u64 const rest = count - taken;
    if (rest < m_bufferSize) {
        std::memcpy(m_buffer.get(), bytes + taken, rest);
        m_held = rest;
        return count;
    }
    Platform::IoResult const result = WriteOut(bytes + taken, rest);
    if (result.error != 0) OnErrorI(result.error);
    return taken + result.count;
}

bool FileWriterBase::FlushI()
{
    return !IsUsable() || DumpStream();
}

bool FileWriterBase::ForceFlushI()
{
    if (!IsUsable()) return true;
    if (!DumpStream()) return false;
    // Contents that grew by writes bring their length along in the smaller flush.
    Platform::FlushKind const kind = m_lengthWasSet ? Platform::FlushKind::Full : Platform::FlushKind::Data;
    if (int const error = Platform::GetFileCalls().flush(GetHandle(), kind)) {
        OnErrorI(error);
        return false;
    }
    m_lengthWasSet = false;
    return true;
}

bool FileWriterBase::Close()
{
    if (IsClosed()) return true;
    bool lost = false;
    int error = 0;
    if (u64 const count = std::exchange(m_held, 0); count != 0 && IsUsable()) {
        Platform::IoResult const result = WriteOut(m_buffer.get(), count);
        lost = result.count != count || result.error != 0;
        error = result.error;
    }
    // The handle goes before anything is reported, because the report may throw.
    int const closeError = CloseHandle();
    if (!lost && closeError == 0) return true;
    OnErrorI(lost ? error : closeError, lost);
    return false;
}

bool FileWriterBase::TruncateI(u64 size)
{
    if (!IsUsable() || !DumpStream()) return false;
    bool ok;
    u64 const end = QuerySize(ok);
    if (!ok) return false;
    m_fileSize = std::min(size, end);
    m_start = m_fileSize;
    if (size >= end) return true;
    m_lengthWasSet = true;
    int const error = Platform::GetFileCalls().setSize(GetHandle(), size);
    if (error != 0) OnErrorI(error);
    return error == 0;
}

bool FileWriterBase::SeekI(SeekMethod method, i64 offset)
{
    if (!IsUsable() || !DumpStream()) return false;
    u64 size = 0;
    bool ok = true;
    if (method == SeekMethod::End) size = QuerySize(ok);
    u64 target;
    if (!ok || !ResolveSeekStrictly(method, offset, m_start, size, target)) return false;
    m_start = target;
    return true;
}

bool FileWriterBase::WriteAtI(u64 position, void const* from, u64 count)
{
    if (!IsUsable() || (!from && count != 0) || !DumpStream()) return false;
    u64 const back = std::exchange(m_start, position);
    Platform::IoResult const result = WriteOut(from, count);
    m_start = back;
    if (result.error != 0) OnErrorI(result.error);
    return result.error == 0 && result.count == count;
}

u64 FileWriterBase::GetSizeI() const
{
    bool ok;
    u64 const size = QuerySize(ok);
    if (!ok) return 0;
    return m_placement == Placement::Append ? size + m_held : m_held != 0 ? std::max(size, m_start + m_held) : size;
}

} // namespace Kernel

#pragma once

#include "libkernel/streams/FileStreamBase.h"
#include "libkernel/streams/SeekMethod.h"

#include <memory>

namespace Kernel {

/// The reading half of a buffered file stream. Reads of the buffer size and more go past the buffer; with a buffer of 0
/// bytes all do. Positions are the stream's own, so that a seek costs no call.
class KERNEL_API FileReaderBase : public FileStreamBase
{
protected:
    /// @p buffer holds @p bufferSize bytes.
    FileReaderBase(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize);
    ~FileReaderBase();

    u64 ReadI(void* to, u64 count);
    /// Moves to @p target. Inside the present buffer no byte is read anew; elsewhere the buffer is emptied.
    bool MoveTo(u64 target);
    u64 GetPosition() const { return IsUsable() ? m_position : 0; }
    u64 GetBufferSizeI() const { return m_bufferSize; }
    /// Bytes read ahead of the position.
    u64 GetAvailable() const { return m_available; }
    /// The last read of the file tried to pass its end.
    bool FileHitEnd() const { return m_fileHitEnd; }

private:
    u64 TakeAvailable(void* to, u64 count);

    std::unique_ptr<u8[]> const m_buffer;
    u64 const m_bufferSize;
    u8* m_read;          // In the buffer; what lies before it there lies before the position in the file too.
    u64 m_available = 0; // Bytes at m_read.
    u64 m_position = 0;  // At most the highest i64.
    bool m_fileHitEnd = false;
};

} // namespace Kernel

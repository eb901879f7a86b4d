#pragma once

#include "libkernel/streams/FileStreamBase.h"
#include "libkernel/streams/SeekMethod.h"

#include <memory>

namespace Kernel {

/// The writing half of a buffered file stream. What is written first fills the buffer; the rest of a large write goes
/// past it.
class KERNEL_API FileWriterBase : public FileStreamBase
{
public:
    /// Writes out what is held and closes the file, whatever fails on the way. True for a stream that is closed
    /// already.
    bool Close();

protected:
    /// Where in the file the writes of a new stream go.
    enum class Placement
    {
        AtPosition = 0,
        Append = 1 ///< Each write goes to the end, whoever else appends.
    };

    /// @p buffer holds @p bufferSize bytes; the file is @p size bytes long.
    FileWriterBase(Platform::FileHandle handle, std::unique_ptr<u8[]> buffer, u64 bufferSize, Placement placement,
                   u64 size);
    /// Writes out what is held, closes the file and reports nothing.
    ~FileWriterBase();

    u64 WriteI(void const* from, u64 count);
    bool FlushI();
    bool ForceFlushI();
    bool TruncateI(u64 size);
    bool SeekI(SeekMethod method, i64 offset);
    bool WriteAtI(u64 position, void const* from, u64 count);
    u64 GetSizeI() const;
    u64 GetPosition() const { return IsUsable() ? m_start + m_held : 0; }
    u64 GetBufferSizeI() const { return m_bufferSize; }

private:
    Platform::IoResult WriteOut(void const* from, u64 count);
    bool DumpStream();

    std::unique_ptr<u8[]> const m_buffer;
    u64 const m_bufferSize;
    u64 m_held = 0; // Bytes in the buffer.
    u64 m_start;    // Where in the file the first of them belongs.
    u64 m_fileSize; // As far as this stream has written.
    Placement const m_placement;
    bool m_lengthWasSet; // Since the last flush to the device.
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Exception.h"
#include "libkernel/core/Types.h"
#include "libkernel/streams/SeekMethod.h"

namespace Kernel {

class InStream;
class StreamCopyProgress;

/// A target for bytes. Held by Counted, ended by its last release; threads and failures as for InStream.
class KERNEL_API OutStream : public virtual Countable
{
public:
    /// A typed write came up short.
    class KERNEL_API WriteException : public Exception
    {
    public:
        ~WriteException() override;
    };

    /// Writes @p count bytes from @p from and moves on. Gives the bytes written; fewer than asked means failure.
    virtual u64 WriteBlock(void const* from, u64 count) = 0;
    /// A hint that @p count more bytes come.
    virtual void Reserve(u64 count);
    /// Hands everything that is held back to whatever lies below. False on failure.
    virtual bool Flush();
    /// Flush, and on to the device: what was written before survives a power cut. False on failure, after which the
    /// bytes must be taken for lost.
    virtual bool ForceFlush();
    /// Copies everything from the present position of @p in; InStream::CopyToStream with the roles exchanged.
    virtual bool CopyFromStream(InStream& in, StreamCopyProgress* progress = nullptr);
    /// True if CopyFromStream hands over to the source's CopyToStream.
    virtual bool WillDelegateCopyFromStream() const;
    /// True if one transfer is slow enough that a copy with a progress object should go in pieces of 1 MiB.
    virtual bool SlowProgressOutStream() const;
    /// Bytes from start to end.
    virtual u64 GetSizeOutStream() const = 0;
    /// Bytes from the start to the present position.
    virtual u64 TellOutStream() const = 0;

    u64 GetSize() const { return GetSizeOutStream(); }
    u64 Tell() const { return TellOutStream(); }

    /// Writes one number little-endian in one WriteBlock. Throws WriteException when fewer bytes go than its width.
    OutStream& operator<<(signed char const& value);
    OutStream& operator<<(unsigned char const& value);
    OutStream& operator<<(short const& value);
    OutStream& operator<<(unsigned short const& value);
    OutStream& operator<<(int const& value);
    OutStream& operator<<(unsigned int const& value);
    OutStream& operator<<(i64 const& value);
    OutStream& operator<<(u64 const& value);

protected:
    ~OutStream() override;
};

/// A target that can be written anywhere.
class KERNEL_API OutStreamSeekable : public OutStream
{
public:
    using SeekMethod = Kernel::SeekMethod;

    /// Writes @p count bytes at @p position and leaves the stream where it stood. False on any failure.
    virtual bool WriteBlockAtPos(u64 position, void const* from, u64 count);
    /// Cuts the stream to @p size bytes if it is longer; it then stands at its end. Never lengthens.
    virtual bool Truncate(u64 size) = 0;
    /// Moves the position, which may pass the end. False for an unknown @p method or where the target can't be reached.
    virtual bool SeekOutStream(SeekMethod method, i64 offset) = 0;
    virtual bool RewindOutStream();

    bool Seek(SeekMethod method, i64 offset) { return SeekOutStream(method, offset); }
    /// Seeks from the beginning.
    bool Seek(i64 offset) { return SeekOutStream(SeekMethod::Beginning, offset); }
    bool Rewind() { return RewindOutStream(); }

protected:
    ~OutStreamSeekable() override;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Exception.h"
#include "libkernel/core/Types.h"
#include "libkernel/streams/SeekMethod.h"

namespace Kernel {

class OutStream;
class StreamCopyProgress;

/// A source of bytes. Held by Counted, ended by its last release.
///
/// No stream class has a lock: one thread uses a stream at a time, and it may be handed to another between operations.
/// Failures are short counts and false; only the typed reads below throw. File streams have failures of their own.
class KERNEL_API InStream : public virtual Countable
{
public:
    /// A typed read came up short.
    class KERNEL_API ReadException : public Exception
    {
    public:
        ~ReadException() override;
    };

    /// Reads up to @p count bytes to @p to and moves on by what it read. Gives the bytes read: fewer than asked at the
    /// end or after a failure, 0 at the end.
    virtual u64 ReadBlock(void* to, u64 count) = 0;
    /// Moves on by @p count bytes without giving them. False if that could not be done; where the stream stands then
    /// is said at each class.
    virtual bool SkipBlock(u64 count) = 0;
    /// True at the end. Streams that can't know their size say so themselves; the default compares position and size.
    virtual bool EOS() const;
    /// Copies everything from the present position to @p out, telling @p progress (may be null) before the first
    /// piece and after each piece of up to 1 MiB. False if the target took less than it was given, or this stream
    /// stopped before its end; what was copied stays copied. Throws MemoryException if there is no memory for the
    /// piece.
    virtual bool CopyToStream(OutStream& out, StreamCopyProgress* progress = nullptr);
    /// True if CopyToStream hands over to the target's CopyFromStream: two such streams copy by the general loop, or
    /// they would call each other for ever.
    virtual bool WillDelegateCopyToStream() const;
    /// True if one transfer is slow enough that a copy with a progress object should go in pieces of 1 MiB.
    virtual bool SlowProgressInStream() const;
    virtual bool CanRewindInStream() const;
    /// Goes back to the start. False where the stream can't.
    virtual bool RewindInStream();
    /// Bytes from start to end; 0 where the stream can't know.
    virtual u64 GetSizeInStream() const = 0;
    /// Bytes from the start to the present position.
    virtual u64 TellInStream() const = 0;

    u64 GetSize() const { return GetSizeInStream(); }
    u64 Tell() const { return TellInStream(); }

    /// Reads one number, stored little-endian, in one ReadBlock. Throws ReadException when fewer bytes come than its
    /// width; the value is then unchanged.
    InStream& operator>>(signed char& value);
    InStream& operator>>(unsigned char& value);
    InStream& operator>>(short& value);
    InStream& operator>>(unsigned short& value);
    InStream& operator>>(int& value);
    InStream& operator>>(unsigned int& value);
    InStream& operator>>(i64& value);
    InStream& operator>>(u64& value);

protected:
    ~InStream() override;
};

/// A source that can be read anywhere.
class KERNEL_API InStreamSeekable : public InStream
{
public:
    using SeekMethod = Kernel::SeekMethod;

    /// A seek by @p count from the present position.
    bool SkipBlock(u64 count) override;
    bool CanRewindInStream() const override;
    bool RewindInStream() override;
    /// Moves the position. False, with the position unchanged, for an unknown @p method or where the target can't be
    /// reached.
    virtual bool SeekInStream(SeekMethod method, i64 offset) = 0;

    bool Seek(SeekMethod method, i64 offset) { return SeekInStream(method, offset); }
    /// Seeks from the beginning.
    bool Seek(i64 offset) { return SeekInStream(SeekMethod::Beginning, offset); }
    bool Rewind() { return RewindInStream(); }

protected:
    ~InStreamSeekable() override;
};

} // namespace Kernel

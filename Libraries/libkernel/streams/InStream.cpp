#include "libkernel/streams/InStream.h"

#include "libkernel/core/Endian.h"
#include "libkernel/streams/OutStream.h"
#include "libkernel/streams/StreamCopyProgress.h"
#include "libkernel/streams/internal/GenericCopy.h"

#include <limits>

namespace Kernel {

StreamCopyProgress::~StreamCopyProgress() = default;
InStream::~InStream() = default;
InStream::ReadException::~ReadException() = default;
InStreamSeekable::~InStreamSeekable() = default;

bool InStream::EOS() const
{
    return TellInStream() == GetSizeInStream();
}

bool InStream::CopyToStream(OutStream& out, StreamCopyProgress* progress)
{
    return GenericCopy(*this, out, progress);
}

bool InStream::WillDelegateCopyToStream() const
{
    return false;
}

bool InStream::SlowProgressInStream() const
{
    return false;
}

bool InStream::CanRewindInStream() const
{
    return false;
}

bool InStream::RewindInStream()
{
    return false;
}

namespace {

template <class T>
InStream& ReadValue(InStream& in, T& value)
{
    T stored;
    if (in.ReadBlock(&stored, sizeof(T)) != sizeof(T)) throw InStream::ReadException();
    value = ToLittleEndian(stored);
    return in;
}

} // namespace

// clang-format off
InStream& InStream::operator>>(signed char& value) { return ReadValue(*this, value); }
InStream& InStream::operator>>(unsigned char& value) { return ReadValue(*this, value); }
InStream& InStream::operator>>(short& value) { return ReadValue(*this, value); }
InStream& InStream::operator>>(unsigned short& value) { return ReadValue(*this, value); }
InStream& InStream::operator>>(int& value) { return ReadValue(*this, value); }
InStream& InStream::operator>>(unsigned int& value) { return ReadValue(*this, value); }
InStream& InStream::operator>>(i64& value) { return ReadValue(*this, value); }
InStream& InStream::operator>>(u64& value) { return ReadValue(*this, value); }
// clang-format on

bool InStreamSeekable::SkipBlock(u64 count)
{
    if (count > static_cast<u64>(std::numeric_limits<i64>::max())) return false;
    return SeekInStream(SeekMethod::Current, static_cast<i64>(count));
}

bool InStreamSeekable::CanRewindInStream() const
{
    return true;
}

bool InStreamSeekable::RewindInStream()
{
    return SeekInStream(SeekMethod::Beginning, 0);
}

} // namespace Kernel

#include "libkernel/streams/OutStream.h"

#include "libkernel/core/Endian.h"
#include "libkernel/streams/InOutStream.h"
#include "libkernel/streams/internal/GenericCopy.h"

#include <limits>

namespace Kernel {

OutStream::~OutStream() = default;
OutStream::WriteException::~WriteException() = default;
OutStreamSeekable::~OutStreamSeekable() = default;
InOutStreamSeekable::~InOutStreamSeekable() = default;

void OutStream::Reserve(u64) {}

bool OutStream::Flush()
{
    return true;
}

bool OutStream::ForceFlush()
{
    return true;
}

bool OutStream::CopyFromStream(InStream& in, StreamCopyProgress* progress)
{
    return GenericCopy(in, *this, progress);
}

bool OutStream::WillDelegateCopyFromStream() const
{
    return false;
}

bool OutStream::SlowProgressOutStream() const
{
    return false;
}

namespace {

template <class T>
OutStream& WriteValue(OutStream& out, T value)
{
    value = ToLittleEndian(value);
    if (out.WriteBlock(&value, sizeof(T)) != sizeof(T)) throw OutStream::WriteException();
    return out;
}

} // namespace

// clang-format off
OutStream& OutStream::operator<<(signed char const& value) { return WriteValue(*this, value); }
OutStream& OutStream::operator<<(unsigned char const& value) { return WriteValue(*this, value); }
OutStream& OutStream::operator<<(short const& value) { return WriteValue(*this, value); }
OutStream& OutStream::operator<<(unsigned short const& value) { return WriteValue(*this, value); }
OutStream& OutStream::operator<<(int const& value) { return WriteValue(*this, value); }
OutStream& OutStream::operator<<(unsigned int const& value) { return WriteValue(*this, value); }
OutStream& OutStream::operator<<(i64 const& value) { return WriteValue(*this, value); }
OutStream& OutStream::operator<<(u64 const& value) { return WriteValue(*this, value); }
// clang-format on

bool OutStreamSeekable::WriteBlockAtPos(u64 position, void const* from, u64 count)
{
    u64 const back = TellOutStream();
    u64 const highest = static_cast<u64>(std::numeric_limits<i64>::max());
    if (position > highest || back > highest) return false;
    if (!SeekOutStream(SeekMethod::Beginning, static_cast<i64>(position))) return false;
    bool const written = WriteBlock(from, count) == count;
    return SeekOutStream(SeekMethod::Beginning, static_cast<i64>(back)) && written;
}

bool OutStreamSeekable::RewindOutStream()
{
    return SeekOutStream(SeekMethod::Beginning, 0);
}

} // namespace Kernel

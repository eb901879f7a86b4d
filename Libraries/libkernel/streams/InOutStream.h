#pragma once

#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

namespace Kernel {

/// A stream that is read and written, with one position for both.
class KERNEL_API InOutStreamSeekable : public InStreamSeekable, public OutStreamSeekable
{
public:
    using SeekMethod = Kernel::SeekMethod;

    // The short names mean the input side, which has the same position and size.
    u64 GetSize() const { return GetSizeInStream(); }
    u64 Tell() const { return TellInStream(); }
    bool Seek(SeekMethod method, i64 offset) { return SeekInStream(method, offset); }
    bool Seek(i64 offset) { return SeekInStream(SeekMethod::Beginning, offset); }
    bool Rewind() { return RewindInStream(); }

protected:
    ~InOutStreamSeekable() override;
};

} // namespace Kernel

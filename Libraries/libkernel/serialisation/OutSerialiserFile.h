#pragma once

#include "libkernel/core/IDTag.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/serialisation/OutSerialiserObjectList.h"
#include "libkernel/serialisation/OutSerialiserTarget.h"
#include "libkernel/streams/OutStream.h"

namespace Kernel {

class FileStoreOut;

/// Accepts and discards everything: stands for the stream on a pass that writes nothing.
class KERNEL_API StubOutStream : public OutStream
{
public:
    StubOutStream();
    ~StubOutStream() override;
    u64 WriteBlock(void const* from, u64 count) override;
    u64 GetSizeOutStream() const override;
    u64 TellOutStream() const override;
};

/// A whole file of properties: the file header, then the root list. Holds 16 KiB in place. What is saved reaches the
/// stream when the buffer is full and at Close; the destructor hands on what is left of a list that was not closed,
/// unless the save failed.
class KERNEL_API OutSerialiserFile : public OutSerialiser
{
public:
    /// Writes the header for a file of kind @p tag and version @p version. Streams and stores are borrowed. Throws
    /// SaveException with code 0 if the stream does not take the header. Items that load on demand are not saved, and
    /// no path is made for them.
    OutSerialiserFile(OutStream& stream, IDTag tag, unsigned short version);
    /// Delay-load items go to @p store, whose strategies are taken over. Nothing reaches @p stream if the store only
    /// enumerates.
    OutSerialiserFile(OutStream& stream, FileStoreOut& store, IDTag tag, unsigned short version);
    ~OutSerialiserFile() override;

private:
    void WriteHeaderI(IDTag tag, unsigned short version);

    StubOutStream m_stub;
    OutSerialiserTarget m_fileTarget;
    OutSerialiserObjectList m_objectList;
    int const m_exceptionsAtStart; // An exception on its way when this dies, but not when it was made, ends the save.
};

} // namespace Kernel

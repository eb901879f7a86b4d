#include "libkernel/serialisation/OutSerialiserFile.h"

#include "libkernel/core/BuildNumber.h"
#include "libkernel/core/Endian.h"
#include "libkernel/filestore/FileStoreOut.h"
#include "libkernel/filestore/VoidFileStore.h"
#include "libkernel/serialisation/internal/OutSerialiserInline.h"

#include <exception>

namespace Kernel {

StubOutStream::StubOutStream() = default;
StubOutStream::~StubOutStream() = default;

u64 StubOutStream::WriteBlock(void const*, u64 count)
{
    return count;
}

u64 StubOutStream::GetSizeOutStream() const
{
    return 0;
}

u64 StubOutStream::TellOutStream() const
{
    return 0;
}

OutSerialiserFile::OutSerialiserFile(OutStream& stream, IDTag tag, unsigned short version)
    : OutSerialiserFile(stream, VoidFileStoreOut::GetInstance(), tag, version)
{
}

OutSerialiserFile::OutSerialiserFile(OutStream& stream, FileStoreOut& store, IDTag tag, unsigned short version)
    : OutSerialiser(m_fileTarget, store, m_objectList), m_fileTarget(store.IsFullSave() ? stream : m_stub),
      m_exceptionsAtStart(std::uncaught_exceptions())
{
    if (!store.GetStrategies().empty()) InitStrategies(store.GetStrategies());
    if (IsFullSave()) WriteHeaderI(tag, version);
}

OutSerialiserFile::~OutSerialiserFile()
{
    bool const isFailing = m_objectList.IsHandlingException() || std::uncaught_exceptions() > m_exceptionsAtStart;
    if (IsClosed() || isFailing) return;
    try {
        m_fileTarget.Flush();
    } catch (...) {
        // The list was not closed, so the file is no good anyway.
    }
}

void OutSerialiserFile::WriteHeaderI(IDTag tag, unsigned short version)
{
    u8* const header = ClaimI(c_serialisedHeaderSize);
    StoreLittleEndian(header, c_serialisedMagic);
    StoreLittleEndian(header + 4, c_serialisedFormatVersion);
    StoreLittleEndian(header + 6, tag.value);
    StoreLittleEndian(header + 10, version);
    StoreLittleEndian(header + 12, BuildNumber::ProductionIndex());
    if (!m_fileTarget.Flush()) Fail(SaveException::ShortWrite);
}

} // namespace Kernel

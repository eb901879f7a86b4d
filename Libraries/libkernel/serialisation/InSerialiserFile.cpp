#include "libkernel/serialisation/InSerialiserFile.h"

#include "libkernel/filestore/VoidFileStore.h"
#include "libkernel/serialisation/internal/InSerialiserLoader.h"

namespace Kernel {

InSerialiserFile::InSerialiserFile(IDTag fileIDTag, unsigned short fileVersion)
    : m_fileIDTag(fileIDTag), m_fileVersion(fileVersion)
{
}

InSerialiserFile::~InSerialiserFile()
{
    // Before the pools, which they lie in. The lists nested in this one go with it.
    TearDownAllProperties();
}

Counted<InSerialiserFile> InSerialiserFile::ParseI(InStream& in, FileStore& store, DelayLoadsBehaviour behaviour,
                                                   bool checks, ProgressFunc progress, EndFunc const& end)
{
    InSerialiserLoader loader(in, store, behaviour, checks, std::move(progress), end != nullptr);
    Counted<InSerialiserFile> file = loader.ReadHeader();
    if (!file || !loader.ParseFile(*file)) return nullptr;
    if (end) loader.ReportObjects(end);
    return file;
}

Counted<InSerialiserFile> InSerialiserFile::ParseWithChecks(InStream& in)
{
    return ParseI(in, VoidFileStore::GetInstance(), DelayLoadsBehaviour::Leave, true, {}, {});
}

Counted<InSerialiserFile> InSerialiserFile::ParseWithChecks(InStream& in, FileStore& store,
                                                            DelayLoadsBehaviour behaviour, ProgressFunc progress,
                                                            EndFunc end)
{
    return ParseI(in, store, behaviour, true, std::move(progress), end);
}

Counted<InSerialiserFile> InSerialiserFile::ParseSkipUnknownClasses(InStream& in)
{
    return ParseI(in, VoidFileStore::GetInstance(), DelayLoadsBehaviour::Leave, false, {}, {});
}

Counted<InSerialiserFile> InSerialiserFile::ParseSkipUnknownClasses(InStream& in, FileStore& store,
                                                                    DelayLoadsBehaviour behaviour)
{
    return ParseI(in, store, behaviour, false, {}, {});
}

} // namespace Kernel

// The ends of the small interface classes, so that each has one home for its virtual table.

#include "libkernel/core/Trace.h"
#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/filestore/FileStoreBackData.h"
#include "libkernel/filestore/FileStoreCompressionHint.h"
#include "libkernel/filestore/FileStoreLoadContext.h"
#include "libkernel/filestore/FileStorePostSaveInterface.h"
#include "libkernel/filestore/FileStoreRevision.h"

namespace Kernel {

FileStoreRevision::~FileStoreRevision() = default;
FileStoreBackData::~FileStoreBackData() = default;
FileStorePostSaveInterface::~FileStorePostSaveInterface() = default;
FileStoreCompressionHint::~FileStoreCompressionHint() = default;
FileStoreCompressionHintGeneral::~FileStoreCompressionHintGeneral() = default;
FileStoreLoadContext::~FileStoreLoadContext() = default;

BackstoreException::BackstoreException(bool outOfSpace) : m_outOfSpace(outOfSpace)
{
    Trace(outOfSpace ? "== BackstoreException: out of space\n" : "== BackstoreException\n");
}

BackstoreException::~BackstoreException() = default;

} // namespace Kernel

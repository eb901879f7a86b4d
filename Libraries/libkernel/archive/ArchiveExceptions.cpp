#include "libkernel/archive/ArchiveExceptions.h"

#include "libkernel/streams/FileIOException.h"

namespace Kernel {

ArchiveException::~ArchiveException() = default;
ArchiveCorruptionException::~ArchiveCorruptionException() = default;
ArchiveBackingException::~ArchiveBackingException() = default;
ArchiveCRCException::~ArchiveCRCException() = default;
ArchiveFileException::~ArchiveFileException() = default;

ArchiveFileException::Reason ArchiveFileException::FromFileIOReason(int fileIOReason)
{
    // By the kind of the stream's failure; everything not listed is Other.
    static constexpr Reason c_reasons[] = {
        Reason::Other,      Reason::FileError, Reason::AccessDenied,       Reason::PermissionDenied,
        Reason::OutOfSpace, Reason::FileError, Reason::OperationNotAllowed};
    constexpr int count = static_cast<int>(sizeof(c_reasons) / sizeof(c_reasons[0]));
    return fileIOReason >= 0 && fileIOReason < count ? c_reasons[fileIOReason] : Reason::Other;
}

} // namespace Kernel

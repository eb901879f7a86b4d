#include "libkernel/archive/ArchiveReferenceInfo.h"

namespace Kernel {

ArchiveReferenceInfo::ArchiveReferenceInfo(String8 const& path) : m_path(path) {}
ArchiveReferenceInfo::~ArchiveReferenceInfo() = default;

} // namespace Kernel

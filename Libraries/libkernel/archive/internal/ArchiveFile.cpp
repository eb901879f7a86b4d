#include "libkernel/archive/internal/ArchiveFile.h"

#include "libkernel/filesystem/FileSystem.h"

namespace Kernel {

Archive::ArchiveFile::ArchiveFile(OpenMode mode, IDTag archiveUID) : m_mode(mode), m_archiveUID(archiveUID) {}

Archive::ArchiveFile::~ArchiveFile()
{
    // A temporary that was never moved over its target holds a save that was never made.
    bool const remove = (m_throwAway || !m_finalPath.IsEmpty()) && !m_path.IsEmpty();
    m_stream = nullptr;
    m_targetStream = nullptr;
    if (remove) FileSystem::Delete(m_path, 0);
}

Counted<FileInOutStream> Archive::ArchiveFile::GetStream() const
{
    CriticalSectionScope const lock(m_lock);
    return m_stream;
}

void Archive::ArchiveFile::BecomeScratch()
{
    m_isScratch = true;
    m_lock = CriticalSection(c_rankScratch);
}

} // namespace Kernel

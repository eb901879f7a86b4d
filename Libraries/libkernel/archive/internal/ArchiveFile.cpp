#include "libkernel/archive/internal/ArchiveFile.h"

#include "libkernel/filesystem/FileSystem.h"

#include <exception>

namespace Kernel {

Archive::ArchiveFile::ArchiveFile(OpenMode mode, IDTag archiveUID) : m_mode(mode), m_archiveUID(archiveUID) {}

Archive::ArchiveFile::~ArchiveFile()
{
    // A temporary without a revision holds a save that was never made. One with a revision could not be moved over its
    // target: it is the only copy of a save that was made, and stays.
    bool const neverSaved = !m_finalPath.IsEmpty() && m_firstFAT == 0;
    bool const remove = (m_throwAway || neverSaved) && !m_path.IsEmpty();
    // The empty file that kept the target's name goes too, unless somebody has put something there.
    bool const removeTarget = neverSaved && m_madeTarget && m_targetStream && FileSystem::GetFileSize(m_finalPath) == 0;
    if (removeTarget) FileSystem::Delete(m_finalPath, 0);
    m_stream = nullptr;
    m_targetStream = nullptr;
    if (remove) FileSystem::Delete(m_path, 0);
}

bool Archive::ArchiveFile::AdoptOwnCounter(u32 found)
{
    bool const isOwn = found == m_writeCounter || (m_guardMayBeAhead && found == m_writeCounter + 1);
    if (!isOwn) return false;
    m_writeCounter = found;
    m_guardMayBeAhead = false;
    return true;
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

bool IsSamePlace(String8 const& a, String8 const& b)
{
    try {
        return FileSystem::IsSameFile(a, b);
    } catch (std::exception const&) {
        return false; // Nothing stands at one of them.
    }
}

} // namespace Kernel

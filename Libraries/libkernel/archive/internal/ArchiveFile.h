#pragma once

#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveThumbnails.h"
#include "libkernel/archive/internal/ArchiveLocks.h"
#include "libkernel/streams/FileInOutStream.h"

#include <atomic>

namespace Kernel {

/// One disk file of an archive.
///
/// m_lock guards the stream pointer and every write; the copies of the file's fields change under it and the state lock
/// both, so that either is enough to read them. Readers take a reference to the stream under the lock and then use its
/// positional reads, so that a long read never holds up a save.
class Archive::ArchiveFile : public Countable
{
public:
    ArchiveFile(OpenMode mode, IDTag archiveUID);

    /// The stream, or null while the handle is closed. Takes m_lock.
    Counted<FileInOutStream> GetStream() const;
    /// Makes it the scratch file. Only while no other thread knows the object.
    void BecomeScratch();
    /// True if the guard's counter on disk is the one this archive left there; m_writeCounter then is @p found. The
    /// caller holds m_lock.
    bool AdoptOwnCounter(u32 found);

    OpenMode m_mode;
    bool m_readOnly = false;
    bool m_readOnlyFallback = false;            ///< Opened read-only after read-write was refused.
    std::atomic<bool> m_bad{false};             ///< Gone bad: no session may write to it any more.
    std::atomic<bool> m_lost{false};            ///< Nor read: the archive's tables are gone, or no longer the file's.
    bool m_throwAway = false;                   ///< Deleted with the archive.
    std::atomic<bool> m_moved{false};           ///< Taken away by MigratePrepare.
    std::atomic<bool> m_closedForUpdate{false}; ///< Kept closed by ExternalUpdatePrepare.
    bool m_isScratch = false;

    mutable CriticalSection m_lock{c_rankMaster};
    Counted<FileInOutStream> m_stream;       // Null while closed.
    String8 m_path;                          // Where the file lies now.
    Counted<FileInOutStream> m_targetStream; // Holds a target reserved while the file is a temporary.
    String8 m_finalPath;                     // Where the first commit moves a temporary; empty otherwise.
    String8 m_backupPath;                    // Where the replaced file goes; empty: a name of our own, if at all.
    bool m_keepBackup = false;
    bool m_madeTarget = false; // The target was not there before it was reserved.

    u16 m_fileVersion = 0;
    u16 m_flags = 0;
    IDTag m_archiveUID;
    u64 m_firstFAT = 0;
    u64 m_fileEnd = 0; // Raised to the end of the newest table when the info block says less.
    u64 m_totalBytes = 0;
    u64 m_deadBytes = 0;
    TimeStamp m_saveTimeStamp;
    u32 m_saveCount = 0;
    u32 m_nextFreeUID = 0;
    u32 m_writeCounter = 0;
    bool m_guardMayBeAhead = false;      // The last step of the guard failed, yet its bytes may have arrived.
    std::atomic<u64> m_thumbnailsPos{0}; // 0: there are none.
    bool m_infoDamaged = false;          // The info block on disk is unreadable; the next commit writes a good one.
    Archive::ArchiveInfo m_rawInfo;      // As the info block has it, for the comparison when the handle is reopened.
    bool m_hasLink = false;
    String8 m_linkPath;
    TimeStamp m_linkSaveTimeStamp;
    u32 m_linkSaveCount = 0;
    Counted<ArchiveThumbnails const> m_thumbnails; // As read or written last; null when not known.
    Counted<ArchiveReferenceInfo> m_referenceInfo;

private:
    ~ArchiveFile() override; // Deletes the file if it is throw-away or a temporary never saved into.
};

/// True when both names are the same or one file stands at both; false also when that cannot be told.
bool IsSamePlace(String8 const& a, String8 const& b);

} // namespace Kernel

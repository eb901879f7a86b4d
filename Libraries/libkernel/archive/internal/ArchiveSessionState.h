#pragma once

#include "libkernel/archive/internal/ArchiveAppender.h"
#include "libkernel/concurrency/ThreadId.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/streams/OutStream.h"
#include "libkernel/streams/ZStandardOutStream.h"

#include <deque>
#include <map>
#include <optional>
#include <unordered_map>

namespace Kernel {

class ArchiveBackData;

/// One step of a session's queue.
struct ArchiveQueueEntry
{
    enum class Operation
    {
        WriteItem = 0,
        CopyStored = 1,
        Delete = 2
    };

    Operation operation = Operation::WriteItem;
    String8 path;
    Counted<FileStoreItem const> item;
    Counted<DelayLoadHolder> holder;
    Counted<FileStoreBackData const> sourceBackData; // Copies come from here, or else from the archive below.
    Counted<Archive> sourceArchive;
    Counted<Archive::Revision const> sourceRevision;
    Counted<FileStoreCompressionHint> hint;
};

/// What an item's Save writes to: takes the CRC of the bytes as they come and hands them to the compressor, or straight
/// to the end of the file. One CRC serves both where the stored bytes are the file.
class ArchiveOutStream : public OutStream
{
public:
    /// @p appender is borrowed and must outlive the stream.
    ArchiveOutStream(ArchiveAppender& appender, FileStoreCompressionHint const* hint);

    u64 WriteBlock(void const* from, u64 count) override;
    u64 GetSizeOutStream() const override { return m_size; }
    u64 TellOutStream() const override { return m_size; }

    /// Ends the compression and closes the CRCs. Throws OutStream::WriteException if any write came up short.
    void Finish();

    u64 GetUnpackedSize() const { return m_size; }
    u32 GetCRC() const { return m_crc; }
    u32 GetStoredCRC() const;
    u8 GetCompressionCode() const;

private:
    class Sink;

    ~ArchiveOutStream() override;

    ArchiveAppender& m_appender;
    Counted<Sink> m_sink;
    Counted<ZStandardOutStream> m_compressor; // Null: stored as it is.
    u64 m_size = 0;
    u32 m_crc;
    bool m_failed = false;
};

/// Everything a session holds. The queue lock guards what several threads touch while they offer files.
struct ArchiveSession::State
{
    State(Archive& a, ArchiveImpl& i) : archive(&a), impl(i) {}

    Counted<Archive> const archive;
    ArchiveImpl& impl;
    Counted<Archive::AccessBlock> access;
    Archive::SessionType type = Archive::SessionTypeFull;
    bool enumerationOnly = false;  // Writes nothing.
    bool restartOfflining = false; // It ran when the session began.

    Counted<Archive::ArchiveFile> file; // Null for an enumeration.
    Counted<Archive::Revision> revision;
    std::optional<ArchiveAppender> appender; // Keeps the revision's end while the session writes.

    Counted<ArchiveThumbnails const> thumbnails;
    Counted<ArchiveSessionProgress> progress;
    std::vector<Counted<Archive>> sources; // Each has one access counted.

    std::unordered_map<String8, Counted<Archive::FileInfo>> newPaths;
    u32 nextFreeUID = 1;

    // Touched only by the thread that runs the queue.
    bool fileOpen = false;

    CriticalSectionSpin lock{c_rankLeaf};
    // Guarded by it, all that follows.
    std::deque<ArchiveQueueEntry> queue;
    bool queueBusy = false;
    bool nonNestable = false; // A non-nestable item is being saved, by this thread:
    ThreadId runner{nullptr};
    bool failed = false;
    bool writeFinished = false;
    bool enumerateUsed = false;
    u32 done = 0;
    u32 total = 0;
    std::set<String8> addedPaths;
    std::set<String8> enumeratedPaths;
    ArchivePathCounts pathCounts;                        // A copy of the archive's; taken over by the commit.
    std::map<Countable const*, String8> generatedPaths;  // By item or holder.
    std::vector<Counted<Countable const>> generatedKeys; // Keeps the keys' addresses from being used again.
    std::map<Counted<DelayLoadHolder>, String8> assignedPaths;

    // What the commit tells the objects.
    std::vector<Counted<FileStoreStateObject>> objectsToClean;
    std::vector<Counted<FileStorePostSaveInterface>> postSaves;
    std::vector<std::pair<Counted<DelayLoadHolder>, String8>> holderPaths;
    std::vector<Counted<FileStoreItem const>> savedItems;

    void BeginFile(String8 const& path, Archive::FileRevision*& entry);
    void FinaliseFile(Archive::FileRevision& entry, u64 size, u8 code, u32 crc, u32 storedCrc, u32 buildIndex);
    void WriteItem(ArchiveSession& session, ArchiveQueueEntry const& entry);
    void CopyStored(ArchiveQueueEntry const& entry);
    void Delete(String8 const& path);
    Counted<Archive::FileInfo> FindFile(String8 const& path);
    void NoteWritten(ArchiveQueueEntry const& entry);
    void ReportProgress();
};

} // namespace Kernel

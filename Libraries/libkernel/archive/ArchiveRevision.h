#pragma once

#include "libkernel/archive/Archive.h"
#include "libkernel/concurrency/TimeStamp.h"
#include "libkernel/core/RawData.h"
#include "libkernel/filestore/FileStoreBackData.h"
#include "libkernel/filestore/FileStoreRevision.h"
#include "libkernel/streams/CompressionPredictor.h"

#include <unordered_map>
#include <vector>

namespace Kernel {

/// One path of an archive, for as long as the file exists. One object for each path and UID.
class KERNEL_API Archive::FileInfo : public Countable
{
public:
    FileInfo(u32 uid, String8 const& path) : m_uid(uid), m_path(path) {}

    u32 GetUID() const { return m_uid; }
    String8 const& GetPath() const { return m_path; }

private:
    friend struct ArchiveImpl;
    friend class ArchiveLoader;
    friend class ArchiveCommit;
    friend class ArchiveStreamliner;
    ~FileInfo() override;

    /// Revisions, oldest first. Most files know one only, and that one takes no memory of its own.
    class History
    {
    public:
        History() : m_one(nullptr) {}
        ~History() { clear(); }
        History(History const&) = delete;
        History& operator=(History const&) = delete;

        Revision* const* begin() const { return m_capacity == 1 ? &m_one : m_many; }
        Revision* const* end() const { return begin() + m_size; }
        size_t size() const { return m_size; }
        size_t capacity() const { return m_capacity; }
        bool empty() const { return m_size == 0; }
        Revision* back() const { return begin()[m_size - 1]; }
        Revision* operator[](size_t i) const { return begin()[i]; }
        void reserve(size_t capacity);
        void push_back(Revision* revision)
        {
            if (m_size == m_capacity) reserve(size_t{2} * m_capacity);
            const_cast<Revision**>(begin())[m_size++] = revision;
        }
        void Remove(Revision const* revision);
        void clear();

    private:
        u32 m_size = 0;
        u32 m_capacity = 1;
        union
        {
            Revision* m_one;   // With a capacity of 1.
            Revision** m_many; // Above it.
        };
    };

    u32 const m_uid;
    String8 m_path; // Set once while loading, when the record that adds the file is met; empty until then.
    // Revisions that have an entry for this file, oldest first, those of the archive's revision vector only. Guarded by
    // the archive's state lock. This is what makes a look-up independent of the number of revisions.
    History m_history;
};

/// Where and how one version of a file is stored; a position of 0 marks a deletion.
struct KERNEL_API Archive::FileRevision
{
    /// How the bytes are packed.
    enum class Method
    {
        Direct = 0,
        ZLib = 1,
        ZStandard = 2
    };

    Counted<FileInfo const> info;
    Counted<FileStoreBackData const> backData; ///< Or null. Guarded by the archive's state lock.
    u64 filePos = 0;                           ///< Offset of the block's tag in its file.
    u64 fileSize = 0;                          ///< Unpacked.
    u64 fileCompressedSize = 0;                ///< As stored.
    u32 crcUncompressed = 0;
    u32 crcCompressed = 0; ///< 0: not known.
    u32 codeBaseIndex = 0; ///< Build index of the program that wrote it.
    u8 compressionCode = 0;
    bool added = false; ///< This revision adds the path.

    bool IsDeletion() const { return filePos == 0; }
    /// What the compression code says.
    Method GetMethod() const;
    CompressionPredictorType GetPredictor() const;
    CompressionPredictorStripingType GetStriping() const;
};

/// One commit. Once it is in an archive's history nothing changes but the back data of its entries.
class KERNEL_API Archive::Revision : public FileStoreRevision
{
public:
    Revision();

    bool IsScratch() const;
    TimeStamp GetTimeStamp() const { return m_timeStamp; }
    RevisionTag GetTag() const { return m_tag; }
    /// Position of the previous table in the same file; 0 for the first.
    u64 GetNextFAT() const { return m_nextFAT; }
    /// Size of the file after this revision, and the totals of stored and of unreachable bytes.
    u64 GetFileEnd() const { return m_fileEnd; }
    u64 GetTotalBytes() const { return m_totalBytes; }
    u64 GetDeadBytes() const { return m_deadBytes; }
    /// The block given with ArchiveSession::SetUserData; may be null.
    Counted<RawDataMalloc> const& GetUserData() const { return m_userData; }
    /// The files this revision changed, by rising UID once it has been committed.
    std::vector<FileRevision> const& GetEntries() const { return m_entries; }
    /// The entry for @p info, or null.
    FileRevision const* Find(FileInfo const& info) const;

private:
    friend class Archive;
    friend struct ArchiveImpl;
    friend class ArchiveLoader;
    friend class ArchiveCommit;
    friend class ArchiveSession;
    friend class ArchiveCompactWriter;
    friend class ArchiveStreamliner;
    friend class ArchiveVerifier;
    ~Revision() override;

    FileRevision* FindI(FileInfo const& info);
    /// The entry for @p info, made empty if there was none; @p made says which. Not after Freeze.
    FileRevision& FindOrAdd(Counted<FileInfo const> const& info, bool& made);
    void Remove(FileInfo const& info);
    /// Sorts by UID and drops the working index: look-ups are binary searches from here on.
    void Freeze();

    Counted<ArchiveFile> m_file;
    TimeStamp m_timeStamp;
    RevisionTag m_tag = RevisionTagFull;
    u64 m_fatPos = 0; // Where this revision's own table lies, and where it ends.
    u64 m_fatEnd = 0;
    u64 m_nextFAT = 0;
    u64 m_fileEnd = 0;
    u64 m_totalBytes = 0;
    u64 m_deadBytes = 0;
    Counted<RawDataMalloc> m_userData;
    u64 m_order = 0; // Rises through the archive's revision vector.
    std::vector<FileRevision> m_entries;
    std::unordered_map<u32, size_t> m_index; // UID to place in m_entries, while a session builds the revision.
    bool m_frozen = false;
};

} // namespace Kernel

#include "libkernel/archive/internal/ArchiveBackData.h"

#include "libkernel/archive/internal/ArchiveAppender.h"
#include "libkernel/archive/internal/ArchiveBucket.h"
#include "libkernel/archive/internal/ArchiveInStream.h"
#include "libkernel/archive/internal/ArchiveReadGate.h"
#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Limits.h"
#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/streams/BufferedInStream.h"
#include "libkernel/streams/CRC32.h"
#include "libkernel/streams/FileIOException.h"

#include <algorithm>

namespace Kernel {

using namespace ArchiveFormat;

namespace {

/// What an item gets as its store when it loads from back data: one that reaches nothing.
class BucketStubFileStore : public FileStore
{
public:
    bool LoadFile(String8 const&, NonCounted<FileStoreRevision const>, FileStoreItem&, bool) override { return false; }
    bool LoadFile(String8 const&, FileStoreItem&) override { return false; }
    Counted<FileStoreBackData const> CreateBackData(NonCounted<FileStoreRevision const>, String8 const&) override
    {
        return nullptr;
    }

protected:
    NonCounted<FileStoreRevision const> GetHeadRevisionI() const override { return nullptr; }
    NonCounted<FileStoreRevision const> GetHeadRevisionForFileI(String8 const&) const override { return nullptr; }

private:
    ~BucketStubFileStore() override { PreDestruction(); }
};

class ArchiveBackDataVoid : public FileStoreBackData
{
public:
    bool LoadItem(FileStoreItem&) const override { return false; }

private:
    ~ArchiveBackDataVoid() override = default;
};

/// The stored bytes of one copy.
class BucketInStreamDirect : public InStream
{
public:
    BucketInStreamDirect(Counted<ArchiveBackDataBucket> bucket, u64 position, u64 size)
        : m_bucket(std::move(bucket)), m_start(position), m_size(size)
    {
    }
    u64 ReadBlock(void* to, u64 count) override
    {
        count = std::min(count, m_size - m_position);
        if (count == 0 || !m_bucket->Read(m_start + m_position, to, count)) return 0;
        m_position += count;
        return count;
    }
    bool SkipBlock(u64 count) override
    {
        if (count > m_size - m_position) return false;
        m_position += count;
        return true;
    }
    u64 GetSizeInStream() const override { return m_size; }
    u64 TellInStream() const override { return m_position; }

private:
    ~BucketInStreamDirect() override = default;

    Counted<ArchiveBackDataBucket> const m_bucket;
    u64 const m_start;
    u64 const m_size;
    u64 m_position = 0;
};

/// Unpacked bytes of one copy, with a size, a read-ahead and a check of the CRC at the end.
class BucketInStreamUnpacked : public InStream
{
public:
    BucketInStreamUnpacked(Counted<InStream> unpacker, Archive::FileRevision const& entry)
        : m_unpacker(std::move(unpacker)), m_size(entry.fileSize), m_expectedCRC(entry.crcUncompressed)
    {
        CRC32::BeginCRC32(m_crc);
    }
    u64 ReadBlock(void* to, u64 count) override
    {
        u8* out = static_cast<u8*>(to);
        u64 left = std::min(count, m_size - m_position);
        u64 const wanted = left;
        while (left != 0) {
            if (m_at == m_held && !Refill()) break;
            u64 const piece = std::min(left, m_held - m_at);
            if (out) std::copy_n(m_buffer.GetData() + m_at, piece, out + (wanted - left));
            m_at += piece;
            left -= piece;
        }
        m_position += wanted - left;
        return wanted - left;
    }
    bool SkipBlock(u64 count) override { return count <= m_size - m_position && ReadBlock(nullptr, count) == count; }
    u64 GetSizeInStream() const override { return m_size; }
    u64 TellInStream() const override { return m_position; }

    /// Every byte that was read came through whole; a copy that was read to its end matches its CRC.
    bool IsSound() const
    {
        u32 crc = m_crc;
        CRC32::EndCRC32(crc);
        return !m_short && (m_unpacked != m_size || crc == m_expectedCRC);
    }

private:
    ~BucketInStreamUnpacked() override = default;

    bool Refill()
    {
        u64 const want = std::min(m_size - m_unpacked, c_copyBufferSize);
        m_held = m_unpacker->ReadBlock(m_buffer.GetData(), want);
        m_at = 0;
        m_short = m_short || m_held != want;
        CRC32::CalcCRC32(m_buffer.GetData(), m_held, m_crc);
        m_unpacked += m_held;
        return m_held != 0;
    }

    Counted<InStream> const m_unpacker;
    ArchiveCopyBuffer m_buffer;
    u64 const m_size;
    u32 const m_expectedCRC;
    u64 m_position = 0;
    u64 m_unpacked = 0;
    u64 m_at = 0;
    u64 m_held = 0;
    u32 m_crc = 0;
    bool m_short = false;
};

} // namespace

// A copy.

ArchiveBackData::ArchiveBackData(Counted<ArchiveBackDataBucket> bucket, Archive::FileRevision entry)
    : m_bucket(std::move(bucket)), m_entry(std::move(entry))
{
}

ArchiveBackData::~ArchiveBackData()
{
    m_bucket->AddDeadBytes(m_entry.fileCompressedSize);
}

bool ArchiveBackData::ReadStored(u64 offset, void* to, u64 count) const
{
    return RangeFits(offset, count, m_entry.fileCompressedSize) && m_bucket->Read(m_entry.filePos + offset, to, count);
}

bool ArchiveBackData::LoadItem(FileStoreItem& item) const
{
    struct Reading
    {
        ArchiveBackDataBucket& bucket;
        explicit Reading(ArchiveBackDataBucket& b) : bucket(b) { bucket.BeginRead(); }
        ~Reading() { bucket.EndRead(); }
    } const reading(*m_bucket);
    auto const store = MakeCounted<BucketStubFileStore>();
    auto const stored = MakeCounted<BucketInStreamDirect>(m_bucket, m_entry.filePos, m_entry.fileCompressedSize);
    Counted<InStream> const unpacker = MakeArchiveUnpacker(stored, m_entry.compressionCode);
    if (!unpacker) return false;
    auto const stream = MakeCounted<BucketInStreamUnpacked>(unpacker, m_entry);
    return item.Load(*stream, *store) && stream->IsSound();
}

// A bucket.

ArchiveBackDataBucket::ArchiveBackDataBucket(Counted<FileInOutStream> stream, String8 const& path)
    : m_stream(std::move(stream)), m_path(path)
{
}

ArchiveBackDataBucket::~ArchiveBackDataBucket()
{
    try {
        m_stream->Close();
        if (m_writer) m_writer->Close();
    } catch (FileIOException const&) {
    }
    FileSystem::Delete(m_path, 0);
}

bool ArchiveBackDataBucket::Read(u64 position, void* to, u64 count)
{
    try {
        return m_stream->ReadAt(position, to, count) == count;
    } catch (FileIOException const&) {
        return false;
    }
}

u64 ArchiveBackDataBucket::GetWritePosition() const
{
    CriticalSectionScope const lock(m_lock);
    return m_position;
}

void ArchiveBackDataBucket::AddDeadBytes(u64 count)
{
    bool remove = false;
    {
        CriticalSectionScope const lock(m_lock);
        m_deadBytes += count;
        if (m_deadBytes != m_position) return;
        remove = m_position > c_maxReusedSize;
        if (!remove) m_position = m_deadBytes = 0;
    }
    if (remove) ArchiveBackDataBucketStore::GetInstance().Remove(*this);
}

// The store of buckets.

ArchiveBackDataBucketStore::ArchiveBackDataBucketStore() : m_void(MakeCounted<ArchiveBackDataVoid>()) {}

ArchiveBackDataBucketStore& ArchiveBackDataBucketStore::GetInstance()
{
    // Never destroyed: copies may outlive everything else in the process.
    static ArchiveBackDataBucketStore* const s_instance = new ArchiveBackDataBucketStore;
    return *s_instance;
}

void ArchiveImpl::EnsureBucketStore()
{
    ArchiveBackDataBucketStore::GetInstance();
}

std::vector<Counted<ArchiveBackDataBucket>> ArchiveBackDataBucketStore::GetBuckets() const
{
    CriticalSectionScope const lock(m_lock);
    return m_buckets;
}

void ArchiveBackDataBucketStore::Clear()
{
    std::vector<Counted<ArchiveBackDataBucket>> buckets;
    CriticalSectionScope const lock(m_lock);
    buckets.swap(m_buckets);
}

void ArchiveBackDataBucketStore::Remove(ArchiveBackDataBucket const& bucket)
{
    Counted<ArchiveBackDataBucket> last; // Dies outside the lock.
    CriticalSectionScope const lock(m_lock);
    auto const it = std::find_if(m_buckets.begin(), m_buckets.end(), [&](auto const& b) { return b.Get() == &bucket; });
    if (it == m_buckets.end()) return;
    last = std::move(*it);
    m_buckets.erase(it);
}

Counted<ArchiveBackDataBucket> ArchiveBackDataBucketStore::FindBucket(u64 size)
{
    CriticalSectionScope const lock(m_lock);
    for (Counted<ArchiveBackDataBucket> const& bucket : m_buckets)
        if (RangeFits(bucket->GetWritePosition(), size, ArchiveBackDataBucket::c_maxSize)) return bucket;
    String8 path;
    try {
        Counted<FileInOutStream> const stream = TempFile::GenerateTempInOutFile(path, String8("bak"));
        if (!stream) return nullptr;
        auto bucket = MakeCounted<ArchiveBackDataBucket>(stream, path);
        m_buckets.push_back(bucket);
        return bucket;
    } catch (FileIOException const&) {
        if (!path.IsEmpty()) FileSystem::Delete(path, 0);
        return nullptr;
    }
}

Counted<ArchiveBackData> ArchiveBackDataBucketStore::Copy(ArchiveImpl& impl, Archive::ArchiveFile& file,
                                                          Archive::FileRevision const& entry,
                                                          std::atomic<bool> const* abort)
{
    for (;;) {
        Counted<ArchiveBackDataBucket> const bucket = FindBucket(entry.fileCompressedSize);
        if (!bucket) return nullptr;
        try {
            return CopyInto(*bucket, impl, file, entry, abort);
        } catch (ArchiveException const&) {
            throw;
        } catch (BackstoreException const&) {
            Remove(*bucket);
            throw;
        } catch (FileIOException const& e) {
            // What comes from the source was turned into an archive's exception on the way: this is the bucket. It
            // takes no more copies, and those that it has can still be read.
            Remove(*bucket);
            throw BackstoreException(e.GetReason() == FileIOException::Reason::OutOfSpace);
        } catch (...) {
            Remove(*bucket);
            throw BackstoreException(false);
        }
    }
}

namespace {

/// Where the stored bytes begin. Blocks that begin with four zero bytes, but not eight, come from a writer that never
/// wrote their tag; they are as sound as the others.
bool IsSoundBlockStart(FileInOutStream& stream, u64 position)
{
    u8 start[8] = {};
    u64 const got = stream.ReadAt(position, start, sizeof(start));
    if (got < c_blockTagSize) return false;
    u32 const tag = LoadLittleEndian<u32>(start);
    return tag == c_tagBlock || (tag == 0 && got == sizeof(start) && LoadLittleEndian<u32>(start + 4) != 0);
}

/// Opens a bucket's file for the copies to come.
Counted<FileInOutStream> OpenWriter(String8 const& path)
{
    File::OpenUnmanagedResult result{};
    Counted<FileInOutStream> stream = FileInOutStream::Open(path.GetData(), File::ShareMode::DenyNone, result, nullptr);
    if (!stream) throw BackstoreException(false);
    return stream;
}

} // namespace

Counted<ArchiveBackData> ArchiveBackDataBucketStore::CopyInto(ArchiveBackDataBucket& bucket, ArchiveImpl& impl,
                                                              Archive::ArchiveFile& file,
                                                              Archive::FileRevision const& entry,
                                                              std::atomic<bool> const* abort)
{
    using Reason = ArchiveFileException::Reason;
    while (bucket.m_readers.load(std::memory_order_acquire) != 0) Dispatch::Yield(Dispatch::YieldPolicy::Default);

    Counted<FileInOutStream> const from = file.GetStream();
    if (!from) impl.ThrowFileException(file, Reason::FileError);
    CriticalSectionScope const lock(bucket.m_lock);
    if (!bucket.m_writer) bucket.m_writer = OpenWriter(bucket.GetPath());
    ArchiveCopyBuffer const buffer;
    u32 crc = 0;
    CRC32::BeginCRC32(crc);
    try {
        u64 const size = from->GetSizeInStream();
        u64 blockSize = 0;
        if (!CheckedAdd(entry.fileCompressedSize, c_blockTagSize, blockSize) ||
            !RangeFits(entry.filePos, blockSize, size) || !IsSoundBlockStart(*from, entry.filePos))
            impl.ThrowFileException(file, Reason::ReadFailed);
    } catch (FileIOException const& e) {
        impl.ThrowFileException(file, ArchiveFileException::FromFileIOReason(static_cast<int>(e.GetReason())));
    }
    for (u64 at = 0; at < entry.fileCompressedSize;) {
        if (abort && abort->load(std::memory_order_relaxed)) return nullptr;
        u64 const piece = std::min(entry.fileCompressedSize - at, c_copyBufferSize);
        u64 got = 0;
        try {
            got = from->ReadAt(entry.filePos + c_blockTagSize + at, buffer.GetData(), piece);
        } catch (FileIOException const& e) {
            impl.ThrowFileException(file, ArchiveFileException::FromFileIOReason(static_cast<int>(e.GetReason())));
        }
        if (got != piece) throw BackstoreException(false);
        CRC32::CalcCRC32(buffer.GetData(), piece, crc);
        if (bucket.m_writer->WriteAt(bucket.m_position + at, buffer.GetData(), piece) != piece)
            throw BackstoreException(false);
        at += piece;
    }
    CRC32::EndCRC32(crc);
    if (crc == 0) crc = 1;
    if (entry.crcCompressed != 0 && entry.crcCompressed != crc) throw ArchiveCRCException(&impl.m_self);

    // Published only now: a reader can never see a copy in part.
    Archive::FileRevision copy = entry;
    copy.backData = nullptr;
    copy.filePos = bucket.m_position;
    copy.crcCompressed = crc;
    bucket.m_position += entry.fileCompressedSize;
    return MakeCounted<ArchiveBackData>(Counted<ArchiveBackDataBucket>(&bucket), std::move(copy));
}

// The archive's side. May run while the archive is being destroyed: nothing here takes a reference to it.

Counted<FileStoreBackData const> Archive::CreateBackData(NonCounted<FileStoreRevision const> revision,
                                                         String8 const& path)
{
    if (!revision || path.IsEmpty() || IsCorrupted()) return nullptr;
    ArchiveReadGate gate(*m);
    FileRevision entry;
    Counted<ArchiveFile> file;
    Counted<Revision> holds;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        Revision* const at = m->AsRevisionCS(revision);
        FileInfo* const info = m->FindFileInfoCS(path);
        Revision* where = nullptr;
        FileRevision* const found = at && info ? m->FindEntryCS(*info, *at, &where) : nullptr;
        if (!found || found->IsDeletion()) return nullptr;
        if (found->backData) return found->backData;
        if (found->fileCompressedSize == 0 && found->fileSize == 0) return nullptr;
        entry = *found;
        holds = Counted<Revision>(where);
        file = where->m_file;
    }
    ArchiveAccessScope const access(*m);
    if (!access.IsOpen()) return nullptr;

    ArchiveBackDataBucketStore& store = ArchiveBackDataBucketStore::GetInstance();
    if (store.IsSwitchedOff()) return store.GetVoid();
    Counted<ArchiveBackData> copy;
    try {
        copy = store.Copy(*m, *file, entry, nullptr);
    } catch (ArchiveCRCException const&) {
        gate.Leave();
        try {
            m->ReportCorruption(true);
        } catch (ArchiveCorruptionException const&) {
        }
        return nullptr;
    }
    if (!copy) return nullptr;
    return m->PublishBackData(*holds, *entry.info, copy);
}

Counted<FileStoreBackData const> ArchiveImpl::PublishBackData(Archive::Revision& revision,
                                                              Archive::FileInfo const& info,
                                                              Counted<FileStoreBackData const> const& copy)
{
    CriticalSectionScope const lock(m_stateLock);
    Archive::FileRevision* const found = revision.FindI(info);
    if (!found) return copy;
    // Two threads may have copied at once; the first copy stands.
    if (!found->backData) found->backData = copy;
    return found->backData;
}

} // namespace Kernel

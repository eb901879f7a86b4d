#include "libkernel/archive/internal/ArchiveInStream.h"

#include "libkernel/core/Endian.h"
#include "libkernel/core/Limits.h"
#include "libkernel/streams/CRC32.h"
#include "libkernel/streams/FileIOException.h"
#include "libkernel/streams/ZStandardInStream.h"
#include "libkernel/streams/ZipInStream.h"

#include <algorithm>
#include <cstring>

namespace Kernel {

using namespace ArchiveFormat;

ArchiveFileStreamReader::ArchiveFileStreamReader(Counted<Archive::ArchiveFile> file, u64 start, u64 length)
    : m_file(std::move(file)), m_start(start), m_length(length)
{
}

ArchiveFileStreamReader::~ArchiveFileStreamReader() = default;

u64 ArchiveFileStreamReader::ReadBlock(void* to, u64 count)
{
    count = std::min(count, m_length - m_position);
    if (count == 0) return 0;
    Counted<FileInOutStream> const stream = m_file->GetStream();
    u64 got = 0;
    try {
        if (stream) got = stream->ReadAt(m_start + m_position, to, count);
    } catch (FileIOException const&) {
    }
    m_failed = m_failed || got != count;
    m_position += got;
    return got;
}

bool ArchiveFileStreamReader::SkipBlock(u64 count)
{
    if (count > m_length - m_position) return false;
    m_position += count;
    return true;
}

Counted<InStream> MakeArchiveUnpacker(Counted<InStream> const& stored, u8 code)
{
    auto const type = static_cast<CompressionPredictorType>(PredictorOf(code));
    auto const striping = static_cast<CompressionPredictorStripingType>(StripingOf(code));
    switch (MethodOf(code)) {
    case MethodZLib: return ZipInStream::Create(stored, type, striping, false);
    case MethodZStandard: return ZStandardInStream::Create(stored, type, striping, false);
    default: return stored;
    }
}

void ThrowIfOutOfMemory(Counted<InStream> const& unpacker)
{
    auto const* const decompressor = dynamic_cast<CompressionInStream const*>(unpacker.Get());
    if (decompressor && decompressor->LacksMemory()) throw MemoryException();
}

ArchiveInStream::ArchiveInStream(Counted<Archive> archive, ArchiveImpl& impl, Counted<Archive::AccessBlock> access,
                                 Counted<Archive::ArchiveFile> file, Counted<Archive::Revision const> revision,
                                 Archive::FileRevision const& entry)
    : m_archive(std::move(archive)), m_impl(impl), m_access(std::move(access)), m_file(std::move(file)),
      m_revision(std::move(revision)),
      m_reader(MakeCounted<ArchiveFileStreamReader>(m_file, entry.filePos + c_blockTagSize, entry.fileCompressedSize)),
      m_size(entry.fileSize), m_expectedCRC(entry.crcUncompressed), m_code(entry.compressionCode),
      m_buffer(nullptr, std::free), m_bufferSize(std::min(entry.fileSize, c_copyBufferSize))
{
    CRC32::BeginCRC32(m_crc);
    // Last, so that the destructor takes back exactly what was counted.
    CriticalSectionScope const lock(m_impl.m_stateLock);
    ++m_impl.m_openInStreams;
}

ArchiveInStream::~ArchiveInStream()
{
    m_impl.CloseInStream();
}

bool ArchiveInStream::Init()
{
    m_unpacker = MakeArchiveUnpacker(m_reader, m_code);
    if (m_bufferSize != 0) m_buffer.reset(static_cast<u8*>(std::malloc(m_bufferSize)));
    return m_unpacker && (m_bufferSize == 0 || m_buffer);
}

u64 ArchiveInStream::ReadUnpacked(void* to, u64 count)
{
    u64 const got = m_unpacker->ReadBlock(to, count);
    CRC32::CalcCRC32(to, got, m_crc);
    m_unpacked += got;
    if (got == count) return got;
    if (m_reader->HasFailed()) m_impl.ThrowFileException(*m_file, ArchiveFileException::Reason::ReadFailed);
    ThrowIfOutOfMemory(m_unpacker);
    m_impl.ReportCorruption(false); // The bytes are there and end too early.
    return got;
}

bool ArchiveInStream::Refill()
{
    m_bufferLeft = ReadUnpacked(m_buffer.get(), std::min(m_bufferSize, m_size - m_unpacked));
    m_bufferRead = m_buffer.get();
    return m_bufferLeft != 0;
}

void ArchiveInStream::CheckEnd()
{
    if (m_position != m_size) return;
    u32 crc = m_crc;
    CRC32::EndCRC32(crc);
    if (crc != m_expectedCRC) m_impl.ReportCorruption(false);
}

u64 ArchiveInStream::ReadBlock(void* to, u64 count)
{
    if (m_position == m_size) return 0;
    count = std::min(count, m_size - m_position);
    u8* out = static_cast<u8*>(to);
    u64 left = count;
    while (left != 0) {
        if (m_bufferLeft == 0 && left >= m_bufferSize) {
            // A predictor works on whole elements, so what goes straight to the caller ends on one; the largest is 4.
            u64 const direct = left == m_size - m_unpacked ? left : left & ~u64{7};
            ReadUnpacked(out, direct);
            out += direct;
            left -= direct;
            continue;
        }
        if (m_bufferLeft == 0 && !Refill()) break;
        u64 const piece = std::min(left, m_bufferLeft);
        std::memcpy(out, m_bufferRead, piece);
        m_bufferRead += piece;
        m_bufferLeft -= piece;
        out += piece;
        left -= piece;
    }
    m_position += count - left;
    CheckEnd();
    return count - left;
}

bool ArchiveInStream::SkipBlock(u64 count)
{
    if (count > m_size - m_position) return false;
    // Bytes that are skipped are unpacked all the same: the check at the end covers the whole file.
    while (count != 0) {
        if (m_bufferLeft == 0 && !Refill()) return false;
        u64 const piece = std::min(count, m_bufferLeft);
        m_bufferRead += piece;
        m_bufferLeft -= piece;
        m_position += piece;
        count -= piece;
    }
    CheckEnd();
    return true;
}

ArchiveInStreamScoped::~ArchiveInStreamScoped() = default;

ArchiveReadCounterScope::ArchiveReadCounterScope(Counted<Archive> archive, ArchiveImpl& impl)
    : m_archive(std::move(archive)), m_impl(impl)
{
    CriticalSectionScope const lock(m_impl.m_stateLock);
    ++m_impl.m_readerCount;
    m_impl.m_readInProgress = true;
}

ArchiveReadCounterScope::~ArchiveReadCounterScope()
{
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        --m_impl.m_readerCount;
    }
    m_impl.ResumeOffliningIfNoReader();
}

Counted<InStream> ArchiveImpl::CreateInStream(Counted<Archive::Revision const> const& revision,
                                              Archive::FileRevision const& entry, InStreamResult& result)
{
    Archive::ArchiveFile& file = *revision->m_file;
    result = InStreamResult::Failure;
    Counted<Archive> const archive(&m_self);
    ArchiveReadCounterScope const reading(archive, *this);
    if (file.m_moved) return nullptr;
    Counted<Archive::AccessBlock> const access =
        m_self.BeginAccessBlockAndOpenFileHandle(m_self.CreateAccessBlockAdorner());
    if (!access) return nullptr;
    if (!SizesArePlausible(entry.compressionCode, entry.fileSize, entry.fileCompressedSize)) {
        result = InStreamResult::Corrupt;
        return nullptr;
    }
    switch (CheckBlockTag(file, entry)) {
    case Archive::BlockCheck::Ok: break;
    case Archive::BlockCheck::BadTag: result = InStreamResult::Corrupt; return nullptr;
    default: return nullptr;
    }
    Counted<Archive::ArchiveFile> const counted(&file);
    bool const scoped = MethodOf(entry.compressionCode) != MethodZStandard;
    Counted<ArchiveInStream> const stream(
        scoped ? new ArchiveInStreamScoped(archive, *this, access, counted, revision, entry)
               : new ArchiveInStream(archive, *this, access, counted, revision, entry));
    if (!stream->Init()) return nullptr;
    result = InStreamResult::Success;
    return stream;
}

Archive::BlockCheck ArchiveImpl::CheckBlockTag(Archive::ArchiveFile& file, Archive::FileRevision const& entry) const
{
    u8 tag[c_blockTagSize];
    Counted<FileInOutStream> const stream = file.GetStream();
    // That is damage of the table, not of the disk.
    if (entry.filePos >= c_noBlockPos) return Archive::BlockCheck::BadTag;
    try {
        if (!stream || stream->ReadAt(entry.filePos, tag, sizeof(tag)) != sizeof(tag))
            return Archive::BlockCheck::Unreadable;
    } catch (FileIOException const&) {
        return Archive::BlockCheck::Unreadable;
    }
    return LoadLittleEndian<u32>(tag) == c_tagBlock ? Archive::BlockCheck::Ok : Archive::BlockCheck::BadTag;
}

void ArchiveImpl::CloseInStream()
{
    CriticalSectionScope const lock(m_stateLock);
    --m_openInStreams;
}

} // namespace Kernel

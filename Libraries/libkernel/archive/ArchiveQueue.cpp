#include "libkernel/archive/internal/ArchiveBackData.h"
#include "libkernel/archive/internal/ArchiveReadGate.h"
#include "libkernel/archive/internal/ArchiveSessionState.h"
#include "libkernel/core/BuildNumber.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/Limits.h"
#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/streams/CRC32.h"
#include "libkernel/streams/FileIOException.h"
#include "libkernel/streams/NullOutStream.h"

#include <algorithm>
#include <limits>

// A session's queue: entries run one at a time, in order, on the thread that found the queue idle. A file that an item
// names in its Save is only queued, so that no file is ever written inside another.

namespace Kernel {

using namespace ArchiveFormat;
using Operation = ArchiveQueueEntry::Operation;

void ArchiveSession::State::ReportProgress()
{
    if (!progress) return;
    u32 nowDone = 0;
    u32 nowTotal = 0;
    {
        CriticalSectionSpinScope const scope(lock);
        nowDone = done;
        nowTotal = total;
    }
    progress->OnProgress(nowDone, nowTotal);
}

void ArchiveSession::RunQueue()
{
    {
        CriticalSectionSpinScope const lock(m->lock);
        if (m->queueBusy) return;
        m->queueBusy = true;
    }
    try {
        ProcessQueueEntries();
    } catch (AbortException const&) {
        SetAborted();
        CriticalSectionSpinScope const lock(m->lock);
        m->queueBusy = false;
        m->nonNestable = false;
        throw;
    } catch (...) {
        CriticalSectionSpinScope const lock(m->lock);
        m->queueBusy = false;
        m->nonNestable = false;
        m->failed = true;
        throw;
    }
}

void ArchiveSession::ProcessQueueEntries()
{
    for (;;) {
        if (IsAbortRequested()) {
            SetAborted();
            throw AbortException();
        }
        ArchiveQueueEntry entry;
        {
            // Taking the last entry and going idle are one step: an entry pushed later finds the queue idle.
            CriticalSectionSpinScope const lock(m->lock);
            if (m->queue.empty()) {
                m->queueBusy = false;
                return;
            }
            entry = std::move(m->queue.front());
            m->queue.pop_front();
        }
        switch (entry.operation) {
        case Operation::WriteItem: m->WriteItem(*this, entry); break;
        case Operation::CopyStored: m->CopyStored(entry); break;
        case Operation::Delete: m->Delete(entry.path); break;
        }
        m->NoteWritten(entry);
        m->ReportProgress();
    }
}

void ArchiveSession::State::NoteWritten(ArchiveQueueEntry const& entry)
{
    CriticalSectionSpinScope const scope(lock);
    ++done;
    if (entry.operation == Operation::Delete || type == Archive::SessionTypeExport) return;
    if (entry.item) savedItems.push_back(entry.item);
    if (entry.holder) holderPaths.emplace_back(entry.holder, entry.path);
}

Counted<Archive::FileInfo> ArchiveSession::State::FindFile(String8 const& path)
{
    {
        CriticalSectionScope const scope(impl.m_stateLock);
        if (Archive::FileInfo* const known = impl.FindFileInfoCS(path)) return Counted<Archive::FileInfo>(known);
    }
    auto const it = newPaths.find(path);
    return it == newPaths.end() ? nullptr : it->second;
}

void ArchiveSession::State::BeginFile(String8 const& path, Archive::FileRevision*& entry)
{
    if (static_cast<u64>(path.GetLength()) > c_maxPathSize) throw OutStream::WriteException();
    Counted<Archive::FileInfo> info = FindFile(path);
    bool const isNew = !info;
    if (isNew) {
        // The highest number stays free, so that the stored next one always fits.
        if (nextFreeUID == std::numeric_limits<u32>::max()) throw OutStream::WriteException();
        info = MakeCounted<Archive::FileInfo>(nextFreeUID, path);
        newPaths.emplace(path, info);
        ++nextFreeUID;
    }
    bool made = false;
    Archive::FileRevision& found = revision->FindOrAdd(info, made);
    // Written twice in one session: the first block stays in the file as dead weight.
    if (!made) revision->m_deadBytes += found.fileCompressedSize;
    found = Archive::FileRevision();
    found.info = info;
    found.added = isNew;
    found.filePos = appender->GetEnd();
    entry = &found;

    u8 tag[c_blockTagSize];
    StoreLittleEndian(tag, c_tagBlock);
    appender->Append(tag, sizeof(tag));
}

void ArchiveSession::State::FinaliseFile(Archive::FileRevision& entry, u64 size, u8 code, u32 crc, u32 storedCrc,
                                         u32 buildIndex)
{
    u8 end[c_blockEndSize];
    StoreLittleEndian(end, c_blockEnd);
    appender->Append(end, sizeof(end));
    entry.fileSize = size;
    entry.fileCompressedSize = appender->GetEnd() - entry.filePos - c_blockTagSize - c_blockEndSize;
    entry.crcUncompressed = crc;
    entry.crcCompressed = storedCrc == 0 ? 1 : storedCrc; // 0 means that none is known.
    entry.codeBaseIndex = buildIndex;
    entry.compressionCode = code;
    revision->m_totalBytes += entry.fileCompressedSize;
    revision->m_fileEnd = appender->GetEnd();
}

void ArchiveSession::State::WriteItem(ArchiveSession& session, ArchiveQueueEntry const& queued)
{
    bool const nestable = queued.item->GetObjectFileStoreItemType()->IsNestable();
    if (enumerationOnly) {
        // The save only names what the item holds; items that hold nothing need not run it.
        if (nestable) queued.item->Save(*MakeCounted<NullOutStream>(), session);
        return;
    }
    Archive::FileRevision* entry = nullptr;
    BeginFile(queued.path, entry);
    {
        CriticalSectionSpinScope const scope(lock);
        nonNestable = !nestable;
        runner = ThreadId::GetCurrent();
    }
    fileOpen = true;
    auto const stream = MakeCounted<ArchiveOutStream>(*appender, queued.hint.Get());
    queued.item->Save(*stream, session);
    stream->Finish();
    // The entry's address holds: only this thread changes the revision, and a Save cannot get here.
    FinaliseFile(*entry, stream->GetUnpackedSize(), stream->GetCompressionCode(), stream->GetCRC(),
                 stream->GetStoredCRC(), BuildNumber::ProductionIndex());
    fileOpen = false;
    CriticalSectionSpinScope const scope(lock);
    nonNestable = false;
}

namespace {

/// A source that cannot be read fails the save in one way, whatever the reason.
bool ReadAll(FileInOutStream* stream, u64 position, void* to, u64 count)
{
    try {
        return stream && stream->ReadAt(position, to, count) == count;
    } catch (FileIOException const&) {
        return false;
    }
}

/// Stored bytes of one file, wherever they lie.
class StoredSource
{
public:
    StoredSource(ArchiveBackData const* backData, Counted<FileInOutStream> stream, u64 position)
        : m_backData(backData), m_stream(std::move(stream)), m_position(position)
    {
    }
    bool Read(u64 offset, void* to, u64 count) const
    {
        if (m_backData) return m_backData->ReadStored(offset, to, count);
        return ReadAll(m_stream.Get(), m_position + offset, to, count);
    }

private:
    ArchiveBackData const* m_backData;
    Counted<FileInOutStream> m_stream;
    u64 m_position;
};

bool IsBlockAt(FileInOutStream* stream, u64 position)
{
    u8 tag[c_blockTagSize];
    return ReadAll(stream, position, tag, sizeof(tag)) && LoadLittleEndian<u32>(tag) == c_tagBlock;
}

} // namespace

void ArchiveSession::State::CopyStored(ArchiveQueueEntry const& queued)
{
    Archive::FileRevision source;
    Counted<FileInOutStream> stream;
    Counted<FileStoreBackData const> backData = queued.sourceBackData;
    std::optional<ArchiveReadGate> gate; // Held over the copy: a streamline of the source would move its bytes.
    if (!backData) {
        ArchiveImpl& from = *queued.sourceArchive->m;
        gate.emplace(from);
        String8 sourcePath;
        if (!queued.holder->GetPath(*queued.sourceArchive, sourcePath)) return;
        // One since the copy was queued has moved the holder on.
        NonCounted<FileStoreRevision const> present = queued.sourceRevision.Get();
        queued.holder->IsBackedBy(*queued.sourceArchive, present);
        Counted<Archive::ArchiveFile> sourceFile;
        {
            CriticalSectionScope const scope(from.m_stateLock);
            Archive::Revision const* at = from.AsRevisionCS(queued.sourceRevision.Get());
            if (!at) at = from.AsRevisionCS(present);
            // To leave the file out without a word would lose it.
            if (!at) throw OutStream::WriteException();
            Archive::FileInfo* const info = from.FindFileInfoCS(sourcePath);
            Archive::Revision* where = nullptr;
            Archive::FileRevision* const found = info ? from.FindEntryCS(*info, *at, &where) : nullptr;
            if (!found || found->IsDeletion()) return;
            source = *found;
            sourceFile = where->m_file;
        }
        backData = source.backData;
        if (!backData) stream = sourceFile->GetStream();
    }
    auto const* const copy = dynamic_cast<ArchiveBackData const*>(backData.Get());
    if (copy) source = copy->GetEntry();
    if (!copy && !IsBlockAt(stream.Get(), source.filePos)) throw OutStream::WriteException();

    StoredSource const bytes(copy, stream, source.filePos + c_blockTagSize);
    Archive::FileRevision* entry = nullptr;
    BeginFile(queued.path, entry);
    bool const needsCRC = source.crcCompressed == 0;
    u32 crc = 0;
    CRC32::BeginCRC32(crc);
    for (u64 at = 0; at < source.fileCompressedSize;) {
        u64 const piece = std::min(source.fileCompressedSize - at, c_copyBufferSize);
        u8* const space = appender->GetSpace(piece);
        if (!bytes.Read(at, space, piece)) throw OutStream::WriteException();
        if (needsCRC) CRC32::CalcCRC32(space, piece, crc);
        appender->CommitSpace(piece);
        at += piece;
    }
    CRC32::EndCRC32(crc);
    FinaliseFile(*entry, source.fileSize, source.compressionCode, source.crcUncompressed,
                 needsCRC ? crc : source.crcCompressed, source.codeBaseIndex);
}

void ArchiveSession::State::Delete(String8 const& path)
{
    Counted<Archive::FileInfo> const info = FindFile(path);
    if (!info) return;
    bool made = false;
    Archive::FileRevision& entry = revision->FindOrAdd(info, made);
    if (!made) revision->m_deadBytes += entry.fileCompressedSize;
    bool const wasAdded = !made && entry.added;
    entry = Archive::FileRevision();
    entry.info = info;
    entry.added = wasAdded;
}

} // namespace Kernel

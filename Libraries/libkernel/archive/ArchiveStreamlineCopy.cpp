#include "libkernel/archive/internal/ArchiveProxies.h"
#include "libkernel/archive/internal/ArchiveStreamliner.h"
#include "libkernel/core/Limits.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/streams/FileIOException.h"

#include <algorithm>
#include <new>

// Compact copies that leave the archive's own files as they are, and those that the archive goes on with.

namespace Kernel {

using Result = Archive::StreamlineResult;

// To write over a file that is being read from would lose it.
bool ArchiveStreamliner::IsOwnFile(String8 const& path) const
{
    String8 own[2];
    {
        CriticalSectionScope const lock(m_impl.m_stateLock);
        if (m_impl.m_master) own[0] = m_impl.m_master->m_path;
        if (m_impl.m_scratch) own[1] = m_impl.m_scratch->m_path;
    }
    return std::any_of(std::begin(own), std::end(own),
                       [&](String8 const& mine) { return !mine.IsEmpty() && IsSamePlace(mine, path); });
}

namespace {

/// A new file on the device, or none.
Result WriteFile(ArchiveImpl& impl, Archive::ArchiveFile& file, bool copyThumbnails, Archive::StreamlineData& data,
                 std::vector<Archive::LostFile>* lost = nullptr)
{
    ArchiveCompactWriter::Options options;
    options.copyThumbnails = copyThumbnails;
    options.lost = lost;
    Result const result = ArchiveCompactWriter::StreamlineToArchiveFileI(impl, file, *file.m_stream, options, data);
    if (result != Archive::StreamlineDone) return result;
    bool const flushed = FlushArchiveFile(*file.m_stream) && FlushFolderOf(file.m_path);
    return flushed ? Archive::StreamlineDone : Archive::StreamlineNoAccess;
}

void Discard(Archive::ArchiveFile& file)
{
    file.m_stream = nullptr;
    FileSystem::Delete(file.m_path, 0);
}

} // namespace

Result Archive::StreamlineToNew(String8 const& path) const
{
    return ArchiveStreamliner(*m).StreamlineToNew(path);
}

Result Archive::SalvageToNew(String8 const& path, std::vector<LostFile>& lost) const
{
    lost.clear();
    return ArchiveStreamliner(*m).StreamlineToNew(path, &lost);
}

Result ArchiveStreamliner::StreamlineToNew(String8 const& path, std::vector<Archive::LostFile>* lost)
{
    if (path.IsEmpty()) return Archive::StreamlineFailed;
    return RunInTurn([&](bool& suspended) {
        Access const access = BeginAccess(m_impl.m_self.CreateAccessBlockAdorner(), false, suspended);
        if (!access) return Archive::StreamlineNoAccess;
        if (IsOwnFile(path)) return Archive::StreamlineNotCreated;
        Counted<File> const file = MakeFile(1);
        file->m_mode = Archive::OpenModeReadWrite;
        file->m_path = path;
        file->m_stream = CreateStream(path, false);
        if (!file->m_stream) return Archive::StreamlineNotCreated;
        Archive::StreamlineData data;
        Result const result = WriteFile(m_impl, *file, true, data, lost);
        if (result != Archive::StreamlineDone) Discard(*file);
        return result;
    });
}

Result Archive::StreamlineAndSwitch(String8 const& path)
{
    return ArchiveStreamliner(*m).StreamlineAndSwitchI(path, false);
}

Result Archive::StreamlineAndSwitchAsScratch(String8 const& path)
{
    return ArchiveStreamliner(*m).StreamlineAndSwitchI(path, true);
}

Result ArchiveStreamliner::StreamlineAndSwitchI(String8 const& path, bool asScratch)
{
    if (path.IsEmpty()) return Archive::StreamlineFailed;
    return RunInTurn([&](bool& suspended) {
        m_impl.WaitForOffliningToAbort();
        Access const access = BeginAccess(m_impl.m_self.CreateExclusiveAccessBlockAdorner(), true, suspended);
        if (!access) return Archive::StreamlineNoAccess;
        if (IsOwnFile(path)) return Archive::StreamlineNotCreated;
        ArchiveReadersOff const readersOff(m_impl);
        if (!readersOff.IsClosed()) return Archive::StreamlineFailed;
        Counted<File> const file = MakeFile(1);
        file->m_path = path;
        file->m_stream = CreateStream(path, false);
        if (!file->m_stream) return Archive::StreamlineNotCreated;
        Archive::StreamlineData data;
        Result result = WriteFile(m_impl, *file, true, data);
        if (result == Archive::StreamlineDone && !ReleaseHolders(data)) result = Archive::StreamlineFailed;
        if (result != Archive::StreamlineDone) {
            Discard(*file);
            return result;
        }
        if (asScratch) file->BecomeScratch();
        {
            CriticalSectionScope const lock(m_impl.m_accessLock);
            Publish(file, data, asScratch);
        }
        m_impl.m_self.UpdateDelayLoadOwners(m_impl.m_revisions.back().Get());
        return Archive::StreamlineDone;
    });
}

Archive::ConvertToThrowAwayResult Archive::ConvertToThrowAway()
{
    return ArchiveStreamliner(*m).ConvertToThrowAway();
}

Archive::ConvertToThrowAwayResult ArchiveStreamliner::ConvertToThrowAway()
{
    if (m_impl.m_self.IsThrowAway()) return Archive::ConvertDone;
    bool noMemory = false;
    Result const result = RunInTurn([&](bool& suspended) {
        m_impl.WaitForOffliningToAbort();
        Access const access = BeginAccess(m_impl.m_self.CreateExclusiveAccessBlockAdorner(), true, suspended);
        if (!access) return Archive::StreamlineNoAccess;
        ArchiveReadersOff const readersOff(m_impl);
        if (!readersOff.IsClosed()) return Archive::StreamlineFailed;
        try {
            Counted<File> const file = MakeFile(1);
            file->m_mode = Archive::OpenModeReadWrite;
            file->m_stream = TempFile::GenerateTempInOutFile(file->m_path, String8("tmp"));
            if (!file->m_stream) return Archive::StreamlineFailed;
            // From here on the file goes with its object.
            file->m_throwAway = true;
            Archive::StreamlineData data;
            if (WriteFile(m_impl, *file, false, data) != Archive::StreamlineDone) return Archive::StreamlineFailed;
            if (!ReleaseHolders(data)) return Archive::StreamlineFailed;
            {
                CriticalSectionScope const lock(m_impl.m_accessLock);
                Publish(file, data, false);
            }
            m_impl.m_self.UpdateDelayLoadOwners(m_impl.m_revisions.back().Get());
            return Archive::StreamlineDone;
        } catch (std::bad_alloc const&) {
            noMemory = true;
            return Archive::StreamlineFailed;
        }
    });
    if (noMemory) return Archive::ConvertNoMemory;
    switch (result) {
    case Archive::StreamlineDone: return Archive::ConvertDone;
    case Archive::StreamlineNoAccess: return Archive::ConvertNoAccess;
    default: return Archive::ConvertFailed;
    }
}

namespace {

bool CopyPieces(FileInOutStream& from, u64 size, OutStream& out)
{
    ArchiveCopyBuffer const buffer;
    for (u64 at = 0; at < size;) {
        u64 const piece = std::min(size - at, c_copyBufferSize);
        if (from.ReadAt(at, buffer.GetData(), piece) != piece) return false;
        if (out.WriteBlock(buffer.GetData(), piece) != piece) return false;
        at += piece;
    }
    return true;
}

} // namespace

Result Archive::StreamlineToOutStream(OutStream& out) const
{
    return ArchiveStreamliner(*m).StreamlineToOutStream(out);
}

Result Archive::StreamlineToFragmentedRawData(FragmentedRawData& data) const
{
    return StreamlineToOutStream(*MakeCounted<DataOutStreamProxy>(data));
}

Result ArchiveStreamliner::StreamlineToOutStream(OutStream& out)
{
    return RunInTurn([&](bool& suspended) {
        Access const access = BeginAccess(m_impl.m_self.CreateAccessBlockAdorner(), false, suspended);
        if (!access) return Archive::StreamlineNoAccess;
        Counted<File> master;
        u64 size = 0;
        {
            CriticalSectionScope const lock(m_impl.m_stateLock);
            bool const headInScratch = !m_impl.m_revisions.empty() && m_impl.m_revisions.back()->IsScratch();
            // After a rewind the file holds more than is shown.
            if (!headInScratch && m_impl.m_rewindCount == 0) master = m_impl.m_master;
            if (master) size = master->m_fileEnd;
        }
        if (master && m_impl.ShowsItself(*master) && !RequiresStreamliningCS()) {
            Counted<FileInOutStream> const stream = master->GetStream();
            try {
                return stream && CopyPieces(*stream, size, out) ? Archive::StreamlineDone : Archive::StreamlineFailed;
            } catch (Exception const&) {
                return Archive::StreamlineFailed;
            }
        }
        Counted<File> const file = MakeFile(1);
        Archive::StreamlineData data;
        auto const target = MakeCounted<OutStreamProxy>(out);
        return ArchiveCompactWriter::StreamlineToArchiveFileI(m_impl, *file, *target, {}, data);
    });
}

Counted<RawData> Archive::ExtractToRawData() const
{
    for (;;) {
        m->WaitWhileSuspended();
        CriticalSectionScope const sessionLock(m->m_sessionLock);
        Counted<ArchiveFile> file;
        u64 size = 0;
        {
            CriticalSectionScope const lock(m->m_stateLock);
            if (m->m_activeSession || (m->m_master && m->m_scratch)) return nullptr;
            file = m->m_master ? m->m_master : m->m_scratch;
            if (file) size = file->m_fileEnd;
        }
        bool suspended = false;
        ArchiveAccessScope const access(*m, suspended);
        if (suspended) continue; // Again, between the wait and the lock.
        // What somebody else has saved meanwhile lies behind the end that is known here.
        if (!file || !access.IsOpen() || !m->HasHeldInfo(*file)) return nullptr;
        Counted<FileInOutStream> const stream = file->GetStream();
        try {
            if (!stream || size > stream->GetSizeInStream()) return nullptr;
            auto data = MakeCounted<RawData>(size);
            if (!data->GetData() || stream->ReadAt(0, data->GetData(), size) != size) return nullptr;
            return data;
        } catch (FileIOException const&) {
            return nullptr;
        }
    }
}

} // namespace Kernel

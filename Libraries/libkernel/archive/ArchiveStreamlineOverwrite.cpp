#include "libkernel/archive/internal/ArchiveStreamliner.h"
#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/streams/FileIOException.h"
#include "libkernel/streams/StreamCopyProgress.h"

// The compact file is written to a temporary elsewhere, and its bytes then go over the master's: for a master that is
// held open or cannot be renamed. The master's header gets the mid-streamline mark, on the device, before any other
// byte changes, and loses it only when all others are there. So a power cut leaves the old document, the new one, or
// one that says that the temporary has it; and that one is on the device by then.

namespace Kernel {

using namespace ArchiveFormat;
using Result = Archive::StreamlineResult;

namespace {

// Passes progress on, if somebody asks for it, and lets the device begin with what has been copied, so that the flush
// at the end finds little left to do.
class ArchiveStreamCopyProgress : public StreamCopyProgress
{
public:
    ArchiveStreamCopyProgress(FileInOutStream const& to, ArchiveStreamlineProgress* progress)
        : m_to(to), m_progress(progress)
    {
    }
    void ReportProgress(u64 done, u64 total) override
    {
        if (done > m_started) m_to.StartWriteBack(c_headerSize + m_started, done - m_started);
        m_started = done;
        if (m_progress) m_progress->OnProgress(done, total);
    }

private:
    FileInOutStream const& m_to;
    ArchiveStreamlineProgress* const m_progress;
    u64 m_started = 0;
};

bool WriteHeader(FileInOutStream& stream, u8 const (&header)[c_headerSize])
{
    return stream.WriteAt(c_headerPos, header, sizeof(header)) == sizeof(header) && FlushArchiveFile(stream);
}

} // namespace

Result ArchiveStreamliner::StreamlineToTempAndOverwrite()
{
    if (!TempFile::HaveTempPath()) return Archive::StreamlineFailed;
    String8 tempPath;
    bool const folder = m_master->m_throwAway ? TempFile::c_primary : TempFile::c_second;
    m_newFile->m_stream = TempFile::GenerateTempInOutFile(tempPath, String8("tmp"), folder);
    if (!m_newFile->m_stream) return Archive::StreamlineFailed;
    if (Result const result = WriteCompactFile(tempPath)) return result;
    return OverwriteI(tempPath);
}

Result ArchiveStreamliner::OverwriteI(String8 const& tempPath)
{
    auto const [done, noSpace] = StreamlineOverwriteOriginalFile(tempPath);
    if (done) return Archive::StreamlineDone;
    return noSpace ? Archive::StreamlineNoSpace : Archive::StreamlineOverwriteFailed;
}

std::pair<bool, bool> ArchiveStreamliner::StreamlineOverwriteOriginalFile(String8 const& tempPath)
{
    constexpr int c_attempts = 3;
    bool done = false;
    bool noSpace = false;
    bool final = false;
    for (int i = 0; i < c_attempts && !done && !final; ++i) {
        if (i > 0) Dispatch::Sleep(FileSystem::c_retryPauseMs);
        try {
            done = TryOverwrite(tempPath);
        } catch (FileIOException const& e) {
            using Reason = FileIOException::Reason;
            noSpace = e.GetReason() == Reason::OutOfSpace;
            final = noSpace || e.GetReason() == Reason::FileHandleLost || e.GetReason() == Reason::SocketNotConnected ||
                    e.GetReason() == Reason::NotAllowed;
        } catch (OutStream::WriteException const&) {
        } catch (...) {
            // The host's own, out of its progress object; the master is half written over by then.
            final = true;
        }
    }
    if (!done) {
        // The temporary stays: the master may be neither the old document nor the new one.
        m_newFile->m_stream = nullptr;
        m_master->m_bad = true;
        m_master->m_lost = true;
        m_data = {};
        return {false, noSpace};
    }
    {
        CriticalSectionScope const access(m_impl.m_accessLock);
        CriticalSectionScope const lock(m_master->m_lock);
        m_newFile->m_stream = std::move(m_master->m_stream);
        m_master->m_stream = nullptr;
    }
    m_newFile->m_flags = c_flagStreamlined;
    {
        CriticalSectionScope const access(m_impl.m_accessLock);
        Publish(m_newFile, m_data, false);
    }
    m_impl.m_self.UpdateDelayLoadOwners(m_impl.m_revisions.back().Get());
    FileSystem::Delete(tempPath, 0);
    return {true, false};
}

/// A stream that failed once stays broken: each attempt has whole ones, or none.
bool ArchiveStreamliner::ReopenIfBroken(File& file, String8 const& path)
{
    CriticalSectionScope const lock(file.m_lock);
    if (file.m_stream && !file.m_stream->IsBroken()) return true;
    file.m_stream = nullptr;
    Kernel::File::OpenUnmanagedResult result{};
    file.m_stream = FileInOutStream::Open(path.GetData(), Kernel::File::ShareMode::DenyWrite, result, nullptr);
    return static_cast<bool>(file.m_stream);
}

// Not under the master's lock: readers are kept out and the session lock is held, and a progress object may ask the
// archive how it stands.
bool ArchiveStreamliner::TryOverwrite(String8 const& tempPath)
{
    if (!ReopenIfBroken(*m_master, m_master->m_path) || !ReopenIfBroken(*m_newFile, tempPath)) return false;
    Counted<FileInOutStream> const to = m_master->GetStream();
    Counted<FileInOutStream> const from = m_newFile->GetStream();
    u8 header[c_headerSize];
    if (from->ReadAt(c_headerPos, header, sizeof(header)) != sizeof(header) || !WriteHeader(*to, header)) return false;

    u64 const size = from->GetSizeInStream();
    if (!from->SeekInStream(SeekMethod::Beginning, c_headerSize)) return false;
    if (!to->SeekInStream(SeekMethod::Beginning, c_headerSize)) return false;
    ArchiveStreamCopyProgress progress(*to, m_request->progress.Get());
    if (!to->CopyFromStream(*from, &progress) || to->TellOutStream() != size || !to->Flush()) return false;
    if (!to->Truncate(size) || !FlushArchiveFile(*to)) return false; // Both at once: the mark goes only behind this.

    Archive::ArchiveHdr decoded;
    if (to->ReadAt(c_headerPos, header, sizeof(header)) != sizeof(header) || !DecodeHeader(header, decoded))
        return false;
    if (decoded.fileVersion < c_oldestVersion || decoded.fileVersion > c_version) return false;
    decoded.flags = static_cast<u16>((decoded.flags & 0xFB) | c_flagStreamlined);
    EncodeHeader(header, decoded);
    return WriteHeader(*to, header);
}

} // namespace Kernel

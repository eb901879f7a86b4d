#pragma once

#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/archive/internal/ArchiveCompactWriter.h"
#include "libkernel/archive/internal/ArchiveReadGate.h"

#include <utility>

namespace Kernel {

/// The operations that write an archive as a compact file, and those that go on with it.
class ArchiveStreamliner
{
public:
    using Result = Archive::StreamlineResult;

    /// What a caller of Streamline asks for; null where it asks for nothing.
    struct Request
    {
        bool verify = false;
        String8* report = nullptr;
        bool const* abort = nullptr;
        Counted<ArchiveStreamlineProgress> progress;
        Archive::MarshalledFileAccess const* marshalled = nullptr;
    };

    explicit ArchiveStreamliner(ArchiveImpl& impl) : m_impl(impl) {}

    // ArchiveStreamline.cpp
    Result StreamlineI(Request const& request);
    bool RequiresStreamliningCS() const;

    // ArchiveStreamlineCopy.cpp
    /// With @p lost, a salvage.
    Result StreamlineToNew(String8 const& path, std::vector<Archive::LostFile>* lost = nullptr);
    Result StreamlineToOutStream(OutStream& out);
    Result StreamlineAndSwitchI(String8 const& path, bool asScratch);
    Archive::ConvertToThrowAwayResult ConvertToThrowAway();

private:
    using Access = Counted<Archive::AccessBlock>;
    using File = Archive::ArchiveFile;

    /// Runs @p step under the session lock, again after a suspension for as long as it reports one.
    template <class TStep>
    Result RunInTurn(TStep const& step)
    {
        // Whoever waits for a suspension to end may hold no lock, so a step that meets one starts afresh.
        for (;;) {
            m_impl.WaitWhileSuspended();
            CriticalSectionScope const lock(m_impl.m_sessionLock);
            if (IsBusyCS()) return Archive::StreamlineFailed;
            bool suspended = false;
            Result const result = step(suspended);
            if (!suspended) return result;
        }
    }
    /// Access for the step, files open. Null with @p suspended, if so, telling why.
    Access BeginAccess(Counted<Archive::AccessBlockAdorner> const& adorner, bool exclusive, bool& suspended);
    bool IsBusyCS() const;
    static Counted<FileInOutStream> CreateStream(String8 const& path, bool mustBeNew);
    bool IsOwnFile(String8 const& path) const;
    u32 NextWriteCounter() const;
    Counted<File> MakeFile(u32 saveCount) const;

    Result StreamlineFrame(Request const& request, bool& suspended);
    Result StreamlineInner(bool& suspended);

    // ArchiveStreamlineReplace.cpp. First: finished; if not, the master has to be overwritten.
    std::pair<bool, Result> StreamlineReplacement();
    Result StreamlineReplacementInner(String8 const& tempPath, String8 backupPath, bool keepBackup);
    bool MoveAway(String8 const& backupPath);
    Result SwapFailed(String8 const& tempPath, String8 const& backupPath, bool hasBackup, int moveResult);
    /// Writes the compact file to the new file's stream, puts it on the device, checks it if that was asked for, and
    /// makes those holders give this store up whose bytes will be gone.
    Result WriteCompactFile(String8 const& tempPath);

    // ArchiveStreamlineOverwrite.cpp
    Result StreamlineToTempAndOverwrite();
    Result OverwriteI(String8 const& tempPath);
    /// First: done; second: it failed for lack of space.
    std::pair<bool, bool> StreamlineOverwriteOriginalFile(String8 const& tempPath);
    bool TryOverwrite(String8 const& tempPath);
    bool ReopenIfBroken(File& file, String8 const& path);

    // ArchiveStreamlinePublish.cpp
    /// Holders of versions that the compact file does not have give this store up. False if one could not be given its
    /// data.
    bool ReleaseHolders(Archive::StreamlineData const& data);
    /// The tables of @p data become the archive's, and @p file one of its files.
    void Publish(Counted<File> const& file, Archive::StreamlineData& data, bool asScratch);
    void ClearTables();

    ArchiveImpl& m_impl;

    // While StreamlineInner runs.
    Request const* m_request = nullptr;
    Counted<File> m_master;
    Counted<File> m_newFile;
    Archive::StreamlineData m_data;
};

/// Flushes to the device; false for a stream that is broken, too.
bool FlushArchiveFile(FileInOutStream& stream);
bool FlushFolderOf(String8 const& path);

} // namespace Kernel

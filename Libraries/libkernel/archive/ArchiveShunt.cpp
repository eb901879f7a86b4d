#include "libkernel/archive/internal/ArchiveVerifier.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/Trace.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/Path.h"
#include "libkernel/platform/Time.h"

#include <cstdio>
#include <exception>

// Files that failed a check are copied to a folder, with a log, for later study.

namespace Kernel {

namespace {

String8 MakeShuntId()
{
    constexpr i64 c_nanosecondsPerSecond = 1'000'000'000;
    std::tm t{};
    char text[40];
    if (!Platform::ToCivilLocal(Platform::GetSystemTime() / c_nanosecondsPerSecond, t)) return String8("old");
    int const length = std::snprintf(text, sizeof(text), "%04d%02d%02d-%02d%02d%02d", t.tm_year + 1900, t.tm_mon + 1,
                                     t.tm_mday, t.tm_hour, t.tm_min, t.tm_sec);
    return length > 0 && length < static_cast<int>(sizeof(text)) ? String8(text) : String8("old");
}

/// The base of the copies' names, with their id in @p report; false if nothing is to be copied.
bool BeginShunt(String8& base, String8& report)
{
    String8 const folder = Archive::GetShuntPath();
    if (folder.IsEmpty()) {
        report = String8("NOLOG");
        return false;
    }
    report = MakeShuntId();
    Path path(folder);
    path.Append(report);
    base = path.GetString();
    return true;
}

/// Copies one file; what went wrong is said in the log.
void CopyAside(Archive::ArchiveFile const* lockedBy, String8 const& from, String8 const& to, char const* name,
               String8& log)
{
    if (from.IsEmpty()) {
        log += Format("[No %1]\n", name);
        return;
    }
    // Under the file's lock nobody writes meanwhile.
    bool copied = false;
    if (lockedBy) {
        CriticalSectionScope const lock(lockedBy->m_lock);
        copied = FileSystem::CopyFile(from, to);
    } else {
        copied = FileSystem::CopyFile(from, to);
    }
    if (!copied) log += Format("[Failed to copy %1]\n", name);
}

bool WriteLog(String8 const& base, String8 log)
{
    log += "\n";
    File file;
    if (!file.Open((base + "-log.txt").GetData(), "w+")) return false;
    std::fwrite(log.GetData(), 1, static_cast<size_t>(log.GetLength()), file);
    return true;
}

struct OwnFiles
{
    explicit OwnFiles(ArchiveImpl& impl)
    {
        CriticalSectionScope const lock(impl.m_stateLock);
        master = impl.m_master;
        scratch = impl.m_scratch;
        if (master) masterPath = master->m_path;
        if (scratch) scratchPath = scratch->m_path;
    }

    Counted<Archive::ArchiveFile> master;
    Counted<Archive::ArchiveFile> scratch;
    String8 masterPath;
    String8 scratchPath;
};

} // namespace

void ArchiveVerifier::ShuntDeadFiles(ArchiveImpl& impl, String8 const& message, String8& report)
{
    String8 base;
    if (!BeginShunt(base, report)) return;
    String8 const log = "The newly written files could not be matched back to the in-memory data\n\n" + message;
    if (!ShuntDeadFilesI(impl, base, log)) report += "-NOLOG";
}

void ArchiveVerifier::ShuntDeadFiles(ArchiveImpl& impl, MissingMap const& missing, String8& report)
{
    String8 base;
    if (!BeginShunt(base, report)) return;
    String8 log("There are required files missing from the archive\n\n");
    for (auto const& [path, deleted] : missing) {
        log += path;
        log += deleted ? " [deleted]\n" : "\n";
    }
    log += "\n";
    if (!ShuntDeadFilesI(impl, base, log)) report += "-NOLOG";
}

bool ArchiveVerifier::ShuntDeadFilesI(ArchiveImpl& impl, String8 const& base, String8 log)
{
    OwnFiles const files(impl);
    log += "\nOriginal paths:\n";
    if (files.master) log += Format("Master: %1\n", files.masterPath);
    if (files.scratch) log += Format("Scratch: %1\n", files.scratchPath);
    log += "\n";
    CopyAside(files.master.Get(), files.masterPath, base + "-master.corvane", "master", log);
    CopyAside(files.scratch.Get(), files.scratchPath, base + "-scratch.corvane", "scratch", log);
    return WriteLog(base, log);
}

void ArchiveVerifier::ShuntDeadStreamlineFiles(ArchiveImpl& impl, String8 const& streamlinePath, String8 const& message,
                                               String8& report)
{
    String8 base;
    if (!BeginShunt(base, report)) return;
    OwnFiles const files(impl);
    String8 log = "The streamlined file failed verification\n\n" + message;
    log += "Original paths:\n";
    if (files.master) log += Format("Master: %1\n", files.masterPath);
    if (!streamlinePath.IsEmpty()) log += Format("Streamline: %1\n", streamlinePath);
    log += "\n";
    CopyAside(files.master.Get(), files.masterPath, base + "-master.corvane", "master", log);
    CopyAside(nullptr, streamlinePath, base + "-streamline.corvane", "streamline", log);
    if (!WriteLog(base, log)) report += "-NOLOG";
}

bool Archive::VerifyExistingFiles(std::set<String8> const& paths, String8& report) const
{
    ArchiveVerifier::MissingMap missing;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        Revision* const working = m->GetWorkingRevisionCS();
        for (String8 const& path : paths) {
            FileInfo* const info = m->FindFileInfoCS(path);
            FileRevision const* const entry = working && info ? m->FindEntryCS(*info, *working) : nullptr;
            if (entry && !entry->IsDeletion()) continue;
            missing.emplace(path, entry != nullptr);
            Trace(Format(entry ? "Missing file: %1 [deleted]\n" : "Missing file: %1\n", path));
        }
    }
    if (missing.empty()) return true;
    // Copying takes the files' locks, which come before the state lock.
    ArchiveVerifier::ShuntDeadFiles(*m, missing, report);
    return false;
}

bool Archive::TestForAdditionalFiles(std::set<String8> const& paths) const
{
    CriticalSectionScope const lock(m->m_stateLock);
    for (Counted<Revision> const& revision : m->m_revisions)
        for (FileRevision const& entry : revision->GetEntries())
            if (!entry.IsDeletion() && paths.count(entry.info->GetPath()) == 0) return true;
    return false;
}

} // namespace Kernel

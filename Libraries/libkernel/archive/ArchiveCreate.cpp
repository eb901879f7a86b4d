#include "libkernel/archive/internal/ArchiveImpl.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/NumberText.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/FileIOException.h"

#include <cerrno>
#include <new>

namespace Kernel {

using namespace ArchiveFormat;
using Code = ArchiveCreateResult::Code;
using Unmanaged = File::OpenUnmanagedResult;

namespace {

struct CodePair
{
    int unmanaged;
    Code code;
};

constexpr CodePair c_createCodes[] = {
    {2, Code::CouldNotCreate}, {4, Code::InUse},         {5, Code::AccessDenied},  {6, Code::NotPermitted},
    {7, Code::AccessDenied},   {8, Code::TimedOut},      {9, Code::Refused},       {11, Code::ReadOnlyVolume},
    {12, Code::NoMemory},      {13, Code::IsDirectory},  {14, Code::TooManyFiles}, {15, Code::TooLarge},
    {16, Code::NoSpace},       {17, Code::NotSupported},
};

/// Sets the failure and gives null, for a one line return.
Counted<Archive> Failed(ArchiveCreateResult& result, Code code, String8 const& err = String8())
{
    result.Set(code);
    result.SetErr(err);
    return nullptr;
}

Counted<FileInOutStream> CreateStream(String8 const& path, bool exclusive, Unmanaged& unmanaged, String8* text)
{
    return FileInOutStream::Create(path.GetData(), File::ShareMode::DenyWrite, unmanaged, text, exclusive);
}

/// A name that was made must be there after a power cut, or the save into it was for nothing.
void FlushFolderOf(String8 const& path)
{
    Platform::GetFileCalls().flushFolder(Platform::GetFolderOf(path.GetData()).c_str());
}

/// Beside the target: "~tmp", "~tmp2", "~tmp3", ... the first that can be made.
Counted<FileInOutStream> CreateAdjacent(String8 const& target, String8& path, Unmanaged& unmanaged)
{
    constexpr int exists = 3;
    for (u32 n = 1;; ++n) {
        path = target + "~tmp";
        if (n > 1) path += ToString(n);
        Counted<FileInOutStream> stream = CreateStream(path, true, unmanaged, nullptr);
        if (stream || static_cast<int>(unmanaged) != exists) return stream;
    }
}

} // namespace

Code ArchiveImpl::MapCreateResult(Unmanaged result)
{
    for (CodePair const& pair : c_createCodes)
        if (pair.unmanaged == static_cast<int>(result)) return pair.code;
    return Code::CouldNotCreate;
}

void ArchiveImpl::SetFreshFields(Archive::ArchiveFile& file, FreshFile const& fresh)
{
    CriticalSectionScope const fileLock(file.m_lock);
    CriticalSectionScope const lock(m_stateLock);
    file.m_fileVersion = c_version;
    file.m_flags = static_cast<u16>((fresh.hasLink ? c_flagLink : 0) | (fresh.hasReference ? c_flagReference : 0));
    file.m_archiveUID = fresh.archiveUID;
    file.m_firstFAT = 0;
    file.m_fileEnd = fresh.info.fileEnd;
    file.m_totalBytes = fresh.info.totalBytes;
    file.m_deadBytes = fresh.info.deadBytes;
    file.m_saveTimeStamp = fresh.info.saveTimeStamp;
    file.m_saveCount = fresh.info.saveCount;
    file.m_nextFreeUID = fresh.info.nextFreeUID;
    file.m_writeCounter = fresh.writeCounter;
    file.m_thumbnailsPos = 0;
    file.m_thumbnails = nullptr;
    file.m_rawInfo = fresh.info;
    file.m_hasLink = fresh.hasLink;
    file.m_linkPath = fresh.linkPath;
    file.m_linkSaveTimeStamp = fresh.linkSaveTimeStamp;
    file.m_linkSaveCount = fresh.linkSaveCount;
}

bool ArchiveImpl::WriteFreshFile(Archive::ArchiveFile& file, FreshFile& fresh)
{
    fresh.archiveUID = m_archiveUID;
    if (file.m_referenceInfo) {
        fresh.hasReference = true;
        fresh.referencePath = file.m_referenceInfo->GetPath();
    }
    try {
        std::vector<u8> bytes;
        if (!EncodeFresh(bytes, fresh)) return false;
        if (file.m_stream->WriteAt(0, bytes.data(), bytes.size()) != bytes.size()) return false;
        if (!file.m_stream->ForceFlush() || file.m_stream->IsBroken()) return false;
    } catch (FileIOException const&) {
        return false;
    }
    SetFreshFields(file, fresh);
    FlushFolderOf(file.m_path);
    return true;
}

// The scratch file's old blocks stay where they are until the next scratch session writes over them.
bool ArchiveImpl::ResetScratch(Archive::ArchiveFile const& master, u32 nextFreeUID)
{
    Archive::ArchiveFile& scratch = *m_scratch;
    FreshFile fresh;
    fresh.archiveUID = m_archiveUID;
    fresh.info.totalBytes = master.m_totalBytes;
    fresh.info.deadBytes = master.m_deadBytes;
    fresh.info.saveTimeStamp = TimeStamp::GetCurrent();
    fresh.info.saveCount = master.m_saveCount;
    fresh.info.nextFreeUID = nextFreeUID;
    fresh.hasLink = true;
    fresh.linkSaveTimeStamp = master.m_saveTimeStamp;
    fresh.linkSaveCount = master.m_saveCount;
    fresh.linkPath = master.m_finalPath.IsEmpty() ? master.m_path : master.m_finalPath;
    bool cleared = false;
    try {
        CriticalSectionScope const lock(scratch.m_lock);
        if (scratch.m_referenceInfo) {
            fresh.hasReference = true;
            fresh.referencePath = scratch.m_referenceInfo->GetPath();
        }
        fresh.writeCounter = scratch.m_writeCounter + 1;
        std::vector<u8> bytes;
        cleared = EncodeFresh(bytes, fresh) && scratch.m_stream &&
                  scratch.m_stream->WriteAt(0, bytes.data(), bytes.size()) == bytes.size() &&
                  scratch.m_stream->ForceFlush() && !scratch.m_stream->IsBroken();
        if (cleared) SetFreshFields(scratch, fresh);
    } catch (Exception const&) {
    } catch (std::bad_alloc const&) {
    }
    if (!cleared) {
        CriticalSectionScope const lock(m_stateLock);
        m_scratch = nullptr;
    }
    return cleared;
}

namespace {

/// The info block of a file that was never saved into.
FreshFile MakeFresh()
{
    FreshFile fresh;
    fresh.info.saveTimeStamp = TimeStamp::GetCurrent();
    fresh.info.saveCount = 1;
    fresh.info.nextFreeUID = 1;
    return fresh;
}

} // namespace

Counted<Archive> Archive::Create(String8 const& path, IDTag tag, CreateResult& result)
{
    return Create(path, tag, result, nullptr);
}

Counted<Archive> Archive::Create(String8 const& path, IDTag tag, CreateResult& result, AdornerFactory adornerFactory)
{
    Counted<Archive> const archive = ArchiveImpl::CreatePlain(path, tag, nullptr, result);
    if (archive) archive->m->m_adornerFactory = std::move(adornerFactory);
    return archive;
}

Counted<Archive> Archive::CreateAsScratch(String8 const& path, IDTag tag,
                                          Counted<ArchiveReferenceInfo> const& referenceInfo, CreateResult& result)
{
    Counted<Archive> const archive = ArchiveImpl::CreatePlain(path, tag, referenceInfo, result);
    if (archive) archive->m->MakeJustScratch();
    return archive;
}

Counted<Archive> ArchiveImpl::CreatePlain(String8 const& path, IDTag tag,
                                          Counted<ArchiveReferenceInfo> const& referenceInfo,
                                          Archive::CreateResult& result)
{
    result.Set(Code::Ok);
    if (path.IsEmpty()) return Failed(result, Code::BadPath);
    try {
        Counted<Archive> const archive = MakeArchive(tag);
        auto const file = MakeCounted<Archive::ArchiveFile>(Archive::OpenModeReadWrite, tag);
        Unmanaged unmanaged{};
        String8 text;
        file->m_stream = CreateStream(path, false, unmanaged, &text);
        if (!file->m_stream) {
            Code const code = MapCreateResult(unmanaged);
            return Failed(result, code, code == Code::CouldNotCreate ? text : String8());
        }
        file->m_path = path;
        file->m_referenceInfo = referenceInfo;
        FreshFile fresh = MakeFresh();
        if (!archive->m->WriteFreshFile(*file, fresh)) return Failed(result, Code::WriteFailed);
        archive->m->m_master = file;
        return archive;
    } catch (std::bad_alloc const&) {
        return Failed(result, Code::NoMemory);
    }
}

Counted<Archive> Archive::CreateAsThrowAway(IDTag tag, CreateResult& result)
{
    result.Set(Code::Ok);
    if (!TempFile::HaveTempPath()) return Failed(result, Code::CouldNotCreate, String8("Internal error"));
    Counted<Archive> const archive =
        ArchiveImpl::CreateTemporaryArchiveInner(String8(), tag, result, nullptr, false, nullptr);
    if (archive) archive->m->m_master->m_throwAway = true;
    return archive;
}

Counted<Archive> Archive::CreateWithTemporary(String8 const& path, IDTag tag, CreateResult& result)
{
    return ArchiveImpl::CreateWithTemporaryInner(path, tag, result, nullptr, false);
}

Counted<Archive> Archive::CreateWithAdjacentTemporary(String8 const& path, IDTag tag, CreateResult& result,
                                                      MarshalledFileAccess const& marshalled)
{
    return ArchiveImpl::CreateWithTemporaryInner(path, tag, result, &marshalled, true);
}

Counted<Archive> ArchiveImpl::CreateWithTemporaryInner(String8 const& path, IDTag tag, Archive::CreateResult& result,
                                                       Archive::MarshalledFileAccess const* marshalled, bool adjacent)
{
    result.Set(Code::Ok);
    if (!adjacent && !TempFile::HaveTempPath()) return Failed(result, Code::CouldNotCreate, String8("Internal error"));
    if (path.IsEmpty()) return Failed(result, Code::BadPath);

    // The target stays open, and so reserved, until the temporary moves over it.
    Unmanaged unmanaged{};
    String8 text;
    Counted<FileInOutStream> target =
        FileInOutStream::Open(path.GetData(), File::ShareMode::DenyWrite, unmanaged, &text);
    int value = static_cast<int>(unmanaged);
    bool const makesTarget = !target && value == 2;
    if (makesTarget) {
        target = CreateStream(path, true, unmanaged, &text);
        value = static_cast<int>(unmanaged);
    }
    if (!target && value != 1) {
        if (value == 6 || value == 11) {
            Unmanaged readOnly{};
            if (FileInOutStream::OpenReadOnly(path.GetData(), File::ShareMode::DenyNone, readOnly, nullptr))
                return Failed(result, Code::ExistsReadOnly);
        }
        Code const code = MapCreateResult(unmanaged);
        return Failed(result, code, code == Code::CouldNotCreate ? text : String8());
    }
    Counted<Archive> const archive = CreateTemporaryArchiveInner(path, tag, result, marshalled, adjacent, target);
    if (archive)
        archive->m->m_master->m_madeTarget = makesTarget;
    else if (makesTarget)
        FileSystem::Delete(path, 0);
    return archive;
}

Counted<Archive> ArchiveImpl::CreateTemporaryArchiveInner(String8 const& target, IDTag tag,
                                                          Archive::CreateResult& result,
                                                          Archive::MarshalledFileAccess const* marshalled,
                                                          bool adjacent, Counted<FileInOutStream> const& targetStream)
{
    try {
        Counted<Archive> const archive = MakeArchive(tag);
        auto const file = MakeCounted<Archive::ArchiveFile>(Archive::OpenModeReadWrite, tag);
        String8 path;
        Unmanaged unmanaged{};
        if (marshalled && !marshalled->path.IsEmpty()) {
            path = marshalled->path;
            file->m_stream = CreateStream(path, false, unmanaged, nullptr);
            file->m_keepBackup = marshalled->keepBackup;
        } else if (!adjacent) {
            file->m_stream = TempFile::GenerateTempInOutFile(path, String8("tmp"));
        } else {
            file->m_stream = CreateAdjacent(target, path, unmanaged);
            if (!file->m_stream) {
                Code const code = MapCreateResult(unmanaged);
                if (code != Code::CouldNotCreate) return Failed(result, code);
            } else {
                FileSystem::SetFileHidden(path, true);
            }
            file->m_keepBackup = true;
        }
        if (!file->m_stream) return Failed(result, Code::CouldNotCreate, String8("Failed to generate temp file\n"));
        file->m_path = path;
        file->m_finalPath = target;
        if (marshalled) file->m_backupPath = marshalled->backupPath;
        file->m_targetStream = targetStream;
        FreshFile fresh = MakeFresh();
        if (!archive->m->WriteFreshFile(*file, fresh)) {
            file->m_throwAway = true;
            return Failed(result, Code::WriteFailed);
        }
        archive->m->m_master = file;
        return archive;
    } catch (std::bad_alloc const&) {
        return Failed(result, Code::NoMemory);
    }
}

Counted<Archive> Archive::CreateReplacementWithTemporary(CreateResult& result, MarshalledFileAccess const& marshalled)
{
    result.Set(Code::Ok);
    String8 const path = GetArchivePath();
    ArchiveAccessScope const access(*m);
    if (path.IsEmpty() || !access.IsOpen())
        return Failed(result, Code::CouldNotCreate, String8("Could not access original file"));

    Counted<FileInOutStream> handle;
    if (m->m_master) handle = m->m_master->GetStream();
    bool const adjacent = !marshalled.path.IsEmpty() || !TempFile::HaveTempPath();
    Counted<Archive> archive;
    if (!handle)
        Failed(result, Code::CouldNotCreate, String8("Could not access original file"));
    else
        archive =
            ArchiveImpl::CreateTemporaryArchiveInner(path, GetArchiveIDTag(), result, &marshalled, adjacent, handle);
    return archive;
}

bool Archive::AddScratchFile(String8 const& path, CreateResult& result)
{
    CriticalSectionScope const sessionLock(m->m_sessionLock);
    result.Set(Code::Ok);
    if (IsThrowAway())
        result.Set(Code::IsThrowAway);
    else if (HasScratchFile())
        result.Set(Code::HasScratchFile);
    else if (!MainFileHasPath())
        result.Set(Code::NoMasterPath);
    else if (path.IsEmpty())
        result.Set(Code::BadPath);
    if (result.GetCode() != Code::Ok) return false;

    Unmanaged unmanaged{};
    errno = 0;
    auto const file = MakeCounted<ArchiveFile>(OpenModeReadWrite, m->m_archiveUID);
    file->BecomeScratch();
    file->m_stream = CreateStream(path, false, unmanaged, nullptr);
    if (!file->m_stream) {
        result.Set(Code::CouldNotCreate);
        result.SetErr(Format("Archive::AddScratchFile failed to create file [errno = %1]\n", errno));
        return false;
    }
    file->m_path = path;
    FreshFile fresh = MakeFresh();
    {
        CriticalSectionScope const lock(m->m_stateLock);
        ArchiveFile const& master = *m->m_master;
        fresh.info.totalBytes = master.m_totalBytes;
        fresh.info.deadBytes = master.m_deadBytes;
        fresh.info.nextFreeUID = m->m_nextFreeUID;
        fresh.hasLink = true;
        fresh.linkPath = master.m_finalPath.IsEmpty() ? master.m_path : master.m_finalPath;
        fresh.linkSaveTimeStamp = master.m_saveTimeStamp;
        fresh.linkSaveCount = master.m_saveCount;
    }
    if (!m->WriteFreshFile(*file, fresh)) {
        result.Set(Code::WriteFailed);
        return false;
    }
    CriticalSectionScope const lock(m->m_stateLock);
    m->m_scratch = file;
    return true;
}

} // namespace Kernel

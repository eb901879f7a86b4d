#include "libkernel/archive/internal/ArchiveImpl.h"
#include "libkernel/core/Limits.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/streams/FileIOException.h"
#include "libkernel/streams/FragmentedRawDataStream.h"

#include <algorithm>
#include <atomic>
#include <new>
#include <set>

namespace Kernel {

using namespace ArchiveFormat;

namespace {

std::atomic<u64> s_nextRuntimeUID{1};

using Unmanaged = File::OpenUnmanagedResult;

/// The library's own share mode: a file open for writing is closed to other writers.
Counted<FileInOutStream> OpenStream(String8 const& path, bool readOnly, Unmanaged& result)
{
    return readOnly ? FileInOutStream::OpenReadOnly(path.GetData(), File::ShareMode::DenyNone, result, nullptr)
                    : FileInOutStream::Open(path.GetData(), File::ShareMode::DenyWrite, result, nullptr);
}

/// A stream of unknown kind as a source.
class StreamSource : public ArchiveSource
{
public:
    explicit StreamSource(InStreamSeekable& in) : m_in(in), m_size(in.GetSize()) {}
    u64 ReadAt(u64 position, void* to, u64 count) override
    {
        if (position > m_size || !m_in.Seek(SeekMethod::Beginning, static_cast<i64>(position))) return 0;
        return m_in.ReadBlock(to, count);
    }
    u64 GetSize() override { return m_size; }

private:
    InStreamSeekable& m_in;
    u64 const m_size;
};

struct ResultPair
{
    int unmanaged;
    Archive::OpenResult first;
    Archive::OpenResult linked;
};

constexpr ResultPair c_openResults[] = {
    {2, Archive::OpenNotFound, Archive::OpenLinkedNotFound},
    {4, Archive::OpenInUse, Archive::OpenInUse},
    {5, Archive::OpenAccessDenied, Archive::OpenLinkedAccessDenied},
    {6, Archive::OpenNotPermitted, Archive::OpenNotPermitted},
    {7, Archive::OpenLocked, Archive::OpenLinkedLocked},
    {8, Archive::OpenTimedOut, Archive::OpenTimedOut},
    {9, Archive::OpenRefused, Archive::OpenRefused},
    {11, Archive::OpenReadOnlyVolume, Archive::OpenReadOnlyVolume},
    {12, Archive::OpenNoMemory, Archive::OpenNoMemory},
    {13, Archive::OpenIsDirectory, Archive::OpenIsDirectory},
    {14, Archive::OpenTooManyFiles, Archive::OpenTooManyFiles},
    {15, Archive::OpenTooLarge, Archive::OpenTooLarge},
    {16, Archive::OpenNoSpace, Archive::OpenNoSpace},
    {17, Archive::OpenNotSupported, Archive::OpenNotSupported},
};

} // namespace

ArchiveImpl::ArchiveImpl(Archive& self, IDTag tag) : m_self(self), m_archiveUID(tag), m_runtimeUID(s_nextRuntimeUID++)
{
    Register(*this);
}

ArchiveImpl::~ArchiveImpl() = default;

namespace {

/// Every archive that lives, for the end of the process.
struct AllArchives
{
    CriticalSectionSpin lock{c_rankLeaf};
    std::set<ArchiveImpl*> archives; // Guarded by lock.
};

AllArchives& GetAllArchives()
{
    // Never destroyed: an archive may outlive every static.
    static AllArchives* const s_all = new AllArchives;
    return *s_all;
}

} // namespace

void ArchiveImpl::Register(ArchiveImpl& impl)
{
    AllArchives& all = GetAllArchives();
    CriticalSectionSpinScope const lock(all.lock);
    all.archives.insert(&impl);
}

void ArchiveImpl::Unregister(ArchiveImpl& impl)
{
    AllArchives& all = GetAllArchives();
    CriticalSectionSpinScope const lock(all.lock);
    all.archives.erase(&impl);
}

std::vector<Counted<Archive>> ArchiveImpl::GetAll()
{
    AllArchives& all = GetAllArchives();
    std::vector<Counted<Archive>> result;
    CriticalSectionSpinScope const lock(all.lock);
    // One that is just dying stays dead.
    for (ArchiveImpl* impl : all.archives)
        if (Counted<Archive> archive = CountedIfAlive(&impl->m_self)) result.push_back(std::move(archive));
    return result;
}

Archive::Archive(IDTag tag) : m(std::make_unique<ArchiveImpl>(*this, tag)) {}

Archive::~Archive()
{
    ArchiveImpl::Unregister(*m);
    // From here on nobody may take a reference to the archive, as a callback that is handed one might.
    SetErrorCallback(nullptr);
    // Nobody is left to end a suspension, and what follows may need the files.
    Unsuspend();
    m->WaitForOffliningToAbort();
    // Holders lose this store here and may take back data from it, so the files must still be open.
    PreDestruction();
    // Revisions that somebody still holds keep the file objects, but nobody may keep the files themselves.
    CriticalSectionScope const lock(m->m_accessLock);
    m->CloseFilesCS();
}

Counted<Archive> ArchiveImpl::MakeArchive(IDTag tag)
{
    return Counted<Archive>(new Archive(tag));
}

Archive::OpenResult ArchiveImpl::MapOpenResult(Unmanaged result, bool linked)
{
    for (ResultPair const& pair : c_openResults)
        if (pair.unmanaged == static_cast<int>(result)) return linked ? pair.linked : pair.first;
    return linked ? Archive::OpenLinkedNotFound : Archive::OpenNotFound;
}

Archive::OpenResult ArchiveImpl::TestForReadOnlyArchive(String8 const& path, IDTag tag)
{
    try {
        Unmanaged unmanaged{};
        Counted<FileInOutStream> const stream = OpenStream(path, true, unmanaged);
        if (!stream) return MapOpenResult(unmanaged, false);
        u8 bytes[c_headerSize];
        Archive::ArchiveHdr header;
        if (stream->ReadBlock(bytes, sizeof(bytes)) != sizeof(bytes) || !DecodeHeader(bytes, header))
            return Archive::OpenNotArchive;
        if (header.fileVersion < c_oldestVersion) return Archive::OpenTooOld;
        if (header.fileVersion > c_version) return Archive::OpenTooNew;
        if (tag != IDTag() && header.archiveUID != tag) return Archive::OpenWrongType;
        return Archive::OpenReadOnlyArchive;
    } catch (FileIOException const& e) {
        switch (e.GetReason()) {
        case FileIOException::Reason::AccessDenied: return Archive::OpenAccessDenied;
        case FileIOException::Reason::PermissionDenied: return Archive::OpenNotPermitted;
        default: return Archive::OpenIOError;
        }
    }
}

// Follows the chain of links from the file that was asked for to its master. Each file that names a further one moves
// to the scratch slot, so the chain can have two files at most.
Archive::OpenResult ArchiveImpl::InitArchive(String8 path, Archive::OpenMode mode, Counted<FileInOutStream> stream,
                                             Counted<ArchiveReferenceInfo> const& referenceInfo, bool asScratch,
                                             bool recover)
{
    if (path.IsEmpty()) return Archive::OpenBadPath;
    ArchiveLoadData data;
    Counted<Archive::ArchiveFile> master;
    Counted<Archive::ArchiveFile> scratch;
    bool linked = false;
    try {
        while (!path.IsEmpty()) {
            if (scratch) return Archive::OpenNotArchive;
            bool fallback = false;
            if (!stream) {
                Unmanaged unmanaged{};
                stream = OpenStream(path, mode == Archive::OpenModeReadOnly, unmanaged);
                int const value = static_cast<int>(unmanaged);
                bool const refused = value == 6 || value == 11;
                if (!stream && mode == Archive::OpenModeReadWriteOrReadOnly && (refused || value == 2 || value == 5)) {
                    stream = OpenStream(path, true, unmanaged);
                    fallback = static_cast<bool>(stream);
                }
                if (!stream && refused && (mode == Archive::OpenModeReadWrite || mode == Archive::OpenModeCoordinated))
                    return TestForReadOnlyArchive(path, m_archiveUID);
                if (!stream) return MapOpenResult(unmanaged, linked);
            }
            auto file = MakeCounted<Archive::ArchiveFile>(mode, m_archiveUID);
            file->m_path = path;
            file->m_stream = stream;
            file->m_readOnly = mode == Archive::OpenModeReadOnly;
            file->m_readOnlyFallback = fallback;
            stream = nullptr;
            if (master) {
                master->BecomeScratch();
                scratch = master;
            }
            master = file;
            auto const load = recover ? ArchiveLoader::RecoverArchiveFile : ArchiveLoader::LoadArchiveFile;
            if (Archive::OpenResult const result = load(*file, m_archiveUID, data)) return result;
            if (!linked) m_archiveUID = file->m_archiveUID;

            if (!scratch && referenceInfo) {
                file->m_referenceInfo = referenceInfo;
                path = referenceInfo->GetPath();
                data.testLink = false;
                // Only the file asked for stands for the reference; the reference itself may have no link.
                if (linked) path = String8();
            } else {
                path = data.hasLink ? data.linkPath : String8();
                data.testLink = data.hasLink;
            }
            linked = true;
        }
        if (asScratch && !scratch) {
            master->BecomeScratch();
            std::swap(master, scratch);
        }
        TakeOver(data, std::move(master), std::move(scratch));
        return Archive::OpenOk;
    } catch (FileIOException const& e) {
        return e.GetReason() == FileIOException::Reason::AccessDenied ? Archive::OpenAccessDenied
                                                                      : Archive::OpenIOError;
    } catch (std::bad_alloc const&) {
        return Archive::OpenNoMemory;
    }
}

void ArchiveImpl::TakeOver(ArchiveLoadData& data, Counted<Archive::ArchiveFile> master,
                           Counted<Archive::ArchiveFile> scratch)
{
    ArchiveLoader::LinkHistories(data);
    CriticalSectionScope const lock(m_stateLock);
    std::swap(m_master, master); // The old ones end outside the lock.
    std::swap(m_scratch, scratch);
    m_paths = std::move(data.paths);
    m_revisions = std::move(data.revisions);
    m_pathCounts = std::move(data.pathCounts);
    m_nextFreeUID = data.nextFreeUID;
    m_nextRevisionOrder = m_revisions.size() + 1;
    m_revisionsByAddress.clear();
    for (Counted<Archive::Revision> const& revision : m_revisions)
        m_revisionsByAddress.emplace(revision.Get(), revision.Get());
}

namespace {

/// A new archive, or null with @p result set when there is no memory for it.
Counted<Archive> Finish(Counted<Archive> archive, Archive::OpenResult opened, Archive::OpenResult& result)
{
    result = opened;
    return opened == Archive::OpenOk ? archive : nullptr;
}

} // namespace

Counted<Archive> Archive::Open(String8 const& path, OpenMode mode, IDTag tag, OpenResult& result)
{
    return Open(path, mode, tag, result, nullptr, nullptr);
}

Counted<Archive> Archive::Open(String8 const& path, OpenMode mode, IDTag tag, OpenResult& result,
                               AdornerFactory adornerFactory, Counted<ArchiveReferenceInfo> const& referenceInfo)
{
    Counted<Archive> const archive = ArchiveImpl::MakeArchive(tag);
    archive->m->m_adornerFactory = std::move(adornerFactory);
    return Finish(archive, archive->m->InitArchive(path, mode, nullptr, referenceInfo), result);
}

Counted<Archive> Archive::RecoverArchive(String8 const& path, OpenMode mode, IDTag tag, OpenResult& result)
{
    Counted<Archive> const archive = ArchiveImpl::MakeArchive(tag);
    return Finish(archive, archive->m->InitArchive(path, mode, nullptr, nullptr, false, true), result);
}

Counted<Archive> Archive::OpenAsScratch(String8 const& path, IDTag tag, OpenResult& result)
{
    Counted<Archive> const archive = ArchiveImpl::MakeArchive(tag);
    OpenResult const opened = archive->m->InitArchive(path, OpenModeReadWrite, nullptr, nullptr, true);
    return Finish(archive, opened, result);
}

void ArchiveImpl::MakeJustScratch()
{
    if (m_scratch || !m_master) return;
    m_master->BecomeScratch();
    m_scratch = m_master;
    m_master = nullptr;
}

Counted<Archive> Archive::OpenAsThrowaway(InStream& in, u64 size, IDTag tag, OpenResult& result)
{
    // A source may be unable to go back, so its bytes are gathered first; memory follows what really comes.
    auto data = MakeCounted<FragmentedRawData>(c_copyBufferSize);
    u64 done = 0;
    while (done < size) {
        u64 const piece = std::min(size - done, c_copyBufferSize);
        u64 const got = data->SetDataFromStream(done, in, piece, false);
        done += got;
        if (got != piece) break;
    }
    if (data->GetSize() > done && !data->SetSize(done, false)) {
        result = OpenNoMemory;
        return nullptr;
    }
    return OpenAsThrowaway(*data, tag, result);
}

Counted<Archive> Archive::OpenAsThrowaway(FragmentedRawData const& data, IDTag tag, OpenResult& result)
{
    // Only read through the stream; it wants a counted object, which a caller's own need not be.
    class Source : public ArchiveSource
    {
    public:
        explicit Source(FragmentedRawData const& d) : m_data(d) {}
        u64 ReadAt(u64 position, void* to, u64 count) override { return m_data.GetData(position, to, count); }
        u64 GetSize() override { return m_data.GetSize(); }

    private:
        FragmentedRawData const& m_data;
    } source(data);

    ArchiveLoader::Front front;
    result = ArchiveLoader::ReadFront(source, tag, nullptr, front);
    if (result == OpenOk && front.HasLink()) result = OpenLinkedNotFound;
    if (result == OpenOk) result = ArchiveLoader::TestArchive(source, tag, nullptr, nullptr);
    if (result != OpenOk) return nullptr;

    String8 path;
    try {
        Counted<FileInOutStream> const stream = TempFile::GenerateTempInOutFile(path, String8("tmp"));
        bool const filled = stream && data.CopyToStream(*stream);
        if (!filled) {
            if (stream) FileSystem::Delete(path, 0);
            result = OpenNoTemporary;
            return nullptr;
        }
        Counted<Archive> const archive = ArchiveImpl::MakeArchive(tag);
        OpenResult const opened = archive->m->InitArchive(path, OpenModeReadWrite, stream, nullptr);
        if (opened == OpenOk)
            archive->m->m_master->m_throwAway = true;
        else
            FileSystem::Delete(path, 0);
        return Finish(archive, opened, result);
    } catch (FileIOException const&) {
        if (!path.IsEmpty()) FileSystem::Delete(path, 0);
        result = OpenNoTemporary;
        return nullptr;
    }
}

namespace {

/// Puts a block into a new file, whole and on the device, or leaves none behind.
bool WriteWholeFile(String8 const& path, void const* data, u64 size)
{
    try {
        Unmanaged unmanaged{};
        Counted<FileInOutStream> const stream =
            FileInOutStream::Create(path.GetData(), File::ShareMode::DenyWrite, unmanaged, nullptr, false);
        if (stream && stream->WriteBlock(data, size) == size && stream->ForceFlush() && !stream->IsBroken())
            return true;
        if (!stream) return false;
    } catch (FileIOException const&) {
    }
    FileSystem::Delete(path, 0);
    return false;
}

/// A file that has gone to its new place is opened there, whether or not a power cut may take it back.
bool MoveToOpen(String8 const& from, String8 const& to)
{
    bool isMoved = false;
    (void)FileSystem::SafeMoveFileAdv(from, to, 0, &isMoved);
    return isMoved;
}

} // namespace

Counted<Archive> Archive::OpenMigrate(String8 const& from, String8 const& to, IDTag tag, OpenResult& result)
{
    result = OpenMoveFailed;
    if (!MoveToOpen(from, to)) return nullptr;
    return Open(to, OpenModeReadWrite, tag, result);
}

Counted<Archive> Archive::OpenMigrate(void const* data, u64 size, String8 const& to, IDTag tag, OpenResult& result)
{
    result = OpenMoveFailed;
    if (!WriteWholeFile(to, data, size)) return nullptr;
    return Open(to, OpenModeReadWrite, tag, result);
}

Counted<Archive> Archive::OpenMigrateAsScratch(String8 const& from, String8 const& to, IDTag tag,
                                               Counted<ArchiveReferenceInfo> const& referenceInfo, OpenResult& result)
{
    result = OpenMoveFailed;
    if (!MoveToOpen(from, to)) return nullptr;
    Counted<Archive> const archive = OpenAsScratch(to, tag, result);
    if (archive && referenceInfo) archive->SetReferenceInfo(referenceInfo);
    return archive;
}

Counted<Archive> Archive::OpenMigrateAsScratch(void const* data, u64 size, String8 const& to, IDTag tag,
                                               Counted<ArchiveReferenceInfo> const& referenceInfo, OpenResult& result)
{
    result = OpenMoveFailed;
    if (!WriteWholeFile(to, data, size)) return nullptr;
    Counted<Archive> const archive = OpenAsScratch(to, tag, result);
    if (archive && referenceInfo) archive->SetReferenceInfo(referenceInfo);
    return archive;
}

Archive::OpenResult Archive::TestArchive(InStreamSeekable& in, IDTag tag, ArchiveHdr* header, ArchiveInfo* info)
{
    StreamSource source(in);
    return ArchiveLoader::TestArchive(source, tag, header, info);
}

Archive::OpenResult Archive::GetArchiveUID(String8 const& path, IDTag& tag)
{
    if (path.IsEmpty()) return OpenBadPath;
    try {
        Unmanaged unmanaged{};
        Counted<FileInOutStream> const stream = OpenStream(path, true, unmanaged);
        if (!stream) return ArchiveImpl::MapOpenResult(unmanaged, false);
        u8 bytes[c_headerSize];
        ArchiveHdr header;
        if (stream->ReadBlock(bytes, sizeof(bytes)) != sizeof(bytes) || !DecodeHeader(bytes, header))
            return OpenNotArchive;
        if (header.fileVersion < c_oldestVersion) return OpenTooOld;
        if (header.fileVersion > c_version) return OpenTooNew;
        tag = header.archiveUID;
        return OpenOk;
    } catch (FileIOException const&) {
        return OpenIOError;
    }
}

Archive::OpenResult Archive::TestForScratchLinkAndReferenceInfo(String8 const& path, bool followLinks, LinkInfo& info)
{
    // A chain of a scratch file and its master is all there can be; a longer one never opens.
    constexpr int maxFiles = 2;
    String8 next(path);
    for (int files = 0; files < maxFiles; ++files) {
        OpenResult const missing = files == 0 ? OpenNotFound : OpenLinkedNotFound;
        try {
            Unmanaged unmanaged{};
            Counted<FileInOutStream> const stream = OpenStream(next, true, unmanaged);
            if (!stream) return missing;
            ArchiveFileSource source(*stream);
            ArchiveLoader::Front front;
            if (OpenResult const result = ArchiveLoader::ReadFront(source, IDTag(), nullptr, front)) return result;
            info.linkPath = front.linkPath;
            info.referencePath = front.referencePath;
            info.isEmpty = front.info.firstFAT == 0;
            info.isMidStreamline = (front.header.flags & c_flagMidStreamline) != 0;
            if (!followLinks || !front.HasLink()) return OpenOk;
            next = front.linkPath;
        } catch (FileIOException const&) {
            return missing;
        }
    }
    return OpenNotArchive;
}

bool Archive::VerifyLinks(String8 const& path)
{
    constexpr int maxFiles = 2;
    String8 next(path);
    ArchiveLoadData link;
    for (int files = 0; files < maxFiles; ++files) {
        try {
            Unmanaged unmanaged{};
            Counted<FileInOutStream> const stream = OpenStream(next, true, unmanaged);
            if (!stream) return false;
            ArchiveFileSource source(*stream);
            ArchiveLoader::Front front;
            if (ArchiveLoader::ReadFront(source, IDTag(), files > 0 ? &link : nullptr, front) != OpenOk) return false;
            if (!front.HasLink()) return true;
            next = front.linkPath;
            link.linkSaveTimeStamp = front.linkSaveTimeStamp;
            link.linkSaveCount = front.linkSaveCount;
        } catch (FileIOException const&) {
            return false;
        }
    }
    return false;
}

} // namespace Kernel

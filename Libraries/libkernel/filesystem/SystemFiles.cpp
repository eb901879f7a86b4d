#include "libkernel/filesystem/internal/SystemFiles.h"

#include "libkernel/filesystem/Path.h"
#include "libkernel/platform/Errors.h"

#include <algorithm>
#include <unicode/bytestream.h>
#include <unicode/casemap.h>
#include <unicode/stringoptions.h>
#include <utility>

namespace Kernel::FileDetail {

Failure GetFailure(int error)
{
    struct Row
    {
        int error;
        Failure failure;
    };
    static constexpr Row c_rows[] = {
        {0, Failure::None},
        {ENOENT, Failure::NotFound},
        {EMFILE, Failure::TooManyOpen},
        {ENFILE, Failure::TooManyOpen},
        {EACCES, Failure::AccessDenied},
        {EPERM, Failure::AccessDenied},
        {EBUSY, Failure::InUse},
        {ETXTBSY, Failure::InUse},
        {EAGAIN, Failure::InUse},
        {EDEADLK, Failure::InUse},
        {ENOSPC, Failure::DiskFull},
        {EDQUOT, Failure::DiskFull},
    };
    for (Row const& row : c_rows)
        if (row.error == error) return row.failure;
    return Failure::Other;
}

char const* ToSystem(String8 const& path)
{
    return path.Find('\0') < 0 ? path.GetData() : nullptr;
}

Platform::FileKind GetKind(String8 const& path, bool followLinks)
{
    Platform::FileInfo info;
    return Platform::GetFileCalls().stat(ToSystem(path), followLinks, info) == 0 ? info.kind : Platform::FileKind::None;
}

bool IsTaken(String8 const& path)
{
    return GetKind(path, false) != Platform::FileKind::None;
}

namespace {

bool IsSameFile(std::string const& a, std::string const& b, bool followLinks)
{
    Platform::FileInfo infoA, infoB;
    auto const& calls = Platform::GetFileCalls();
    return calls.stat(a.c_str(), followLinks, infoA) == 0 && calls.stat(b.c_str(), followLinks, infoB) == 0 &&
           infoA.device == infoB.device && infoA.inode == infoB.inode;
}

bool HoldsBoth(std::string const& folder, String8 const& a, String8 const& b)
{
    std::vector<Platform::FolderEntry> entries;
    if (Platform::GetFileCalls().listFolder(folder.c_str(), entries) != 0) return false;
    auto const holds = [&](String8 const& name) {
        return std::any_of(entries.begin(), entries.end(), [&](auto const& e) { return name == e.name.c_str(); });
    };
    return holds(a) && holds(b);
}

} // namespace

Kinship GetKinship(String8 const& a, String8 const& b)
{
    if (!ToSystem(a) || !ToSystem(b) || !IsSameFile(a.GetData(), b.GetData(), false)) return Kinship::Strangers;
    std::string const folderA = Platform::GetFolderOf(a.GetData());
    std::string const folderB = Platform::GetFolderOf(b.GetData());
    if (!IsSameFile(folderA, folderB, true)) return Kinship::TwoNames;
    String8 const nameA = GetLastPart(a), nameB = GetLastPart(b);
    // In a folder that ignores case two spellings may be one entry, and then it lists one of them.
    return nameA != nameB && HoldsBoth(folderA, nameA, nameB) ? Kinship::TwoNames : Kinship::OneName;
}

int RenameEntry(String8 const& from, String8 const& to)
{
    auto const& calls = Platform::GetFileCalls();
    int const error = calls.rename(ToSystem(from), ToSystem(to));
    if (error != 0 || !IsTaken(from)) return error;
    return GetKinship(from, to) == Kinship::TwoNames ? calls.unlink(ToSystem(from)) : 0;
}

String8 GetLastPart(String8 const& path)
{
    int end = path.GetLength();
    while (end > 0 && PathTraitsNative::IsSeparator(path[end - 1])) --end;
    return Path(path.GetSubstring(0, end)).GetLastElement();
}

String8 AppendElement(String8 const& folder, String8 const& name)
{
    return Path(folder).Append(name).GetString();
}

std::string FoldName(String8 const& name)
{
    std::string folded;
    icu::StringByteSink<std::string> sink(&folded);
    UErrorCode error = U_ZERO_ERROR;
    icu::CaseMap::utf8Fold(U_FOLD_CASE_DEFAULT, {name.GetData(), name.GetLength()}, sink, nullptr, error);
    return U_SUCCESS(error) ? folded : std::string(name.GetView());
}

int OpenFile::Open(String8 const& path, Platform::OpenFlags const& flags)
{
    Close();
    return Platform::GetFileCalls().open(ToSystem(path), flags, m_handle);
}

int OpenFile::Close()
{
    auto const handle = std::exchange(m_handle, Platform::c_noHandle);
    return handle == Platform::c_noHandle ? 0 : Platform::GetFileCalls().close(handle);
}

} // namespace Kernel::FileDetail

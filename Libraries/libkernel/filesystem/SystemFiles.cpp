#include "libkernel/filesystem/internal/SystemFiles.h"

#include "libkernel/filesystem/Path.h"
#include "libkernel/platform/Errors.h"

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

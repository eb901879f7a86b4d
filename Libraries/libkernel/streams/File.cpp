#include "libkernel/streams/File.h"

#include "libkernel/platform/Errors.h"
#include "libkernel/platform/FileMarks.h"
#include "libkernel/platform/OpenFileLimit.h"
#include "libkernel/platform/StdioFile.h"
#include "libkernel/platform/Time.h"
#include "libkernel/streams/FileIOException.h"
#include "libkernel/streams/internal/FileOpening.h"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <utility>

namespace Kernel {

namespace {

using Result = File::OpenUnmanagedResult;

// By the access mode's number.
constexpr char const* c_accessModes[] = {"r", "r+", "a+", "w+", "a", "w"};

struct ErrorResult
{
    int error;
    Result result;
};

constexpr ErrorResult c_errorResults[] = {
    {0, Result::Opened},
    {ENOENT, Result::NotFound},
    {EEXIST, Result::Exists},
    {EACCES, Result::AccessDenied},
    {EPERM, Result::NotPermitted},
    {EAGAIN, Result::Locked},
    {ETIMEDOUT, Result::TimedOut},
    {ECONNREFUSED, Result::Refused},
    {EROFS, Result::ReadOnlyVolume},
    {ENOMEM, Result::NoMemory},
    {EISDIR, Result::IsDirectory},
    {ENFILE, Result::TooManyFiles},
    {EMFILE, Result::TooManyFiles},
    {EFBIG, Result::TooLarge},
    {ENOSPC, Result::NoSpace},
    {ENODEV, Result::NotSupported},
    {ENOSYS, Result::NotSupported},
};

constexpr u64 c_openFiles = 8192;

constexpr i64 c_nanosecondsASecond = 1000000000;

} // namespace

bool ParseOpenMode(char const* text, OpenMode& mode)
{
    if (!text) return false;
    mode = OpenMode();
    Platform::OpenFlags& flags = mode.flags;
    switch (*text) {
    case 'r': flags.read = true; break;
    case 'w': flags.write = flags.create = flags.truncate = true; break;
    case 'a': flags.write = flags.create = flags.append = true; break;
    default: return false;
    }
    for (char const* p = text + 1; *p; ++p) {
        switch (*p) {
        case '+': flags.read = flags.write = true; break;
        case 'x': flags.exclusive = true; break;
        case 'S': mode.sequential = true; break;
        case 'b': break;
        default: return false;
        }
    }
    return !flags.exclusive || flags.create;
}

File::OpenUnmanagedResult FailOpen(char const* path, int error, String8* errorText)
{
    Result const result = File::TranslateOpenError(error, path);
    if (errorText) {
        char const* const known = FileIOException::ErrorToString(error);
        *errorText = String8(known ? known : std::strerror(error));
    }
    errno = error;
    return result;
}

File::OpenUnmanagedResult OpenPlatformFile(char const* path, OpenMode const& mode, File::ShareMode share,
                                           File::VisibilityMode visibility, Platform::FileHandle& handle,
                                           String8* errorText)
{
    // A document with many parts may hold thousands of files open, and the usual limit is 1,024.
    static bool const s_limitRaised = (Platform::RaiseOpenFileLimit(c_openFiles), true);
    static_cast<void>(s_limitRaised);

    handle = Platform::c_noHandle;
    Platform::OpenFlags flags = mode.flags;
    flags.share = share == File::ShareMode::DenyWrite ? Platform::FileShare::DenyWrite : Platform::FileShare::DenyNone;
    if (int const error = path ? Platform::GetFileCalls().open(path, flags, handle) : EINVAL) {
        handle = Platform::c_noHandle;
        return FailOpen(path, error, errorText);
    }
    if (mode.sequential) Platform::GetFileCalls().advise(handle, 0, 0, Platform::ReadAdvice::Sequential);
    if (visibility == File::VisibilityMode::Hidden)
        Platform::GetFileCalls().setAttribute(path, Platform::c_hiddenAttribute, "1", 1);
    errno = 0;
    return Result::Opened;
}

File::OpenUnmanagedResult OpenPlatformFile(char const* path, char const* mode, File::ShareMode share,
                                           Platform::FileHandle& handle, String8* errorText)
{
    OpenMode parsed;
    handle = Platform::c_noHandle;
    if (!ParseOpenMode(mode, parsed)) return FailOpen(path, EINVAL, errorText);
    return OpenPlatformFile(path, parsed, share, File::VisibilityMode::Normal, handle, errorText);
}

File::~File()
{
    Close();
}

File::OpenUnmanagedResult File::OpenUnmanaged(char const* path, AccessMode access, ShareMode share,
                                              VisibilityMode visibility, std::FILE*& out, String8* errorText)
{
    int const index = static_cast<int>(access);
    bool const known = index >= 0 && index < static_cast<int>(std::size(c_accessModes));
    return OpenUnmanaged(path, known ? c_accessModes[index] : nullptr, share, visibility, out, errorText);
}

File::OpenUnmanagedResult File::OpenUnmanaged(char const* path, char const* mode, ShareMode share,
                                              VisibilityMode visibility, std::FILE*& out, String8* errorText)
{
    out = nullptr;
    OpenMode parsed;
    if (!ParseOpenMode(mode, parsed)) return FailOpen(path, EINVAL, errorText);
    Platform::FileHandle handle;
    Result const result = OpenPlatformFile(path, parsed, share, visibility, handle, errorText);
    if (!IsOpened(result)) return result;

    // The C library knows fewer letters than we do.
    char const plain[] = {mode[0], parsed.flags.read && parsed.flags.write ? '+' : '\0', '\0'};
    int error = 0;
    out = Platform::MakeStdioFile(handle, plain, error);
    if (out) return result;
    Platform::GetFileCalls().close(handle);
    return FailOpen(path, error, errorText);
}

bool File::Open(char const* path, AccessMode access, ShareMode share, VisibilityMode visibility)
{
    return IsOpened(OpenEx(path, access, share, visibility));
}

bool File::Open(char const* path, char const* mode, ShareMode share, VisibilityMode visibility)
{
    return IsOpened(OpenEx(path, mode, share, visibility));
}

File::OpenUnmanagedResult File::OpenEx(char const* path, AccessMode access, ShareMode share, VisibilityMode visibility)
{
    Close();
    return OpenUnmanaged(path, access, share, visibility, m_file);
}

File::OpenUnmanagedResult File::OpenEx(char const* path, char const* mode, ShareMode share, VisibilityMode visibility)
{
    Close();
    return OpenUnmanaged(path, mode, share, visibility, m_file);
}

void File::Attach(std::FILE* file)
{
    if (file == m_file) return;
    Close();
    m_file = file;
}

std::FILE* File::Detach()
{
    return std::exchange(m_file, nullptr);
}

bool File::Close()
{
    std::FILE* const file = Detach();
    return !file || std::fclose(file) == 0;
}

bool File::Flush()
{
    return m_file && std::fflush(m_file) == 0;
}

bool File::ForceFlush()
{
    if (!Flush()) return false;
    Platform::FileHandle const handle = Platform::GetStdioHandle(m_file);
    return handle != Platform::c_noHandle && Platform::GetFileCalls().flush(handle, Platform::FlushKind::Full) == 0;
}

i64 File::GetPosition() const
{
    return m_file ? ftello(m_file) : -1;
}

i64 File::GetSize() const
{
    i64 const position = GetPosition();
    if (position < 0 || fseeko(m_file, 0, SEEK_END) != 0) return -1;
    i64 const size = ftello(m_file);
    return fseeko(m_file, position, SEEK_SET) == 0 ? size : -1;
}

i64 File::GetSize(char const* path)
{
    Platform::FileInfo info;
    if (!path || Platform::GetFileCalls().stat(path, true, info) != 0) return -1;
    return static_cast<i64>(info.size);
}

bool File::SetPosition(i64 position)
{
    return m_file && fseeko(m_file, position, SEEK_SET) == 0;
}

bool File::SetPosition(i64 offset, Offset from)
{
    int const whence = from == Offset::Current ? SEEK_CUR : from == Offset::End ? SEEK_END : SEEK_SET;
    return m_file && fseeko(m_file, offset, whence) == 0;
}

i64 File::GetSecondSinceModified() const
{
    Platform::FileHandle const handle = m_file ? Platform::GetStdioHandle(m_file) : Platform::c_noHandle;
    Platform::FileInfo info;
    if (handle == Platform::c_noHandle || Platform::GetFileCalls().statHandle(handle, info) != 0) return -1;
    return std::max<i64>(0, (Platform::GetSystemTime() - info.modifyTime) / c_nanosecondsASecond);
}

bool File::UpdateModifiedTimestamp()
{
    return false;
}

File::OpenUnmanagedResult File::TranslateError(int error)
{
    auto const* row = std::find_if(std::begin(c_errorResults), std::end(c_errorResults),
                                   [&](ErrorResult const& r) { return r.error == error; });
    return row != std::end(c_errorResults) ? row->result : Result::Other;
}

File::OpenUnmanagedResult File::TranslateOpenError(int error, char const* path)
{
    if (error != EACCES) return TranslateError(error);
    bool const exists = Platform::GetFileCalls().access(path, Platform::Access::Exists) == 0;
    return exists ? Result::NotPermitted : Result::NotFound;
}

void File::Unlock(std::FILE*) {}

} // namespace Kernel

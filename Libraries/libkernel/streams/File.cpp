#include "libkernel/streams/File.h"

#include "libkernel/platform/Errors.h"
#include "libkernel/platform/FileMarks.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/platform/StdioFile.h"
#include "libkernel/platform/Time.h"
#include "libkernel/streams/internal/FileOpening.h"

#include <cstring>
#include <utility>

namespace Kernel {

namespace {

using Result = File::OpenUnmanagedResult;

struct ErrorRow
{
    int error;
    Result result;
};

constexpr ErrorRow c_openErrors[] = {
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

constexpr char const* c_modes[] = {"r", "r+", "a+", "w+", "a", "w"};

char const* ModeText(File::AccessMode mode)
{
    size_t const index = static_cast<size_t>(mode);
    return index < std::size(c_modes) ? c_modes[index] : nullptr;
}

bool ReadMode(char const* mode, Platform::OpenFlags& flags)
{
    if (!mode) return false;
    bool const plus = std::strchr(mode, '+') != nullptr;
    switch (mode[0]) {
    case 'r':
        flags.read = true;
        flags.write = plus;
        break;
    case 'w':
        flags.write = flags.create = flags.truncate = true;
        flags.read = plus;
        flags.exclusive = std::strchr(mode, 'x') != nullptr;
        break;
    case 'a':
        flags.write = flags.create = flags.append = true;
        flags.read = plus;
        break;
    default: return false;
    }
    return true;
}

} // namespace

// An access error tells apart what stands there and may not be opened, and what is not there.
Result File::TranslateOpenError(int error, char const* path)
{
    if (error != EACCES) return TranslateError(error);
    Platform::FileInfo info;
    bool const exists = Platform::GetFileCalls().stat(path, true, info) == 0;
    return exists ? Result::NotPermitted : Result::NotFound;
}

Result File::TranslateError(int error)
{
    for (ErrorRow const& row : c_openErrors)
        if (row.error == error) return row.result;
    return Result::Other;
}

Result OpenPlatformFile(char const* path, Platform::OpenFlags flags, File::ShareMode share,
                        Platform::FileHandle& handle, String8* text)
{
    flags.share = share == File::ShareMode::DenyWrite && flags.write ? Platform::FileShare::DenyWrite
                                                                     : Platform::FileShare::DenyNone;
    int const error = Platform::GetFileCalls().open(path, flags, handle);
    if (error == 0) return Result::Opened;
    handle = Platform::c_noHandle;
    if (text) *text = String8(std::strerror(error));
    return File::TranslateOpenError(error, path);
}

void HidePlatformFile(char const* path, File::VisibilityMode visibility)
{
    // Where the file system has no attributes the file stays visible.
    if (visibility == File::VisibilityMode::Hidden)
        Platform::GetFileCalls().setAttribute(path, Platform::c_hiddenAttribute, "1", 1);
}

File::~File()
{
    Close();
}

Result File::OpenUnmanaged(char const* path, AccessMode mode, ShareMode share, VisibilityMode visibility,
                           std::FILE*& file, String8* text)
{
    return OpenUnmanaged(path, ModeText(mode), share, visibility, file, text);
}

Result File::OpenUnmanaged(char const* path, char const* mode, ShareMode share, VisibilityMode visibility,
                           std::FILE*& file, String8* text)
{
    file = nullptr;
    Platform::OpenFlags flags;
    if (!path || !ReadMode(mode, flags)) {
        errno = EINVAL;
        return Result::Other;
    }
    Platform::FileHandle handle = Platform::c_noHandle;
    Result const result = OpenPlatformFile(path, flags, share, handle, text);
    if (result != Result::Opened) return result;
    int error = 0;
    file = Platform::MakeStdioFile(handle, mode, error);
    if (!file) {
        Platform::GetFileCalls().close(handle);
        return TranslateError(error);
    }
    HidePlatformFile(path, visibility);
    return Result::Opened;
}

Result File::OpenEx(char const* path, AccessMode mode, ShareMode share, VisibilityMode visibility)
{
    return OpenEx(path, ModeText(mode), share, visibility);
}

Result File::OpenEx(char const* path, char const* mode, ShareMode share, VisibilityMode visibility)
{
    Close();
    return OpenUnmanaged(path, mode, share, visibility, m_file);
}

bool File::Open(char const* path, AccessMode mode, ShareMode share, VisibilityMode visibility)
{
    return OpenEx(path, mode, share, visibility) == Result::Opened;
}

bool File::Open(char const* path, char const* mode, ShareMode share, VisibilityMode visibility)
{
    return OpenEx(path, mode, share, visibility) == Result::Opened;
}

void File::Attach(std::FILE* file)
{
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
    return Flush() && Platform::GetFileCalls().flush(Platform::GetStdioHandle(m_file), Platform::FlushKind::Full) == 0;
}

i64 File::GetPosition() const
{
    return m_file ? static_cast<i64>(::ftello(m_file)) : -1;
}

i64 File::GetSize() const
{
    if (!m_file || std::fflush(m_file) != 0) return -1;
    u64 size = 0;
    return Platform::GetFileCalls().getSize(Platform::GetStdioHandle(m_file), size) == 0 ? static_cast<i64>(size) : -1;
}

i64 File::GetSize(char const* path)
{
    Platform::FileInfo info;
    if (Platform::GetFileCalls().stat(path, true, info) != 0 || info.kind != Platform::FileKind::File) return -1;
    return static_cast<i64>(info.size);
}

bool File::SetPosition(i64 position)
{
    return SetPosition(position, Offset::Start);
}

bool File::SetPosition(i64 distance, Offset from)
{
    int const whence = from == Offset::Current ? SEEK_CUR : from == Offset::End ? SEEK_END : SEEK_SET;
    return m_file && ::fseeko(m_file, distance, whence) == 0;
}

i64 File::GetSecondSinceModified() const
{
    Platform::FileInfo info;
    if (!m_file || Platform::GetFileCalls().statHandle(Platform::GetStdioHandle(m_file), info) != 0) return -1;
    constexpr i64 nanoseconds = 1'000'000'000;
    return (Platform::GetSystemTime() - info.modifyTime) / nanoseconds;
}

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"
#include "libkernel/core/Types.h"
#include "libkernel/platform/PlatformFile.h"

#include <string>

namespace Kernel::FileDetail {

/// What a failure means for the retry rules, whatever number the system gives it.
enum class Failure : u8
{
    None,
    NotFound,
    TooManyOpen,
    AccessDenied,
    InUse, ///< Somebody else has the file open or locked in a way that forbids it.
    DiskFull,
    Other
};

Failure GetFailure(int error);

/// The mode bits that a copy takes over: never those that lend rights.
constexpr u32 c_permissions = 0777;

/// The path as the system's calls take it. Null, which they answer with EINVAL, for a path with a zero unit inside: the
/// system would see another path than the caller.
char const* ToSystem(String8 const& path);

/// The kind of what stands at the path; None if nothing does or it can't be asked.
Platform::FileKind GetKind(String8 const& path, bool followLinks);

/// True if a new file could not be made there without meeting something, if only a link that leads nowhere.
bool IsTaken(String8 const& path);

/// What two paths are to each other, links not followed.
enum class Kinship : u8
{
    Strangers, ///< Different files, or one can't be asked.
    OneName,   ///< One entry of one folder, however the paths are spelt.
    TwoNames   ///< Two entries, in one folder or two, that are links to one file.
};

/// Where it can't be found out whether one file has one name or two, it is one: that answer costs nobody a file.
Kinship GetKinship(String8 const& a, String8 const& b);

/// Renames and replaces, atomically. The system does nothing where both are names of one file: the old one is then
/// deleted. Gives the error.
int RenameEntry(String8 const& from, String8 const& to);

/// What stands behind the last separator, separators at the end left out.
String8 GetLastPart(String8 const& path);

/// Name in folder, with one separator between them.
String8 AppendElement(String8 const& folder, String8 const& name);

/// The name under full case folding, for comparisons. Names of files may be any bytes: what is no UTF-8 folds to the
/// replacement character.
std::string FoldName(String8 const& name);

/// An open file, closed when it dies. Opens nothing but regular files, and never waits for one.
class OpenFile
{
public:
    OpenFile() = default;
    ~OpenFile() { Close(); }
    OpenFile(OpenFile const&) = delete;
    OpenFile& operator=(OpenFile const&) = delete;

    [[nodiscard]] int Open(String8 const& path, Platform::OpenFlags const& flags);
    int Close();
    bool IsOpen() const { return m_handle != Platform::c_noHandle; }
    Platform::FileHandle Get() const { return m_handle; }

private:
    Platform::FileHandle m_handle = Platform::c_noHandle;
};

} // namespace Kernel::FileDetail

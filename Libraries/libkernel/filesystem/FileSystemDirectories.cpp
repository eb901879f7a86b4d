// Directories, links, unique names, and the places that a program asks for.

#include "libkernel/core/Format.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/Path.h"
#include "libkernel/filesystem/internal/SystemFiles.h"
#include "libkernel/platform/Errors.h"

#include <atomic>
#include <string>

namespace Kernel {

using FileDetail::ToSystem;
using Platform::FileKind;
using Platform::GetFileCalls;

namespace {

/// The process-wide directories.
struct Places
{
    String8 appData;
    String8 resources;
    String8 temporary;
};

// Never destroyed: threads may still ask while the process ends.
Places& GetPlaces()
{
    static Places* const s_places = new Places;
    return *s_places;
}

String8 ToString8(std::string const& text)
{
    return String8{std::string_view(text)};
}

String8 UpToLimit(std::string const& path)
{
    return path.size() <= FileSystem::c_maxExecutablePath ? ToString8(path) : String8();
}

bool MakeDirectory(String8 const& path)
{
    if (FileDetail::GetKind(path, true) == FileKind::Folder) return true;
    // Somebody else may make it at the same moment, which is as good.
    return GetFileCalls().makeFolder(ToSystem(path)) == 0 || FileDetail::GetKind(path, true) == FileKind::Folder;
}

} // namespace

String8 FileSystem::ResolveLink(String8 const& path)
{
    std::string target;
    if (GetFileCalls().readLink(ToSystem(path), target) != 0 || target.empty()) return path;
    String8 const text = ToString8(target);
    String8 const folder = Path(path).GetFolder();
    if (target[0] == PathTraitsNative::DefaultSeparator || folder.IsEmpty()) return text;
    // Not brought into its shortest form: a ".." behind a linked folder means the folder that the link leads into.
    return FileDetail::AppendElement(folder, text);
}

bool FileSystem::CreateDirectoryRecursive(String8 const& path)
{
    if (path.IsEmpty()) return false;
    Platform::FileInfo info;
    int const error = GetFileCalls().stat(ToSystem(path), true, info);
    if (error == ENAMETOOLONG || error == EINVAL) return false;

    int end = path.GetLength();
    String8 const last = Path(path).GetLastElement();
    if (last.Find('.') >= 0) end -= last.GetLength();
    for (int i = 1; i <= end; ++i) {
        bool const isEnd = i == end || PathTraitsNative::IsSeparator(path[i]);
        if (!isEnd || PathTraitsNative::IsSeparator(path[i - 1])) continue;
        if (!MakeDirectory(path.GetSubstring(0, i))) return false;
    }
    return true;
}

String8 FileSystem::GetUniqueFilename(String8 const& dir, String8 const& format)
{
    static std::atomic<u64> s_count{0};
    String8 previous;
    for (;;) {
        String8 const name = FileDetail::AppendElement(dir, Format(format, ++s_count));
        if (!FileDetail::IsTaken(name)) return name;
        if (name == previous) return String8();
        previous = name;
    }
}

String8 FileSystem::GetUniqueTemporaryFilename(String8 const& format)
{
    return GetUniqueFilename(GetTemporaryDirectory(), format);
}

String8 FileSystem::GetCurrentDirectory()
{
    return UpToLimit(Platform::GetCurrentFolder());
}

String8 FileSystem::GetExecutablePath()
{
    return UpToLimit(Platform::GetExecutablePath());
}

String8 FileSystem::GetExecutableDirectory()
{
    return Path(GetExecutablePath()).GetFolder();
}

String8 FileSystem::GetHomeDirectory()
{
    return ToString8(Platform::GetHomeFolder());
}

String8 FileSystem::GetFontResourcesDirectory()
{
    return "/usr/share/fonts";
}

String8 FileSystem::GetAppDataDirectory()
{
    return GetPlaces().appData;
}

void FileSystem::SetAppDataDirectory(String8 const& path)
{
    GetPlaces().appData = path;
}

String8 FileSystem::GetResourcesDirectory()
{
    return GetPlaces().resources;
}

void FileSystem::SetResourcesDirectory(String8 const& path)
{
    GetPlaces().resources = path;
}

String8 FileSystem::GetTemporaryDirectory()
{
    return GetPlaces().temporary;
}

void FileSystem::SetTemporaryDirectory(String8 const& path)
{
    String8 directory = path;
    // A separator behind nothing would be the root.
    if (!path.IsEmpty() && !PathTraitsNative::IsSeparator(path[path.GetLength() - 1]))
        directory.Append(PathTraitsNative::DefaultSeparator);
    if (!directory.IsEmpty()) CreateDirectoryRecursive(directory);
    GetPlaces().temporary = directory;
}

} // namespace Kernel

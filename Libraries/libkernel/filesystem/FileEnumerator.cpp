#include "libkernel/filesystem/FileEnumerator.h"

#include "libkernel/filesystem/internal/SystemFiles.h"

#include <algorithm>
#include <utility>

namespace Kernel {

using Platform::FileKind;

FileEnumerator::FileEnumerator(std::vector<PathRec> paths) : m_paths(std::move(paths)) {}

FileEnumerator::~FileEnumerator() = default;

Counted<FileEnumerator> FileEnumerator::Create(String8 const& folder, bool fullPaths)
{
    if (folder.IsEmpty()) return nullptr;
    std::vector<Platform::FolderEntry> entries;
    if (Platform::GetFileCalls().listFolder(FileDetail::ToSystem(folder), entries) != 0) return nullptr;
    std::sort(entries.begin(), entries.end(), [](auto const& a, auto const& b) { return a.name < b.name; });

    std::vector<PathRec> paths;
    paths.reserve(entries.size());
    for (Platform::FolderEntry const& entry : entries) {
        String8 const name{std::string_view(entry.name)};
        String8 const full = FileDetail::AppendElement(folder, name);
        FileKind kind = entry.kind == FileKind::None ? FileDetail::GetKind(full, false) : entry.kind;
        bool const isLink = kind == FileKind::Link;
        if (isLink) kind = FileDetail::GetKind(full, true);
        paths.push_back({fullPaths ? full : name, kind == FileKind::Folder ? Kind::Directory : Kind::File, isLink});
    }
    return Counted<FileEnumerator>(new FileEnumerator(std::move(paths)));
}

} // namespace Kernel

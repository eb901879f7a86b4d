#include "libkernel/filesystem/FileFinder.h"

#include "libkernel/filesystem/internal/SystemFiles.h"

namespace Kernel {

FileFinder::FileFinder() = default;

FileFinder::~FileFinder() = default;

Counted<FileFinder> FileFinder::Create(String8 const& folder, String8 const& name)
{
    return Create(nullptr, folder, name);
}

Counted<FileFinder> FileFinder::Create(Counted<FileFinder> finder, String8 const& folder, String8 const& name)
{
    if (!finder) finder = Counted<FileFinder>(new FileFinder());
    finder->FindI(folder, name);
    return finder;
}

// One level for each open folder, on the heap: a tree may be deeper than a stack.
void FileFinder::FindI(String8 const& folder, String8 const& name)
{
    struct Level
    {
        String8 folder;
        Counted<FileEnumerator> entries;
        size_t next = 0;
    };
    std::string const folded = FileDetail::FoldName(name);
    std::vector<Level> levels;
    levels.push_back({folder, FileEnumerator::Create(folder, false)});
    while (!levels.empty()) {
        Level& level = levels.back();
        if (!level.entries || level.next == level.entries->GetPaths().size()) {
            levels.pop_back();
            continue;
        }
        PathRec const& entry = level.entries->GetPaths()[level.next++];
        String8 const path = FileDetail::AppendElement(level.folder, entry.path);
        if (FileDetail::FoldName(entry.path) == folded) m_paths.push_back({path, entry.kind, entry.isLink});
        // A link may lead back up, so none is entered.
        if (entry.kind == Kind::Directory && !entry.isLink)
            levels.push_back({path, FileEnumerator::Create(path, false)});
    }
}

} // namespace Kernel

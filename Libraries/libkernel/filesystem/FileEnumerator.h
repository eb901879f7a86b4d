#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

#include <vector>

namespace Kernel {

/// The entries of one folder at one moment, in the order of their names' bytes. Never changes once made.
class KERNEL_API FileEnumerator : public Countable
{
public:
    enum class Kind
    {
        File = 1,     ///< Anything that is not a directory; a link that leads nowhere too.
        Directory = 2 ///< A directory, or a link to one.
    };

    struct PathRec
    {
        String8 path;
        Kind kind = Kind::File;
        bool isLink = false; ///< The entry itself is a symbolic link.
    };

    /// Lists @p folder without "." and "..", as names or, with @p fullPaths, as paths below @p folder. Null for an
    /// empty path and for a folder that can't be read; an empty folder gives an object without entries.
    static Counted<FileEnumerator> Create(String8 const& folder, bool fullPaths);

    std::vector<PathRec> const& GetPaths() const { return m_paths; }

private:
    explicit FileEnumerator(std::vector<PathRec> paths);
    ~FileEnumerator() override;

    std::vector<PathRec> const m_paths;
};

} // namespace Kernel

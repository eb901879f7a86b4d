#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"
#include "libkernel/filesystem/FileEnumerator.h"

#include <vector>

namespace Kernel {

/// Finds by name in a folder and in all folders under it.
class KERNEL_API FileFinder : public Countable
{
public:
    using Kind = FileEnumerator::Kind;
    using PathRec = FileEnumerator::PathRec;

    enum class ErrorType
    {
        None = 0
    };

    /// Full paths of every entry called @p name, compared without regard to case, in @p folder and below it, depth
    /// first. Links to folders are reported but not entered, so that a circle of links ends. Folders that can't be
    /// read are passed over. Slow: lists the whole tree.
    static Counted<FileFinder> Create(String8 const& folder, String8 const& name);

    /// Appends what it finds to @p finder and gives it back; a null one is made. One thread at a time for one finder.
    static Counted<FileFinder> Create(Counted<FileFinder> finder, String8 const& folder, String8 const& name);

    std::vector<PathRec> const& GetPaths() const { return m_paths; }

    /// Always None: there is no failure that is told apart.
    ErrorType GetErrorType() const { return m_error; }

private:
    FileFinder();
    ~FileFinder() override;
    void FindI(String8 const& folder, String8 const& name);

    std::vector<PathRec> m_paths;
    ErrorType m_error = ErrorType::None;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"
#include "libkernel/filesystem/PathTraits.h"

#include <vector>

namespace Kernel {

/// A string that knows the grammar of its path. A plain value: copies share the string's block.
template <class Str, class Traits>
class PathT
{
public:
    using StringType = Str;
    using TraitsType = Traits;

    PathT() = default;
    /// Takes the text as it is, or with @p canonicalise in its shortest form.
    explicit PathT(Str path, bool canonicalise = false);

    Str const& GetString() const { return m_path; }
    char const* GetData() const { return m_path.GetData(); }
    bool IsEmpty() const { return m_path.IsEmpty(); }

    /// Appends one element, or a relative path, with exactly one separator before it. An empty one changes nothing.
    PathT& Append(Str const& element);

    /// Appends "name.extension", or the bare name when the extension is empty. False, with nothing changed, when both
    /// are empty.
    bool AppendName(Str const& name, Str const& extension);

    /// Appends the elements in turn; an empty element stands for one separator, so that {"", "usr", "lib"} begins at
    /// the root.
    static PathT Join(std::vector<Str> const& elements);

    /// Brings the path into its shortest form.
    void Canonicalize();

    bool IsRelative() const { return Traits::IsRelative(GetData()); }

    /// What stands behind the last separator; the whole path if it has none.
    Str GetLastElement() const;
    /// What stands before the last element, without the separator between them unless that is the root's. Empty for a
    /// path of one element.
    Str GetFolder() const;

    friend bool operator==(PathT const& a, PathT const& b) { return a.m_path == b.m_path; }

private:
    Str m_path;
};

extern template class KERNEL_API PathT<String8, PathTraitsDos>;
extern template class KERNEL_API PathT<String8, PathTraitsUnix>;

using PathDos = PathT<String8, PathTraitsDos>;
using PathUnix = PathT<String8, PathTraitsUnix>;
/// A path of this system.
using Path = PathT<String8, PathTraitsNative>;

} // namespace Kernel

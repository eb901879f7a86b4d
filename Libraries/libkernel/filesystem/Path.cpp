#include "libkernel/filesystem/Path.h"

#include "libkernel/core/Exception.h"

#include <climits>
#include <utility>

namespace Kernel {

template <class Str, class Traits>
PathT<Str, Traits>::PathT(Str path, bool canonicalise) : m_path(std::move(path))
{
    if (canonicalise) Canonicalize();
}

template <class Str, class Traits>
PathT<Str, Traits>& PathT<Str, Traits>::Append(Str const& element)
{
    if (element.IsEmpty()) return *this;
    Str const tail = element; // It may be this path's own string.
    i64 const room = i64(m_path.GetLength()) + tail.GetLength() + 1;
    if (room >= INT_MAX) throw InvalidArgException();
    int const length = m_path.GetLength();
    auto* const units = m_path.SetLength(static_cast<int>(room));
    m_path.SetLength(Traits::Append(units, tail.GetData(), static_cast<int>(room) + 1, length, tail.GetLength()));
    return *this;
}

template <class Str, class Traits>
bool PathT<Str, Traits>::AppendName(Str const& name, Str const& extension)
{
    Str element = name;
    if (!extension.IsEmpty()) element.Append('.').Append(extension);
    if (element.IsEmpty()) return false;
    Append(element);
    return true;
}

template <class Str, class Traits>
PathT<Str, Traits> PathT<Str, Traits>::Join(std::vector<Str> const& elements)
{
    PathT result;
    for (Str const& element : elements) {
        if (element.IsEmpty())
            result.m_path.Append(Traits::DefaultSeparator);
        else
            result.Append(element);
    }
    return result;
}

template <class Str, class Traits>
void PathT<Str, Traits>::Canonicalize()
{
    int const length = m_path.GetLength();
    if (length > 0) m_path.SetLength(Traits::Canonicalize(m_path.GetWritable(), length));
}

template <class Str, class Traits>
Str PathT<Str, Traits>::GetLastElement() const
{
    int begin = m_path.GetLength();
    while (begin > 0 && !Traits::IsSeparator(m_path[begin - 1])) --begin;
    return m_path.GetSubstring(begin);
}

template <class Str, class Traits>
Str PathT<Str, Traits>::GetFolder() const
{
    int end = m_path.GetLength();
    while (end > 0 && !Traits::IsSeparator(m_path[end - 1])) --end;
    if (end == 0) return Str();
    Str const folder = m_path.GetSubstring(0, end - 1);
    Str const rooted = m_path.GetSubstring(0, end);
    // A separator that makes the root is part of the folder: "/a" lies in "/", "c:\a" in "c:\".
    bool const isDrive = Traits::DriveSeparator[0] != 0 && folder.EndsWith(Traits::DriveSeparator);
    bool const isRoot = isDrive || (Traits::IsRelative(folder.GetData()) && !Traits::IsRelative(rooted.GetData()));
    return isRoot ? rooted : folder;
}

template class PathT<String8, PathTraitsDos>;
template class PathT<String8, PathTraitsUnix>;

} // namespace Kernel

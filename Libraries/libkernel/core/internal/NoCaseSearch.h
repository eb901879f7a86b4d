#pragma once

#include "libkernel/core/internal/FoldedWalk.h"

#include <vector>

namespace Kernel {

/// One search without case: the needle folded, and where in a text it is worth a look.
template <class Enc>
class NoCaseSearch
{
public:
    using Unit = typename Enc::Unit;

    /// The needle is not needed any more afterwards.
    NoCaseSearch(Unit const* needle, int m);

    /// The first match that begins at or after @p p and lies below @p end; null if there is none. Then @p matchEnd is
    /// where it ends.
    Unit const* Find(Unit const* p, Unit const* end, Unit const*& matchEnd) const;

    /// Where the match that begins at @p p ends; null if there is none.
    Unit const* Match(Unit const* p, Unit const* end) const;

    /// True if the text from @p begin to @p end ends with a match.
    bool IsSuffixOf(Unit const* begin, Unit const* end) const;

private:
    Unit const* FindByCodePoint(Unit const* p, Unit const* end, Unit const*& matchEnd) const;

    CaseTable const& m_folding;
    std::vector<u32> m_folded;
};

extern template class NoCaseSearch<TEncUtf8>;
extern template class NoCaseSearch<TEncUtf16>;
extern template class NoCaseSearch<TEncUtf32>;

} // namespace Kernel

#pragma once

#include "libkernel/core/CaseTable.h"
#include "libkernel/core/CharTraits.h"

namespace Kernel {

/// Stands for the unit in its low bits, which belongs to no whole code point.
constexpr u32 c_strayUnit = 0x40000000;

/// Decodes the code point at @p p, below @p end, and moves p behind it; a unit of one that would pass the end counts by
/// itself.
template <class Enc>
u32 NextWithin(typename Enc::Unit const*& p, typename Enc::Unit const* end)
{
    if (CharTraits<Enc>::GetCodePointLength(*p) <= end - p) return CharTraits<Enc>::NextCodePoint(p);
    return c_strayUnit | static_cast<std::make_unsigned_t<typename Enc::Unit>>(*p++);
}

/// The code points of a text one by one, folded.
template <class Enc>
class FoldedWalk
{
public:
    using Unit = typename Enc::Unit;

    FoldedWalk(Unit const* begin, Unit const* end, CaseTable const& folding)
        : m_p(begin), m_end(end), m_folding(folding)
    {
    }

    /// False at the end of the text.
    [[gnu::always_inline]] bool Next(u32& folded)
    {
        if (m_given == m_count) {
            if (m_p == m_end) return false;
            if (u32 const unit = static_cast<std::make_unsigned_t<Unit>>(*m_p); unit < 0x80) {
                ++m_p;
                folded = unit - 'A' < 26 ? unit | 0x20 : unit;
                return true;
            }
            m_count = m_folding.Map(NextWithin<Enc>(m_p, m_end), m_folded);
            m_given = 0;
        }
        folded = m_folded[m_given++];
        return true;
    }
    /// True if what was given so far is the folding of whole code points.
    bool IsBetweenCodePoints() const { return m_given == m_count; }
    /// Behind the code point that the last one given came from.
    Unit const* GetPosition() const { return m_p; }

private:
    Unit const* m_p;
    Unit const* m_end;
    CaseTable const& m_folding;
    int m_given = 0;
    int m_count = 0;
    u32 m_folded[CaseTable::c_longest];
};

} // namespace Kernel

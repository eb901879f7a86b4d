#include "libkernel/core/CodePointTraits.h"

#include "libkernel/core/internal/NoCaseSearch.h"

#include <algorithm>

namespace Kernel {
namespace {

// The first code point of the text that @p isWanted.
template <class Enc, class F>
IndexRange FindCodePoint(typename Enc::Unit const* s, int n, int start, F&& isWanted)
{
    for (auto const* p = s + std::max(start, 0); p < s + n;) {
        auto const* const begin = p;
        if (isWanted(NextWithin<Enc>(p, s + n))) return {static_cast<int>(begin - s), static_cast<int>(p - begin)};
    }
    return {-1, 0};
}

// A set of code points; most are told apart by their low bits alone.
class CodePointSet
{
public:
    void Add(u32 codePoint)
    {
        m_lowBits[codePoint % 256] = true;
        m_all.push_back(codePoint);
    }
    bool Contains(u32 codePoint) const
    {
        return m_lowBits[codePoint % 256] && std::find(m_all.begin(), m_all.end(), codePoint) != m_all.end();
    }

private:
    bool m_lowBits[256] = {};
    std::vector<u32> m_all;
};

} // namespace

template <class Enc>
int CodePointTraits<Enc>::CompareNoCase(Unit const* a, int n, Unit const* b, int m)
{
    CaseTable const& folding = CaseTable::Get(CaseTable::Operation::Fold);
    FoldedWalk<Enc> first(a, a + std::max(n, 0), folding);
    FoldedWalk<Enc> second(b, b + std::max(m, 0), folding);
    for (;;) {
        u32 c = 0;
        u32 d = 0;
        bool const more = first.Next(c);
        if (!second.Next(d)) return more;
        if (!more) return -1;
        if (c != d) return c < d ? -1 : 1;
    }
}

template <class Enc>
bool CodePointTraits<Enc>::BeginsWithNoCase(Unit const* s, int n, Unit const* prefix, int m)
{
    return NoCaseSearch<Enc>(prefix, m).Match(s, s + std::max(n, 0)) != nullptr;
}

template <class Enc>
bool CodePointTraits<Enc>::EndsWithNoCase(Unit const* s, int n, Unit const* suffix, int m)
{
    return NoCaseSearch<Enc>(suffix, m).IsSuffixOf(s, s + std::max(n, 0));
}

template <class Enc>
int CodePointTraits<Enc>::FindNoCase(Unit const* s, int n, Unit const* needle, int m, int start, int* matched)
{
    start = std::max(start, 0);
    if (start > n) return -1;
    Unit const* end = nullptr;
    Unit const* const found = NoCaseSearch<Enc>(needle, m).Find(s + start, s + n, end);
    if (!found) return -1;
    if (matched) *matched = static_cast<int>(end - found);
    return static_cast<int>(found - s);
}

template <class Enc>
IndexRange CodePointTraits<Enc>::FindAnyOf(Unit const* s, int n, Unit const* set, int m, int start)
{
    CodePointSet wanted;
    for (Unit const* p = set; p < set + m;) wanted.Add(NextWithin<Enc>(p, set + m));
    return FindCodePoint<Enc>(s, n, start, [&](u32 c) { return wanted.Contains(c); });
}

template <class Enc>
IndexRange CodePointTraits<Enc>::FindAnyOfCodePoints(Unit const* s, int n, u32 const* set, int m, int start)
{
    CodePointSet wanted;
    for (u32 const* p = set; p < set + m; ++p) wanted.Add(*p);
    return FindCodePoint<Enc>(s, n, start, [&](u32 c) { return wanted.Contains(c); });
}

template <class Enc>
void CodePointTraits<Enc>::Reverse(Unit* dst, Unit const* src, int n)
{
    Unit* to = dst + std::max(n, 0);
    for (Unit const* p = src; p < src + n;) {
        Unit const* const begin = p;
        NextWithin<Enc>(p, src + n);
        to = std::copy_backward(begin, p, to);
    }
}

template struct CodePointTraits<TEncUtf8>;
template struct CodePointTraits<TEncUtf16>;
template struct CodePointTraits<TEncUtf32>;

} // namespace Kernel

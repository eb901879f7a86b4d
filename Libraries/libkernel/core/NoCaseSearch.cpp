#include "libkernel/core/internal/NoCaseSearch.h"

#include <algorithm>
#include <bit>
#include <type_traits>
#if defined(__SSE2__)
#include <emmintrin.h>
#endif

// A match can begin only with a code point whose folding begins the folded needle: both cases of a letter, and for some
// a few more, such as the sharp s for "ss". From these follow the few units that can be the first of a match, and the
// few that can be the second. A long text is asked for both at once, sixteen bytes at a time, with no look at code
// points; only where both fit is it folded and compared. The first unit of a code point is never a later unit of
// another, so what fits begins a code point.

namespace Kernel {
namespace {

// Below this many units the preparation costs more than it saves.
constexpr int c_shortText = 96;

// The code points that folding changes, by the first code point of their folding.
struct Unfolding
{
    u32 first;
    u32 codePoint;
};

std::vector<Unfolding> const& GetUnfoldings()
{
    static std::vector<Unfolding> const unfoldings = [] {
        CaseTable const& folding = CaseTable::Get(CaseTable::Operation::Fold);
        std::vector<Unfolding> all;
        for (u32 const codePoint : folding.GetChanged()) {
            u32 folded[CaseTable::c_longest];
            folding.Map(codePoint, folded);
            all.push_back({folded[0], codePoint});
        }
        std::stable_sort(all.begin(), all.end(), [](auto const& a, auto const& b) { return a.first < b.first; });
        return all;
    }();
    return unfoldings;
}

// Calls @p take with each code point whose folding the @p n folded code points begin with, and the length of that.
template <class F>
void ForEachBeginning(CaseTable const& folding, u32 const* folded, int n, F&& take)
{
    take(folded[0], 1);
    auto const& all = GetUnfoldings();
    auto at = std::lower_bound(all.begin(), all.end(), folded[0], [](auto const& a, u32 c) { return a.first < c; });
    for (; at != all.end() && at->first == folded[0]; ++at) {
        u32 its[CaseTable::c_longest];
        int const count = folding.Map(at->codePoint, its);
        if (count <= n && std::equal(its, its + count, folded)) take(at->codePoint, count);
    }
}

template <class Enc>
int Encode(u32 codePoint, typename Enc::Unit* to)
{
    if (codePoint < c_strayUnit) return static_cast<int>(CharTraits<Enc>::AppendCodePoint(to, codePoint) - to);
    *to = static_cast<typename Enc::Unit>(codePoint);
    return 1;
}

// Units that a place of the text may hold. Tested as up to three values with one bit each left out, which takes in both
// cases of a letter, and beyond that as all units that aren't ASCII: it may let too much through, never too little.
template <class Unit>
class UnitSet
{
public:
    using Bits = std::make_unsigned_t<Unit>;
    static constexpr int c_slots = 3;

    struct Slot
    {
        Bits ignored = static_cast<Bits>(~Bits{0}); // As it stands: every unit fits.
        Bits value = static_cast<Bits>(~Bits{0});
    };

    void Add(Unit unit)
    {
        Bits const bits = static_cast<Bits>(unit);
        if (m_everything || (m_beyondAscii && bits > 0x7F)) return;
        for (int i = 0; i < m_count; ++i)
            if ((bits | m_slots[i].ignored) == m_slots[i].value) return;
        for (int i = 0; i < m_count; ++i) {
            Slot& slot = m_slots[i];
            if (slot.ignored != 0 || !std::has_single_bit(static_cast<Bits>(slot.value ^ bits))) continue;
            slot.ignored = static_cast<Bits>(slot.value ^ bits);
            slot.value |= bits;
            return;
        }
        if (m_count < c_slots)
            m_slots[m_count++] = {0, bits};
        else
            Widen(bits);
    }
    void AddEverything()
    {
        m_everything = true;
        m_beyondAscii = false;
        m_count = 0;
    }

    // Unused slots repeat the first one.
    Slot GetSlot(int i) const { return m_everything ? Slot() : m_slots[i < m_count ? i : 0]; }
    bool TakesAllBeyondAscii() const { return m_beyondAscii; }
    bool NeedsThirdTest() const { return m_count > 2 || m_beyondAscii; }

private:
    void Widen(Bits bits)
    {
        // Slots of units beyond ASCII become free.
        int kept = 0;
        for (int i = 0; i < m_count; ++i)
            if (m_slots[i].value <= 0x7F) m_slots[kept++] = m_slots[i];
        m_count = kept;
        m_beyondAscii = true;
        if (bits > 0x7F) return;
        if (kept == c_slots) return AddEverything();
        m_slots[m_count++] = {0, bits};
    }

    Slot m_slots[c_slots];
    int m_count = 0;
    bool m_beyondAscii = false;
    bool m_everything = false;
};

#if defined(__SSE2__)

template <class Unit>
struct Lanes
{
    static __m128i Fill(Unit unit)
    {
        if constexpr (sizeof(Unit) == 1)
            return _mm_set1_epi8(static_cast<char>(unit));
        else if constexpr (sizeof(Unit) == 2)
            return _mm_set1_epi16(static_cast<short>(unit));
        else
            return _mm_set1_epi32(static_cast<int>(unit));
    }
    static __m128i AreEqual(__m128i a, __m128i b)
    {
        if constexpr (sizeof(Unit) == 1)
            return _mm_cmpeq_epi8(a, b);
        else if constexpr (sizeof(Unit) == 2)
            return _mm_cmpeq_epi16(a, b);
        else
            return _mm_cmpeq_epi32(a, b);
    }
};

// A UnitSet laid out for sixteen bytes at once. Narrow tests two slots only.
template <class Unit, bool Narrow>
class Probe
{
public:
    using Bits = typename UnitSet<Unit>::Bits;
    using L = Lanes<Bits>;

    explicit Probe(UnitSet<Unit> const& set)
    {
        for (int i = 0; i < c_tests; ++i) {
            m_ignored[i] = L::Fill(set.GetSlot(i).ignored);
            m_value[i] = L::Fill(set.GetSlot(i).value);
        }
        m_beyond = L::Fill(set.TakesAllBeyondAscii() ? static_cast<Bits>(~Bits{0x7F}) : Bits{0});
    }

    [[gnu::always_inline]] __m128i Test(Unit const* p) const
    {
        __m128i const units = _mm_loadu_si128(reinterpret_cast<__m128i const*>(p));
        __m128i fit = Fits(units, 0);
        for (int i = 1; i < c_tests; ++i) fit = _mm_or_si128(fit, Fits(units, i));
        if constexpr (!Narrow) {
            __m128i const ascii = L::AreEqual(_mm_and_si128(units, m_beyond), _mm_setzero_si128());
            fit = _mm_or_si128(fit, _mm_xor_si128(ascii, _mm_set1_epi8(-1)));
        }
        return fit;
    }

private:
    static constexpr int c_tests = Narrow ? 2 : UnitSet<Unit>::c_slots;

    [[gnu::always_inline]] __m128i Fits(__m128i units, int i) const
    {
        return L::AreEqual(_mm_or_si128(units, m_ignored[i]), m_value[i]);
    }

    __m128i m_ignored[c_tests];
    __m128i m_value[c_tests];
    __m128i m_beyond;
};

// Calls @p look for each place from @p p on where both units fit, until it says true: then that place. Otherwise null,
// and @p p is where too little was left for another sixteen bytes and the unit behind them.
template <bool Narrow, class Unit, class F>
Unit const* Scan(UnitSet<Unit> const& first, UnitSet<Unit> const& second, Unit const*& p, Unit const* end, F&& look)
{
    constexpr int lanes = 16 / sizeof(Unit);
    constexpr u32 lane = (1u << sizeof(Unit)) - 1;
    Probe<Unit, Narrow> const firsts(first);
    Probe<Unit, Narrow> const seconds(second);
    for (; end - p > lanes; p += lanes) {
        u32 fits = static_cast<u32>(_mm_movemask_epi8(_mm_and_si128(firsts.Test(p), seconds.Test(p + 1))));
        while (fits != 0) {
            int const bit = std::countr_zero(fits);
            if (look(p + static_cast<u32>(bit) / sizeof(Unit))) return p + static_cast<u32>(bit) / sizeof(Unit);
            fits &= ~(lane << bit);
        }
    }
    return nullptr;
}

#else

template <bool, class Unit, class F>
Unit const* Scan(UnitSet<Unit> const&, UnitSet<Unit> const&, Unit const*&, Unit const*, F&&)
{
    return nullptr;
}

#endif

} // namespace

template <class Enc>
NoCaseSearch<Enc>::NoCaseSearch(Unit const* needle, int m) : m_folding(CaseTable::Get(CaseTable::Operation::Fold))
{
    if (m <= 0) return;
    m_folded.reserve(static_cast<size_t>(m));
    FoldedWalk<Enc> walk(needle, needle + m, m_folding);
    for (u32 folded; walk.Next(folded);) m_folded.push_back(folded);
}

template <class Enc>
auto NoCaseSearch<Enc>::Match(Unit const* p, Unit const* end) const -> Unit const*
{
    FoldedWalk<Enc> walk(p, end, m_folding);
    for (u32 const wanted : m_folded)
        if (u32 folded; !walk.Next(folded) || folded != wanted) return nullptr;
    return walk.IsBetweenCodePoints() ? walk.GetPosition() : nullptr;
}

template <class Enc>
bool NoCaseSearch<Enc>::IsSuffixOf(Unit const* begin, Unit const* end) const
{
    auto left = m_folded.size();
    while (left > 0) {
        if (end == begin) return false;
        int const length = static_cast<int>(end - begin);
        Unit const* const at = begin + CharTraits<Enc>::GetCodePointBegin(begin, length - 1);
        Unit const* next = at;
        u32 folded[CaseTable::c_longest];
        auto const count = static_cast<size_t>(m_folding.Map(NextWithin<Enc>(next, end), folded));
        if (count > left || !std::equal(folded, folded + count, m_folded.data() + left - count)) return false;
        left -= count;
        end = at;
    }
    return true;
}

template <class Enc>
auto NoCaseSearch<Enc>::FindByCodePoint(Unit const* p, Unit const* end, Unit const*& matchEnd) const -> Unit const*
{
    for (; p < end; ++p) {
        if (CharTraits<Enc>::IsContinuation(*p)) continue;
        matchEnd = Match(p, end);
        if (matchEnd) return p;
    }
    return nullptr;
}

template <class Enc>
auto NoCaseSearch<Enc>::Find(Unit const* p, Unit const* end, Unit const*& matchEnd) const -> Unit const*
{
    if (m_folded.empty()) return matchEnd = p;
    if (end - p < c_shortText) return FindByCodePoint(p, end, matchEnd);

    UnitSet<Unit> first;
    UnitSet<Unit> second;
    int const n = static_cast<int>(m_folded.size());
    ForEachBeginning(m_folding, m_folded.data(), n, [&](u32 codePoint, int count) {
        Unit units[4];
        int const length = Encode<Enc>(codePoint, units);
        first.Add(units[0]);
        if (length > 1)
            second.Add(units[1]);
        else if (count == n)
            second.AddEverything();
        else
            ForEachBeginning(m_folding, m_folded.data() + count, n - count, [&](u32 next, int) {
                Encode<Enc>(next, units);
                second.Add(units[0]);
            });
    });
    auto const look = [&](Unit const* place) { return (matchEnd = Match(place, end)) != nullptr; };
    Unit const* const found = first.NeedsThirdTest() || second.NeedsThirdTest()
                                  ? Scan<false>(first, second, p, end, look)
                                  : Scan<true>(first, second, p, end, look);
    return found ? found : FindByCodePoint(p, end, matchEnd);
}

template class NoCaseSearch<TEncUtf8>;
template class NoCaseSearch<TEncUtf16>;
template class NoCaseSearch<TEncUtf32>;

} // namespace Kernel

#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <atomic>
#include <compare>
#include <functional>
#include <string_view>
#include <type_traits>

namespace Kernel {

/// Encodings, as empty tags.
struct TEncUtf8
{
    using Unit = char;
};
struct TEncUtf16
{
    using Unit = char16_t;
};
struct TEncUtf32
{
    using Unit = unsigned int;
};

/// The library's string: one pointer to a shared heap block of reference count, length, capacity, the units and a
/// terminator. A copy is one atomic increment; a writer gets a block of its own first. There is no small-string form.
///
/// Always terminated, so the units can go to any C interface; zero units inside are allowed, since the length decides.
/// A moved-from string may only be assigned to or destroyed. One variable is not safe for concurrent writes; blocks
/// may be shared between threads. An allocation that fails throws std::bad_alloc.
template <class Enc>
class StringT
{
public:
    using Unit = typename Enc::Unit;
    using EncodingType = Enc;

    /// Empty; takes no memory.
    StringT() : m_block(&s_empty.header) {}
    /// Copies up to the terminator; null gives the empty string.
    StringT(Unit const* text);
    /// Copies @p length units; null or a length below 1 gives the empty string.
    StringT(Unit const* text, int length);
    explicit StringT(std::basic_string_view<Unit> text) requires(!std::is_same_v<Unit, unsigned int>)
        : StringT(text.data(), CheckedLength(text.size()))
    {
    }
    /// @p length units that the caller writes at @p units, terminated; empty for a length below 1. The cheapest way to
    /// build a text whose length is known.
    StringT(int length, Unit*& units);
    StringT(StringT const& o) : m_block(o.m_block)
    {
        if (m_block) Retain();
    }
    StringT(StringT&& o) noexcept : m_block(o.m_block) { o.m_block = nullptr; }
    ~StringT() { Release(); }
    StringT& operator=(StringT const& o)
    {
        StringT copy(o);
        Swap(copy);
        return *this;
    }
    StringT& operator=(StringT&& o) noexcept
    {
        Swap(o);
        return *this;
    }
    void Swap(StringT& o) noexcept
    {
        Header* const mine = m_block;
        m_block = o.m_block;
        o.m_block = mine;
    }

    /// Units without the terminator.
    int GetLength() const { return m_block->length; }
    int GetCapacity() const { return m_block->capacity; }
    bool IsEmpty() const { return m_block->length == 0; }
    /// The units, terminated; valid until this string is changed or dies.
    Unit const* GetData() const { return UnitsOf(m_block); }
    Unit operator[](int i) const { return GetData()[i]; }

    Unit const* begin() const { return GetData(); }
    Unit const* end() const { return GetData() + GetLength(); }

    /// True if a text of @p n units fits into the block as it is: it is private and large enough.
    bool HasRoomFor(int n) const
    {
        return n <= m_block->capacity && m_block->references.load(std::memory_order_acquire) < 2;
    }
    /// Makes the block private with room for @p n units: nothing happens when it is both already. Otherwise the new
    /// block is sized for exactly n units and keeps min(n, length) of the text; n = 0 gives the empty string.
    void Reserve(int n);
    /// Makes the text @p n units long and private, and gives its units for writing. Units beyond the old length are
    /// undefined; the terminator is set.
    Unit* SetLength(int n);
    /// Makes the block private and gives its units for writing.
    Unit* GetWritable() { return SetLength(GetLength()); }

    /// Appending grows by exact need: reserve once before a loop. The text may lie in this string; null or a length
    /// below 1 adds nothing.
    StringT& Append(Unit const* text, int length);
    StringT& Append(StringT const& text) { return Append(text.GetData(), text.GetLength()); }
    StringT& Append(Unit unit) { return Append(&unit, 1); }
    StringT& operator+=(StringT const& text) { return Append(text); }
    StringT& operator+=(Unit const* text) { return Append(text, Measure(text)); }
    friend StringT operator+(StringT const& a, StringT const& b)
    {
        return Joined(a.GetData(), a.GetLength(), b.GetData(), b.GetLength());
    }
    friend StringT operator+(StringT const& a, Unit const* b)
    {
        return Joined(a.GetData(), a.GetLength(), b, Measure(b));
    }
    friend StringT operator+(Unit const* a, StringT const& b)
    {
        return Joined(a, Measure(a), b.GetData(), b.GetLength());
    }

    /// @p count units from @p start, cut to the end. The whole string shares the block; a start beyond the end gives
    /// the empty string; anything else is a copy.
    StringT GetSubstring(int start, int count) const;
    StringT GetSubstring(int start) const { return GetSubstring(start, GetLength()); }

    /// Index of the first match at or after @p start, or -1.
    int Find(StringT const& needle, int start = 0) const;
    int Find(Unit unit, int start = 0) const;
    /// Index of the last such unit, or -1.
    int FindLast(Unit unit) const;
    bool BeginsWith(StringT const& prefix) const;
    bool EndsWith(StringT const& suffix) const;

    /// Order and equality by units, as BaseCharTraits::Compare has them.
    int Compare(StringT const& o) const;
    u32 GenerateHash() const;

    std::basic_string_view<Unit> GetView() const requires(!std::is_same_v<Unit, unsigned int>)
    {
        return {GetData(), static_cast<size_t>(GetLength())};
    }

    friend bool operator==(StringT const& a, StringT const& b) { return a.IsEqual(b.GetData(), b.GetLength()); }
    friend bool operator==(StringT const& a, Unit const* b) { return a.IsEqual(b, Measure(b)); }
    friend std::strong_ordering operator<=>(StringT const& a, StringT const& b) { return a.Compare(b) <=> 0; }

    /// True if both share one block; for tests of the sharing rule.
    bool SharesBlockWith(StringT const& o) const { return m_block == o.m_block; }

private:
    struct Header
    {
        mutable std::atomic<i32> references;
        i32 length;
        i32 capacity;
    };
    struct EmptyBlock
    {
        Header header{{1}, 0, 0};
        Unit terminator = 0;
    };
    static_assert(sizeof(Header) == 12);

    static Unit* UnitsOf(Header* h) { return reinterpret_cast<Unit*>(h + 1); }
    static Unit const* UnitsOf(Header const* h) { return reinterpret_cast<Unit const*>(h + 1); }
    static Header* Allocate(int units);
    static int CheckedLength(size_t length);
    static int Measure(Unit const* text);
    static StringT Joined(Unit const* a, int n, Unit const* b, int m);
    bool IsEqual(Unit const* text, int length) const;
    // The empty block is nobody's to free. Counting it would make every thread write the same line of memory.
    bool IsCounted() const { return m_block != &s_empty.header; }
    void Retain()
    {
        if (IsCounted()) m_block->references.fetch_add(1, std::memory_order_relaxed);
    }
    // The only owner needs no atomic exchange: nobody is left who could take a reference meanwhile.
    void Release()
    {
        if (m_block && IsCounted() &&
            (m_block->references.load(std::memory_order_acquire) == 1 ||
             m_block->references.fetch_sub(1, std::memory_order_acq_rel) == 1))
            Free(m_block);
    }
    static void Free(Header* block);

    // Never counted and never freed.
    KERNEL_API static EmptyBlock s_empty;

    Header* m_block; // Null only after a move.
};

/// Makes @p out exactly @p n + @p m units: those at @p a, then those at @p b; a length below 1 adds nothing. Both may
/// lie in @p out. Throws std::bad_alloc when there is no memory or the text would pass 2^31 units.
template <class Enc>
void ConcatString(StringT<Enc>& out, typename Enc::Unit const* a, int n, typename Enc::Unit const* b, int m);

extern template class KERNEL_API StringT<TEncUtf8>;
extern template class KERNEL_API StringT<TEncUtf16>;
extern template class KERNEL_API StringT<TEncUtf32>;
extern template KERNEL_API void ConcatString(StringT<TEncUtf8>&, char const*, int, char const*, int);
extern template KERNEL_API void ConcatString(StringT<TEncUtf16>&, char16_t const*, int, char16_t const*, int);
extern template KERNEL_API void ConcatString(StringT<TEncUtf32>&, unsigned int const*, int, unsigned int const*, int);

using String8 = StringT<TEncUtf8>;
using String16 = StringT<TEncUtf16>;
using String32 = StringT<TEncUtf32>;

} // namespace Kernel

template <class Enc>
struct std::hash<Kernel::StringT<Enc>>
{
    size_t operator()(Kernel::StringT<Enc> const& s) const { return s.GenerateHash() * 0x9E3779B97F4A7C15ull >> 16; }
};

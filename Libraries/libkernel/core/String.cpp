#include "libkernel/core/String.h"

#include "libkernel/core/BaseCharTraits.h"

#include <algorithm>
#include <cstdlib>
#include <limits>
#include <new>
#include <optional>
#include <utility>

namespace Kernel {

template <class Enc>
constinit typename StringT<Enc>::EmptyBlock StringT<Enc>::s_empty{};

// Block bytes are the header, the units and the terminator, rounded down to 8 after adding 7; the capacity is what then
// fits. Header and terminator together are 13, 14 and 16 bytes.
template <class Enc>
auto StringT<Enc>::Allocate(int units) -> Header*
{
    constexpr u64 overhead = sizeof(Header) + sizeof(Unit);
    u64 const bytes = (static_cast<u64>(units) * sizeof(Unit) + overhead + 7) & ~u64{7};
    u64 const capacity = (bytes - overhead) / sizeof(Unit);
    if (capacity > static_cast<u64>(std::numeric_limits<i32>::max())) throw std::bad_alloc();
    void* const memory = std::malloc(bytes);
    if (!memory) throw std::bad_alloc();
    Header* const block = new (memory) Header{{1}, 0, static_cast<i32>(capacity)};
    return block;
}

template <class Enc>
void StringT<Enc>::Free(Header* block)
{
    std::free(block);
}

template <class Enc>
int StringT<Enc>::CheckedLength(size_t length)
{
    if (length > static_cast<size_t>(std::numeric_limits<i32>::max())) throw std::bad_alloc();
    return static_cast<int>(length);
}

template <class Enc>
int StringT<Enc>::Measure(Unit const* text)
{
    return text ? BaseCharTraits<Unit>::GetLength(text) : 0;
}

template <class Enc>
StringT<Enc>::StringT(Unit const* text) : StringT(text, Measure(text))
{
}

template <class Enc>
StringT<Enc>::StringT(int length, Unit*& units)
{
    if (length > 0) {
        m_block = Allocate(length);
        m_block->length = length;
        UnitsOf(m_block)[length] = 0;
    } else {
        m_block = &s_empty.header;
    }
    units = UnitsOf(m_block);
}

template <class Enc>
StringT<Enc>::StringT(Unit const* text, int length)
{
    Unit* units;
    StringT copy(text ? length : 0, units);
    BaseCharTraits<Unit>::Copy(units, text, copy.GetLength());
    m_block = std::exchange(copy.m_block, nullptr);
}

template <class Enc>
void StringT<Enc>::Reserve(int n)
{
    if (HasRoomFor(n)) return;
    if (n <= 0) {
        *this = StringT();
        return;
    }
    Header* const fresh = Allocate(n);
    fresh->length = std::min(n, m_block->length);
    BaseCharTraits<Unit>::Copy(UnitsOf(fresh), UnitsOf(m_block), fresh->length);
    UnitsOf(fresh)[fresh->length] = 0;
    Release();
    m_block = fresh;
}

template <class Enc>
auto StringT<Enc>::SetLength(int n) -> Unit*
{
    n = std::max(n, 0);
    Reserve(n);
    // The shared empty block already says 0 and holds the terminator; writing to it would race with other threads.
    if (m_block == &s_empty.header) return UnitsOf(m_block);
    m_block->length = n;
    UnitsOf(m_block)[n] = 0;
    return UnitsOf(m_block);
}

template <class Enc>
StringT<Enc>& StringT<Enc>::Append(Unit const* text, int length)
{
    if (!text || length <= 0) return *this;
    int const old = GetLength();
    if (length > std::numeric_limits<i32>::max() - old) throw std::bad_alloc();
    // The text may lie in this very block. If that is about to be replaced, it is kept alive until the copy is made.
    std::optional<StringT> keep;
    if (!HasRoomFor(old + length)) keep = *this;
    BaseCharTraits<Unit>::Copy(SetLength(old + length) + old, text, length);
    return *this;
}

template <class Enc>
StringT<Enc> StringT<Enc>::Joined(Unit const* a, int n, Unit const* b, int m)
{
    StringT result;
    ConcatString(result, a, n, b, m);
    return result;
}

template <class Enc>
StringT<Enc> StringT<Enc>::GetSubstring(int start, int count) const
{
    int const length = GetLength();
    start = std::max(start, 0);
    if (start >= length || count <= 0) return StringT();
    count = std::min(count, length - start);
    if (count == length) return *this;
    return StringT(GetData() + start, count);
}

template <class Enc>
int StringT<Enc>::Find(StringT const& needle, int start) const
{
    return BaseCharTraits<Unit>::Find(GetData(), GetLength(), needle.GetData(), needle.GetLength(), start);
}

template <class Enc>
int StringT<Enc>::Find(Unit unit, int start) const
{
    return BaseCharTraits<Unit>::Find(GetData(), GetLength(), unit, start);
}

template <class Enc>
int StringT<Enc>::FindLast(Unit unit) const
{
    for (int i = GetLength() - 1; i >= 0; --i)
        if (GetData()[i] == unit) return i;
    return -1;
}

template <class Enc>
bool StringT<Enc>::BeginsWith(StringT const& prefix) const
{
    int const n = prefix.GetLength();
    return n <= GetLength() && BaseCharTraits<Unit>::IsEqual(GetData(), n, prefix.GetData(), n);
}

template <class Enc>
bool StringT<Enc>::EndsWith(StringT const& suffix) const
{
    int const n = suffix.GetLength();
    return n <= GetLength() && BaseCharTraits<Unit>::IsEqual(end() - n, n, suffix.GetData(), n);
}

template <class Enc>
int StringT<Enc>::Compare(StringT const& o) const
{
    return BaseCharTraits<Unit>::Compare(GetData(), GetLength(), o.GetData(), o.GetLength());
}

template <class Enc>
bool StringT<Enc>::IsEqual(Unit const* text, int length) const
{
    return text == GetData() ? length == GetLength()
                             : BaseCharTraits<Unit>::IsEqual(GetData(), GetLength(), text, length);
}

template <class Enc>
u32 StringT<Enc>::GenerateHash() const
{
    return BaseCharTraits<Unit>::GenerateHash(GetData(), GetLength());
}

template <class Enc>
void ConcatString(StringT<Enc>& out, typename Enc::Unit const* a, int n, typename Enc::Unit const* b, int m)
{
    using Traits = BaseCharTraits<typename Enc::Unit>;
    n = std::max(n, 0);
    m = std::max(m, 0);
    if (n > std::numeric_limits<i32>::max() - m) throw std::bad_alloc();
    // Built aside, so that the parts may lie in the target.
    typename Enc::Unit* to;
    StringT<Enc> joined(n + m, to);
    Traits::Copy(to, a, n);
    Traits::Copy(to + n, b, m);
    out = std::move(joined);
}

template class StringT<TEncUtf8>;
template class StringT<TEncUtf16>;
template class StringT<TEncUtf32>;
template KERNEL_API void ConcatString(StringT<TEncUtf8>&, char const*, int, char const*, int);
template KERNEL_API void ConcatString(StringT<TEncUtf16>&, char16_t const*, int, char16_t const*, int);
template KERNEL_API void ConcatString(StringT<TEncUtf32>&, unsigned int const*, int, unsigned int const*, int);

} // namespace Kernel

#pragma once

#include "libkernel/core/Types.h"

namespace Kernel {

/// A run of whole numbers: the first of them, and how many. What searches of text give back, and the piece that sets of
/// indices are made of. A plain value.
class IndexRange
{
public:
    /// (0, 0), which is empty.
    constexpr IndexRange() = default;
    /// The one index @p i.
    constexpr explicit IndexRange(int i) : m_location(i), m_length(1) {}
    constexpr IndexRange(int location, int length) : m_location(location), m_length(length) {}

    /// From the lower to the higher of two indices, both included.
    static constexpr IndexRange FromEndPoints(int a, int b)
    {
        return a < b ? IndexRange(a, b - a + 1) : IndexRange(b, a - b + 1);
    }
    /// What both hold. An empty @p b comes back as it is; otherwise the location is the larger of the two, even where
    /// nothing is left.
    static constexpr IndexRange Clamp(IndexRange const& a, IndexRange const& b)
    {
        if (b.empty()) return b;
        int const location = a.m_location > b.m_location ? a.m_location : b.m_location;
        i64 const end = a.End() < b.End() ? a.End() : b.End();
        return {location, a.empty() || end < location ? 0 : static_cast<int>(end - location)};
    }

    constexpr int GetFirst() const { return m_location; }
    constexpr int GetLocation() const { return m_location; }
    /// The last index; one below the first for an empty range.
    constexpr int GetLast() const { return m_location + m_length - 1; }
    /// One past the last index.
    constexpr int GetMax() const { return m_location + m_length; }
    constexpr int GetLength() const { return m_length; }
    constexpr bool empty() const { return m_length == 0; }

    constexpr bool Contains(int i) const { return m_location <= i && i < End(); }
    /// True if @p o ends above this location and begins at or before this last index.
    constexpr bool Intersects(IndexRange const& o) const { return o.End() > m_location && o.m_location < End(); }
    /// The range moved by @p d.
    constexpr IndexRange Offset(int d) const { return {m_location + d, m_length}; }

    friend constexpr bool operator==(IndexRange const&, IndexRange const&) = default;

private:
    constexpr i64 End() const { return static_cast<i64>(m_location) + m_length; }

    i32 m_location = 0;
    i32 m_length = 0;
};

} // namespace Kernel

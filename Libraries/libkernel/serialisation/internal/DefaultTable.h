#pragma once

#include "libkernel/core/IDTag.h"
#include "libkernel/serialisation/Defaults.h"

#include <algorithm>
#include <cstring>
#include <vector>

namespace Kernel {

class ClassPropertiesBase;

/// The default of one tag.
struct DefaultRow
{
    u32 tag;
    Defaults::DefaultItemType kind;
    PropType type; // The next three are set for a scalar of at most 8 bytes; size is 0 otherwise.
    u8 size;
    u64 value; // The number that its bytes make.
    Defaults::DefaultBase const* item;

    /// The item as a @p D, or null if it is of another kind.
    template <class D>
    D const* As() const
    {
        return kind == D::c_kind ? static_cast<D const*>(item) : nullptr;
    }
    bool EqualsScalar(PropType valueType, u64 bits, u32 count) const
    {
        return size == count && type == valueType && value == bits;
    }
};

/// The defaults of a class and all its parents in one table, sorted by tag: for each tag the one that a reader will
/// find, which is the nearest. A save asks this once for each property instead of walking a map for each class. Never
/// changes.
class DefaultTable
{
public:
    using Row = DefaultRow;

    explicit DefaultTable(ClassPropertiesBase const& description);

    bool IsEmpty() const { return m_rows.empty(); }
    /// The tag's row, or null.
    Row const* Find(IDTag tag) const
    {
        auto row = m_rows.begin();
        auto const end = m_rows.end();
        if (m_rows.size() > 8)
            row = std::lower_bound(row, end, tag.value, IsBefore);
        else
            while (row != end && row->tag < tag.value) ++row;
        return row != end && row->tag == tag.value ? &*row : nullptr;
    }

private:
    static bool IsBefore(Row const& row, u32 tag) { return row.tag < tag; }

    std::vector<Row> m_rows;
};

} // namespace Kernel

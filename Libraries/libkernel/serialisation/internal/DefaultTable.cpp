#include "libkernel/serialisation/internal/DefaultTable.h"

#include "libkernel/serialisation/ClassProperties.h"

#include <algorithm>

namespace Kernel {

namespace {

DefaultTable::Row MakeRow(Defaults::DefaultBase const& item)
{
    DefaultTable::Row row{item.GetIDTag().value, item.GetDefaultType(), PropType::EndOfList, 0, 0, &item};
    auto const* const scalar = row.As<Defaults::DefaultType>();
    if (!scalar || scalar->GetBytes().size() > sizeof row.value) return row;
    row.type = scalar->GetPropType();
    row.size = static_cast<u8>(scalar->GetBytes().size());
    for (u32 i = 0; i < row.size; ++i) row.value |= u64{scalar->GetBytes()[i]} << (8 * i);
    return row;
}

} // namespace

DefaultTable::DefaultTable(ClassPropertiesBase const& description)
{
    for (auto const* level = &description; level; level = level->GetParentClassProperties())
        for (auto const& [tag, item] : level->GetDefaults()) m_rows.push_back(MakeRow(*item));
    std::stable_sort(m_rows.begin(), m_rows.end(), [](Row const& a, Row const& b) { return a.tag < b.tag; });
    // A reader takes the nearest default of a tag. A value that only equals one further up, which a class on the way
    // replaces, would come back as another if it were left out.
    auto const isFurther = [](Row const& a, Row const& b) { return a.tag == b.tag; };
    m_rows.erase(std::unique(m_rows.begin(), m_rows.end(), isFurther), m_rows.end());
}

} // namespace Kernel

#include "libkernel/serialisation/UsedTagSet.h"

#include <algorithm>

namespace Kernel {

bool UsedTagSet::ContainsSorted(IDTag tag) const
{
    return std::ranges::binary_search(m_sorted, tag.value);
}

void UsedTagSet::AddSorted(IDTag tag)
{
    if (m_sorted.empty()) {
        m_sorted.assign(m_inPlace, m_inPlace + m_count);
        std::ranges::sort(m_sorted);
        m_count = 0;
    }
    m_sorted.insert(std::ranges::lower_bound(m_sorted, tag.value), tag.value);
}

} // namespace Kernel

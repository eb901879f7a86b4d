#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/Types.h"

#include <span>
#include <vector>

namespace Kernel {

/// The tags used so far in one property list. Lists are short: the first tags lie in place and are searched from end to
/// end, which takes no memory; a longer list is kept sorted.
class KERNEL_API UsedTagSet
{
public:
    static constexpr u32 c_inPlace = 24;

    UsedTagSet() {}
    UsedTagSet(UsedTagSet const&) = delete;
    UsedTagSet& operator=(UsedTagSet const&) = delete;

    bool Contains(IDTag tag) const
    {
        u32 found = 0;
        for (u32 i = 0; i < m_count; ++i) found |= m_inPlace[i] == tag.value;
        return found || (!m_sorted.empty() && ContainsSorted(tag));
    }
    /// False if the tag was there already.
    bool Add(IDTag tag)
    {
        if (Contains(tag)) return false;
        if (m_count == c_inPlace || !m_sorted.empty())
            AddSorted(tag);
        else
            m_inPlace[m_count++] = tag.value;
        return true;
    }
    /// The tags in the order of their use, while there are at most c_inPlace; otherwise nothing.
    std::span<u32 const> GetShort() const { return {m_inPlace, m_count}; }

private:
    bool ContainsSorted(IDTag tag) const;
    void AddSorted(IDTag tag);

    u32 m_count = 0;
    u32 m_inPlace[c_inPlace];
    std::vector<u32> m_sorted; // Takes over from m_inPlace.
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <memory>
#include <vector>

namespace Kernel {

/// What each code point becomes under one of the full case operations of Unicode (The Unicode Standard, section 3.13),
/// seen alone, without its neighbours: one to three code points. Made from ICU's data at first use, shared by all
/// threads from then on, and never freed.
class KERNEL_API CaseTable
{
public:
    enum class Operation
    {
        Fold = 0, ///< For comparison without case; the same in every language.
        Lower = 1,
        Upper = 2,
        Title = 3
    };
    static constexpr int c_longest = 3; ///< Code points that one code point becomes, at most.

    /// The table with the rules of the language of @p locale, a BCP 47 tag or ICU's form of one; of no language when it
    /// is empty. Turkish, Azerbaijani, Lithuanian and Armenian have rules of their own.
    static CaseTable const& Get(Operation operation, char const* locale = "");

    /// Writes what @p codePoint becomes to @p to, which has room for c_longest; gives the count. Any number may be
    /// given; what is no code point stays as it is.
    int Map(u32 codePoint, u32* to) const
    {
        u32 const entry = codePoint < c_end ? m_entries[m_blocks[codePoint / c_block] + codePoint % c_block] : 0;
        if (entry < c_several) {
            *to = entry ? entry : codePoint;
            return 1;
        }
        return MapToSeveral(entry, to);
    }

    /// The code points that don't stay as they are, ascending.
    std::vector<u32> const& GetChanged() const { return m_changed; }

private:
    static constexpr u32 c_end = 0x20000; // Nothing from here on has case.
    static constexpr u32 c_block = 128;
    static constexpr u32 c_several = 0x80000000;

    CaseTable(Operation operation, char const* language);
    int MapToSeveral(u32 entry, u32* to) const;

    // Where the entries of each block of code points begin; blocks without case share the first. An entry is 0 for a
    // code point that stays, the one that it becomes, or c_several with a count and a place in the sequences.
    u16 m_blocks[c_end / c_block] = {};
    std::vector<u32> m_entries;
    std::vector<u32> m_sequences;
    std::vector<u32> m_changed;
};

} // namespace Kernel

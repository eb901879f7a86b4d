#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"
#include "libkernel/text/Wildcard.h"

#include <vector>

namespace Kernel {

/// The tokens that an application knows, or a document beside those: dictionaries form a chain. Once built, any thread
/// may read; AddWildcard is for building.
class KERNEL_API WildcardDictionary : public Countable
{
public:
    using WildcardVector = std::vector<Counted<BuiltinWildcard const>>;

    WildcardDictionary() = default;
    /// Stands on @p parent, which is kept and may be null.
    explicit WildcardDictionary(Counted<WildcardDictionary const> const& parent) : m_parent(parent) {}
    WildcardDictionary(WildcardDictionary const&) = default;

    /// Appends, without a look for another of that token: Find gives the first. Null adds nothing.
    void AddWildcard(Counted<BuiltinWildcard const> const& wildcard)
    {
        if (wildcard) m_wildcards.push_back(wildcard);
    }
    /// The first of exactly that token, here and then in the parent, so that an entry hides the parent's of its token.
    /// Null if there is none.
    Counted<BuiltinWildcard const> Find(String8 const& token) const;

    /// Entries here and in all ancestors.
    u64 GetCount() const;
    /// This dictionary's own, in the order in which they were added.
    WildcardVector const& GetWildcards() const { return m_wildcards; }
    Counted<WildcardDictionary const> const& GetParent() const { return m_parent; }
    /// Appends all entries, those of the root first, hidden ones too.
    void CollateWildcardsOrdered(WildcardVector& wildcards) const;

protected:
    ~WildcardDictionary() override;

private:
    WildcardVector m_wildcards;
    Counted<WildcardDictionary const> m_parent;
};

} // namespace Kernel

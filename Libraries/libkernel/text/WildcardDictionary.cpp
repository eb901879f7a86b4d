#include "libkernel/text/WildcardDictionary.h"

namespace Kernel {

WildcardDictionary::~WildcardDictionary() = default;

Counted<BuiltinWildcard const> WildcardDictionary::Find(String8 const& token) const
{
    for (WildcardDictionary const* at = this; at; at = at->m_parent.Get())
        for (Counted<BuiltinWildcard const> const& wildcard : at->m_wildcards)
            if (wildcard->GetToken() == token) return wildcard;
    return nullptr;
}

u64 WildcardDictionary::GetCount() const
{
    u64 count = 0;
    for (WildcardDictionary const* at = this; at; at = at->m_parent.Get()) count += at->m_wildcards.size();
    return count;
}

void WildcardDictionary::CollateWildcardsOrdered(WildcardVector& wildcards) const
{
    wildcards.reserve(wildcards.size() + GetCount());
    std::vector<WildcardDictionary const*> chain;
    for (WildcardDictionary const* at = this; at; at = at->m_parent.Get()) chain.push_back(at);
    for (auto at = chain.rbegin(); at != chain.rend(); ++at)
        wildcards.insert(wildcards.end(), (*at)->m_wildcards.begin(), (*at)->m_wildcards.end());
}

} // namespace Kernel

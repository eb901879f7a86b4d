#include "libkernel/serialisation/internal/InSerialiserClassInfo.h"

#include <algorithm>
#include <iterator>

namespace Kernel {

namespace {

// Tables up to this size are joined with their parents', so that one search serves; a file that states more for its
// classes must not be able to multiply them.
constexpr size_t c_maxJoined = 256;

} // namespace

InSerialiserClassInfoBase::InSerialiserClassInfoBase(ClassPropertiesBase const& properties, u16 version)
    : m_properties(properties), m_version(version)
{
}

InSerialiserClassInfoBase::~InSerialiserClassInfoBase()
{
    for (auto& [tag, property] : m_own) property.Release();
}

void InSerialiserClassInfoBase::AddDefault(InSerialiserProperty const& property)
{
    auto const [at, isNew] = m_own.try_emplace(property.tag, property);
    if (isNew) return;
    at->second.Release();
    at->second = property;
}

void InSerialiserClassInfoBase::Close(InSerialiserClassInfoBase const* parent)
{
    m_isOpen = false;
    m_parent = parent;
    m_joined.reserve(m_own.size());
    for (auto const& [tag, property] : m_own) m_joined.push_back(property);
    m_next = parent;
    if (parent && m_joined.size() + parent->m_joined.size() <= c_maxJoined) {
        std::vector<InSerialiserProperty> joined;
        joined.reserve(m_joined.size() + parent->m_joined.size());
        std::set_union(m_joined.begin(), m_joined.end(), parent->m_joined.begin(), parent->m_joined.end(),
                       std::back_inserter(joined),
                       [](InSerialiserProperty const& a, InSerialiserProperty const& b) { return a.tag < b.tag; });
        m_joined = std::move(joined);
        m_next = parent->m_next;
    }
    m_followers.resize(m_joined.size());
}

InSerialiserProperty const* InSerialiserClassInfoBase::FindSlow(IDTag tag) const
{
    if (m_isOpen) {
        // A default object of this very class sees what has been stated so far.
        auto const at = m_own.find(tag);
        return at == m_own.end() ? nullptr : &at->second;
    }
    for (InSerialiserClassInfoBase const* info = this; info; info = info->m_next) {
        auto const at = std::lower_bound(info->m_joined.begin(), info->m_joined.end(), tag,
                                         [](InSerialiserProperty const& a, IDTag wanted) { return a.tag < wanted; });
        if (at == info->m_joined.end() || at->tag != tag) continue;
        if (info == this) {
            u32 const found = static_cast<u32>(at - m_joined.begin());
            m_followers[m_last] = found;
            m_last = found;
        }
        return &*at;
    }
    return nullptr;
}

} // namespace Kernel

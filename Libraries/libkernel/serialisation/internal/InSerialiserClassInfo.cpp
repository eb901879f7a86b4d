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
    if (!parent || m_joined.size() + parent->m_joined.size() > c_maxJoined) return;
    std::vector<InSerialiserProperty> joined;
    joined.reserve(m_joined.size() + parent->m_joined.size());
    std::set_union(m_joined.begin(), m_joined.end(), parent->m_joined.begin(), parent->m_joined.end(),
                   std::back_inserter(joined),
                   [](InSerialiserProperty const& a, InSerialiserProperty const& b) { return a.tag < b.tag; });
    m_joined = std::move(joined);
    m_next = parent->m_next;
}

InSerialiserProperty const* InSerialiserClassInfoBase::FindDefault(IDTag tag) const
{
    if (m_isOpen) {
        // A default object of this very class sees what has been stated so far.
        auto const at = m_own.find(tag);
        return at == m_own.end() ? nullptr : &at->second;
    }
    for (InSerialiserClassInfoBase const* info = this; info; info = info->m_next) {
        if (auto const* const found = FindProperty(const_cast<InSerialiserProperty*>(info->m_joined.data()),
                                                   static_cast<u32>(info->m_joined.size()), tag))
            return found;
    }
    return nullptr;
}

} // namespace Kernel

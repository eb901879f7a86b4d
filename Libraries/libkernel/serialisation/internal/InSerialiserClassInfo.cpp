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
    MakeTable();
}

void InSerialiserClassInfoBase::MakeTable()
{
    if (m_joined.size() > c_maxJoined) return;
    u32 bits = 1;
    while ((size_t(1) << bits) < 2 * m_joined.size()) ++bits;
    m_places.assign(size_t(1) << bits, 0);
    m_shift = 32 - bits;
    u32 const mask = static_cast<u32>(m_places.size()) - 1;
    for (size_t i = 0; i < m_joined.size(); ++i) {
        u32 at = Mix(m_joined[i].tag, m_shift);
        while (m_places[at] != 0) at = (at + 1) & mask;
        m_places[at] = static_cast<u16>(i + 1);
    }
}

InSerialiserProperty const* InSerialiserClassInfoBase::FindAmongMany(IDTag tag) const
{
    return FindSorted(const_cast<InSerialiserProperty*>(m_joined.data()), static_cast<u32>(m_joined.size()), tag);
}

// A default object of this very class sees what has been stated so far.
InSerialiserProperty const* InSerialiserClassInfoBase::FindWhileOpen(IDTag tag) const
{
    auto const at = m_own.find(tag);
    return at == m_own.end() ? nullptr : &at->second;
}

} // namespace Kernel

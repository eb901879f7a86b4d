#pragma once

#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/internal/StoredProperty.h"

#include <map>
#include <vector>

namespace Kernel {

/// What a file says about one class: its version, its parent, and its defaults. Lives as long as the parse.
class InSerialiserClassInfoBase : public Countable
{
public:
    InSerialiserClassInfoBase(ClassPropertiesBase const& properties, u16 version);

    ClassPropertiesBase const& GetProperties() const { return m_properties; }
    u16 GetVersion() const { return m_version; }
    /// The parent that the file gives, or null.
    InSerialiserClassInfoBase const* GetParent() const { return m_parent; }

    /// True until Close: the description is still being read. Such a class can't be a parent, so that a chain of
    /// parents always ends.
    bool IsOpen() const { return m_isOpen; }
    /// Takes over a default; of two with one tag the later one stays.
    void AddDefault(InSerialiserProperty const& property);
    /// Ends the description.
    void Close(InSerialiserClassInfoBase const* parent);

    /// The default that the file states for the class or the nearest of its parents, or null.
    InSerialiserProperty const* FindDefault(IDTag tag) const
    {
        // Objects of one class ask for their defaults in one order: what followed last time is tried first.
        u32 const guess = m_followers.empty() ? 0 : m_followers[m_last];
        if (guess < m_joined.size() && m_joined[guess].tag == tag) {
            m_last = guess;
            return &m_joined[guess];
        }
        return FindSlow(tag);
    }

private:
    ~InSerialiserClassInfoBase() override;
    InSerialiserProperty const* FindSlow(IDTag tag) const;

    ClassPropertiesBase const& m_properties;
    InSerialiserClassInfoBase const* m_parent = nullptr;
    u16 const m_version;
    bool m_isOpen = true;
    std::map<IDTag, InSerialiserProperty> m_own; // Owns what the properties hold.
    // Once closed: sorted copies of the defaults of this class and of those parents that come before m_next.
    std::vector<InSerialiserProperty> m_joined;
    mutable std::vector<u32> m_followers; // For each of m_joined, which was asked for after it the last time.
    mutable u32 m_last = 0;               // Of m_joined, found last.
    InSerialiserClassInfoBase const* m_next = nullptr;
};

} // namespace Kernel

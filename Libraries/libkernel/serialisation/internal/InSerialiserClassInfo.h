#pragma once

#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/internal/InSerialiserProperty.h"

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
    InSerialiserProperty const* FindDefault(IDTag tag) const { return m_isOpen ? FindWhileOpen(tag) : FindClosed(tag); }

private:
    ~InSerialiserClassInfoBase() override;
    InSerialiserProperty const* FindWhileOpen(IDTag tag) const;
    InSerialiserProperty const* FindClosed(IDTag tag) const
    {
        InSerialiserClassInfoBase const* info = this;
        do {
            if (info->m_places.empty()) {
                if (auto const* const property = info->FindAmongMany(tag)) return property;
                info = info->m_next;
                continue;
            }
            u32 const mask = static_cast<u32>(info->m_places.size()) - 1;
            for (u32 at = Mix(tag, info->m_shift); info->m_places[at] != 0; at = (at + 1) & mask) {
                InSerialiserProperty const& property = info->m_joined[info->m_places[at] - 1];
                if (property.tag == tag) return &property;
            }
            info = info->m_next;
        } while (info);
        return nullptr;
    }
    static u32 Mix(IDTag tag, u32 shift) { return static_cast<u32>(u64(tag.value * 0x9E3779B9u) >> shift); }
    InSerialiserProperty const* FindAmongMany(IDTag tag) const;
    void MakeTable();

    ClassPropertiesBase const& m_properties;
    InSerialiserClassInfoBase const* m_parent = nullptr;
    u16 const m_version;
    bool m_isOpen = true;
    std::map<IDTag, InSerialiserProperty> m_own; // Owns what the properties hold.
    // Once closed: sorted copies of the defaults of this class and of those parents that come before m_next, and for a
    // short list a table of their places plus 1, by open addressing, 0 for none. Long lists are searched: the stream
    // could choose tags that all meet in one place.
    std::vector<InSerialiserProperty> m_joined;
    std::vector<u16> m_places;
    u32 m_shift = 32; // From a mixed tag to its place in the table.
    InSerialiserClassInfoBase const* m_next = nullptr;
};

} // namespace Kernel

#pragma once

#include "libkernel/filestore/FileStoreLink.h"

#include <array>
#include <functional>
#include <memory>
#include <utility>

namespace Kernel {

/// A small map from links to values, ordered by the link's address. Nearly every object knows one store or two, so that
/// many entries lie in the map itself, and a look-up is a walk over them. No lock: the owner has one.
template <class V, u32 c_inline>
class LinkMapT
{
public:
    struct Entry
    {
        Counted<FileStoreLink> link;
        V value{};
    };

    LinkMapT() = default;
    LinkMapT(LinkMapT const& o) { *this = o; }
    LinkMapT& operator=(LinkMapT const& o)
    {
        if (this == &o) return *this;
        Clear();
        if (o.m_size > m_capacity) Grow(o.m_size);
        for (u32 i = 0; i < o.m_size; ++i) GetEntries()[i] = o.GetEntries()[i];
        m_size = o.m_size;
        return *this;
    }

    Entry* begin() { return GetEntries(); }
    Entry* end() { return GetEntries() + m_size; }
    Entry const* begin() const { return GetEntries(); }
    Entry const* end() const { return GetEntries() + m_size; }
    u32 GetSize() const { return m_size; }
    bool IsEmpty() const { return m_size == 0; }

    /// The value for @p link, valid until the map changes; null if there is none.
    V* Find(FileStoreLink const* link) { return const_cast<V*>(std::as_const(*this).Find(link)); }
    V const* Find(FileStoreLink const* link) const
    {
        for (Entry const& entry : *this)
            if (entry.link.Get() == link) return &entry.value;
        return nullptr;
    }

    /// The value for @p link, made from @p initial if there was none.
    V& FindOrCreate(FileStoreLink* link, V initial)
    {
        if (V* const found = Find(link)) return *found;
        if (m_size == m_capacity) Grow(m_capacity * 2);
        Entry* const entries = GetEntries();
        u32 at = m_size;
        for (; at > 0 && std::less<FileStoreLink const*>()(link, entries[at - 1].link.Get()); --at)
            entries[at] = std::move(entries[at - 1]);
        entries[at] = Entry{Counted<FileStoreLink>(link), std::move(initial)};
        ++m_size;
        return entries[at].value;
    }

    /// False if there was no entry.
    bool Erase(FileStoreLink const* link)
    {
        return EraseIf([link](Entry const& entry) { return entry.link.Get() == link; }) != 0;
    }

    /// Erases the entries that @p condition picks; how many those were.
    template <class Condition>
    u32 EraseIf(Condition condition)
    {
        Entry* const entries = GetEntries();
        u32 kept = 0;
        for (u32 i = 0; i < m_size; ++i) {
            if (condition(entries[i])) continue;
            if (kept != i) entries[kept] = std::move(entries[i]);
            ++kept;
        }
        u32 const erased = m_size - kept;
        for (u32 i = kept; i < m_size; ++i) entries[i] = Entry{};
        m_size = kept;
        return erased;
    }

    void Clear()
    {
        EraseIf([](Entry const&) { return true; });
    }

private:
    Entry* GetEntries() { return m_heap ? m_heap.get() : m_inline.data(); }
    Entry const* GetEntries() const { return m_heap ? m_heap.get() : m_inline.data(); }
    void Grow(u32 capacity)
    {
        auto heap = std::make_unique<Entry[]>(capacity);
        std::move(begin(), end(), heap.get());
        m_heap = std::move(heap);
        m_capacity = capacity;
    }

    u32 m_size = 0;
    u32 m_capacity = c_inline;
    std::array<Entry, c_inline> m_inline{};
    std::unique_ptr<Entry[]> m_heap; // Null while the inline entries suffice.
};

} // namespace Kernel

#pragma once

#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/core/String.h"

#include <iterator>
#include <utility>
#include <vector>

// Look-ups of an archive's files, by path and by identifier. Both keep their entries in one block and find them by open
// addressing over a second one: with a node of its own for each file, making and freeing these would cost more than all
// else that is done when an archive opens. The hashes are seeded, since the names come out of a file.

namespace Kernel {

/// Places in a block of entries, by hash.
class ArchiveFileSlots
{
public:
    static constexpr u32 c_none = 0xFFFFFFFF;

    /// The place of the entry for which @p matches gives true, or c_none.
    template <class TMatch>
    u32 Find(u32 hash, TMatch const& matches) const
    {
        if (m_slots.empty()) return c_none;
        for (size_t slot = hash & Mask(); m_slots[slot] != 0; slot = (slot + 1) & Mask())
            if (matches(m_slots[slot] - 1)) return m_slots[slot] - 1;
        return c_none;
    }
    /// There must be a free slot, and no entry that matches.
    void Insert(u32 hash, u32 place);
    /// @p hashOf gives the hash of the entry at a place.
    template <class THashOf>
    void Remove(u32 hash, u32 place, THashOf const& hashOf)
    {
        size_t hole = SlotOf(hash, place);
        // What follows without a gap moves up, unless it would pass its own first choice.
        for (size_t slot = (hole + 1) & Mask(); m_slots[slot] != 0; slot = (slot + 1) & Mask()) {
            size_t const wanted = hashOf(m_slots[slot] - 1) & Mask();
            if (((slot - wanted) & Mask()) < ((slot - hole) & Mask())) continue;
            m_slots[hole] = m_slots[slot];
            hole = slot;
        }
        m_slots[hole] = 0;
    }
    void Renumber(u32 hash, u32 place, u32 newPlace) { m_slots[SlotOf(hash, place)] = newPlace + 1; }
    bool HasRoomFor(size_t count) const { return 2 * count <= m_slots.size(); }
    /// Empty, with room for @p count entries.
    void Reset(size_t count);
    void Clear() { m_slots.clear(); }

private:
    size_t Mask() const { return m_slots.size() - 1; }
    size_t SlotOf(u32 hash, u32 place) const;

    std::vector<u32> m_slots; // A place plus 1, or 0. A power of two in number, at least half of them free.
};

/// An archive's files by path. Each reference is counted.
class ArchivePathMap
{
public:
    /// What an iterator stands for: usable as the pair that a standard map would give.
    struct Item
    {
        String8 const& first;
        Counted<Archive::FileInfo> const& second;
    };
    class const_iterator
    {
    public:
        using iterator_category = std::input_iterator_tag;
        using value_type = Item;
        using difference_type = std::ptrdiff_t;
        using pointer = Item const*;
        using reference = Item;

        explicit const_iterator(Counted<Archive::FileInfo> const* at = nullptr) : m_at(at) {}
        Item operator*() const { return {(*m_at)->GetPath(), *m_at}; }
        struct Arrow
        {
            Item item;
            Item const* operator->() const { return &item; }
        };
        Arrow operator->() const { return {**this}; }
        const_iterator& operator++()
        {
            ++m_at;
            return *this;
        }
        bool operator==(const_iterator const&) const = default;

    private:
        friend class ArchivePathMap;
        Counted<Archive::FileInfo> const* m_at;
    };

    const_iterator begin() const { return const_iterator(m_files.data()); }
    const_iterator end() const { return const_iterator(m_files.data() + m_files.size()); }
    size_t size() const { return m_files.size(); }
    bool empty() const { return m_files.empty(); }
    const_iterator find(String8 const& path) const;
    /// Keeps what is there. @p path must be the file's own.
    std::pair<const_iterator, bool> try_emplace(String8 const& path, Counted<Archive::FileInfo> file);
    std::pair<const_iterator, bool> emplace(String8 const& path, Counted<Archive::FileInfo> file)
    {
        return try_emplace(path, std::move(file));
    }
    /// Takes over all files whose paths are new. Allocates nothing if there is room for them.
    void merge(ArchivePathMap& from);
    /// Room for @p count files in all.
    void reserve(size_t count);
    void erase(const_iterator at);
    void clear();
    void swap(ArchivePathMap& other) noexcept;

private:
    std::vector<Counted<Archive::FileInfo>> m_files;
    std::vector<u32> m_hashes; // Of their paths.
    ArchiveFileSlots m_slots;
};

/// Files by identifier, while an archive is read: references are those of the revisions' entries and of nobody else.
class ArchiveFilesByUID
{
public:
    using Entry = std::pair<u32, NonCounted<Archive::FileInfo>>;

    bool empty() const { return m_entries.empty(); }
    Entry const* end() const { return nullptr; }
    Entry const* find(u32 uid) const;
    /// Makes a null where there is none.
    NonCounted<Archive::FileInfo>& operator[](u32 uid);
    void reserve(size_t count);
    void clear();

private:
    std::vector<Entry> m_entries;
    ArchiveFileSlots m_slots;
};

} // namespace Kernel

#include "libkernel/archive/internal/ArchiveFileMaps.h"

#include <algorithm>
#include <cstdint>
#include <cstring>

namespace Kernel {

namespace {

constexpr u64 c_multiplier = 0x9E3779B97F4A7C15;

// Where the system has put this is as good as a random number, and differs from process to process.
u64 GetSeed()
{
    static char s_here;
    return reinterpret_cast<std::uintptr_t>(&s_here) * c_multiplier;
}

u64 Mix(u64 hash, u64 bits)
{
    hash = (hash ^ bits) * c_multiplier;
    return hash ^ hash >> 29;
}

u32 HashOf(String8 const& path)
{
    char const* at = path.GetData();
    auto left = static_cast<size_t>(path.GetLength());
    u64 hash = GetSeed() + left;
    u64 bits = 0;
    for (; left > sizeof(bits); at += sizeof(bits), left -= sizeof(bits)) {
        std::memcpy(&bits, at, sizeof(bits));
        hash = Mix(hash, bits);
    }
    bits = 0;
    std::memcpy(&bits, at, left);
    return static_cast<u32>(Mix(Mix(hash, bits), hash) >> 32);
}

u32 HashOf(u32 uid)
{
    return static_cast<u32>(Mix(GetSeed(), uid) * c_multiplier >> 32);
}

} // namespace

void ArchiveFileSlots::Insert(u32 hash, u32 place)
{
    size_t slot = hash & Mask();
    while (m_slots[slot] != 0) slot = (slot + 1) & Mask();
    m_slots[slot] = place + 1;
}

void ArchiveFileSlots::Reset(size_t count)
{
    size_t slots = 16;
    while (slots < 2 * count) slots *= 2;
    m_slots.assign(slots, 0);
}

size_t ArchiveFileSlots::SlotOf(u32 hash, u32 place) const
{
    size_t slot = hash & Mask();
    while (m_slots[slot] != place + 1) slot = (slot + 1) & Mask();
    return slot;
}

ArchivePathMap::const_iterator ArchivePathMap::find(String8 const& path) const
{
    u32 const hash = HashOf(path);
    u32 const place = m_slots.Find(hash, [&](u32 i) { return m_hashes[i] == hash && m_files[i]->GetPath() == path; });
    return place == ArchiveFileSlots::c_none ? end() : const_iterator(m_files.data() + place);
}

std::pair<ArchivePathMap::const_iterator, bool> ArchivePathMap::try_emplace(String8 const& path,
                                                                            Counted<Archive::FileInfo> file)
{
    u32 const hash = HashOf(path);
    u32 place = m_slots.Find(hash, [&](u32 i) { return m_hashes[i] == hash && m_files[i]->GetPath() == path; });
    bool const isNew = place == ArchiveFileSlots::c_none;
    if (isNew) {
        reserve(m_files.size() + 1);
        place = static_cast<u32>(m_files.size());
        m_files.push_back(std::move(file));
        m_hashes.push_back(hash);
        m_slots.Insert(hash, place);
    }
    return {const_iterator(m_files.data() + place), isNew};
}

void ArchivePathMap::merge(ArchivePathMap& from)
{
    ArchivePathMap rest;
    for (Counted<Archive::FileInfo> const& file : from.m_files)
        if (!try_emplace(file->GetPath(), file).second) rest.try_emplace(file->GetPath(), file);
    from.swap(rest);
}

void ArchivePathMap::reserve(size_t count)
{
    if (count > m_files.capacity() || count > m_hashes.capacity()) {
        size_t const room = std::max(count, 2 * m_files.capacity());
        m_files.reserve(room);
        m_hashes.reserve(room);
    }
    if (m_slots.HasRoomFor(count)) return;
    m_slots.Reset(std::max(count, 2 * m_files.size()));
    for (u32 i = 0; i < m_files.size(); ++i) m_slots.Insert(m_hashes[i], i);
}

void ArchivePathMap::erase(const_iterator at)
{
    auto const hashOf = [&](u32 i) { return m_hashes[i]; };
    auto const place = static_cast<u32>(at.m_at - m_files.data());
    auto const last = static_cast<u32>(m_files.size() - 1);
    m_slots.Remove(m_hashes[place], place, hashOf);
    if (place != last) {
        m_slots.Renumber(m_hashes[last], last, place);
        std::swap(m_files[place], m_files[last]);
        m_hashes[place] = m_hashes[last];
    }
    m_files.pop_back();
    m_hashes.pop_back();
}

void ArchivePathMap::clear()
{
    m_files.clear();
    m_hashes.clear();
    m_slots.Clear();
}

void ArchivePathMap::swap(ArchivePathMap& other) noexcept
{
    m_files.swap(other.m_files);
    m_hashes.swap(other.m_hashes);
    std::swap(m_slots, other.m_slots);
}

ArchiveFilesByUID::Entry const* ArchiveFilesByUID::find(u32 uid) const
{
    u32 const place = m_slots.Find(HashOf(uid), [&](u32 i) { return m_entries[i].first == uid; });
    return place == ArchiveFileSlots::c_none ? nullptr : &m_entries[place];
}

NonCounted<Archive::FileInfo>& ArchiveFilesByUID::operator[](u32 uid)
{
    u32 const hash = HashOf(uid);
    u32 place = m_slots.Find(hash, [&](u32 i) { return m_entries[i].first == uid; });
    if (place == ArchiveFileSlots::c_none) {
        reserve(m_entries.size() + 1);
        place = static_cast<u32>(m_entries.size());
        m_entries.emplace_back(uid, nullptr);
        m_slots.Insert(hash, place);
    }
    return m_entries[place].second;
}

void ArchiveFilesByUID::reserve(size_t count)
{
    if (count > m_entries.capacity()) m_entries.reserve(std::max(count, 2 * m_entries.capacity()));
    if (m_slots.HasRoomFor(count)) return;
    m_slots.Reset(std::max(count, 2 * m_entries.size()));
    for (u32 i = 0; i < m_entries.size(); ++i) m_slots.Insert(HashOf(m_entries[i].first), i);
}

void ArchiveFilesByUID::clear()
{
    m_entries.clear();
    m_slots.Clear();
}

} // namespace Kernel

#include "libkernel/archive/ArchiveRevision.h"

#include "libkernel/archive/internal/ArchiveFile.h"
#include "libkernel/archive/internal/ArchiveFormat.h"

#include <algorithm>

namespace Kernel {

Archive::FileInfo::~FileInfo() = default;

void Archive::FileInfo::History::reserve(size_t capacity)
{
    if (capacity <= m_capacity) return;
    auto** const many = new Revision*[capacity];
    std::copy(begin(), end(), many);
    if (m_capacity > 1) delete[] m_many;
    m_many = many;
    m_capacity = static_cast<u32>(capacity);
}

void Archive::FileInfo::History::Remove(Revision const* revision)
{
    auto** const first = const_cast<Revision**>(begin());
    m_size = static_cast<u32>(std::remove(first, first + m_size, revision) - first);
}

void Archive::FileInfo::History::clear()
{
    if (m_capacity > 1) delete[] m_many;
    m_one = nullptr;
    m_size = 0;
    m_capacity = 1;
}

Archive::FileRevision::Method Archive::FileRevision::GetMethod() const
{
    return static_cast<Method>(ArchiveFormat::MethodOf(compressionCode));
}

CompressionPredictorType Archive::FileRevision::GetPredictor() const
{
    return static_cast<CompressionPredictorType>(ArchiveFormat::PredictorOf(compressionCode));
}

CompressionPredictorStripingType Archive::FileRevision::GetStriping() const
{
    return static_cast<CompressionPredictorStripingType>(ArchiveFormat::StripingOf(compressionCode));
}

Archive::Revision::Revision() = default;
Archive::Revision::~Revision() = default;

bool Archive::Revision::IsScratch() const
{
    return m_file && m_file->m_isScratch;
}

Archive::FileRevision const* Archive::Revision::Find(FileInfo const& info) const
{
    return const_cast<Revision*>(this)->FindI(info);
}

Archive::FileRevision* Archive::Revision::FindI(FileInfo const& info)
{
    u32 const uid = info.GetUID();
    if (!m_frozen) {
        auto const it = m_index.find(uid);
        return it == m_index.end() ? nullptr : &m_entries[it->second];
    }
    if (m_entries.empty()) return nullptr;
    // A session that writes everything numbers without gaps, so the place is most often known.
    u32 const place = uid - m_entries.front().info->GetUID();
    if (place < m_entries.size() && m_entries[place].info->GetUID() == uid) return &m_entries[place];
    auto const it = std::lower_bound(m_entries.begin(), m_entries.end(), uid,
                                     [](FileRevision const& e, u32 u) { return e.info->GetUID() < u; });
    return it != m_entries.end() && it->info->GetUID() == uid ? &*it : nullptr;
}

Archive::FileRevision& Archive::Revision::FindOrAdd(Counted<FileInfo const> const& info, bool& made)
{
    auto const [it, inserted] = m_index.try_emplace(info->GetUID(), m_entries.size());
    made = inserted;
    if (inserted) m_entries.emplace_back().info = info;
    return m_entries[it->second];
}

void Archive::Revision::Remove(FileInfo const& info)
{
    auto const it = m_index.find(info.GetUID());
    if (it == m_index.end()) return;
    size_t const place = it->second;
    m_index.erase(it);
    if (place + 1 != m_entries.size()) {
        m_entries[place] = std::move(m_entries.back());
        m_index[m_entries[place].info->GetUID()] = place;
    }
    m_entries.pop_back();
}

void Archive::Revision::Freeze()
{
    auto const uidOf = [](FileRevision const& e) { return e.info->GetUID(); };
    auto const notRising = [&](FileRevision const& a, FileRevision const& b) { return uidOf(a) >= uidOf(b); };
    if (std::adjacent_find(m_entries.begin(), m_entries.end(), notRising) != m_entries.end()) {
        // Of several records for one file the last one counts.
        std::reverse(m_entries.begin(), m_entries.end());
        std::stable_sort(m_entries.begin(), m_entries.end(),
                         [&](FileRevision const& a, FileRevision const& b) { return uidOf(a) < uidOf(b); });
        auto const same = [&](FileRevision const& a, FileRevision const& b) { return uidOf(a) == uidOf(b); };
        m_entries.erase(std::unique(m_entries.begin(), m_entries.end(), same), m_entries.end());
    }
    m_index = {};
    m_frozen = true;
}

} // namespace Kernel

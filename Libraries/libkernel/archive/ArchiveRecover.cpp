#include "libkernel/archive/internal/ArchiveImpl.h"
#include "libkernel/core/Endian.h"

#include <algorithm>
#include <limits>
#include <map>
#include <vector>

// Finding tables (FATs) in a file whose chain cannot be walked. A file block ends with FF FF FF FF and most tables
// follow one, so the bytes of a terminator with a table's tag behind it show where tables lie. A stored item may hold
// such bytes too, a document inside the document for instance: a hit counts only if it is a table that ends at its own
// FileEnd.

namespace Kernel {

using namespace ArchiveFormat;

namespace {

using Result = Archive::OpenResult;

constexpr u64 c_searchBlock = 4'194'304;

/// A table that the search found. Tables that name it as the one before them are its children.
class FATEntry : public Countable
{
public:
    explicit FATEntry(u64 position) : m_position(position) {}

    u64 const m_position; // 0 for the root, which stands for the beginning of every history.
    FATEntry* m_parent = nullptr;
    bool m_hasChildren = false;
    bool m_isBad = false; // No chain through it can be walked.

private:
    ~FATEntry() override = default;
};

class FATSearch
{
public:
    /// What looks like a table before @p contentPos lies in the fixed part, which the next save writes over; tables
    /// older than @p oldest are dead ones.
    FATSearch(ArchiveSource& source, u64 contentPos, TimeStamp oldest)
        : m_source(source), m_contentPos(contentPos), m_oldest(oldest)
    {
    }

    /// Finds all tables and joins them to the tree.
    void Run()
    {
        FindHits();
        // A table behind a table follows no block, but the newer one names it.
        for (size_t i = 0; i < m_hits.size(); ++i) Add(m_hits[i]);
        m_tree.try_emplace(0, MakeCounted<FATEntry>(0));
        for (auto const& [position, previous] : m_previous) {
            auto const parent = m_tree.find(previous);
            FATEntry& entry = *m_tree.at(position);
            if (parent == m_tree.end()) continue;
            entry.m_parent = parent->second.Get();
            parent->second->m_hasChildren = true;
        }
    }

    /// The tables that no other one names and from which the root can be reached, highest first.
    std::vector<FATEntry*> GetLeaves() const
    {
        std::vector<FATEntry*> leaves;
        for (auto i = m_tree.rbegin(); i != m_tree.rend(); ++i) {
            FATEntry& entry = *i->second;
            if (entry.m_position != 0 && entry.m_parent && !entry.m_hasChildren) leaves.push_back(&entry);
        }
        return leaves;
    }

    FATEntry* Find(u64 position) const
    {
        auto const found = m_tree.find(position);
        return found == m_tree.end() ? nullptr : found->second.Get();
    }

private:
    void FindHits()
    {
        constexpr u64 patternSize = 8; // The terminator and the tag.
        std::vector<u8> block(std::min(c_searchBlock, m_source.GetSize()) + patternSize);
        u64 kept = 0; // Bytes of the last block that a pattern may begin in.
        for (u64 at = 0;;) {
            u64 const got = m_source.ReadAt(at, block.data() + kept, std::min(c_searchBlock, block.size() - kept));
            u64 const held = kept + got;
            for (u64 i = 0; i + patternSize <= held; ++i) {
                u8 const* const p = block.data() + i;
                if (p[0] != 0xFF || LoadLittleEndian<u32>(p) != c_blockEnd || p[4] != '#') continue;
                if (IsTableTag(LoadLittleEndian<u32>(p + 4))) m_hits.push_back(at - kept + i + 4);
            }
            if (got == 0 || at + got >= m_source.GetSize()) return;
            at += got;
            kept = std::min(held, patternSize - 1);
            std::copy(block.begin() + static_cast<i64>(held - kept), block.begin() + static_cast<i64>(held),
                      block.begin());
        }
    }

    static bool IsTableTag(u32 tag)
    {
        return std::any_of(std::begin(c_fatKinds), std::end(c_fatKinds),
                           [tag](FATKind const& kind) { return kind.tag == tag; });
    }

    void Add(u64 position)
    {
        if (position < m_contentPos || m_previous.count(position)) return;
        FATHeader header;
        FATKind const* kind = nullptr;
        if (ArchiveLoader::ReadFATHeader(m_source, position, false, header, kind) != Archive::OpenOk) return;
        if (header.timeStamp < m_oldest) return;
        m_tree.emplace(position, MakeCounted<FATEntry>(position));
        m_previous.emplace(position, header.nextFAT);
        if (header.nextFAT != 0) m_hits.push_back(header.nextFAT);
    }

    ArchiveSource& m_source;
    u64 const m_contentPos;
    TimeStamp const m_oldest;
    std::vector<u64> m_hits;
    std::map<u64, u64> m_previous; // NextFAT of each table found.
    std::map<u64, Counted<FATEntry>> m_tree;
};

} // namespace

// Of the leaves the highest comes first, since it was written last; from each the way goes up to older tables until a
// chain can be walked. What is known to be bad is not walked again, so that no file makes the search slow.
Result ArchiveLoader::RecoverArchiveFile(Archive::ArchiveFile& file, IDTag tag, ArchiveLoadData& data)
{
    ArchiveFileSource source(*file.m_stream);
    Counted<Archive::ArchiveFile> const counted(&file);
    Front front;
    if (Result const result = ReadFront(source, tag, nullptr, front, true)) return result;
    bool const isLinked = data.testLink;
    if (isLinked && !front.infoDamaged && !IsLinkedState(source, front.info, data)) return Archive::OpenLinkMismatch;

    auto const take = [&](ArchiveLoadData& loaded, u64 position, u32 highestUID) {
        size_t const count = loaded.revisions.size() - data.revisions.size();
        Archive::Revision const* const newest = count == 0 ? nullptr : loaded.revisions[count - 1].Get();
        TakeFront(front, file, loaded);
        if (newest && (front.infoDamaged || position != front.info.firstFAT)) {
            file.m_firstFAT = position;
            file.m_fileEnd = newest->m_fileEnd;
            file.m_totalBytes = newest->m_totalBytes;
            file.m_deadBytes = newest->m_deadBytes;
            file.m_saveTimeStamp = newest->m_timeStamp;
        }
        TakeEnd(source, front, newest, highestUID, file, loaded);
        data = std::move(loaded);
        return Archive::OpenOk;
    };

    if (!front.infoDamaged) {
        ArchiveLoadData fresh = data;
        u32 highestUID = 0;
        Result const walked = LoadFATChain(source, front, counted, fresh, front.info.firstFAT, highestUID);
        // Tables of a later version are no damage: with an older state in their place, the next save would write over
        // them.
        if (walked == Archive::OpenTooNew || walked == Archive::OpenNoMemory) return walked;
        bool const isWhole = walked == Archive::OpenOk;
        bool const hasTable = fresh.revisions.size() > data.revisions.size();
        if (isWhole && !(hasTable && fresh.revisions.front()->m_fatPos < front.contentPos))
            return take(fresh, front.info.firstFAT, highestUID);
    }
    // A scratch file depends on the exact state of its master, and of a state that had to be searched nobody can say
    // that it is the one.
    if (isLinked) return Archive::OpenCorrupt;

    // What a scratch file held before its master was saved lies behind the front until it is written over.
    FATSearch search(source, front.contentPos,
                     front.HasLink() ? front.linkSaveTimeStamp : TimeStamp(std::numeric_limits<i64>::min()));
    search.Run();
    constexpr int maxContradictions = 16; // Each may cost a walk to the oldest table.
    int contradictions = 0;
    for (FATEntry* const leaf : search.GetLeaves()) {
        for (FATEntry* entry = leaf; entry && entry->m_position != 0; entry = entry->m_parent) {
            entry->m_isBad |= entry->m_parent && entry->m_parent->m_isBad;
            if (entry->m_isBad) continue;
            ArchiveLoadData fresh = data;
            u32 highestUID = 0;
            u64 failedAt = 0;
            Result const walked = LoadFATChain(source, front, counted, fresh, entry->m_position, highestUID, &failedAt);
            if (walked == Archive::OpenNoMemory) return walked;
            if (walked == Archive::OpenOk && fresh.revisions.front()->m_fatPos >= front.contentPos)
                return take(fresh, entry->m_position, highestUID);
            if (failedAt == 0 && ++contradictions == maxContradictions) return Archive::OpenCorrupt;
            if (failedAt == 0) continue;
            // What the search has not seen ends the way to it.
            FATEntry* const bad = search.Find(failedAt);
            for (FATEntry* one = entry; one && one != bad && one->m_position != 0; one = one->m_parent)
                one->m_isBad = true;
            if (bad) bad->m_isBad = true;
        }
    }
    return Archive::OpenCorrupt;
}

} // namespace Kernel

#include "libkernel/core/FragmentedRawData.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Limits.h"
#include "libkernel/core/RawData.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace Kernel {

FragmentedRawData::FragmentedRawData(u64 blockSize) : m_blockSize(std::max(blockSize, c_minBlockSize)) {}

FragmentedRawData::~FragmentedRawData()
{
    for (u8* block : m_blocks) AllocatorMalloc::Free(block);
}

// Nothing of the object is touched until every block is there.
bool FragmentedRawData::Expand(u64 size)
{
    if (size <= m_size) return true;
    u64 const needed = BlocksFor(size);
    if (needed > m_blocks.size()) {
        // Asked for block by block, such a range would take all memory before it failed.
        if (needed > c_maxAllocation / m_blockSize) return false;
        std::vector<u8*> blocks;
        try {
            blocks.reserve(needed);
        } catch (std::bad_alloc const&) {
            return false;
        }
        blocks.assign(m_blocks.begin(), m_blocks.end());
        while (blocks.size() < needed) {
            void* const block = AllocatorMalloc::Allocate(m_blockSize);
            if (!block) {
                for (u64 i = m_blocks.size(); i < blocks.size(); ++i) AllocatorMalloc::Free(blocks[i]);
                return false;
            }
            blocks.push_back(static_cast<u8*>(block));
        }
        m_blocks.swap(blocks);
    }
    m_size = size;
    return true;
}

bool FragmentedRawData::SetSize(u64 size, bool zeroFill)
{
    u64 const old = m_size;
    if (size >= old) {
        if (!Expand(size)) return false;
        if (zeroFill) ZeroRange(old, size - old);
        return true;
    }
    u64 const needed = BlocksFor(size);
    for (u64 i = needed; i < m_blocks.size(); ++i) AllocatorMalloc::Free(m_blocks[i]);
    m_blocks.resize(needed);
    m_size = size;
    return true;
}

// Runs @p step on each stretch of the range that lies in one block, until it takes less than it is given; gives the
// bytes taken. The range must lie inside the data.
template <class Step>
u64 FragmentedRawData::ForEachPiece(u64 offset, u64 count, Step step) const
{
    u64 done = 0;
    while (done < count) {
        u64 const at = offset + done;
        u64 const within = at % m_blockSize;
        u64 const piece = std::min(count - done, m_blockSize - within);
        u64 const taken = std::min<u64>(step(m_blocks[at / m_blockSize] + within, piece), piece);
        done += taken;
        if (taken < piece) break;
    }
    return done;
}

bool FragmentedRawData::SetData(u64 offset, void const* bytes, u64 count, bool zeroFill)
{
    u64 const old = m_size;
    u64 end;
    if (!CheckedAdd(offset, count, end) || !Expand(end)) return false;
    if (zeroFill && offset > old) ZeroRange(old, offset - old);
    auto const* from = static_cast<u8 const*>(bytes);
    ForEachPiece(offset, count, [&](u8* to, u64 piece) {
        std::memcpy(to, from, piece);
        from += piece;
        return piece;
    });
    return true;
}

u64 FragmentedRawData::SetDataFromStream(u64 offset, InStream& in, u64 count, bool zeroFill)
{
    u64 const old = m_size;
    u64 end;
    if (!CheckedAdd(offset, count, end) || !Expand(end)) return 0;
    if (zeroFill && offset > old) ZeroRange(old, offset - old);
    return ForEachPiece(offset, count, [&](u8* to, u64 piece) { return in.ReadBlock(to, piece); });
}

u64 FragmentedRawData::GetData(u64 offset, void* to, u64 count) const
{
    if (offset >= m_size) return 0;
    auto* bytes = static_cast<u8*>(to);
    return ForEachPiece(offset, std::min(count, m_size - offset), [&](u8 const* from, u64 piece) {
        std::memcpy(bytes, from, piece);
        bytes += piece;
        return piece;
    });
}

void FragmentedRawData::ZeroRange(u64 offset, u64 count)
{
    if (offset >= m_size) return;
    ForEachPiece(offset, std::min(count, m_size - offset), [](u8* to, u64 piece) {
        std::memset(to, 0, piece);
        return piece;
    });
}

bool FragmentedRawData::CopyToStream(OutStream& out) const
{
    return ForEachPiece(0, m_size, [&](u8 const* from, u64 piece) { return out.WriteBlock(from, piece); }) == m_size;
}

} // namespace Kernel

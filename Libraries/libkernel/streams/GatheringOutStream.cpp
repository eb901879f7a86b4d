#include "libkernel/streams/GatheringOutStream.h"

#include <algorithm>
#include <cstring>
#include <utility>

namespace Kernel {

GatheringOutStream::GatheringOutStream(Counted<OutStream> target, u32 blockSize)
    : m_target(std::move(target)), m_block(std::make_unique_for_overwrite<char[]>(blockSize)), m_blockSize(blockSize)
{
}

GatheringOutStream::~GatheringOutStream() = default;

u64 GatheringOutStream::WriteBlock(void const* from, u64 count)
{
    char const* p = static_cast<char const*>(from);
    for (u64 left = count; left;) {
        if (m_failed) return 0;
        u64 const part = std::min<u64>(left, m_blockSize - m_fill);
        std::memcpy(m_block.get() + m_fill, p, part);
        m_fill += static_cast<u32>(part);
        p += part;
        left -= part;
        if (m_fill == m_blockSize && !FlushBlock()) return 0;
    }
    m_taken += count;
    return count;
}

bool GatheringOutStream::FlushBlock()
{
    if (m_failed || m_fill == 0) return !m_failed;
    m_failed = true; // Stays so if the target throws.
    u32 const count = std::exchange(m_fill, 0);
    m_failed = !m_target || !Encode(*m_target, m_block.get(), count);
    return !m_failed;
}

void GatheringOutStream::FlushTail() noexcept
{
    try {
        FlushBlock();
    } catch (...) {
        // A destructor has nobody to tell; the target keeps its own record of the failure.
    }
}

bool GatheringOutStream::Flush()
{
    return true;
}

u64 GatheringOutStream::GetSizeOutStream() const
{
    return m_taken;
}

u64 GatheringOutStream::TellOutStream() const
{
    return m_taken;
}

} // namespace Kernel

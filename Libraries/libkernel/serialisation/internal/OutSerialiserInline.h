#pragma once

#include "libkernel/core/Endian.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/serialisation/internal/DefaultTable.h"

#include <limits>

// The few steps that every property takes, for the sources of the writer: out of line they would cost more than what
// they do.

namespace Kernel {

constexpr u64 c_tagHeaderSize = 5; // Type byte and tag.

inline u8* OutSerialiser::ClaimI(u64 count)
{
    u8* const room = m_target.Claim(count);
    if (!room) Fail(SaveException::ShortWrite);
    return room;
}

inline void OutSerialiser::PutI(void const* bytes, u64 count)
{
    if (!m_target.Put(bytes, count)) Fail(SaveException::ShortWrite);
}

inline u8* OutSerialiser::PutHeaderI(IDTag tag, u8 type, u64 more)
{
    u8* const room = ClaimI(c_tagHeaderSize + more);
    room[0] = type;
    StoreLittleEndian(room + 1, tag.value);
    return room + c_tagHeaderSize;
}

inline u32 OutSerialiser::CheckCountI(u64 count) const
{
    if (count > std::numeric_limits<u32>::max()) Fail(SaveException::TooLarge);
    return static_cast<u32>(count);
}

inline u16 OutSerialiser::CheckShortI(u64 size) const
{
    if (size > std::numeric_limits<u16>::max()) Fail(SaveException::TooLarge);
    return static_cast<u16>(size);
}

inline DefaultRow const* OutSerialiser::StartI(IDTag tag)
{
    if (IsAbortRequestedI()) AbortI();
    if (m_obstacles & Closed) Fail(SaveException::Misuse);
    if (m_obstacles & ChildActive) Fail(SaveException::TagOrChild);
    return m_step->tag == tag.value ? (m_step++)->row : StartOutOfSequenceI(tag);
}

} // namespace Kernel

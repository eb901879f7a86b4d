#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

// The library's hashes are distinct and stay so: values of one are never compared with those of another. The third is
// BaseCharTraits::GenerateHash. None is meant for keys that somebody hostile chooses.

/// Hash of a sequence of pieces, 0 at the start.
class KERNEL_API HashAccumulator
{
public:
    HashAccumulator() = default;
    explicit HashAccumulator(u32 state) : m_state(state) {}

    /// Bob Jenkins' lookup3, hashlittle, of the bytes, seeded by the state, becomes the state. The same on every
    /// machine and for every alignment.
    void AddToHash(void const* bytes, u64 count);

    u32 GetHash() const { return m_state; }

private:
    u32 m_state = 0;
};

/// Feeds the bytes of the code units of @p text, without a terminator or the length.
template <class Enc>
void AddToHash(HashAccumulator& hash, StringT<Enc> const& text)
{
    hash.AddToHash(text.GetData(), static_cast<u64>(text.GetLength()) * sizeof(typename Enc::Unit));
}

/// 64-bit FNV-1a of the eight bytes of the pointer's value, lowest first.
KERNEL_API u64 HashConstVoidStar(void const* p);

} // namespace Kernel

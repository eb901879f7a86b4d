#pragma once

#include "libkernel/core/Types.h"

#include <cstddef>
#include <cstdint>
#include <stdexcept>

/// What every target defines: takes any bytes, returns 0, and throws nothing unless a promise of the library is broken.
/// The ordinary tests compile each target under a name of its own and call it for each file of its corpus, so
/// everything else in a target's source stands in an unnamed namespace.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size);

namespace Kernel::Fuzz {

/// A broken promise. Nothing catches it under the fuzzer, which then stops with the input and the stack.
inline void Require(bool holds, char const* promise)
{
    if (!holds) throw std::logic_error(promise);
}

/// The choices that the first bytes of an input make, before what is left of it goes to the reader under test. Bytes
/// that are not there count as 0.
class Input
{
public:
    Input(uint8_t const* data, size_t size) : m_data(data), m_left(size) {}

    u8 Take() { return m_left ? (--m_left, *m_data++) : u8(0); }
    /// Below @p bound, which is at least 1 and at most 256.
    u32 TakeBelow(u32 bound) { return Take() % bound; }
    bool TakeBool() { return Take() & 1; }

    u8 const* GetRest() const { return m_data; }
    u64 GetLeft() const { return m_left; }

private:
    u8 const* m_data;
    u64 m_left;
};

/// A run of numbers that one byte of the input stands for: sizes of reads and writes.
class Numbers
{
public:
    explicit Numbers(u32 seed) : m_state(seed * 2654435761u + 1) {}

    /// From 1 to @p most, small ones as likely as large ones.
    u64 Next(u64 most)
    {
        m_state = m_state * 1664525u + 1013904223u;
        u64 const shifted = most >> (m_state >> 27) % 20;
        return 1 + (m_state >> 4) % (shifted ? shifted : 1);
    }

private:
    u32 m_state;
};

} // namespace Kernel::Fuzz

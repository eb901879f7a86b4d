#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

#include <vector>

namespace KernelTest {

/// Refuses the n-th allocation from here on that any thread of this program asks for, and for ever all behind it if so
/// wanted: what operator new gives and what malloc and its kin give to the library, to the C and C++ libraries, and to
/// those for compression and text. Under a sanitiser, which has a malloc of its own, operator new alone.
class RefusedMemory
{
public:
    explicit RefusedMemory(long n, bool forEver = false);
    ~RefusedMemory();
    RefusedMemory(RefusedMemory const&) = delete;
    RefusedMemory& operator=(RefusedMemory const&) = delete;

    /// True if the last one made has refused anything.
    static bool HasRefused();
};

/// For loops over steps: each allocation is refused by itself, and then with all behind it. Nothing is refused at
/// c_noStep.
class RefusedStep : public RefusedMemory
{
public:
    static constexpr long c_noStep = -2;
    explicit RefusedStep(long step) : RefusedMemory(1 + step / 2, step % 2 != 0) {}
};

/// Lets a thread allocate what it likes, for code that is not under test.
class QuietMemory
{
public:
    QuietMemory();
    ~QuietMemory();
    QuietMemory(QuietMemory const&) = delete;
    QuietMemory& operator=(QuietMemory const&) = delete;
};

/// Holds what the library keeps of compressors and decompressors for the next stream, so that each stream that is made
/// meanwhile asks for its own.
class EmptyCodecPools
{
public:
    EmptyCodecPools();
    EmptyCodecPools(EmptyCodecPools const&) = delete;
    EmptyCodecPools& operator=(EmptyCodecPools const&) = delete;

private:
    std::vector<Kernel::Counted<Kernel::InStream>> m_in;
    std::vector<Kernel::Counted<Kernel::OutStream>> m_out;
};

/// Blocks that have been given out and not been taken back.
long GetLiveBlocks();

} // namespace KernelTest

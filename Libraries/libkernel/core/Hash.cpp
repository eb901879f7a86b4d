#include "libkernel/core/Hash.h"

#include "libkernel/core/Endian.h"

#include <bit>
#include <cstring>

namespace Kernel {
namespace {

// lookup3.c, Bob Jenkins, May 2006, public domain: 12 bytes go into three words, which are mixed; the last 1 to 12 get
// the stronger final mix.
struct Words
{
    u32 a, b, c;

    void Add(u8 const* p)
    {
        a += LoadLittleEndian<u32>(p);
        b += LoadLittleEndian<u32>(p + 4);
        c += LoadLittleEndian<u32>(p + 8);
    }
    void Mix()
    {
        a -= c, a ^= std::rotl(c, 4), c += b;
        b -= a, b ^= std::rotl(a, 6), a += c;
        c -= b, c ^= std::rotl(b, 8), b += a;
        a -= c, a ^= std::rotl(c, 16), c += b;
        b -= a, b ^= std::rotl(a, 19), a += c;
        c -= b, c ^= std::rotl(b, 4), b += a;
    }
    void FinalMix()
    {
        c ^= b, c -= std::rotl(b, 14);
        a ^= c, a -= std::rotl(c, 11);
        b ^= a, b -= std::rotl(a, 25);
        c ^= b, c -= std::rotl(b, 16);
        a ^= c, a -= std::rotl(c, 4);
        b ^= a, b -= std::rotl(a, 14);
        c ^= b, c -= std::rotl(b, 24);
    }
};

constexpr u64 c_step = 12;

u32 HashLittle(u8 const* p, u64 count, u32 seed)
{
    u32 const start = 0xDEADBEEF + static_cast<u32>(count) + seed;
    Words words{start, start, start};
    if (count == 0) return words.c;
    for (; count > c_step; count -= c_step, p += c_step) {
        words.Add(p);
        words.Mix();
    }
    u8 tail[c_step] = {};
    std::memcpy(tail, p, count);
    words.Add(tail);
    words.FinalMix();
    return words.c;
}

} // namespace

void HashAccumulator::AddToHash(void const* bytes, u64 count)
{
    m_state = HashLittle(static_cast<u8 const*>(bytes), count, m_state);
}

u64 HashConstVoidStar(void const* p)
{
    u64 value = reinterpret_cast<std::uintptr_t>(p);
    u64 hash = 0xCBF29CE484222325;
    for (int i = 0; i < 8; ++i, value >>= 8) hash = (hash ^ (value & 0xFF)) * 0x100000001B3;
    return hash;
}

} // namespace Kernel

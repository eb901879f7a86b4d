#pragma once

#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/Endian.h"
#include "libkernel/serialisation/internal/OutSerialiserInline.h"

#include <algorithm>
#include <vector>

namespace Kernel {

/// The item forms that properties and data streams share, from behind the tag on.
class PropWriter
{
public:
    explicit PropWriter(OutSerialiser& out) : m_out(out) {}

    /// u32 count, bits.
    template <class Bools>
    void PutBools(Bools const& values, u64 count)
    {
        StoreLittleEndian(m_out.ClaimI(4), m_out.CheckCountI(count));
        for (u64 done = 0; done < count;) {
            u64 const now = std::min<u64>(count - done, 8 * c_packedPiece);
            u8* const to = m_out.ClaimI((now + 7) / 8);
            std::fill_n(to, (now + 7) / 8, u8{0});
            for (u64 i = 0; i < now; ++i) to[i / 8] |= static_cast<u8>(static_cast<u8>(values[done + i]) << (i % 8));
            done += now;
        }
    }

    /// The total that the texts take; SaveException with code 2 if it does not fit.
    u32 CheckTexts(String8 const* texts, u64 count) const
    {
        m_out.CheckCountI(count);
        u64 total = 0;
        for (u64 i = 0; i < count; ++i) total += 4 + static_cast<u64>(texts[i].GetLength());
        return m_out.CheckCountI(total);
    }
    /// u32 total, u32 count, the texts.
    void PutTexts(String8 const* texts, u64 count, u32 total)
    {
        u8* const header = m_out.ClaimI(8);
        StoreLittleEndian(header, total);
        StoreLittleEndian(header + 4, static_cast<u32>(count));
        for (u64 i = 0; i < count; ++i) {
            StoreLittleEndian(m_out.ClaimI(4), static_cast<u32>(texts[i].GetLength()));
            m_out.PutI(texts[i].GetData(), static_cast<u64>(texts[i].GetLength()));
        }
    }
    template <class Enc>
    static std::vector<String8> ConvertTexts(StringT<Enc> const* texts, u64 count)
    {
        std::vector<String8> result;
        result.reserve(count);
        for (u64 i = 0; i < count; ++i) result.push_back(ConvertedTo<TEncUtf8>(texts[i]));
        return result;
    }

private:
    static constexpr u64 c_packedPiece = 256; // Bytes; no more than the target gives at once.

    OutSerialiser& m_out;
};

} // namespace Kernel

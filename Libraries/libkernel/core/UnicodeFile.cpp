#include "libkernel/core/UnicodeFile.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/internal/FileBytes.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <limits>
#include <new>

namespace Kernel {
namespace {

struct Form
{
    u8 mark[4];
    u8 markSize; // 0 for a form without a mark.
    u8 unitSize;
    std::endian order;
};

// By the number of the encoding.
constexpr Form c_forms[] = {
    {{}, 0, 1, std::endian::little},
    {{0xEF, 0xBB, 0xBF}, 3, 1, std::endian::little},
    {{0xFF, 0xFE}, 2, 2, std::endian::little},
    {{0xFE, 0xFF}, 2, 2, std::endian::big},
    {{0xFF, 0xFE, 0x00, 0x00}, 4, 4, std::endian::little},
    {{0x00, 0x00, 0xFE, 0xFF}, 4, 4, std::endian::big},
    {{}, 0, 1, std::endian::little},
    {{}, 0, 2, std::endian::little},
    {{}, 0, 2, std::endian::big},
    {{}, 0, 4, std::endian::little},
    {{}, 0, 4, std::endian::big},
};
constexpr i64 c_longestText = std::numeric_limits<i32>::max() - 1;

bool HasMark(Form const& form, u8 const* text, i64 size)
{
    return form.markSize != 0 && size >= form.markSize && std::memcmp(text, form.mark, form.markSize) == 0;
}

// Units in the machine's order, copied since the text need not be aligned.
template <class Enc>
String8 ConvertWide(u8 const* text, i64 units, std::endian order, bool allowZero)
{
    using Unit = typename Enc::Unit;
    if (units > c_longestText) return {};
    int const n = static_cast<int>(units);
    StringT<Enc> wide;
    Unit* const to = wide.SetLength(n);
    std::memcpy(to, text, static_cast<size_t>(n) * sizeof(Unit));
    if (order != std::endian::native)
        for (int i = 0; i < n; ++i)
            to[i] = static_cast<Unit>(sizeof(Unit) == 2 ? __builtin_bswap16(static_cast<u16>(to[i]))
                                                        : __builtin_bswap32(static_cast<u32>(to[i])));
    String8 result;
    ConvertEnc<TEncUtf8, Enc>(result, to, CharTraits<Enc>::GetValidLength(to, n, allowZero));
    return result;
}

} // namespace

UnicodeEncoding GetByteOrderMark(u8 const* text, i64 size)
{
    // The longer marks first: that of UTF-32 begins with that of UTF-16.
    for (int const i : {4, 5, 1, 2, 3})
        if (HasMark(c_forms[i], text, size)) return static_cast<UnicodeEncoding>(i);
    return UnicodeEncoding::None;
}

String8 ConvertToUtf8(UnicodeEncoding encoding, u8 const* text, i64 size, bool allowZero)
{
    auto const index = static_cast<size_t>(encoding);
    if (size < 1 || index >= std::size(c_forms)) return {};
    Form const& form = c_forms[index];
    if (HasMark(form, text, size)) {
        text += form.markSize;
        size -= form.markSize;
    }
    try {
        if (form.unitSize == 2) return ConvertWide<TEncUtf16>(text, size / 2, form.order, allowZero);
        if (form.unitSize == 4) return ConvertWide<TEncUtf32>(text, size / 4, form.order, allowZero);
        if (size > c_longestText) return {};
        char const* const units = reinterpret_cast<char const*>(text);
        return {units, CharTraits<TEncUtf8>::GetValidLength(units, static_cast<int>(size), allowZero)};
    } catch (std::bad_alloc const&) {
        return {};
    }
}

String8 LoadAsUtf8(String8 const& path, bool allowZero)
{
    try {
        u64 size = 0;
        auto const bytes = ReadFileBytes(path.GetData(), 4 * static_cast<u64>(c_longestText), size);
        if (!bytes) return {};
        u8 const* const text = reinterpret_cast<u8 const*>(bytes.get());
        UnicodeEncoding const mark = GetByteOrderMark(text, static_cast<i64>(size));
        return ConvertToUtf8(mark == UnicodeEncoding::None ? UnicodeEncoding::Utf8 : mark, text, static_cast<i64>(size),
                             allowZero);
    } catch (std::bad_alloc const&) {
        return {};
    }
}

} // namespace Kernel

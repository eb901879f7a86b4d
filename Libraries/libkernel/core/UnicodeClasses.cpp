#include "libkernel/core/UnicodeClasses.h"

#include <algorithm>
#include <iterator>
#include <unicode/uchar.h>
#include <unicode/unorm2.h>
#include <unicode/utf16.h>

namespace Kernel {
namespace {

struct Range
{
    u32 first;
    u32 last;
};

// In the order of the standard's productions, the commonest first.
constexpr Range c_nameStart[] = {
    {':', ':'},       {'A', 'Z'},       {'_', '_'},       {'a', 'z'},         {0xC0, 0xD6},     {0xD8, 0xF6},
    {0xF8, 0x2FF},    {0x370, 0x37D},   {0x37F, 0x1FFF},  {0x200C, 0x200D},   {0x2070, 0x218F}, {0x2C00, 0x2FEF},
    {0x3001, 0xD7FF}, {0xF900, 0xFDCF}, {0xFDF0, 0xFFFD}, {0x10000, 0xEFFFF},
};
constexpr Range c_nameOnly[] = {
    {'-', '-'}, {'.', '.'}, {'0', '9'}, {0xB7, 0xB7}, {0x300, 0x36F}, {0x203F, 0x2040},
};

template <size_t n>
bool IsInTable(Range const (&table)[n], u32 codePoint)
{
    return std::any_of(std::begin(table), std::end(table),
                       [=](Range const& r) { return codePoint >= r.first && codePoint <= r.last; });
}

constexpr struct
{
    u32 accented;
    u32 plain;
} c_tonas[] = {
    {0x386, 0x391}, {0x388, 0x395}, {0x389, 0x397}, {0x38A, 0x399},
    {0x38C, 0x39F}, {0x38E, 0x3A5}, {0x38F, 0x3A9}, {0x390, 0x3AA},
};

UChar32 ToIcu(u32 codePoint)
{
    return static_cast<UChar32>(codePoint);
}

bool HasProperty(u32 codePoint, UProperty property)
{
    return u_hasBinaryProperty(ToIcu(codePoint), property) != 0;
}

} // namespace

bool IsAlnum(u32 codePoint)
{
    return HasProperty(codePoint, UCHAR_POSIX_ALNUM);
}

bool IsAlpha(u32 codePoint)
{
    return HasProperty(codePoint, UCHAR_ALPHABETIC);
}

bool IsAnyDigit(u32 codePoint)
{
    return u_isdigit(ToIcu(codePoint)) != 0;
}

bool IsLower(u32 codePoint)
{
    return HasProperty(codePoint, UCHAR_LOWERCASE);
}

bool IsUpper(u32 codePoint)
{
    return HasProperty(codePoint, UCHAR_UPPERCASE);
}

bool IsSpace(u32 codePoint)
{
    if (codePoint <= 0x7F) return codePoint == 0x20 || codePoint - 9 <= 4;
    return HasProperty(codePoint, UCHAR_WHITE_SPACE);
}

bool IsPunct(u32 codePoint)
{
    constexpr u32 c_punctuation = U_GC_PD_MASK | U_GC_PS_MASK | U_GC_PE_MASK | U_GC_PC_MASK | U_GC_PO_MASK |
                                  U_GC_PI_MASK | U_GC_PF_MASK | U_GC_SM_MASK | U_GC_SK_MASK;
    return (U_GET_GC_MASK(ToIcu(codePoint)) & c_punctuation) != 0;
}

bool IsCombining(u32 codePoint)
{
    return u_getCombiningClass(ToIcu(codePoint)) != 0;
}

bool IsKnown(u32 codePoint)
{
    return u_isdefined(ToIcu(codePoint)) != 0;
}

bool IsXmlNameStart(u32 codePoint)
{
    return IsInTable(c_nameStart, codePoint);
}

bool IsXmlName(u32 codePoint)
{
    return IsXmlNameStart(codePoint) || IsInTable(c_nameOnly, codePoint);
}

int GetUnicodeCharacterType(u32 codePoint)
{
    return u_charType(ToIcu(codePoint));
}

String8 GetUnicodeName(u32 codePoint)
{
    char name[256];
    UErrorCode status = U_ZERO_ERROR;
    int const length = u_charName(ToIcu(codePoint), U_UNICODE_CHAR_NAME, name, sizeof name, &status);
    if (U_FAILURE(status)) return {};
    return {name, std::min(length, static_cast<int>(sizeof name))};
}

int GetUnicodeDecomposition(u32* out, int size, u32 codePoint)
{
    UErrorCode status = U_ZERO_ERROR;
    UNormalizer2 const* const normaliser = unorm2_getNFCInstance(&status);
    if (U_FAILURE(status)) return 0;
    UChar units[64]; // The longest canonical decomposition is four code points.
    int const length = unorm2_getDecomposition(normaliser, ToIcu(codePoint), units, std::size(units), &status);
    if (U_FAILURE(status)) return 0; // A negative length means no decomposition, and leaves the loop out.
    int count = 0;
    for (int i = 0; i < length && count < size;) {
        UChar32 c;
        U16_NEXT(units, i, length, c);
        out[count++] = static_cast<u32>(c);
    }
    return count;
}

u32 RemoveGreekTonas(u32 codePoint)
{
    for (auto const& row : c_tonas)
        if (row.accented == codePoint) return row.plain;
    return codePoint;
}

} // namespace Kernel

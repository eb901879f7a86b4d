#include "libkernel/core/UnicodeNormalize.h"

#include "libkernel/core/ConvertEnc.h"

#include <unicode/unorm2.h>

namespace Kernel {
namespace {

UNormalizer2 const* GetNormalizer(UnicodeNormalize::ComposeType type, UErrorCode& error)
{
    switch (type) {
    case UnicodeNormalize::Composed: return unorm2_getNFCInstance(&error);
    case UnicodeNormalize::Decomposed: return unorm2_getNFDInstance(&error);
    }
    return nullptr;
}

} // namespace

template <class Enc>
StringT<Enc> UNormalize(StringT<Enc> const& text, UnicodeNormalize::ComposeType type)
{
    UErrorCode error = U_ZERO_ERROR;
    UNormalizer2 const* const normalizer = GetNormalizer(type, error);
    if (!normalizer || U_FAILURE(error)) return {};

    String16 const wide = ConvertedTo<TEncUtf16>(text);
    int const length = wide.GetLength();
    int const same = unorm2_spanQuickCheckYes(normalizer, wide.GetData(), length, &error);
    if (U_FAILURE(error)) return {};
    if (same == length) return text;
    // The first run only measures.
    int const needed = unorm2_normalize(normalizer, wide.GetData(), length, nullptr, 0, &error);
    if (error != U_BUFFER_OVERFLOW_ERROR) return {};
    error = U_ZERO_ERROR;
    String16 normal;
    unorm2_normalize(normalizer, wide.GetData(), length, normal.SetLength(needed), needed, &error);
    if (U_FAILURE(error)) return {};
    return ConvertedTo<Enc>(normal);
}

template String8 UNormalize(String8 const&, UnicodeNormalize::ComposeType);
template String16 UNormalize(String16 const&, UnicodeNormalize::ComposeType);
template String32 UNormalize(String32 const&, UnicodeNormalize::ComposeType);

} // namespace Kernel

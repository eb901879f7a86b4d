#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// Appends @p n units of @p src, in the encoding From, to @p dst; a negative n means up to the terminator. The length
/// is summed first, so that the target grows once.
///
/// The input is trusted: nothing is validated and nothing replaced, and ill-formed text gives ill-formed text, so that
/// text from outside goes through CharTraits::GetValidLength first. Nothing outside the given units is read all the
/// same: a last code point that is cut short is dropped. Throws std::bad_alloc when there is no memory or the text
/// would pass 2^31 units. All nine pairs of encodings exist.
template <class To, class From>
void ConvertEnc(StringT<To>& dst, typename From::Unit const* src, int n);

/// The text in the encoding To.
template <class To, class From>
StringT<To> ConvertedTo(StringT<From> const& text)
{
    StringT<To> result;
    ConvertEnc<To, From>(result, text.GetData(), text.GetLength());
    return result;
}

extern template KERNEL_API void ConvertEnc<TEncUtf8, TEncUtf8>(String8&, char const*, int);
extern template KERNEL_API void ConvertEnc<TEncUtf8, TEncUtf16>(String8&, char16_t const*, int);
extern template KERNEL_API void ConvertEnc<TEncUtf8, TEncUtf32>(String8&, unsigned int const*, int);
extern template KERNEL_API void ConvertEnc<TEncUtf16, TEncUtf8>(String16&, char const*, int);
extern template KERNEL_API void ConvertEnc<TEncUtf16, TEncUtf16>(String16&, char16_t const*, int);
extern template KERNEL_API void ConvertEnc<TEncUtf16, TEncUtf32>(String16&, unsigned int const*, int);
extern template KERNEL_API void ConvertEnc<TEncUtf32, TEncUtf8>(String32&, char const*, int);
extern template KERNEL_API void ConvertEnc<TEncUtf32, TEncUtf16>(String32&, char16_t const*, int);
extern template KERNEL_API void ConvertEnc<TEncUtf32, TEncUtf32>(String32&, unsigned int const*, int);

} // namespace Kernel

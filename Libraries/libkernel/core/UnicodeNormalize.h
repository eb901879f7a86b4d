#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

namespace UnicodeNormalize {
/// The normal form wanted.
enum ComposeType
{
    Composed = 0,  ///< Normal form C: marks joined with their letters.
    Decomposed = 1 ///< Normal form D: letters and marks apart.
};
} // namespace UnicodeNormalize

/// The text in a normal form of Unicode Standard Annex 15. Text that is in it already comes back with its own block.
/// The empty string for another @p type and where there is no memory for the work; valid text is taken for granted.
template <class Enc>
StringT<Enc> UNormalize(StringT<Enc> const& text, UnicodeNormalize::ComposeType type);

extern template KERNEL_API String8 UNormalize(String8 const&, UnicodeNormalize::ComposeType);
extern template KERNEL_API String16 UNormalize(String16 const&, UnicodeNormalize::ComposeType);
extern template KERNEL_API String32 UNormalize(String32 const&, UnicodeNormalize::ComposeType);

} // namespace Kernel

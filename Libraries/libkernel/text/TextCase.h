#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"
#include "libkernel/text/Locale.h"

namespace Kernel {

// Case of texts in the three encodings, by the full mappings of Unicode with the rules of the locale's language, or of
// no language for null. Each code point is mapped by itself, whatever stands beside it, and may become several: "ß" is
// "SS" in upper case, while a last "Σ" is "σ" in lower case like any other. Text that stays as it is comes back with
// its own block. Valid text is taken for granted. The locale is borrowed for the call.

/// Every code point to lower case.
template <class Enc>
StringT<Enc> ToLowerCase(StringT<Enc> const& text, NonCounted<Locale const> locale = nullptr);

/// Every code point to upper case.
template <class Enc>
StringT<Enc> ToUpperCase(StringT<Enc> const& text, NonCounted<Locale const> locale = nullptr);

/// The first code point to title case, all others to lower case.
template <class Enc>
StringT<Enc> ToTitleCaseSingleWord(StringT<Enc> const& text, NonCounted<Locale const> locale = nullptr);

/// Upper-case letters (general category Lu) to lower case, everything else to upper case.
template <class Enc>
StringT<Enc> ToggleCase(StringT<Enc> const& text, NonCounted<Locale const> locale = nullptr);

extern template KERNEL_API String8 ToLowerCase(String8 const&, NonCounted<Locale const>);
extern template KERNEL_API String16 ToLowerCase(String16 const&, NonCounted<Locale const>);
extern template KERNEL_API String32 ToLowerCase(String32 const&, NonCounted<Locale const>);
extern template KERNEL_API String8 ToUpperCase(String8 const&, NonCounted<Locale const>);
extern template KERNEL_API String16 ToUpperCase(String16 const&, NonCounted<Locale const>);
extern template KERNEL_API String32 ToUpperCase(String32 const&, NonCounted<Locale const>);
extern template KERNEL_API String8 ToTitleCaseSingleWord(String8 const&, NonCounted<Locale const>);
extern template KERNEL_API String16 ToTitleCaseSingleWord(String16 const&, NonCounted<Locale const>);
extern template KERNEL_API String32 ToTitleCaseSingleWord(String32 const&, NonCounted<Locale const>);
extern template KERNEL_API String8 ToggleCase(String8 const&, NonCounted<Locale const>);
extern template KERNEL_API String16 ToggleCase(String16 const&, NonCounted<Locale const>);
extern template KERNEL_API String32 ToggleCase(String32 const&, NonCounted<Locale const>);

} // namespace Kernel

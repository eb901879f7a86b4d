#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// How well an identifier on offer answers the language that is wanted.
enum class LanguageIdMatch
{
    None = 0,
    Language = 1, ///< The same language, but another or an unknown country.
    Exact = 2     ///< The same, or the default country of the language.
};

/// Compares identifiers such as "en" and "en-GB"; @p first is the language that is wanted, @p second one on offer. Any
/// thread, and any bytes.
KERNEL_API LanguageIdMatch GetLanguageIdMatch(String8 const& first, String8 const& second);

/// "en-US" for "en": a two-letter language with its default country. Anything else comes back as it is.
KERNEL_API String8 GetDefaultLanguageCountry(String8 const& language);

/// The language tag of a Windows language identifier, as [MS-LCID] publishes them; "zxx" for 255, empty for an unknown
/// one.
KERNEL_API String8 GetLanguageIdFromLcid(int lcid);

} // namespace Kernel

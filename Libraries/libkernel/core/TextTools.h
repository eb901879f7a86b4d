#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// CR LF, LF CR and lone CR each become one LF. Text without a CR comes back with its own block.
KERNEL_API String8 CanonicaliseLineEnds(String8 const& text);

/// Cuts @p text behind its word number @p count; with @p ellipsis U+2026 goes behind a cut. A word ends at the first
/// white space (IsSpace) behind something else, so white space behind the last word wanted is cut off too. A count
/// below 1 is no limit.
KERNEL_API void ApplyMaxWordCount(String8& text, int count, bool ellipsis);

/// The units from @p begin to @p end with the five characters that XML gives meaning to (XML 1.0, section 4.6) as
/// references to the predefined entities; all else is copied. Zero units are not a case of their own.
KERNEL_API String8 EscapeXml(char const* begin, char const* end);
KERNEL_API String16 EscapeXml(char16_t const* begin, char16_t const* end);
KERNEL_API String32 EscapeXml(unsigned int const* begin, unsigned int const* end);

} // namespace Kernel

#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

// Checks of addresses on their text alone. Any bytes may be given.

/// The address as a PDF writer takes it: ASCII letters, digits and !#$%&'()*+,-./:;=?@[]_~ stay, every other byte
/// becomes "%" and two upper-case hexadecimal digits. A "%" stays too, so that text escaped already is not changed.
KERNEL_API String8 EscapeURLForPDFLib(String8 const& url);

/// True if every byte is one of those that EscapeURLForPDFLib lets stay, and two hexadecimal digits stand behind each
/// "%". Empty text is valid.
KERNEL_API bool IsValidURLForPDFLib(String8 const& url);

/// True if there is a ":" and only alphanumeric code points (IsAlnum) stand before it, perhaps none.
KERNEL_API bool HasUriProtocol(String8 const& text);

/// True for text in the shape of a mail address, with a dot in its domain and perhaps a query behind it. Looser than
/// RFC 5322 in places and stricter in others; no quoting. In the domain, bytes above 127 count as the code points of
/// the same numbers.
KERNEL_API bool IsValidEmail(String8 const& text);

} // namespace Kernel

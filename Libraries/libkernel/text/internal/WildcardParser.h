#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"
#include "libkernel/core/Utf8Sequence.h"

#include <string_view>

namespace Kernel {

class Wildcard;
class WildcardDictionary;

/// The bytes of a delimiter; empty if it has none. Borrowed from @p sequence.
inline std::string_view DelimiterOf(Utf8Sequence const& sequence)
{
    return {sequence.GetSequence(), static_cast<size_t>(sequence.GetSequenceSize())};
}

/// The dictionary's wildcard for the token, otherwise a new one of the user's. The dictionary may be null.
Counted<Wildcard const> FindOrMakeWildcard(String8 const& token, Counted<WildcardDictionary const> const& dictionary);

} // namespace Kernel

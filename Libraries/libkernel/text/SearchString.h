#pragma once

#include "libkernel/core/String.h"

#include <vector>

namespace Kernel {

/// A search with several tokens, as a search box takes it. Constant operations may be called from several threads.
class KERNEL_API SearchString
{
public:
    /// Splits @p text at runs of tab, line feed, carriage return and space. With @p flag true the tokens are looked for
    /// without case (CharTraits::FindNoCase), with false as they stand.
    SearchString(String8 const& text, bool flag);

    std::vector<String8> const& GetTokens() const { return m_tokens; }
    /// The flag as it was given to the constructor, whatever the name says.
    bool IsCaseSensitive() const { return m_flag; }

    /// True if @p text has all tokens, in order, each behind the end of the match before it. No tokens: true.
    bool Test(String8 const& text) const;
    /// Does the same from token @p first on, from the start of the text, as far as tokens are found; gives the number
    /// of the first that wasn't, which is the token count when none is left. So one search can go over several fields.
    u64 TestSubset(String8 const& text, u64 first) const;
    /// True if @p index, from TestSubset, is past the last token.
    bool Completed(u64 index) const { return index >= m_tokens.size(); }

private:
    std::vector<String8> m_tokens;
    bool m_flag;
};

} // namespace Kernel

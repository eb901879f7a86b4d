#include "libkernel/text/SearchString.h"

#include "libkernel/core/CharTraits.h"

namespace Kernel {

SearchString::SearchString(String8 const& text, bool flag) : m_flag(flag)
{
    constexpr std::string_view blanks = "\t\n\r ";
    std::string_view const all = text.GetView();
    for (size_t begin = all.find_first_not_of(blanks), end; begin != all.npos;
         begin = all.find_first_not_of(blanks, end)) {
        end = std::min(all.find_first_of(blanks, begin), all.size());
        m_tokens.emplace_back(all.substr(begin, end - begin));
    }
}

bool SearchString::Test(String8 const& text) const
{
    return Completed(TestSubset(text, 0));
}

u64 SearchString::TestSubset(String8 const& text, u64 first) const
{
    using Traits = CharTraits<TEncUtf8>;
    int pos = 0;
    for (; first < m_tokens.size(); ++first) {
        String8 const& token = m_tokens[first];
        // Without case a match may have another length than its token.
        int matched = token.GetLength();
        int const found = m_flag ? Traits::FindNoCase(text.GetData(), text.GetLength(), token.GetData(),
                                                      token.GetLength(), pos, &matched)
                                 : text.Find(token, pos);
        if (found < 0) break;
        pos = found + matched;
    }
    return first;
}

} // namespace Kernel

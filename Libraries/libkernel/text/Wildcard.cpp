#include "libkernel/text/Wildcard.h"

#include "libkernel/text/WildcardDictionary.h"
#include "libkernel/text/internal/WildcardParser.h"

namespace Kernel {

Wildcard::~Wildcard() = default;

String8 Wildcard::GetWildcard(unsigned int delimiter) const
{
    Utf8Sequence const sequence(delimiter);
    if (!sequence.IsValid()) return String8();
    String8 const bytes(DelimiterOf(sequence));
    return bytes + m_token + bytes;
}

Counted<Wildcard const> Wildcard::ParseSingleWildcard(String8 const& text,
                                                      Counted<WildcardDictionary const> const& dictionary,
                                                      unsigned int delimiter)
{
    Utf8Sequence const sequence(delimiter);
    if (!sequence.IsValid()) return nullptr;
    std::string_view const bytes = DelimiterOf(sequence), whole = text.GetView();
    if (whole.size() <= 2 * bytes.size() || !whole.starts_with(bytes)) return nullptr;
    if (whole.find(bytes, 1) != whole.size() - bytes.size()) return nullptr;
    return FindOrMakeWildcard(String8(whole.substr(bytes.size(), whole.size() - 2 * bytes.size())), dictionary);
}

Counted<Wildcard const> FindOrMakeWildcard(String8 const& token, Counted<WildcardDictionary const> const& dictionary)
{
    if (dictionary)
        if (Counted<BuiltinWildcard const> const known = dictionary->Find(token)) return known;
    return MakeCounted<UserWildcard>(token);
}

BuiltinWildcard::BuiltinWildcard(IDTag tag, String8 const& token, LocalisedString const& label,
                                 LocalisedString const& description)
    : Wildcard(tag, token), m_label(label), m_description(description)
{
}

BuiltinWildcard::~BuiltinWildcard() = default;

UserWildcard::UserWildcard(String8 const& token) : Wildcard(IDTag(), token) {}

UserWildcard::~UserWildcard() = default;

} // namespace Kernel

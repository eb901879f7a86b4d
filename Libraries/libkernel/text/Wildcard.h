#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/String.h"
#include "libkernel/text/LocalisedString.h"

namespace Kernel {

class WildcardDictionary;

/// A token that stands between delimiters in a template text and is filled in when the text is written out. The
/// delimiter is any code point; each operation is given it.
class KERNEL_API Wildcard : public Countable
{
public:
    /// What a person is shown for the token; good as long as this lives.
    virtual String8 const& GetLabel() const = 0;

    String8 const& GetToken() const { return m_token; }
    IDTag GetIDTag() const { return m_tag; }
    /// Delimiter, token, delimiter. Empty for a delimiter that has no UTF-8 form.
    String8 GetWildcard(unsigned int delimiter) const;

    /// The wildcard that makes up the whole of @p text, as WildcardSequence::Parse would find it. Null unless a
    /// delimiter stands at the start and the next one at the very end, with a token between; null too for a delimiter
    /// that has no UTF-8 form.
    static Counted<Wildcard const> ParseSingleWildcard(String8 const& text,
                                                       Counted<WildcardDictionary const> const& dictionary,
                                                       unsigned int delimiter);

protected:
    Wildcard(IDTag tag, String8 const& token) : m_token(token), m_tag(tag) {}
    ~Wildcard() override;

private:
    String8 const m_token;
    IDTag const m_tag;
};

/// A token that the application knows.
///
/// Label and description are resolved when they are first asked for, which writes to them: ask once before other
/// threads do, or give texts that are resolved.
class KERNEL_API BuiltinWildcard : public Wildcard
{
public:
    BuiltinWildcard(IDTag tag, String8 const& token, LocalisedString const& label, LocalisedString const& description);

    /// In the user's language.
    String8 const& GetLabel() const override { return m_label.ToString(); }
    String8 const& GetDescription() const { return m_description.ToString(); }

protected:
    ~BuiltinWildcard() override;

private:
    LocalisedString const m_label;
    LocalisedString const m_description;
};

/// A token that no dictionary knows. Its tag is 0 and its label the token.
class KERNEL_API UserWildcard : public Wildcard
{
public:
    explicit UserWildcard(String8 const& token);

    String8 const& GetLabel() const override { return GetToken(); }

protected:
    ~UserWildcard() override;
};

} // namespace Kernel

#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"
#include "libkernel/text/Wildcard.h"

#include <vector>

namespace Kernel {

class WildcardDictionary;

/// A template text, taken apart into literals and wildcards. Never changes once made: any thread may read.
class KERNEL_API WildcardSequence : public Countable
{
public:
    /// A wildcard, or without one the literal.
    struct Item
    {
        Counted<Wildcard const> wildcard;
        String8 literal;
    };

    /// Where a text could not be parsed, in bytes; both 0 for a clean parse.
    struct ErrorRec
    {
        int position = 0; ///< Of the first byte of a token that is not closed.
        int length = 0;   ///< Up to the end of the text.
    };

    /// One wildcard; no items for null.
    static Counted<WildcardSequence const> Create(Counted<Wildcard const> const& wildcard);
    /// One literal.
    static Counted<WildcardSequence const> Create(String8 const& literal);
    static Counted<WildcardSequence const> Create(std::vector<Item> const& items);

    /// Takes @p text apart. A token is a wildcard of @p dictionary, which may be null, or else a UserWildcard of its
    /// own. Two delimiters in a row vanish, and the text around them is one literal. A token that is not closed becomes
    /// part of the literal before it, and @p error tells of it. Any bytes may be given. Null only for a delimiter that
    /// has no UTF-8 form.
    static Counted<WildcardSequence const>
    Parse(String8 const& text, Counted<WildcardDictionary const> const& dictionary, unsigned int delimiter);
    static Counted<WildcardSequence const> Parse(String8 const& text,
                                                 Counted<WildcardDictionary const> const& dictionary, ErrorRec& error,
                                                 unsigned int delimiter);

    std::vector<Item> const& GetItems() const { return m_items; }

    /// The text, if it is UTF-8, that parses to these items. Delimiters within literals are left out, since nothing
    /// could stand for them. Empty for a delimiter that has no UTF-8 form.
    String8 Reform(unsigned int delimiter) const { return Reform(m_items, delimiter); }
    static String8 Reform(std::vector<Item> const& items, unsigned int delimiter);

private:
    explicit WildcardSequence(std::vector<Item>&& items) : m_items(std::move(items)) {}
    ~WildcardSequence() override;

    std::vector<Item> const m_items;
};

} // namespace Kernel

#include "libkernel/text/WildcardSequence.h"

#include "libkernel/text/WildcardDictionary.h"
#include "libkernel/text/internal/WildcardParser.h"

#include <algorithm>
#include <limits>
#include <new>

namespace Kernel {

namespace {

// Items in the making. The literal stays open until a wildcard follows it, so that text around a doubled delimiter
// becomes one literal.
class ItemBuilder
{
public:
    void AddText(std::string_view text)
    {
        if (m_literal.IsEmpty())
            m_literal = String8(text);
        else
            m_literal.Append(text.data(), static_cast<int>(text.size()));
    }
    void AddWildcard(Counted<Wildcard const>&& wildcard)
    {
        CloseLiteral();
        m_items.push_back({std::move(wildcard), String8()});
    }
    std::vector<WildcardSequence::Item> Finish()
    {
        CloseLiteral();
        return std::move(m_items);
    }

private:
    void CloseLiteral()
    {
        if (m_literal.IsEmpty()) return;
        m_items.push_back({nullptr, m_literal});
        m_literal = String8();
    }

    std::vector<WildcardSequence::Item> m_items;
    String8 m_literal;
};

// The pieces between delimiters, one after the other.
char* AppendWithout(char* out, std::string_view text, std::string_view delimiter)
{
    for (size_t at = 0; at <= text.size();) {
        std::string_view const piece = text.substr(at, text.find(delimiter, at) - at);
        out = std::copy(piece.begin(), piece.end(), out);
        at += piece.size() + delimiter.size();
    }
    return out;
}

} // namespace

WildcardSequence::~WildcardSequence() = default;

Counted<WildcardSequence const> WildcardSequence::Create(Counted<Wildcard const> const& wildcard)
{
    return Create(wildcard ? std::vector<Item>{{wildcard, String8()}} : std::vector<Item>());
}

Counted<WildcardSequence const> WildcardSequence::Create(String8 const& literal)
{
    return Create(std::vector<Item>{{nullptr, literal}});
}

Counted<WildcardSequence const> WildcardSequence::Create(std::vector<Item> const& items)
{
    return Counted<WildcardSequence const>(new WildcardSequence(std::vector<Item>(items)));
}

Counted<WildcardSequence const> WildcardSequence::Parse(String8 const& text,
                                                        Counted<WildcardDictionary const> const& dictionary,
                                                        unsigned int delimiter)
{
    ErrorRec error;
    return Parse(text, dictionary, error, delimiter);
}

Counted<WildcardSequence const> WildcardSequence::Parse(String8 const& text,
                                                        Counted<WildcardDictionary const> const& dictionary,
                                                        ErrorRec& error, unsigned int delimiter)
{
    error = ErrorRec();
    Utf8Sequence const sequence(delimiter);
    if (!sequence.IsValid()) return nullptr;
    std::string_view const bytes = DelimiterOf(sequence), whole = text.GetView();

    ItemBuilder items;
    for (size_t at = 0;;) {
        size_t const open = whole.find(bytes, at);
        items.AddText(whole.substr(at, open - at));
        if (open == std::string_view::npos) break;
        size_t const token = open + bytes.size();
        size_t const close = whole.find(bytes, token);
        at = close + bytes.size();
        if (close == token) continue;
        if (close == std::string_view::npos) {
            error = {static_cast<int>(token), static_cast<int>(whole.size() - token)};
            items.AddText(whole.substr(token));
            break;
        }
        items.AddWildcard(FindOrMakeWildcard(String8(whole.substr(token, close - token)), dictionary));
    }
    return Counted<WildcardSequence const>(new WildcardSequence(items.Finish()));
}

String8 WildcardSequence::Reform(std::vector<Item> const& items, unsigned int delimiter)
{
    Utf8Sequence const sequence(delimiter);
    if (items.empty() || !sequence.IsValid()) return String8();
    std::string_view const bytes = DelimiterOf(sequence);

    u64 size = 0; // What it takes at most: literals may hold delimiters.
    for (Item const& item : items)
        size += static_cast<u64>(item.wildcard ? item.wildcard->GetToken().GetLength() : item.literal.GetLength()) +
                (item.wildcard ? 2 * bytes.size() : 0);
    if (size > static_cast<u64>(std::numeric_limits<int>::max())) throw std::bad_alloc();
    if (size == 0) return String8();

    char* begin = nullptr;
    String8 result(static_cast<int>(size), begin);
    char* out = begin;
    for (Item const& item : items) {
        if (!item.wildcard) {
            out = AppendWithout(out, item.literal.GetView(), bytes);
            continue;
        }
        for (std::string_view const part : {bytes, item.wildcard->GetToken().GetView(), bytes})
            out = std::copy(part.begin(), part.end(), out);
    }
    result.SetLength(static_cast<int>(out - begin));
    return result;
}

} // namespace Kernel

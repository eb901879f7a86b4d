#include "FuzzTarget.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/core/Utf8Sequence.h"
#include "libkernel/text/WildcardDictionary.h"
#include "libkernel/text/WildcardSequence.h"
#include "libkernel/text/WildcardWriter.h"

#include <string>

namespace {

using namespace Kernel;
using Fuzz::Require;

/// One byte of each kind of length, and one without an encoding.
constexpr u32 c_delimiters[] = {'%', 0xA7, 0x2020, 0x1F600, 0x3FFFFFF, 0x7FFFFFFF, 0, 0x80000000};

Counted<WildcardDictionary const> MakeDictionary()
{
    auto const dictionary = MakeCounted<WildcardDictionary>();
    for (char const* token : {"a", "page"})
        dictionary->AddWildcard(
            MakeCounted<BuiltinWildcard>(IDTag("Wild"), token, LocalisedString::Empty, LocalisedString::Empty));
    return dictionary;
}

/// Every token is its own value, so that what is written can be told from the items.
class TokenEvaluator : public WildcardWriter::Evaluator
{
public:
    bool Evaluate(NonCounted<Wildcard const> wildcard, String8& value) override
    {
        value = wildcard->GetToken();
        return true;
    }
};

bool AreSame(WildcardSequence const& a, WildcardSequence const& b)
{
    auto const& first = a.GetItems();
    auto const& second = b.GetItems();
    if (first.size() != second.size()) return false;
    for (size_t i = 0; i < first.size(); ++i) {
        if (static_cast<bool>(first[i].wildcard) != static_cast<bool>(second[i].wildcard)) return false;
        if (first[i].wildcard ? first[i].wildcard->GetToken() != second[i].wildcard->GetToken()
                              : first[i].literal != second[i].literal)
            return false;
    }
    return true;
}

} // namespace

// A byte that chooses the delimiter, then the template text.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    static Counted<WildcardDictionary const> const s_dictionary = MakeDictionary();
    Fuzz::Input input(data, size);
    u32 const delimiter = c_delimiters[input.TakeBelow(std::size(c_delimiters))];
    Utf8Sequence const bytes(delimiter);
    String8 const text(reinterpret_cast<char const*>(input.GetRest()), static_cast<int>(input.GetLeft()));

    WildcardSequence::ErrorRec error;
    auto const sequence = WildcardSequence::Parse(text, s_dictionary, error, delimiter);
    auto const single = Wildcard::ParseSingleWildcard(text, s_dictionary, delimiter);
    Require(static_cast<bool>(sequence) == bytes.IsValid(), "only a delimiter without bytes gives nothing");
    if (!sequence) return 0;

    Require(error.position >= 0 && error.length >= 0 && error.position + error.length <= text.GetLength(),
            "an error lies within the text");
    String8 const reformed = sequence->Reform(delimiter);
    Require(reformed.GetLength() <= text.GetLength(), "a text that is put together again is no longer");
    // In other bytes a delimiter that vanishes may leave one behind, made of what stood around it.
    if (CharTraits<TEncUtf8>::IsValid(text.GetData(), text.GetLength(), true))
        Require(AreSame(*WildcardSequence::Parse(reformed, s_dictionary, delimiter), *sequence),
                "a text that is put together again comes apart the same");
    if (single)
        Require(sequence->GetItems().size() == 1 && single->GetWildcard(delimiter) == text,
                "a single wildcard is the whole text");

    TokenEvaluator evaluator;
    WildcardTargetString target;
    WildcardWriter(evaluator, target).WriteSequence(*sequence);
    std::string plain;
    for (auto const& item : sequence->GetItems())
        plain += (item.wildcard ? item.wildcard->GetToken() : item.literal).GetView();
    Require(target.GetResult().GetView() == plain, "every item is written once, in order");
    return 0;
}

#include "Diagnostics.h"
#include "Output.h"
#include "SourceItem.h"
#include "TextInput.h"
#include "Verbs.h"
#include "libkernel/text/Collator.h"
#include "libkernel/text/Locale.h"

#include <algorithm>

// Lines in the order of a language.

namespace KernelTool {

using namespace Kernel;

namespace {

std::string ReadAll(Source const& source)
{
    std::string bytes(source.GetSize(), '\0');
    Source::Stream const stream = source.Open();
    bytes.resize(source.Read(stream, bytes.data(), bytes.size()));
    return bytes;
}

// Without their ends, "\n" or "\r\n". What follows the last end is a line unless it is empty.
std::vector<String8> SplitLines(std::string_view text)
{
    std::vector<String8> lines;
    while (!text.empty()) {
        size_t const end = std::min(text.find('\n'), text.size());
        std::string_view line = text.substr(0, end);
        if (line.ends_with('\r')) line.remove_suffix(1);
        lines.emplace_back(line);
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return lines;
}

} // namespace

int RunTextSort(Arguments const& arguments)
{
    Counted<Locale const> const locale =
        arguments.Has(Option::Locale) ? Locale::Create(arguments.GetString(Option::Locale)) : Locale::GetCurrent();
    auto const collator = MakeCounted<Collator>(locale, true, arguments.Has(Option::Numeric));
    if (!collator->IsLocaleAware()) throw UsageProblem{"'" + ToStd(locale->GetId()) + "' is not a locale"};

    Source const source =
        arguments.positional[0] == "-" ? Source::FromStandardInput() : Source::FromPath(arguments.At(0));
    std::string const text = ReadAll(source);
    if (arguments.Has(Option::Json))
        if (size_t const good = GetWellFormedLength(text); good != text.size())
            throw Failure{"reading " + DescribeInput(arguments.At(0)), "IllFormed", static_cast<int>(good),
                          "The text goes wrong at byte " + std::to_string(good) +
                              ", which JSON can't show; without --json its lines are sorted as they are.",
                          ExitFailed};
    std::vector<String8> lines = SplitLines(text);
    // Lines that the language does not tell apart keep their order.
    std::stable_sort(lines.begin(), lines.end(),
                     [&](String8 const& a, String8 const& b) { return collator->Collate(a, b) < 0; });

    if (arguments.Has(Option::Json)) {
        Json sorted = Json::array();
        for (String8 const& line : lines) sorted.push_back(ToStd(line));
        PrintJson({{"locale", ToStd(locale->GetId())}, {"lines", std::move(sorted)}});
        return ExitDone;
    }
    for (String8 const& line : lines) Print(ToStd(line) + "\n");
    return ExitDone;
}

} // namespace KernelTool

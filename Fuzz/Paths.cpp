#include "FuzzTarget.h"
#include "libkernel/core/Exception.h"
#include "libkernel/filesystem/PathTraits.h"

#include <algorithm>
#include <string>
#include <vector>

namespace Kernel::Fuzz {

namespace {

// Canonical by the definition, with a list of elements.
std::string CanonicalSlowly(std::string const& path)
{
    if (path.find('/') == path.npos) return path;
    std::string const root = path[0] == '/' ? "/" : path.compare(0, 2, "~/") == 0 ? "~/" : "";
    std::vector<std::string> elements;
    for (size_t begin = root.size(); begin <= path.size();) {
        size_t const end = std::min(path.find('/', begin), path.size());
        std::string const element = path.substr(begin, end - begin);
        begin = end + 1;
        if (element.empty() || element == ".") continue;
        bool const isParent = element == "..";
        bool const canTake = !elements.empty() && elements.back() != "..";
        if (isParent && canTake)
            elements.pop_back();
        else if (!isParent || root.empty())
            elements.push_back(element);
    }
    std::string result = root;
    for (std::string const& element : elements) {
        if (&element != &elements[0]) result += '/';
        result += element;
    }
    return result;
}

// One grammar in one unit. Buffers have the promised size and no more.
template <class Grammar, class Text>
struct Checks
{
    static int Length(Text const& text) { return static_cast<int>(text.size()); }

    static Text Canonicalize(Text path)
    {
        int const length = Grammar::Canonicalize(path.data(), Length(path));
        Require(length >= 0 && length <= Length(path), "a canonical path is never longer");
        path.resize(static_cast<size_t>(length));
        return path;
    }

    static Text Run(Text const& a, Text const& b)
    {
        Text const canonical = Canonicalize(a);
        // What is no path may become one: ".\\c:" has a colon where none may stand, and without its dot a drive.
        bool const isValid = Grammar::IsValidPath(a.c_str());
        Require(!isValid || Canonicalize(canonical) == canonical, "a canonical path stays as it is");
        Text safe(a.size(), 0);
        int length = Length(a);
        bool const isSafe = Grammar::CanonicalizeSafe(safe.data(), a.c_str(), length);
        safe.resize(static_cast<size_t>(length));
        Require(safe == canonical, "the safe form writes the same");
        Require(isSafe || Grammar::IsRoot(a.c_str()), "only a rooted path can be climbed above");
        Require(Grammar::IsRelative(a.c_str()) != Grammar::IsRoot(a.c_str()), "a path is rooted or relative");
        int const common = Grammar::CommonPrefixLength(a.c_str(), b.c_str());
        Require(common == Grammar::CommonPrefixLength(b.c_str(), a.c_str()), "what is common is so both ways");
        Require(common <= std::min(Length(a), Length(b)), "what is common lies in both");

        // Once with the room that is always enough, once with one unit too few.
        Text joined(a.size() + b.size() + 2, 0);
        int const joinedLength =
            Grammar::Combine(joined.data(), Length(joined) + 1, a.c_str(), Length(a), b.c_str(), Length(b));
        joined.resize(static_cast<size_t>(joinedLength));
        Require(!Grammar::IsRoot(b.c_str()) || joined == canonical, "a rooted second path is ignored");
        Text tight(joined.size(), 0);
        bool fits = true;
        try {
            Grammar::Combine(tight.data(), joinedLength, a.c_str(), Length(a), b.c_str(), Length(b));
        } catch (InvalidArgException const&) {
            fits = false;
        }
        Require(!fits, "a result that does not fit is refused");
        if (b.empty()) return joined;
        Text appended = a;
        appended.resize(a.size() + b.size() + 1);
        int const end = Grammar::Append(appended.data(), b.c_str(), Length(appended) + 1, Length(a), Length(b));
        Require(end >= Length(a) && end <= Length(appended), "an append adds one separator at most");
        return joined;
    }
};

void CheckBoth(std::string const& a, std::string const& b)
{
    std::u16string const wideA(a.begin(), a.end()), wideB(b.begin(), b.end());
    auto const compare = [](std::string const& narrow, std::u16string const& wide) {
        Require(std::u16string(narrow.begin(), narrow.end()) == wide, "both units give the same");
    };
    compare(Checks<PathTraitsDos, std::string>::Run(a, b),
            Checks<PathTraitsDos::Wide, std::u16string>::Run(wideA, wideB));
    compare(Checks<PathTraitsUnix, std::string>::Run(a, b),
            Checks<PathTraitsUnix::Wide, std::u16string>::Run(wideA, wideB));
    Require(Checks<PathTraitsUnix, std::string>::Canonicalize(a) == CanonicalSlowly(a), "as by the definition");
}

} // namespace

} // namespace Kernel::Fuzz

// Bytes of the input: two paths, with a zero between them.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    std::string text;
    for (size_t i = 0; i < size; ++i) text += static_cast<char>(data[i] & 0x7F);
    size_t const middle = std::min(text.find('\0'), text.size());
    std::string second = text.substr(std::min(middle + 1, text.size()));
    second.resize(std::min(second.find('\0'), second.size()));
    Kernel::Fuzz::CheckBoth(text.substr(0, middle), second);
    return 0;
}

#include "Diagnostics.h"
#include "Output.h"
#include "TextInput.h"
#include "Verbs.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/core/UnicodeClasses.h"
#include "libkernel/core/Utf8Sequence.h"

#include <cstdio>

// The code points of a text, one by one.

namespace KernelTool {

using namespace Kernel;

namespace {

// General categories by their numbers (Unicode Standard Annex 44, section 5.7.1).
constexpr char const* c_categories[] = {"Cn", "Lu", "Ll", "Lt", "Lm", "Lo", "Mn", "Me", "Mc", "Nd",
                                        "Nl", "No", "Zs", "Zl", "Zp", "Cc", "Cf", "Co", "Cs", "Pd",
                                        "Ps", "Pe", "Pc", "Po", "Sm", "Sc", "Sk", "So", "Pi", "Pf"};

std::string CategoryOf(u32 codePoint)
{
    auto const type = static_cast<size_t>(GetUnicodeCharacterType(codePoint));
    return type < std::size(c_categories) ? c_categories[type] : "Cn";
}

std::string Label(u32 codePoint)
{
    char text[16];
    std::snprintf(text, sizeof text, "U+%04X", codePoint);
    return text;
}

} // namespace

int RunTextChars(Arguments const& arguments)
{
    String8 const text = arguments.At(0);
    int const valid = static_cast<int>(GetWellFormedLength(text.GetView()));
    Json list = Json::array();
    Table table("lllll");
    table.Add({"code", "class", "bytes", "name", ""});
    char const* const end = text.GetData() + valid;
    for (char const* p = text.GetData(); p < end;) {
        u32 const codePoint = CharTraits<TEncUtf8>::NextCodePoint(p);
        Utf8Sequence const sequence(codePoint);
        std::string const bytes = FormatHex({sequence.GetSequence(), static_cast<size_t>(sequence.GetSequenceSize())});
        std::string const name = ToStd(GetUnicodeName(codePoint));
        std::string const category = CategoryOf(codePoint);
        // A mark on its own would sit on what stands before it, and a control drives the terminal.
        bool const isShown = category[0] != 'C' && category[0] != 'M' && category[0] != 'Z';
        list.push_back({{"codePoint", codePoint}, {"name", name}, {"class", category}, {"utf8", bytes}});
        table.Add({Label(codePoint), category, bytes, name, isShown ? sequence.GetSequence() : ""});
    }
    if (arguments.Has(Option::Json))
        PrintJson(list);
    else
        table.Show();
    if (valid == text.GetLength()) return ExitDone;
    throw Failure{"reading TEXT", "IllFormed", valid, "The text goes wrong at byte " + std::to_string(valid) + ".",
                  ExitFailed};
}

} // namespace KernelTool

#include "Diagnostics.h"
#include "Output.h"
#include "TextEncodingName.h"
#include "TextInput.h"
#include "Verbs.h"

// Text from one encoding to another.

namespace KernelTool {

using namespace Kernel;

int RunTextConvert(Arguments const& arguments)
{
    String8 const path = arguments.positional.empty() ? String8() : arguments.At(0);
    TextEncodingName const from = TextEncodingName::Parse(arguments.Get(Option::FromEncoding, "UTF-8"));
    TextEncodingName const to = TextEncodingName::Parse(arguments.Get(Option::ToEncoding, "UTF-8"));
    size_t undefined = 0, unmapped = 0;
    String8 const text = Decode(from, ReadInput(path), undefined);
    std::string const bytes = Encode(to, text, unmapped);
    if (arguments.Has(Option::Json))
        PrintJson({{"from", from.name},
                   {"to", to.name},
                   {"text", ToStd(text)},
                   {"bytes", FormatHex(bytes)},
                   {"undefined", undefined},
                   {"unmapped", unmapped}});
    else
        Print(bytes);
    if (undefined != 0)
        throw Failure{"reading " + DescribeInput(path), "Undefined", static_cast<int>(undefined),
                      "So many codes stand for nothing in " + Printable(from.name) +
                          "; stand-ins were written for them.",
                      ExitFailed};
    if (unmapped == 0) return ExitDone;
    throw Failure{"converting " + DescribeInput(path), "Unmapped", static_cast<int>(unmapped),
                  "So many characters have no code in " + Printable(to.name) + "; stand-ins were written for them.",
                  ExitFailed};
}

} // namespace KernelTool

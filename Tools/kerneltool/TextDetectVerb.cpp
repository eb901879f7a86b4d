#include "Output.h"
#include "TextInput.h"
#include "Verbs.h"
#include "libkernel/core/StringConverter.h"
#include "libkernel/core/UnicodeFile.h"

#include <algorithm>
#include <cstring>
#include <memory>

// What encoding a file is in: told by its mark, or guessed.

namespace KernelTool {

using namespace Kernel;

namespace {

constexpr char const* c_byMark[] = {nullptr, "UTF-8", "UTF-16LE", "UTF-16BE", "UTF-32LE", "UTF-32BE"};

bool IsAscii(std::string const& bytes)
{
    return std::all_of(bytes.begin(), bytes.end(), [](char c) { return c > 0; });
}

} // namespace

int RunTextDetect(Arguments const& arguments)
{
    std::string const bytes = ReadInput(arguments.At(0));
    int const mark =
        static_cast<int>(GetByteOrderMark(reinterpret_cast<u8 const*>(bytes.data()), static_cast<i64>(bytes.size())));
    bool const isUtf8 = bytes.find('\0') == std::string::npos && GetWellFormedLength(bytes) == bytes.size();
    std::string guess;
    if (mark == 0 && !bytes.empty()) {
        std::unique_ptr<char[]> copy(new char[bytes.size()]);
        std::memcpy(copy.get(), bytes.data(), bytes.size());
        guess = ToStd(IcuCharsetDetect(std::move(copy), static_cast<i64>(bytes.size())));
    }
    // Text that is well-formed UTF-8 beyond ASCII is hardly ever anything else.
    std::string const encoding = mark != 0 ? c_byMark[mark] : isUtf8 ? IsAscii(bytes) ? "US-ASCII" : "UTF-8" : guess;
    char const* const how = mark != 0 ? "mark" : isUtf8 ? "form" : guess.empty() ? "none" : "guess";
    if (arguments.Has(Option::Json))
        PrintJson({{"encoding", encoding.empty() ? Json() : Json(encoding)},
                   {"by", how},
                   {"mark", mark},
                   {"validUtf8", isUtf8},
                   {"guess", guess.empty() ? Json() : Json(guess)}});
    else
        Print(encoding.empty() ? "unknown\n" : encoding + ", by its " + (how[0] == 'g' ? "statistics" : how) + "\n");
    return ExitDone;
}

} // namespace KernelTool

// Conversion and validation of text in two styles, against ICU. Rounds are short and many, so that the best of them
// falls between the turns of other programs.

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "support/Table.h"

#include <random>
#include <unicode/ustring.h>

using namespace Kernel;

namespace {

constexpr size_t c_textSize = 1000000;
constexpr int c_rounds = 400;

String8 MakeText(bool ascii)
{
    std::mt19937 random(2);
    char const* const words[] = {"plain words ", "\xCE\xBB\xCF\x8C\xCE\xB3\xCE\xBF\xCF\x82 ", "caf\xC3\xA9 ",
                                 "\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E ", "\xF0\x9F\x98\x80 "};
    std::string text;
    while (text.size() < c_textSize) {
        char const* const word = words[ascii ? 0 : random() % 5];
        for (u32 count = random() % 40; count > 0; --count) text += word;
    }
    return String8(text.c_str());
}

void Conversion(char const* style, String8 const& text)
{
    Bench::Table table(style);
    String16 const wide = ConvertedTo<TEncUtf16>(text);
    std::vector<UChar> units(static_cast<size_t>(text.GetLength()) + 1);
    std::vector<char> bytes(static_cast<size_t>(wide.GetLength()) * 3 + 1);
    UErrorCode error = U_ZERO_ERROR;
    auto const ms = [](auto&& work) { return 1e3 * Bench::BestSeconds(c_rounds, work); };
    double const widening = ms([&] {
        u_strFromUTF8(units.data(), static_cast<int>(units.size()), nullptr, text.GetData(), text.GetLength(), &error);
    });
    table.Row("UTF-8 to UTF-16", "ICU, into warm memory", widening, "ms");
    String16 target16;
    table.Row("UTF-8 to UTF-16", "libkernel", ms([&] {
                  target16.SetLength(0);
                  ConvertEnc<TEncUtf16, TEncUtf8>(target16, text.GetData(), text.GetLength());
              }),
              "ms", widening, "<= 0.85 x ICU");
    double const narrowing = ms([&] {
        u_strToUTF8(bytes.data(), static_cast<int>(bytes.size()), nullptr, wide.GetData(), wide.GetLength(), &error);
    });
    table.Row("UTF-16 to UTF-8", "ICU, into warm memory", narrowing, "ms");
    String8 target8;
    table.Row("UTF-16 to UTF-8", "libkernel", ms([&] {
                  target8.SetLength(0);
                  ConvertEnc<TEncUtf8, TEncUtf16>(target8, wide.GetData(), wide.GetLength());
              }),
              "ms", narrowing, "<= 0.85 x ICU");
    table.Row("validate UTF-8", "libkernel",
              ms([&] { Bench::Keep(CharTraits<TEncUtf8>::IsValid(text.GetData(), text.GetLength(), false)); }), "ms");
}

} // namespace

int main()
{
    Conversion("1 MB, mixed scripts", MakeText(false));
    Conversion("1 MB, ASCII", MakeText(true));
}

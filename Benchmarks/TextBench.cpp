// Numbers to text, messages, and conversion and validation of text in two styles, against the C and C++ libraries and
// ICU. Each number's text is one string made and destroyed. Rounds are short and many, so that the best of them falls
// between the turns of other programs.

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/Format.h"
#include "support/Table.h"

#include <charconv>
#include <random>
#include <unicode/ustring.h>

using namespace Kernel;

namespace {

constexpr int c_count = 2000;
constexpr size_t c_textSize = 1000000;
constexpr int c_rounds = 400;

std::vector<i64> MakeNumbers()
{
    std::mt19937_64 random(1);
    std::vector<i64> numbers(c_count);
    for (i64& n : numbers) n = static_cast<i64>(random() >> (random() % 60 + 1)) * (random() % 2 ? 1 : -1);
    return numbers;
}

std::string GroupedByHand(i64 value)
{
    char digits[32];
    char const* const end = std::to_chars(digits, digits + sizeof digits, value).ptr;
    char const* p = digits;
    std::string text;
    text.reserve(32);
    if (*p == '-') text += *p++;
    for (; p < end; ++p) {
        text += *p;
        if (end - p > 1 && (end - p) % 3 == 1) text += ',';
    }
    return text;
}

void Numbers()
{
    Bench::Table table("Numbers and messages");
    std::vector<i64> const numbers = MakeNumbers();
    auto const each = [&](auto&& work) {
        return 1e9 / c_count * Bench::BestSeconds(c_rounds, [&] {
                   for (i64 n : numbers) work(n);
               });
    };
    double const peer = each([](i64 n) { Bench::Keep(GroupedByHand(n)); });
    table.Row("integers grouped", "to_chars, grouped by hand", peer, "ns");
    table.Row("integers grouped", "libkernel", each([](i64 n) { Bench::Keep(ToStringNumber(n)); }), "ns", peer,
              "<= 0.85 x to_chars");
    double const plain = each([](i64 n) { Bench::Keep(std::to_string(n)); });
    table.Row("integers", "std::to_string", plain, "ns");
    table.Row("integers", "libkernel", each([](i64 n) { Bench::Keep(ToString(n)); }), "ns", plain);
    double const message = each([](i64 n) {
        char text[64];
        char* p = std::to_chars(text, text + 24, n).ptr;
        std::memcpy(p, " of ", 4);
        p = std::to_chars(p + 4, text + sizeof text, n / 2).ptr;
        Bench::Keep(std::string(text, p));
    });
    table.Row("\"%1 of %2\"", "to_chars into one buffer", message, "ns");
    double const printed = each([](i64 n) {
        char text[64];
        int const length = std::snprintf(text, sizeof text, "%ld of %ld", n, n / 2);
        Bench::Keep(std::string(text, static_cast<size_t>(length)));
    });
    table.Row("\"%1 of %2\"", "snprintf", printed, "ns", message);
    table.Row("\"%1 of %2\"", "libkernel", each([](i64 n) { Bench::Keep(Format("%1 of %2", n, n / 2)); }), "ns",
              message, "<= 1.0 x a fast formatter");
}

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
    Numbers();
    Conversion("1 MB, mixed scripts", MakeText(false));
    Conversion("1 MB, ASCII", MakeText(true));
}

// Conversion between UTF-8 and UTF-16, validation, and search without case in 10 MB, for text of mixed scripts and for
// ASCII, against ICU, Qt and GLib where those are installed. Peers that give new memory are set beside a new string of
// ours, those that write into memory they are given beside a string that keeps its block. Every find looks at the whole
// text: the word is not in it.

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "support/Table.h"

#include <cstring>
#include <random>
#include <unicode/ucasemap.h>
#include <unicode/ustring.h>
#ifdef KERNEL_HAVE_QT
#include <QByteArray>
#include <QString>
#endif
#ifdef KERNEL_HAVE_GLIB
#include <glib.h>
#endif

using namespace Kernel;

namespace {

using Utf8 = CharTraits<TEncUtf8>;

constexpr size_t c_textSize = 10'000'000;
constexpr int c_rounds = 30;

char const* const c_words[] = {"harbour", "Morning", "the",    "sails", "of",      "Ships",   "and", "wind",
                               "plain",   "letters", "stream", "in",    "Reports", "quietly", "a",   "to",
                               "rock",    "north",   "Stone",  "light", "over",    "is",      "was", "market"};
char const* const c_farWords[] = {"λόγος",   "Θάλασσα", "και",        "море",   "Корабль", "ветер", "и",
                                  "日本語",  "港",      "風の音",     "café",   "naïve",   "Über",  "Größe",
                                  "Čeština", "żagiel",  "\U0001F600", "한국어", "שלום",    "سفينة"};

String8 MakeText(bool ascii)
{
    std::mt19937 random(2);
    std::string text;
    text.reserve(c_textSize + 64);
    while (text.size() < c_textSize) {
        // Runs of words in one manner of writing.
        bool const isFar = !ascii && random() % 2;
        for (u32 count = random() % 20 + 1; count > 0; --count) {
            text += isFar ? c_farWords[random() % std::size(c_farWords)] : c_words[random() % std::size(c_words)];
            text += ' ';
        }
    }
    return String8(text);
}

double Ms(auto&& work)
{
    return 1e3 * Bench::BestSeconds(c_rounds, work);
}

void Convert(Bench::Table& table, String8 const& text, String16 const& wide)
{
    UErrorCode error = U_ZERO_ERROR;
    std::vector<UChar> units(static_cast<size_t>(text.GetLength()) + 1);
    std::vector<char> bytes(static_cast<size_t>(wide.GetLength()) * 3 + 1);
    double const widening = Ms([&] {
        u_strFromUTF8(units.data(), static_cast<int>(units.size()), nullptr, text.GetData(), text.GetLength(), &error);
    });
    table.Row("UTF-8 to UTF-16", "ICU, given memory", widening, "ms");
    String16 target16;
    table.Row("UTF-8 to UTF-16", "libkernel, given memory", Ms([&] {
                  target16.SetLength(0);
                  ConvertEnc<TEncUtf16, TEncUtf8>(target16, text.GetData(), text.GetLength());
              }),
              "ms", widening, "<= 0.85 x ICU");
    double const wideningNew = Ms([&] { Bench::Keep(ConvertedTo<TEncUtf16>(text).GetLength()); });
#ifdef KERNEL_HAVE_QT
    double const qtWidening = Ms([&] { Bench::Keep(QString::fromUtf8(text.GetData(), text.GetLength()).size()); });
    table.Row("UTF-8 to UTF-16", "Qt, new string", qtWidening, "ms");
    table.Row("UTF-8 to UTF-16", "libkernel, new string", wideningNew, "ms", qtWidening, "<= 0.85 x Qt");
#else
    table.Row("UTF-8 to UTF-16", "libkernel, new string", wideningNew, "ms");
#endif

    double const narrowing = Ms([&] {
        u_strToUTF8(bytes.data(), static_cast<int>(bytes.size()), nullptr, wide.GetData(), wide.GetLength(), &error);
    });
    table.Row("UTF-16 to UTF-8", "ICU, given memory", narrowing, "ms");
    String8 target8;
    table.Row("UTF-16 to UTF-8", "libkernel, given memory", Ms([&] {
                  target8.SetLength(0);
                  ConvertEnc<TEncUtf8, TEncUtf16>(target8, wide.GetData(), wide.GetLength());
              }),
              "ms", narrowing, "<= 0.85 x ICU");
    double const narrowingNew = Ms([&] { Bench::Keep(ConvertedTo<TEncUtf8>(wide).GetLength()); });
#ifdef KERNEL_HAVE_QT
    QString const qtText = QString::fromUtf8(text.GetData(), text.GetLength());
    double const qtNarrowing = Ms([&] { Bench::Keep(qtText.toUtf8().size()); });
    table.Row("UTF-16 to UTF-8", "Qt, new string", qtNarrowing, "ms");
    table.Row("UTF-16 to UTF-8", "libkernel, new string", narrowingNew, "ms", qtNarrowing, "<= 0.85 x Qt");
#else
    table.Row("UTF-16 to UTF-8", "libkernel, new string", narrowingNew, "ms");
#endif
}

void Validate(Bench::Table& table, String8 const& text)
{
    double peer = 0.0;
#ifdef KERNEL_HAVE_GLIB
    peer = Ms([&] { Bench::Keep(g_utf8_validate(text.GetData(), text.GetLength(), nullptr)); });
    table.Row("validate UTF-8", "GLib", peer, "ms");
#endif
    table.Row("validate UTF-8", "libkernel",
              Ms([&] { Bench::Keep(Utf8::IsValid(text.GetData(), text.GetLength(), false)); }), "ms", peer,
              "<= 0.25 x GLib");
}

void Find(Bench::Table& table, String8 const& text, char const* word)
{
    String8 const needle(word);
    std::string const workload = "find \"" + std::string(word) + "\" without case";
    char const* const name = workload.c_str();
    UErrorCode error = U_ZERO_ERROR;
    UCaseMap* const map = ucasemap_open("", U_FOLD_CASE_DEFAULT, &error);
    std::vector<char> folded(c_textSize * 2);
    char foldedNeedle[64];
    i32 const needleLength = ucasemap_utf8FoldCase(map, foldedNeedle, 64, needle.GetData(), needle.GetLength(), &error);
    table.Row(name, "ICU, fold and search", Ms([&] {
                  i32 const n = ucasemap_utf8FoldCase(map, folded.data(), static_cast<i32>(folded.size()),
                                                      text.GetData(), text.GetLength(), &error);
                  Bench::Keep(
                      memmem(folded.data(), static_cast<size_t>(n), foldedNeedle, static_cast<size_t>(needleLength)));
              }),
              "ms");
    ucasemap_close(map);
#ifdef KERNEL_HAVE_GLIB
    table.Row(name, "GLib, fold and search",
              Bench::BestSeconds(3,
                                 [&] {
                                     char* const all = g_utf8_casefold(text.GetData(), text.GetLength());
                                     char* const wanted = g_utf8_casefold(word, -1);
                                     Bench::Keep(std::strstr(all, wanted));
                                     g_free(all);
                                     g_free(wanted);
                                 }) *
                  1e3,
              "ms");
#endif
    double peer = 0.0;
#ifdef KERNEL_HAVE_QT
    QString const qtText = QString::fromUtf8(text.GetData(), text.GetLength());
    QString const qtWord = QString::fromUtf8(word);
    peer = Ms([&] { Bench::Keep(qtText.indexOf(qtWord, 0, Qt::CaseInsensitive)); });
    table.Row(name, "Qt", peer, "ms");
#endif
    table.Row(name, "libkernel", Ms([&] {
                  Bench::Keep(
                      Utf8::FindNoCase(text.GetData(), text.GetLength(), needle.GetData(), needle.GetLength(), 0));
              }),
              "ms", peer, "<= 0.7 x Qt");
}

void All(char const* title, String8 const& text, std::initializer_list<char const*> words)
{
    Bench::Table table(title);
    Convert(table, text, ConvertedTo<TEncUtf16>(text));
    Validate(table, text);
    for (char const* word : words) Find(table, text, word);
}

} // namespace

int main()
{
    All("10 MB, mixed scripts", MakeText(false), {"STRASSE", "Кораблик", "harvest"});
    All("10 MB, ASCII", MakeText(true), {"STRASSE", "harvest", "ink"});
}

// Conversion between UTF-8 and UTF-16, validation, and search without case in 10 MB, for text of mixed scripts and for
// ASCII, against ICU, and Qt and GLib where those are installed. Every find looks at the whole text: the word is not in
// it.

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
constexpr int c_rounds = 20;

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

struct Times
{
    double peer;
    double own;
};

// Milliseconds of each, the best of many rounds taken in turns, so that both meet the same disturbances.
Times InTurns(auto&& peer, auto&& own)
{
    Times best{1e300, 1e300};
    for (int i = 0; i < c_rounds; ++i) {
        best.peer = std::min(best.peer, 1e3 * Bench::BestSeconds(1, peer));
        best.own = std::min(best.own, 1e3 * Bench::BestSeconds(1, own));
    }
    return best;
}

class Duels
{
public:
    explicit Duels(char const* title) : m_table(title) {}

    void Add(char const* workload, char const* peer, char const* goal, auto&& peerWork, auto&& ownWork)
    {
        Times const times = InTurns(peerWork, ownWork);
        m_table.Row(workload, peer, times.peer, "ms");
        m_table.Row(workload, "libkernel", times.own, "ms", times.peer, goal);
    }

private:
    Bench::Table m_table;
};

void Convert(Duels& duels, String8 const& text, String16 const& wide)
{
    UErrorCode error = U_ZERO_ERROR;
    std::vector<UChar> units(static_cast<size_t>(text.GetLength()) + 1);
    std::vector<char> bytes(static_cast<size_t>(wide.GetLength()) * 3 + 1);
    String16 target16;
    duels.Add(
        "UTF-8 to UTF-16, given memory", "ICU", "<= 0.85 x ICU",
        [&] {
            u_strFromUTF8(units.data(), static_cast<int>(units.size()), nullptr, text.GetData(), text.GetLength(),
                          &error);
        },
        [&] {
            target16.SetLength(0);
            ConvertEnc<TEncUtf16, TEncUtf8>(target16, text.GetData(), text.GetLength());
        });
    String8 target8;
    duels.Add(
        "UTF-16 to UTF-8, given memory", "ICU", "<= 0.85 x ICU",
        [&] {
            u_strToUTF8(bytes.data(), static_cast<int>(bytes.size()), nullptr, wide.GetData(), wide.GetLength(),
                        &error);
        },
        [&] {
            target8.SetLength(0);
            ConvertEnc<TEncUtf8, TEncUtf16>(target8, wide.GetData(), wide.GetLength());
        });
#ifdef KERNEL_HAVE_QT
    QString const qtText = QString::fromUtf8(text.GetData(), text.GetLength());
    duels.Add(
        "UTF-8 to UTF-16, new string", "Qt", "<= 0.85 x Qt",
        [&] { Bench::Keep(QString::fromUtf8(text.GetData(), text.GetLength()).size()); },
        [&] { Bench::Keep(ConvertedTo<TEncUtf16>(text).GetLength()); });
    duels.Add(
        "UTF-16 to UTF-8, new string", "Qt", "<= 0.85 x Qt", [&] { Bench::Keep(qtText.toUtf8().size()); },
        [&] { Bench::Keep(ConvertedTo<TEncUtf8>(wide).GetLength()); });
#endif
}

void Validate([[maybe_unused]] Duels& duels, [[maybe_unused]] String8 const& text)
{
#ifdef KERNEL_HAVE_GLIB
    duels.Add(
        "validate UTF-8", "GLib", "<= 0.25 x GLib",
        [&] { Bench::Keep(g_utf8_validate(text.GetData(), text.GetLength(), nullptr)); },
        [&] { Bench::Keep(Utf8::IsValid(text.GetData(), text.GetLength(), false)); });
#endif
}

void Find(Duels& duels, String8 const& text, char const* word)
{
    String8 const needle(word);
    std::string const workload = "find \"" + std::string(word) + "\" without case";
    auto const own = [&] {
        Bench::Keep(Utf8::FindNoCase(text.GetData(), text.GetLength(), needle.GetData(), needle.GetLength(), 0));
    };
    UErrorCode error = U_ZERO_ERROR;
    UCaseMap* const map = ucasemap_open("", U_FOLD_CASE_DEFAULT, &error);
    std::vector<char> folded(c_textSize * 2);
    char foldedNeedle[64];
    i32 const needleLength = ucasemap_utf8FoldCase(map, foldedNeedle, 64, needle.GetData(), needle.GetLength(), &error);
    duels.Add(
        workload.c_str(), "ICU, fold and search", "",
        [&] {
            i32 const n = ucasemap_utf8FoldCase(map, folded.data(), static_cast<i32>(folded.size()), text.GetData(),
                                                text.GetLength(), &error);
            Bench::Keep(memmem(folded.data(), static_cast<size_t>(n), foldedNeedle, static_cast<size_t>(needleLength)));
        },
        own);
    ucasemap_close(map);
#ifdef KERNEL_HAVE_QT
    QString const qtText = QString::fromUtf8(text.GetData(), text.GetLength());
    QString const qtWord = QString::fromUtf8(word);
    duels.Add(
        workload.c_str(), "Qt", "<= 0.7 x Qt", [&] { Bench::Keep(qtText.indexOf(qtWord, 0, Qt::CaseInsensitive)); },
        own);
#endif
}

void All(char const* title, String8 const& text, std::initializer_list<char const*> words)
{
    Duels duels(title);
    Convert(duels, text, ConvertedTo<TEncUtf16>(text));
    Validate(duels, text);
    for (char const* word : words) Find(duels, text, word);
}

} // namespace

int main()
{
    All("10 MB, mixed scripts", MakeText(false), {"STRASSE", "Кораблик", "harvest"});
    All("10 MB, ASCII", MakeText(true), {"STRASSE", "harvest", "ink"});
}

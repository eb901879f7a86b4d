#include "libkernel/text/Collator.h"
#include "libkernel/text/Locale.h"
#include "support/Table.h"

#include <cstring>
#include <random>
#include <unicode/ucol.h>
#include <unicode/uiter.h>

// Sorting 100,000 words as a language sorts them: the collator, the bare comparison of ICU that it stands on, and sort
// keys, which are made once for each word and then compared byte by byte.

using namespace Kernel;

namespace {

constexpr int c_words = 100000;
constexpr int c_rounds = 3;

/// Words of 3 to 14 letters, one in eight with a letter beyond ASCII, one in four with digits behind it.
std::vector<String8> MakeWords()
{
    char const* const syllables[] = {"ba", "ke", "lo", "Mi", "nu", "ras", "tel", "vor", "ship", "sand", "ing", "er"};
    char const* const accented[] = {"\xC3\xB6", "\xC3\xA9", "\xC3\x9F", "\xC5\x81"};
    std::mt19937 random(42);
    std::vector<String8> words;
    for (int i = 0; i < c_words; ++i) {
        std::string word;
        for (u32 n = 1 + random() % 4; n > 0; --n) word += syllables[random() % std::size(syllables)];
        if (random() % 8 == 0) word += accented[random() % std::size(accented)];
        if (random() % 4 == 0) word += std::to_string(random() % 1000);
        words.emplace_back(std::string_view(word));
    }
    return words;
}

struct Keyed
{
    std::string key;
    String8 word;
};

std::vector<Keyed> MakeKeys(UCollator* collator, std::vector<String8> const& words)
{
    std::vector<Keyed> result;
    result.reserve(words.size());
    for (String8 const& word : words) {
        UCharIterator text;
        uiter_setUTF8(&text, word.GetData(), word.GetLength());
        u32 state[2] = {};
        u8 key[256];
        UErrorCode status = U_ZERO_ERROR;
        int const length = ucol_nextSortKeyPart(collator, &text, state, key, sizeof key, &status);
        result.push_back({std::string(reinterpret_cast<char const*>(key), static_cast<size_t>(length)), word});
    }
    return result;
}

} // namespace

int main()
{
    std::vector<String8> const words = MakeWords();
    Bench::Table table("Sorting 100,000 words");
    for (char const* locale : {"en-GB", "sv-SE"}) {
        auto const collator = MakeCounted<Collator>(Locale::Create(locale), true, true);
        UErrorCode status = U_ZERO_ERROR;
        UCollator* const bare = ucol_open(locale, &status);
        ucol_setAttribute(bare, UCOL_NUMERIC_COLLATION, UCOL_ON, &status);

        double const bareTime = Bench::BestSeconds(c_rounds, [&] {
            std::vector<String8> list = words;
            std::stable_sort(list.begin(), list.end(), [&](String8 const& a, String8 const& b) {
                UErrorCode ignored = U_ZERO_ERROR;
                return ucol_strcollUTF8(bare, a.GetData(), a.GetLength(), b.GetData(), b.GetLength(), &ignored) < 0;
            });
            Bench::Keep(list);
        });
        double const ours = Bench::BestSeconds(c_rounds, [&] {
            std::vector<String8> list = words;
            std::stable_sort(list.begin(), list.end(),
                             [&](String8 const& a, String8 const& b) { return collator->Collate(a, b) < 0; });
            Bench::Keep(list);
        });
        double const keys = Bench::BestSeconds(c_rounds, [&] {
            std::vector<Keyed> list = MakeKeys(bare, words);
            std::stable_sort(list.begin(), list.end(), [](Keyed const& a, Keyed const& b) { return a.key < b.key; });
            Bench::Keep(list);
        });
        table.Row(locale, "Collator", ours * 1e3, "ms", bareTime * 1e3, "<= 1.05 x the bare comparison");
        table.Row(locale, "ucol_strcollUTF8", bareTime * 1e3, "ms");
        table.Row(locale, "sort keys", keys * 1e3, "ms", bareTime * 1e3);
        ucol_close(bare);
    }
}

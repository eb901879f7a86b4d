#include "libkernel/text/LanguageId.h"

#include "libkernel/text/internal/LanguageIdTable.h"

#include <algorithm>
#include <string_view>

namespace Kernel {

namespace {

struct DefaultCountry
{
    char language[3];
    char country[3];
};

constexpr DefaultCountry c_defaultCountries[] = {
    {"ca", "ES"}, {"cs", "CZ"}, {"da", "DK"}, {"de", "DE"}, {"el", "GR"}, {"en", "US"}, {"es", "ES"}, {"fi", "FI"},
    {"fr", "FR"}, {"he", "IL"}, {"hi", "IN"}, {"hr", "HR"}, {"hu", "HU"}, {"id", "ID"}, {"it", "IT"}, {"ja", "JP"},
    {"ko", "KR"}, {"ms", "MY"}, {"nb", "NO"}, {"nl", "NL"}, {"pl", "PL"}, {"ro", "RO"}, {"ru", "RU"}, {"sk", "SK"},
    {"sv", "SE"}, {"th", "TH"}, {"tr", "TR"}, {"uk", "UA"}, {"vi", "VN"},
};
constexpr auto c_languageOf = [](DefaultCountry const& row) { return std::string_view(row.language, 2); };
static_assert(std::size(c_defaultCountries) == 29);
static_assert(std::ranges::is_sorted(c_defaultCountries, {}, c_languageOf));

// Empty for a language that has none.
std::string_view FindDefaultCountry(std::string_view language)
{
    auto const* const row = std::ranges::lower_bound(c_defaultCountries, language, {}, c_languageOf);
    return row != std::end(c_defaultCountries) && c_languageOf(*row) == language ? row->country : std::string_view();
}

constexpr int c_noLinguisticContent = 255;

} // namespace

LanguageIdMatch GetLanguageIdMatch(String8 const& first, String8 const& second)
{
    std::string_view const wanted = first.GetView(), offered = second.GetView();
    if (wanted.size() >= 2 && offered.size() > 2) {
        if (wanted.substr(0, 2) != offered.substr(0, 2)) return LanguageIdMatch::None;
        if (offered.size() == 5 && (wanted.size() == 5 || wanted.size() == 2)) {
            std::string_view const country = wanted.size() == 5 ? wanted.substr(3) : FindDefaultCountry(wanted);
            return offered.substr(3) == country ? LanguageIdMatch::Exact : LanguageIdMatch::Language;
        }
    }
    return wanted == offered ? LanguageIdMatch::Exact : LanguageIdMatch::None;
}

String8 GetDefaultLanguageCountry(String8 const& language)
{
    std::string_view const country = FindDefaultCountry(language.GetView());
    return country.empty() ? language : language + "-" + String8(country);
}

String8 GetLanguageIdFromLcid(int lcid)
{
    if (lcid == c_noLinguisticContent) return "zxx";
    std::span<LanguageIdRow const> const table = GetLanguageIdTable();
    auto const row = std::ranges::lower_bound(table, lcid, {}, &LanguageIdRow::lcid);
    return row != table.end() && row->lcid == lcid ? String8(row->tag) : String8();
}

} // namespace Kernel

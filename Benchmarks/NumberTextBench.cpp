// Numbers to text and messages, against the peers that are installed. Each text is one string made and destroyed.

#include "libkernel/core/Format.h"
#include "support/Table.h"

#include <charconv>
#include <cmath>
#include <cstring>
#include <functional>
#include <locale>
#include <random>

#ifdef KERNEL_HAVE_FMT
#include <fmt/format.h>
#endif
#ifdef KERNEL_HAVE_ABSL
#include <absl/strings/str_cat.h>
#include <absl/strings/str_format.h>
#include <absl/strings/substitute.h>
#endif
#ifdef KERNEL_HAVE_DOUBLE_CONVERSION
#include <double-conversion/double-conversion.h>
#endif
#ifdef KERNEL_HAVE_QT
#include <QLocale>
#include <QString>
#endif
#ifdef KERNEL_HAVE_GLIB
#include <glib.h>
#endif

using namespace Kernel;

namespace {

constexpr int c_count = 2000;

// Subjects that do the same work for each of some values. They are measured in turn, again and again, so that a machine
// that is slow for a while is slow for all of them.
template <class T>
class Race
{
public:
    explicit Race(std::vector<T> const& values) : m_values(values) {}

    template <class Work>
    void Add(char const* subject, Work work)
    {
        m_subjects.push_back({subject, [this, work] {
                                  for (T const value : m_values) work(value);
                              }});
    }

    void Run()
    {
        for (int turn = 0; turn < 60; ++turn)
            for (Subject& s : m_subjects) s.best = std::min(s.best, 1e9 / c_count * Bench::BestSeconds(10, s.work));
    }

    // A row for each, and then the library's against each peer that has a goal and is part of this run.
    void Print(char const* workload, std::vector<std::pair<char const*, char const*>> const& goals)
    {
        Bench::Table table(workload);
        for (Subject const& s : m_subjects) table.Row(workload, s.name, s.best, "ns");
        for (auto const& [peer, goal] : goals)
            for (Subject const& s : m_subjects)
                if (s.name == std::string_view(peer)) table.Row(workload, c_own, Own(), "ns", s.best, goal);
    }

    char const* BestPeer() const
    {
        Subject const* best = nullptr;
        for (Subject const& s : m_subjects)
            if (s.name != c_own && (!best || s.best < best->best)) best = &s;
        return best->name;
    }

    static constexpr char const* c_own = "libkernel";

private:
    struct Subject
    {
        char const* name;
        std::function<void()> work;
        double best = 1e300;
    };

    double Own() const
    {
        for (Subject const& s : m_subjects)
            if (s.name == c_own) return s.best;
        return 0.0;
    }

    std::vector<T> const& m_values;
    std::vector<Subject> m_subjects;
};

std::vector<i64> MakeIntegers()
{
    std::mt19937_64 random(1);
    std::vector<i64> numbers(c_count);
    for (i64& n : numbers) n = static_cast<i64>(random() >> (random() % 60 + 1)) * (random() % 2 ? 1 : -1);
    return numbers;
}

// Measures of a drawing: some with few decimals, some with all that a double has.
std::vector<double> MakeDoubles()
{
    std::mt19937_64 random(2);
    std::vector<double> numbers(c_count);
    for (double& n : numbers) {
        double const decimal = static_cast<double>(random() % 100'000'000) / std::pow(10.0, random() % 8);
        n = (random() % 2 ? decimal : decimal / 3.0) * (random() % 2 ? 1 : -1);
    }
    return numbers;
}

std::string Grouped(char const* p, char const* end)
{
    std::string text;
    text.reserve(32);
    if (*p == '-') text += *p++;
    for (; p < end; ++p) {
        text += *p;
        if (end - p > 1 && (end - p) % 3 == 1) text += ',';
    }
    return text;
}

std::string WithoutZeros(char const* begin, char const* end)
{
    while (end[-1] == '0') --end;
    if (end[-1] == '.') --end;
    return std::string(begin, end);
}

class Groups : public std::numpunct<char>
{
    char do_thousands_sep() const override { return ','; }
    std::string do_grouping() const override { return "\3"; }
};

void GroupedIntegers(std::vector<i64> const& numbers)
{
    Race<i64> race(numbers);
    race.Add("to_chars, grouped by hand", [](i64 n) {
        char digits[32];
        Bench::Keep(Grouped(digits, std::to_chars(digits, digits + sizeof digits, n).ptr));
    });
    race.Add("snprintf, grouped by hand", [](i64 n) {
        char digits[32];
        Bench::Keep(Grouped(digits, digits + std::snprintf(digits, sizeof digits, "%ld", n)));
    });
#ifdef KERNEL_HAVE_FMT
    std::locale const locale(std::locale::classic(), new Groups);
    race.Add("fmt, own locale", [&](i64 n) { Bench::Keep(fmt::format(locale, "{:L}", n)); });
#endif
#ifdef KERNEL_HAVE_QT
    QLocale const english(QLocale::English);
    race.Add("QLocale", [&](i64 n) { Bench::Keep(english.toString(qlonglong{n})); });
#endif
    race.Add(race.c_own, [](i64 n) { Bench::Keep(ToStringNumber(n)); });
    race.Run();
    race.Print("integers grouped by three", {{"to_chars, grouped by hand", "<= 0.85 x to_chars"}});
}

void Doubles(std::vector<double> const& numbers)
{
    Race<double> race(numbers);
    race.Add("to_chars", [](double n) {
        char text[400];
        Bench::Keep(WithoutZeros(text, std::to_chars(text, text + sizeof text, n, std::chars_format::fixed, 6).ptr));
    });
    race.Add("snprintf", [](double n) {
        char text[400];
        Bench::Keep(WithoutZeros(text, text + std::snprintf(text, sizeof text, "%.6f", n)));
    });
#ifdef KERNEL_HAVE_FMT
    race.Add("fmt", [](double n) {
        char text[400];
        Bench::Keep(WithoutZeros(text, fmt::format_to(text, "{:.6f}", n)));
    });
#endif
#ifdef KERNEL_HAVE_DOUBLE_CONVERSION
    race.Add("double-conversion", [](double n) {
        char text[400];
        double_conversion::StringBuilder builder(text, sizeof text);
        double_conversion::DoubleToStringConverter::EcmaScriptConverter().ToFixed(n, 6, &builder);
        int const length = builder.position();
        builder.Finalize();
        Bench::Keep(WithoutZeros(text, text + length));
    });
#endif
#ifdef KERNEL_HAVE_ABSL
    race.Add("absl", [](double n) {
        char text[400];
        Bench::Keep(WithoutZeros(text, text + absl::SNPrintF(text, sizeof text, "%.6f", n)));
    });
#endif
#ifdef KERNEL_HAVE_QT
    race.Add("QString::number, zeros kept", [](double n) { Bench::Keep(QString::number(n, 'f', 6)); });
#endif
    race.Add(race.c_own, [](double n) { Bench::Keep(ToString(n, 6, 0, SignStyle::None, TruncateStyle::StripZeros)); });
    race.Run();
    race.Print("doubles, 6 decimals, zeros cut", {{race.BestPeer(), "<= 0.70 x the best peer"}});
}

void Messages(std::vector<i64> const& numbers)
{
    Race<i64> race(numbers);
    race.Add("to_chars into one buffer", [](i64 n) {
        char text[64];
        char* p = std::to_chars(text, text + 24, n).ptr;
        std::memcpy(p, " of ", 4);
        p = std::to_chars(p + 4, text + sizeof text, n / 2).ptr;
        Bench::Keep(std::string(text, p));
    });
    race.Add("snprintf", [](i64 n) {
        char text[64];
        int const length = std::snprintf(text, sizeof text, "%ld of %ld", n, n / 2);
        Bench::Keep(std::string(text, static_cast<size_t>(length)));
    });
#ifdef KERNEL_HAVE_FMT
    race.Add("fmt", [](i64 n) { Bench::Keep(fmt::format("{} of {}", n, n / 2)); });
#endif
#ifdef KERNEL_HAVE_ABSL
    race.Add("absl::StrCat, no format", [](i64 n) { Bench::Keep(absl::StrCat(n, " of ", n / 2)); });
    race.Add("absl::Substitute", [](i64 n) { Bench::Keep(absl::Substitute("$0 of $1", n, n / 2)); });
#endif
#ifdef KERNEL_HAVE_QT
    QString const arrangement = QStringLiteral("%1 of %2");
    race.Add("QString::arg", [&](i64 n) { Bench::Keep(arrangement.arg(qlonglong{n}).arg(qlonglong{n / 2})); });
#endif
#ifdef KERNEL_HAVE_GLIB
    race.Add("g_strdup_printf", [](i64 n) {
        char* const text = g_strdup_printf("%ld of %ld", n, n / 2);
        Bench::Keep(text);
        g_free(text);
    });
#endif
    race.Add(race.c_own, [](i64 n) { Bench::Keep(Format("%1 of %2", n, n / 2)); });
    race.Run();
    race.Print("\"%1 of %2\" with two integers", {{"absl::Substitute", "<= 1.00 x absl"}, {"fmt", "<= 0.65 x fmt"}});
}

} // namespace

int main()
{
    std::vector<i64> const integers = MakeIntegers();
    GroupedIntegers(integers);
    Doubles(MakeDoubles());
    Messages(integers);
}

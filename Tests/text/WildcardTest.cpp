#include "libkernel/core/CharTraits.h"
#include "libkernel/core/Utf8Sequence.h"
#include "libkernel/text/WildcardDictionary.h"
#include "libkernel/text/WildcardSequence.h"
#include "libkernel/text/WildcardWriter.h"
#include "serialisation/WriterTestSupport.h"

#include <algorithm>
#include <atomic>
#include <gtest/gtest.h>
#include <random>
#include <string>
#include <thread>

namespace Kernel::Test {
namespace {

Counted<BuiltinWildcard const> Known(char const* token, char const* label = "label")
{
    return MakeCounted<BuiltinWildcard>(IDTag("Wild"), token, LocalisedString::CreateFakeFromString(label),
                                        LocalisedString::CreateFakeFromString("about it"));
}

/// An application's dictionary of "page" and "date", and a document's on it of "author" and a "date" of its own.
class WildcardTest : public testing::Test
{
protected:
    WildcardTest()
    {
        auto const parent = MakeCounted<WildcardDictionary>();
        for (auto const& wildcard : {page, date}) parent->AddWildcard(wildcard);
        auto const child = MakeCounted<WildcardDictionary>(Counted<WildcardDictionary const>(parent));
        for (auto const& wildcard : {author, ownDate, secondAuthor, none}) child->AddWildcard(wildcard);
        dictionary = child;
    }

    Counted<BuiltinWildcard const> const page = Known("page"), date = Known("date"), author = Known("author"),
                                         ownDate = Known("date"), secondAuthor = Known("author"), none;
    Counted<WildcardDictionary const> dictionary;
};

/// Items as one text: [token] for the dictionary's, <token> for the user's, 'text' for a literal.
std::string Shown(WildcardSequence const& sequence)
{
    std::string result;
    for (auto const& item : sequence.GetItems()) {
        if (!item.wildcard)
            result += "'" + std::string(item.literal.GetView()) + "'";
        else if (CountedCast<UserWildcard const>(item.wildcard))
            result += "<" + std::string(item.wildcard->GetToken().GetView()) + ">";
        else
            result += "[" + std::string(item.wildcard->GetToken().GetView()) + "]";
    }
    return result;
}

TEST_F(WildcardTest, TextIsTakenApartAtDelimiters)
{
    struct
    {
        char const* text;
        u32 delimiter;
        char const* items;
        int position, length;
        char const* reformed;
    } const cases[] = {
        {"", '%', "", 0, 0, ""},
        {"plain", '%', "'plain'", 0, 0, "plain"},
        {"a%%b", '%', "'ab'", 0, 0, "ab"},
        {"%%", '%', "", 0, 0, ""},
        {"a%t", '%', "'at'", 2, 1, "at"},
        {"a%", '%', "'a'", 2, 0, "a"},
        {"%", '%', "", 1, 0, ""},
        {"%page%", '%', "[page]", 0, 0, "%page%"},
        {"p. %page% of %pages%.", '%', "'p. '[page]' of '<pages>'.'", 0, 0, "p. %page% of %pages%."},
        {"%author%%page%", '%', "[author][page]", 0, 0, "%author%%page%"},
        {"a%%%page%b%%", '%', "'a'[page]'b'", 0, 0, "a%page%b"},
        {"%Page% %page%%", '%', "<Page>' '[page]", 14, 0, "%Page% %page%"},
        {"a%%b%page%c%rest", '%', "'ab'[page]'crest'", 12, 4, "ab%page%crest"},
        {"a\xE2\x80\xA0page\xE2\x80\xA0\xE2\x80", 0x2020, "'a'[page]'\xE2\x80'", 0, 0,
         "a\xE2\x80\xA0page\xE2\x80\xA0\xE2\x80"},
        {"\xC2\xA7\xC2\xA7\xC2\xA7x", 0xA7, "'x'", 6, 1, "x"},
        {"%page%", 0xA7, "'%page%'", 0, 0, "%page%"},
    };
    for (auto const& c : cases) {
        WildcardSequence::ErrorRec error{7, 7};
        auto const sequence = WildcardSequence::Parse(c.text, dictionary, error, c.delimiter);
        ASSERT_TRUE(sequence) << c.text;
        EXPECT_EQ(Shown(*sequence), c.items) << c.text;
        EXPECT_EQ(error.position, c.position) << c.text;
        EXPECT_EQ(error.length, c.length) << c.text;
        EXPECT_EQ(sequence->Reform(c.delimiter), c.reformed) << c.text;
    }
    EXPECT_EQ(Shown(*WildcardSequence::Parse("%page%", nullptr, '%')), "<page>");
}

TEST_F(WildcardTest, SingleWildcardIsTheWholeText)
{
    struct
    {
        char const* text;
        u32 delimiter;
        char const* token; ///< Null where there is none.
    } const cases[] = {
        {"%page%", '%', "page"},
        {"%x%", '%', "x"},
        {"%a%b%", '%', nullptr},
        {"%%", '%', nullptr},
        {"%", '%', nullptr},
        {"", '%', nullptr},
        {"%page", '%', nullptr},
        {"page%", '%', nullptr},
        {" %page%", '%', nullptr},
        {"%page% ", '%', nullptr},
        {"%%%", '%', nullptr},
        {"\xC2\xA7"
         "date\xC2\xA7",
         0xA7, "date"},
        {"\xC2\xA7\xC2\xA7", 0xA7, nullptr},
        {"\xC2\xA7"
         "d\xC2",
         0xA7, nullptr},
    };
    for (auto const& c : cases) {
        auto const wildcard = Wildcard::ParseSingleWildcard(c.text, dictionary, c.delimiter);
        ASSERT_EQ(static_cast<bool>(wildcard), c.token != nullptr) << c.text;
        if (!wildcard) continue;
        EXPECT_EQ(wildcard->GetToken(), c.token);
        EXPECT_EQ(wildcard->GetWildcard(c.delimiter), c.text);
    }
    EXPECT_TRUE(Wildcard::ParseSingleWildcard("%page%", dictionary, '%') == page);
    auto const user = Wildcard::ParseSingleWildcard("%x%", nullptr, '%');
    EXPECT_EQ(user->GetLabel(), "x");
    EXPECT_EQ(user->GetIDTag(), IDTag());
    EXPECT_EQ(page->GetLabel(), "label");
    EXPECT_EQ(page->GetDescription(), "about it");
}

TEST_F(WildcardTest, DelimiterWithoutAnEncodingGivesNothing)
{
    u32 const bad = 0x80000000;
    for (char const* text : {"", "%page%"}) {
        EXPECT_FALSE(WildcardSequence::Parse(text, dictionary, bad));
        EXPECT_FALSE(Wildcard::ParseSingleWildcard(text, dictionary, bad));
    }
    EXPECT_EQ(WildcardSequence::Create(String8("text"))->Reform(bad), "");
    EXPECT_EQ(page->GetWildcard(bad), "");
}

TEST_F(WildcardTest, ReformLeavesDelimitersOutOfLiterals)
{
    EXPECT_EQ(WildcardSequence::Create(String8("%5%% off%"))->Reform('%'), "5 off");
    EXPECT_EQ(WildcardSequence::Create(String8("%%"))->Reform('%'), "");
    EXPECT_EQ(WildcardSequence::Create(String8("\xC2\xA7"
                                               "1\xC2"))
                  ->Reform(0xA7),
              "1\xC2");
    EXPECT_EQ(WildcardSequence::Reform({{page, ""}, {nullptr, ""}, {nullptr, "%x"}}, '%'), "%page%x");
    EXPECT_TRUE(WildcardSequence::Create(Counted<Wildcard const>())->GetItems().empty());
    EXPECT_EQ(Shown(*WildcardSequence::Create(Counted<Wildcard const>(page))), "[page]");
}

TEST_F(WildcardTest, ChildDictionaryHidesItsParentsEntry)
{
    EXPECT_TRUE(dictionary->Find("page") == page);
    EXPECT_TRUE(dictionary->Find("date") == ownDate);
    EXPECT_TRUE(dictionary->Find("author") == author);
    EXPECT_TRUE(dictionary->GetParent()->Find("date") == date);
    EXPECT_FALSE(dictionary->Find("Page"));
    EXPECT_EQ(dictionary->GetCount(), 5u);
    EXPECT_EQ(dictionary->GetWildcards().size(), 3u);
    WildcardDictionary::WildcardVector all{page};
    dictionary->CollateWildcardsOrdered(all);
    EXPECT_EQ(all, (WildcardDictionary::WildcardVector{page, page, date, author, ownDate, secondAuthor}));
}

/// Gives the values of a map and counts the questions.
class MapEvaluator : public WildcardWriter::Evaluator
{
public:
    using Pair = std::pair<char const*, char const*>;
    explicit MapEvaluator(std::initializer_list<Pair> values) : m_values(values) {}
    bool Evaluate(NonCounted<Wildcard const> wildcard, String8& value) override
    {
        ++asked;
        auto const found =
            std::ranges::find_if(m_values, [&](Pair const& pair) { return wildcard->GetToken() == pair.first; });
        if (found == m_values.end()) return false;
        value = found->second;
        return true;
    }
    int asked = 0;

private:
    std::vector<Pair> const m_values;
};

TEST_F(WildcardTest, EachWildcardIsAskedForOnceAndGapsWriteNothing)
{
    MapEvaluator evaluator({{"page", "7"}, {"author", ""}});
    WildcardTargetString target;
    WildcardWriter writer(evaluator, target);
    auto const sequence = WildcardSequence::Parse("<%page%-%page%|%author%|%gone%>", dictionary, '%');
    writer.WriteSequence(*sequence);
    EXPECT_EQ(target.GetResult(), "<7-7||>");
    EXPECT_EQ(evaluator.asked, 3);
    writer.WriteSequence(*sequence);
    EXPECT_EQ(target.GetResult(), "<7-7||><7-7||>");
    EXPECT_EQ(evaluator.asked, 3);
    // A token of the user's in another text is another wildcard, though the first may be gone by then.
    writer.WriteSequence(*WildcardSequence::Parse("%gone%", dictionary, '%'));
    writer.WriteSequence(*WildcardSequence::Parse("%gone%", dictionary, '%'));
    EXPECT_EQ(evaluator.asked, 5);
}

TEST_F(WildcardTest, ChildWriterAsksItsParentAndKeepsTheAnswer)
{
    MapEvaluator parentEvaluator({{"page", "7"}, {"date", "today"}}), evaluator({{"date", "tomorrow"}});
    WildcardTargetString target;
    WildcardWriter parent(parentEvaluator, target), child(evaluator, parent);
    auto const sequence = WildcardSequence::Parse("%page% %date% %author%.", dictionary, '%');
    child.WriteSequence(*sequence);
    child.WriteSequence(*sequence);
    EXPECT_EQ(target.GetResult(), "7 tomorrow .7 tomorrow .");
    EXPECT_EQ(evaluator.asked, 3);
    EXPECT_EQ(parentEvaluator.asked, 2);
    parent.WriteSequence(*WildcardSequence::Parse("%date%%page%", dictionary, '%'));
    EXPECT_EQ(target.GetResult(), "7 tomorrow .7 tomorrow .today7");
    EXPECT_EQ(parentEvaluator.asked, 3);
}

TEST_F(WildcardTest, StreamTargetTellsOfAShortWrite)
{
    auto const stream = MakeCounted<KernelTest::BytesOutStream>(4);
    WildcardTargetStream target(*stream);
    target.WriteString("abc");
    EXPECT_FALSE(target.HasFailed());
    target.WriteString("de");
    EXPECT_TRUE(target.HasFailed());
    EXPECT_EQ(stream->m_bytes, "abcd");
}

// Bytes that are not UTF-8 are taken too, but a delimiter that vanishes from between them may leave one behind.
TEST_F(WildcardTest, ReformedTextParsesToTheSameItems)
{
    std::mt19937 random(3);
    u32 const delimiters[] = {'%', 0xA7, 0x2020, 0x1F600, 0x3FFFFFF, 0};
    int valid = 0;
    for (int round = 0; round < 20000; ++round) {
        u32 const delimiter = delimiters[random() % std::size(delimiters)];
        std::string const bytes(Utf8Sequence(delimiter).GetSequence(),
                                static_cast<size_t>(Utf8Sequence(delimiter).GetSequenceSize()));
        std::string text;
        for (u32 i = random() % 12; i > 0; --i) {
            u32 const kind = random() % 4;
            text += kind == 0   ? bytes
                    : kind == 1 ? "page"
                                : std::string(1, static_cast<char>(kind == 2 ? random() : bytes[0]));
        }
        WildcardSequence::ErrorRec error;
        auto const sequence = WildcardSequence::Parse(String8(std::string_view(text)), dictionary, error, delimiter);
        ASSERT_TRUE(sequence);
        EXPECT_LE(error.position + error.length, static_cast<int>(text.size()));
        String8 const reformed = sequence->Reform(delimiter);
        Wildcard::ParseSingleWildcard(reformed, dictionary, delimiter);
        if (!CharTraits<TEncUtf8>::IsValid(text.data(), static_cast<int>(text.size()), true)) continue;
        ++valid;
        EXPECT_EQ(Shown(*WildcardSequence::Parse(reformed, dictionary, delimiter)), Shown(*sequence)) << text;
    }
    EXPECT_GT(valid, 3000);
}

TEST_F(WildcardTest, ManyThreadsReadOneDictionaryAndSequence)
{
    auto const sequence = WildcardSequence::Parse("%page% %date% text", dictionary, '%');
    std::vector<std::thread> threads;
    std::atomic<int> right = 0;
    for (int i = 0; i < 4; ++i)
        threads.emplace_back([&] {
            for (int round = 0; round < 200; ++round) {
                MapEvaluator evaluator({{"page", "7"}, {"date", "today"}});
                WildcardTargetString target;
                WildcardWriter(evaluator, target).WriteSequence(*sequence);
                auto const again = WildcardSequence::Parse(sequence->Reform('$'), dictionary, '$');
                right += target.GetResult() == "7 today text" && Shown(*again) == Shown(*sequence);
            }
        });
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(right, 800);
}

} // namespace
} // namespace Kernel::Test

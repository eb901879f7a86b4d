#include "libkernel/text/WildcardDictionary.h"
#include "libkernel/text/WildcardSequence.h"
#include "libkernel/text/WildcardWriter.h"
#include "support/PlainStreams.h"

#include <atomic>
#include <gtest/gtest.h>
#include <map>
#include <string>
#include <thread>
#include <tuple>

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
    using Row = std::tuple<char const*, u32, char const*, int, int, char const*>;
    for (auto const& [text, delimiter, items, position, length, reformed] :
         {Row{"", '%', "", 0, 0, ""}, Row{"plain", '%', "'plain'", 0, 0, "plain"}, Row{"a%%b", '%', "'ab'", 0, 0, "ab"},
          Row{"%%", '%', "", 0, 0, ""}, Row{"a%t", '%', "'at'", 2, 1, "at"}, Row{"a%", '%', "'a'", 2, 0, "a"},
          Row{"%", '%', "", 1, 0, ""}, Row{"%page%", '%', "[page]", 0, 0, "%page%"},
          Row{"p. %page% of %pages%.", '%', "'p. '[page]' of '<pages>'.'", 0, 0, "p. %page% of %pages%."},
          Row{"%author%%page%", '%', "[author][page]", 0, 0, "%author%%page%"},
          Row{"a%%%page%b%%", '%', "'a'[page]'b'", 0, 0, "a%page%b"},
          Row{"%Page% %page%%", '%', "<Page>' '[page]", 14, 0, "%Page% %page%"},
          Row{"a%%b%page%c%rest", '%', "'ab'[page]'crest'", 12, 4, "ab%page%crest"},
          Row{"a\xE2\x80\xA0page\xE2\x80\xA0\xE2\x80", 0x2020, "'a'[page]'\xE2\x80'", 0, 0,
              "a\xE2\x80\xA0page\xE2\x80\xA0\xE2\x80"},
          Row{"\xC2\xA7\xC2\xA7\xC2\xA7x", 0xA7, "'x'", 6, 1, "x"}, Row{"%page%", 0xA7, "'%page%'", 0, 0, "%page%"}})
    {
        WildcardSequence::ErrorRec error{7, 7};
        auto const sequence = WildcardSequence::Parse(text, dictionary, error, delimiter);
        ASSERT_TRUE(sequence) << text;
        EXPECT_EQ(Shown(*sequence), items) << text;
        EXPECT_EQ(error.position, position) << text;
        EXPECT_EQ(error.length, length) << text;
        EXPECT_EQ(sequence->Reform(delimiter), reformed) << text;
    }
    EXPECT_EQ(Shown(*WildcardSequence::Parse("%page%", nullptr, '%')), "<page>");
}

TEST_F(WildcardTest, SingleWildcardIsTheWholeText)
{
    using Row = std::tuple<char const*, u32, char const*>;
    for (auto const& [text, delimiter, token] :
         {Row{"%page%", '%', "page"}, Row{"%x%", '%', "x"}, Row{"\xC2\247date\xC2\xA7", 0xA7, "date"}})
    {
        auto const wildcard = Wildcard::ParseSingleWildcard(text, dictionary, delimiter);
        ASSERT_TRUE(wildcard) << text;
        EXPECT_EQ(wildcard->GetToken(), token);
        EXPECT_EQ(wildcard->GetWildcard(delimiter), text);
    }
    for (char const* none : {"%a%b%", "%%", "%", "", "%page", "page%", " %page%", "%page% ", "%%%"})
        EXPECT_FALSE(Wildcard::ParseSingleWildcard(none, dictionary, '%')) << none;
    for (char const* none : {"\xC2\xA7\xC2\xA7", "\xC2\247d\xC2"})
        EXPECT_FALSE(Wildcard::ParseSingleWildcard(none, dictionary, 0xA7));
    EXPECT_TRUE(Wildcard::ParseSingleWildcard("%page%", dictionary, '%') == page);
    auto const user = Wildcard::ParseSingleWildcard("%x%", nullptr, '%');
    EXPECT_EQ(user->GetLabel(), "x");
    EXPECT_EQ(user->GetIDTag(), IDTag());
    EXPECT_EQ(page->GetLabel(), "label");
    EXPECT_EQ(page->GetDescription(), "about it");
}

TEST_F(WildcardTest, ReformLeavesDelimitersOutOfLiterals)
{
    u32 const bad = 0x80000000; // Without an encoding.
    EXPECT_FALSE(WildcardSequence::Parse("%page%", dictionary, bad));
    EXPECT_FALSE(Wildcard::ParseSingleWildcard("%page%", dictionary, bad));
    EXPECT_EQ(WildcardSequence::Create(String8("text"))->Reform(bad), "");
    EXPECT_EQ(page->GetWildcard(bad), "");
    EXPECT_EQ(WildcardSequence::Create(String8("%5%% off%"))->Reform('%'), "5 off");
    EXPECT_EQ(WildcardSequence::Create(String8("%%"))->Reform('%'), "");
    EXPECT_EQ(WildcardSequence::Create(String8("\xC2\2471\xC2"))->Reform(0xA7), "1\xC2");
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
    using Map = std::map<std::string_view, char const*>;
    explicit MapEvaluator(std::initializer_list<Map::value_type> values) : m_values(values) {}
    bool Evaluate(NonCounted<Wildcard const> wildcard, String8& value) override
    {
        ++asked;
        auto const found = m_values.find(wildcard->GetToken().GetView());
        if (found == m_values.end()) return false;
        value = found->second;
        return true;
    }
    int asked = 0;

private:
    Map const m_values;
};

TEST_F(WildcardTest, EachWildcardIsAskedForOnceGapsWriteNothingAndAShortWriteIsTold)
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

    auto const stream = MakeCounted<PlainTarget>(4);
    WildcardTargetStream narrow(*stream);
    narrow.WriteString("abc");
    EXPECT_FALSE(narrow.HasFailed());
    narrow.WriteString("de");
    EXPECT_TRUE(narrow.HasFailed());
    EXPECT_EQ(stream->bytes, "abcd");
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

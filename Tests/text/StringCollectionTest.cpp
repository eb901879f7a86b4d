#include "libkernel/text/StringCollection.h"

#include "libkernel/filestore/VoidFileStore.h"
#include "text/TextSaving.h"

namespace Kernel::Test {
namespace {

using Mode = StringCollection::LookupMode;
using Texts = std::vector<String8>;

constexpr IDTag c_item("Item");

Counted<StringCollection> Make(char const* standard, std::map<char const*, char const*> const& variants)
{
    auto const texts = MakeCounted<StringCollection>();
    texts->SetDefault(standard);
    for (auto const& [key, text] : variants) texts->SetVariant(key, text);
    return texts;
}

TEST(StringCollectionTest, ModeSaysWhatStandsIn)
{
    auto const both = Make("std", {{"en", "sea"}, {"fr", "mer"}}), french = Make("std", {{"fr", "mer"}});
    using Row = std::tuple<char const*, Mode, char const*, char const*>;
    for (auto const& [key, mode, expected, withoutEnglish] :
         {Row{"fr", Mode::Exact, "mer", "mer"}, Row{"de", Mode::Exact, "", ""}, Row{"", Mode::Exact, "", ""},
          Row{"fr", Mode::Default, "mer", "mer"}, Row{"de", Mode::Default, "std", "std"},
          Row{"", Mode::Default, "std", "std"}, Row{"fr", Mode::English, "mer", "mer"},
          Row{"de", Mode::English, "sea", "std"}, Row{"", Mode::English, "std", "std"}})
    {
        EXPECT_EQ(both->GetVariant(key, mode), expected) << key << static_cast<int>(mode);
        EXPECT_EQ(french->GetVariant(key, mode), withoutEnglish) << key << static_cast<int>(mode);
    }
}

TEST(StringCollectionTest, EmptyKeyIsTheDefault)
{
    auto const texts = Make("std", {{"fr", "mer"}});
    texts->SetVariant("", "other");
    EXPECT_TRUE(*texts == *Make("other", {{"fr", "mer"}}));
    texts->UnsetVariant("");
    texts->UnsetVariant("de");
    EXPECT_TRUE(*texts == *Make("", {{"fr", "mer"}}));
    texts->UnsetVariant("fr");
    EXPECT_TRUE(*texts == *Make("", {}));
    EXPECT_TRUE(*texts != *Make("", {{"fr", ""}}));
}

TEST(StringCollectionTest, SavedCollectionComesBackEqual)
{
    auto const texts = Make("std", {{"fr", "mer"}, {"en", "sea"}});
    EXPECT_EQ(Show(SaveList([&](OutSerialiser& out) { texts->Save(out); })),
              Show(Bytes("2B [defl] 03000000 'std' AB [locK] 0C000000 02000000 02000000 'en' 02000000 'fr'"
                         "AB [locV] 0E000000 02000000 03000000 'sea' 03000000 'mer' 00")));
    Counted<StringCollection> loaded;
    ASSERT_TRUE(Parsed([&](OutSerialiser& out) { out.SaveObject(c_item, texts); })->LoadObject(c_item, loaded));
    EXPECT_TRUE(loaded->Equals(texts));
    loaded->SetVariant("fr", "la mer");
    EXPECT_FALSE(loaded->Equals(texts));
}

TEST(StringCollectionTest, ForeignListsAreReadWithCare)
{
    auto const load = [](Texts const& keys, Texts const& values, StringCollection& texts) {
        auto const list = Parsed([&](OutSerialiser& out) {
            out.SaveTypes(IDTag("locK"), keys);
            out.SaveTypes(IDTag("locV"), values);
        });
        return texts.Load(*list, VoidFileStore::GetInstance(), 1);
    };
    auto const texts = MakeCounted<StringCollection>(), cut = MakeCounted<StringCollection>();
    EXPECT_TRUE(load({"fr", "fr", ""}, {"first", "second", "none"}, *texts));
    EXPECT_EQ(texts->GetVariant("fr", Mode::Exact), "first");
    EXPECT_EQ(texts->GetVariant("", Mode::Exact), "none");
    EXPECT_FALSE(load({"fr", "de"}, {"one"}, *cut));
}

} // namespace
} // namespace Kernel::Test

#include "libkernel/text/LocalisedString.h"

#include "libkernel/filestore/VoidFileStore.h"
#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/text/StringCollection.h"
#include "libkernel/text/StringLocaliser.h"
#include "serialisation/WriterTestSupport.h"
#include "support/Rows.h"

namespace Kernel::Test {
namespace {

using KernelTest::Bytes;
using KernelTest::SaveFunction;
using KernelTest::SaveList;
using KernelTest::Show;

/// The properties that @p save writes, read back.
Counted<InSerialiserFile> Parsed(SaveFunction const& save)
{
    auto const stream = MakeCounted<PlainTarget>();
    OutSerialiserFile out(*stream, IDTag("Test"), 1);
    save(out);
    out.Close();
    auto const in = MakeCounted<MemoryInStream>(stream->bytes.data(), stream->bytes.size(), true);
    return InSerialiserFile::ParseWithChecks(*in);
}

/// An inline class of LStr without a property.
struct EmptyClass
{
    static ClassUID GetClassUID() { return ClassUID("LStr"); }
    static unsigned short GetSchemaVersion() { return 1; }
    void Save(OutSerialiser&) const {}
};

/// Answers "sail" with "voile", "hull" with an empty text and anything else with context, bar and base.
String8 Translate(String8 const& base, String8 const& context)
{
    if (base == "sail") return "voile";
    return base == "hull" ? String8() : context + "|" + base;
}

class LocalisedStringTest : public testing::Test
{
protected:
    LocalisedStringTest() { StringLocaliser::GetInstance().SetLocalisationSink(&Translate); }
    ~LocalisedStringTest() override { StringLocaliser::GetInstance().SetLocalisationSink(nullptr); }

    static LocalisedString Make(char const* base, char const* context = "Boat")
    {
        return LocalisedString::RecreateFromString(base, context);
    }
    static LocalisedString Fake(char const* text) { return LocalisedString::CreateFakeFromString(text); }
};

TEST_F(LocalisedStringTest, TextIsTranslatedOnceUntilItIsUntranslatedUnlessFakeOrEmpty)
{
    LocalisedString text = Make("mast"), fake = Fake("mast");
    EXPECT_EQ(text.ToString(), "Boat|mast");
    StringLocaliser::GetInstance().SetLocalisationSink(nullptr);
    EXPECT_EQ(text.ToString(), "Boat|mast");
    text.Untranslate();
    EXPECT_EQ(String8(text), "mast");
    StringLocaliser::GetInstance().SetLocalisationSink(&Translate);
    fake.Untranslate();
    EXPECT_EQ(fake.ToString(), "mast");
    EXPECT_TRUE(fake.IsFake() && !fake.IsEmpty() && !text.IsFake());
    EXPECT_TRUE(LocalisedString::Empty.IsEmpty() && !LocalisedString::Empty.IsFake());
    EXPECT_EQ(LocalisedString::Empty.ToString(), "");
    EXPECT_EQ(Make("", "Boat").ToString(), "");
}

TEST_F(LocalisedStringTest, ShownTextCountsOnlyWithoutAContext)
{
    LocalisedString const shown = Make("mast"), bare = Make("mast", "");
    shown.ToString();
    EXPECT_EQ(shown, Make("mast"));
    EXPECT_EQ(bare, Make("mast", ""));
    bare.ToString();
    EXPECT_NE(bare, Make("mast", ""));
    EXPECT_NE(Make("mast"), Make("mast", "Circus"));
    EXPECT_NE(Make("mast"), Make("sail"));
    EXPECT_EQ(Fake("a"), Fake("a"));
    EXPECT_NE(Fake("a"), Fake("b"));
}

TEST_F(LocalisedStringTest, SavedPropertiesFollowTheKindOfText)
{
    LocalisedString const shown = Make("sail"), same = Make("keel");
    shown.ToString();
    StringLocaliser::GetInstance().SetLocalisationSink(nullptr);
    same.ToString();
    Rows<char const*, LocalisedString, char const*> const cases = {
        {"fake", Fake("oar"), "2B [LStr] 03000000 'oar' 00"},
        {"not shown", Make("sail"), "2B [Str_] 04000000 'sail' 2B [Ctxt] 04000000 'Boat' 00"},
        {"shown", shown, "2B [Str_] 04000000 'sail' 2B [Ctxt] 04000000 'Boat' 2B [LStr] 05000000 'voile' 00"},
        {"shown as it is", same, "2B [Str_] 04000000 'keel' 2B [Ctxt] 04000000 'Boat' 00"},
        {"empty", LocalisedString(), "2B [Str_] 00000000 2B [Ctxt] 00000000 00"},
    };
    for (auto const& [what, text, list] : cases)
        EXPECT_EQ(Show(SaveList([&text = text](OutSerialiser& out) { text.Save(out); })), Show(Bytes(list))) << what;
}

TEST_F(LocalisedStringTest, RunningLanguageWinsOverTheStoredOne)
{
    Rows<char const*, std::map<IDTag, char const*>, bool, char const*, char const*> const cases = {
        {"fake", {{"LStr", "oar"}}, true, "", "oar"},
        {"no stored text", {{"Str_", "sail"}, {"Ctxt", "Boat"}}, true, "sail", "voile"},
        {"stored text", {{"Str_", "sail"}, {"Ctxt", "Boat"}, {"LStr", "Segel"}}, true, "sail", "voile"},
        {"empty answer", {{"Str_", "hull"}, {"Ctxt", "Boat"}, {"LStr", "Rumpf"}}, true, "hull", "Rumpf"},
        {"no base at all", {{"Str_", ""}, {"Ctxt", ""}, {"LStr", "Rumpf"}}, true, "", "Rumpf"},
        {"context lost", {{"Str_", "sail"}, {"LStr", "Segel"}}, true, "", "Segel"},
        {"context and text lost", {{"Str_", "sail"}}, false, "was", "Boat|was"},
        {"nothing", {}, false, "was", "Boat|was"},
    };
    for (auto const& [what, stored, loads, base, shown] : cases) {
        auto const list = Parsed([&stored = stored](OutSerialiser& out) {
            for (auto const& [tag, value] : stored) out.SaveType(tag, value);
        });
        LocalisedString text = Make("was");
        text.ToString();
        EXPECT_EQ(text.Load(*list, LocalisedString::GetClassUID(), 1), loads) << what;
        EXPECT_EQ(text.GetBaseString(), base) << what;
        EXPECT_EQ(text.ToString(), shown) << what;
    }
}

TEST_F(LocalisedStringTest, FallbackTakesTheClassThenThePlainString)
{
    IDTag const classTag("Clas"), stringTag("Name");
    auto const load = [&](LocalisedString& text, SaveFunction const& save) {
        return text.LoadWithFallback(*Parsed(save), classTag, stringTag);
    };
    LocalisedString text;
    EXPECT_TRUE(load(text, [&](OutSerialiser& out) {
        out.SaveClass(classTag, Make("sail"));
        out.SaveType(stringTag, "plain");
    }));
    EXPECT_EQ(text.ToString(), "voile");
    EXPECT_TRUE(load(text, [&](OutSerialiser& out) { out.SaveType(stringTag, "plain"); }));
    EXPECT_EQ(text.ToString(), "plain");
    EXPECT_EQ(text.GetBaseString(), "sail");
    EXPECT_FALSE(load(text, [](OutSerialiser&) {}));
    EXPECT_THROW(load(text, [&](OutSerialiser& out) { out.SaveClass(classTag, EmptyClass{}); }),
                 FutureVersionException);
}

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

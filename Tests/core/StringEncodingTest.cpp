#include "libkernel/core/StringEncoding.h"

#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/filesystem/FileSystem.h"
#include "support/TempFolder.h"

#include <gmock/gmock.h>
#include <random>

using namespace Kernel;
using Policy = StringEncoding::ErrorPolicy;

namespace {

std::string ToStd(String8 const& text)
{
    return {text.GetData(), static_cast<size_t>(text.GetLength())};
}

String8 Text(std::string_view text)
{
    return String8(text);
}

// Mapping files of our own, under names that are never installed. Each is read at its first use in the process.
class MappingFile : public testing::Test
{
protected:
    MappingFile()
    {
        FileSystem::SetResourcesDirectory(Text(m_folder.GetPath()));
        StringEncoding::SetSubdirectory("");
    }
    ~MappingFile() override
    {
        FileSystem::SetResourcesDirectory("");
        StringEncoding::SetSubdirectory("encodings");
    }
    Counted<StringEncoding> Make(char const* file, std::string const& content, int script, int language)
    {
        TestSupport::WriteWholeFile(m_folder / file, content);
        return StringEncoding::Make(script, language);
    }

    TestSupport::TempFolder m_folder;
};

TEST_F(MappingFile, LinesGiveEntriesAndEverythingElseIsIgnored)
{
    auto const encoding = Make("Inuit.txt",
                               "0x41 0x0041 # LATIN CAPITAL LETTER A\n"
                               "# 0x42 0x0042\n"
                               "0x43\n"
                               "0x44 # 0x0044\n"
                               "45 0x0045\n"
                               "  code 0x46=0x2022+0x20\r\n"
                               "0x47 0xD800\n"
                               "0x48 0x110000\n"
                               "0x12345678 0x41\n"
                               "0x100000041 0x41\n"
                               "0x41 0x5A\n" // Behind its place.
                               "0x4a\t0x1f600\n"
                               "0x4B 0x" +
                                   std::string(300, '0') + "4B\n" + // Past what is read of a line.
                                   std::string(300, ' ') + "0x4C 0x4C\n" + "0xFF 0x0041",
                               28, 0);
    struct
    {
        u32 code;
        u32 codePoint;
    } const cases[] = {
        {0, 0},         {31, 31},       {32, 0xFFFF},   {0x41, 0x41},   {0x42, 0xFFFF}, {0x43, 0xFFFF},
        {0x44, 0xFFFF}, {0x45, 0xFFFF}, {0x46, 0x2022}, {0x47, 0xFFFF}, {0x48, 0xFFFF}, {0x4A, 0x1F600},
        {0x4B, 0},      {0x4C, 0xFFFF}, {0x7F, 0x7F},   {0xFF, 0x41},   {256, 0xFFFF},  {0x12345678, 0xFFFF},
    };
    for (auto const& c : cases) EXPECT_EQ(encoding->ToUnicode(c.code), c.codePoint) << c.code;
    EXPECT_EQ(encoding->GetName(), "Inuit");
    EXPECT_FALSE(encoding->IsVariableLength());
    EXPECT_FALSE(encoding->IsIdentity());
    EXPECT_EQ(encoding->FromUnicode(0x41, 0), 0x41u); // The lowest of its two codes.
    EXPECT_EQ(encoding->FromUnicode(0xFFFF, 7), 7u);
}

TEST_F(MappingFile, CodesAbove255MakeLeadBytes)
{
    auto const encoding = Make("Celtic.txt", "0x41 0x0041\n0x42 0x0042\n0x8141 0x3042\n0x8250 0x4E00\n", 0, 50);
    EXPECT_TRUE(encoding->IsVariableLength());
    for (int byte = 0; byte < 256; ++byte)
        EXPECT_EQ(encoding->IsLeadByte(static_cast<u8>(byte)), byte == 0x81 || byte == 0x82) << byte;
    struct
    {
        std::string in;
        std::string out;
    } const cases[] = {
        {"", ""},
        {"A\x81\x41"
         "B",
         "A\u3042B"},
        {"\x82\x50", "\u4E00"},
        {"A\x81", "A\uFFFF"}, // A lead byte as the very last one is a code of its own.
        {"\x81\x42"
         "A",
         "\uFFFF"
         "A"}, // No such pair.
        {"\x83"
         "A",
         "\uFFFF"
         "A"},
    };
    for (auto const& c : cases)
        EXPECT_EQ(ToStd(encoding->ToUnicode(c.in.data(), static_cast<int>(c.in.size()))), c.out) << c.out;
    EXPECT_EQ(encoding->ToUnicodeSingle("\x81\x41", 2), 0x3042u);
    EXPECT_EQ(encoding->ToUnicodeSingle("\x81\x41", 1), 0xFFFFu);
    EXPECT_EQ(encoding->ToUnicodeSingle("\x81\x41"
                                        "A",
                                        3),
              0xFFFFu);
    EXPECT_EQ(encoding->ToUnicodeSingle("A\x41", 2), 0x41u);
    EXPECT_EQ(encoding->ToUnicodeSingle(nullptr, 0), 0xFFFFu);
}

TEST_F(MappingFile, NameWithoutExtensionIsTheWholeFileName)
{
    auto const encoding = Make("Gaelic", "0x80 0x1E02\n", 6, 81);
    EXPECT_EQ(encoding->GetName(), "Gaelic");
    EXPECT_EQ(encoding->ToUnicode(0x80), 0x1E02u);
}

TEST(StringEncoding, EachNumberHasItsFile)
{
    struct
    {
        int script; // -1 for a code page.
        int number;
        char const* name;
    } const cases[] = {
        {-1, 2, "WinSymbol"},  {-1, 775, "CP775"},     {-1, 1252, "CP1252"},     {-1, 1256, "Arabic"},
        {-1, 10004, "Arabic"}, {-1, 10029, "Latin2"},  {-1, 10079, "Icelandic"}, {-1, 20936, "ChinSimp"},
        {-1, 0, "Identity"},   {-1, 1257, "Identity"}, {-1, 12345, "Identity"},  {0, 0, "Roman"},
        {0, 20, "Greek"},      {6, 20, "Greek"},       {6, 0, "Roman"},          {0, 47, "Iceland"},
        {0, 24, "Turkish"},    {0, 68, "Croatian"},    {0, 39, "Romanian"},      {1, 20, "Japanese"},
        {4, 48, "Farsi"},      {4, 12, "Arabic"},      {8, 0, "MacSymbol"},      {29, 5, "CentEuro"},
        {12, 0, "Identity"},   {32, 0, "Identity"},    {-7, -1, "Identity"},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(testing::Message() << c.script << ", " << c.number);
        bool const page = c.script == -1;
        auto const encoding = page ? StringEncoding::Make(c.number) : StringEncoding::Make(c.script, c.number);
        EXPECT_EQ(encoding->GetName(), c.name);
        bool const supported =
            page ? StringEncoding::IsSupported(c.number) : StringEncoding::IsSupported(c.script, c.number);
        EXPECT_EQ(supported, encoding->GetName() != "Identity");
        if (page) {
            EXPECT_EQ(StringEncoding::ToCodePage(c.number), supported ? c.number : 0);
        }
    }
    EXPECT_EQ(StringEncoding::MakePdfDocEncoding()->GetName(), "PdfDocEncoding");
    EXPECT_EQ(StringEncoding::Make(12345), StringEncoding::MakeIdentity());
}

TEST(StringEncoding, AllThreadsGetOneObject)
{
    std::vector<Counted<StringEncoding>> made(8);
    Dispatch::DispatchParallelFor([&](u64 i) { made[i] = StringEncoding::Make(10000); }, made.size());
    for (auto const& encoding : made) EXPECT_EQ(encoding, made[0]);
    EXPECT_EQ(made[0], StringEncoding::Make(10000));
}

TEST(StringEncoding, IdentityReadsTwoBytesACharacter)
{
    auto const identity = StringEncoding::MakeIdentity();
    EXPECT_TRUE(identity->IsIdentity());
    EXPECT_FALSE(identity->IsVariableLength());
    EXPECT_EQ(ToStd(identity->ToUnicode("\0A\x30\x42"
                                        "B",
                                        5)),
              "A\u3042B");
    EXPECT_EQ(ToStd(identity->ToUnicode("ab", -1)), "\u6162");
    EXPECT_EQ(identity->FromUnicode(0x3042, 0), 0x3042u);
    std::vector<char> out{'<'};
    EXPECT_TRUE(identity->FromUnicode(out, "\u3042", Policy::Stop, 0));
    EXPECT_THAT(out, testing::ElementsAreArray("<\u3042", 4));
    char bytes[2];
    EXPECT_EQ(identity->FromUnicodeSingle(bytes, 2, 'A'), 2);
    EXPECT_EQ(std::string(bytes, 2), std::string("\0A", 2));
    EXPECT_EQ(identity->FromUnicodeSingle(bytes, 1, 'A'), 0);
    EXPECT_EQ(identity->FromUnicodeSingle(bytes, 2, 0x1F600), 0);
}

TEST(StringEncoding, PolicyDecidesAboutWhatHasNoCode)
{
    struct
    {
        CodePage codePage;
        char const* text;
        Policy policy;
        u32 fallback;
        std::string out;
        bool whole;
    } const cases[] = {
        {1252, "a\u20ACb", Policy::Stop, '?',
         "a\x80"
         "b",
         true},
        {1252, "a\u3042b", Policy::WriteFallback, '?', "a?b", false},
        {1252, "a\u3042b", Policy::WriteFallback, 0x4142, "aABb", false},
        {1252, "a\u3042b", Policy::Skip, '?', "ab", false},
        {1252, "a\u3042b", Policy::Stop, '?', "a", false},
        {1252,
         "a\xE3\x81"
         "b",
         Policy::WriteFallback, '?', "a??b", false},
        {1252, "a\xF0", Policy::Skip, '?', "a", false},
        {932, "a\u3042\uFF71", Policy::Stop, '?', "a\x82\xA0\xB1", true},
    };
    for (auto const& c : cases) {
        std::vector<char> out;
        EXPECT_EQ(StringEncoding::Make(c.codePage)->FromUnicode(out, c.text, c.policy, c.fallback), c.whole) << c.text;
        EXPECT_EQ(std::string(out.begin(), out.end()), c.out) << c.text;
    }
    char bytes[2];
    auto const japanese = StringEncoding::Make(932);
    EXPECT_EQ(japanese->FromUnicodeSingle(bytes, 2, 0x3042), 2);
    EXPECT_EQ(japanese->FromUnicodeSingle(bytes, 1, 0x3042), 0);
    EXPECT_EQ(japanese->FromUnicodeSingle(bytes, 1, 'a'), 1);
    EXPECT_EQ(japanese->FromUnicodeSingle(bytes, 2, 0x10FFFF), 0);
}

TEST(StringEncoding, RandomBytesGiveValidTextAndComeBack)
{
    std::mt19937 random(5);
    for (CodePage const codePage : {0, 2, 932, 949, 950, 1252, 10001, 10003}) {
        auto const encoding = StringEncoding::Make(codePage);
        for (int round = 0; round < 200; ++round) {
            std::string bytes(random() % 40, 0);
            for (char& c : bytes) c = static_cast<char>(random());
            String8 const text = encoding->ToUnicode(bytes.data(), static_cast<int>(bytes.size()));
            ASSERT_TRUE(CharTraits<TEncUtf8>::IsValid(text.GetData(), text.GetLength(), true));
            std::vector<char> back;
            if (encoding->IsIdentity() || !encoding->FromUnicode(back, text, Policy::Stop, 0)) continue;
            EXPECT_EQ(encoding->ToUnicode(back.data(), static_cast<int>(back.size())), text);
        }
    }
}

} // namespace
